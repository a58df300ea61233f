// The service's own process.
#pragma once

namespace vela::platform {

/// Thread-safe.
class ProcessControl {
public:
    virtual ~ProcessControl() = default;

    /// Ends the process at once: no destructor runs, nothing is written that is still in memory. It returns only where
    /// a test stands in for the system.
    virtual void exitWithStatus(int status) = 0;
};

} // namespace vela::platform
