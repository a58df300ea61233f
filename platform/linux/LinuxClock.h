// The kernel's clocks. Thread-safe.
#pragma once

#include "platform/Clock.h"

namespace vela::platform {

class LinuxClock final : public Clock {
public:
    WallTime now() const override;
    MonotonicTime monotonicNow() const override;
    Nanoseconds systemUptime() const override;

    /// By the zone in force now: a device that travels has its zone file replaced while the service runs.
    std::chrono::seconds localOffset(WallTime time) const override;
};

} // namespace vela::platform
