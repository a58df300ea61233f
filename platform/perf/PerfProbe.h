// The performance-trace service of Linux: a profile of all processors and programs by `perf record`, 999 times a second
// with the stacks of callers. Template 1 is the only one. Thread-safe; sessions do not need the probe any more.
//
// Perf or the rights to trace the whole system may be missing: then a trace fails to start, with what perf said. So
// does one beyond those that may run at the same time.
#pragma once

#include "platform/Clock.h"
#include "platform/Probe.h"
#include "platform/WorkQueue.h"

#include <chrono>
#include <cstddef>
#include <cstdint>
#include <memory>
#include <string>

namespace vela::platform {

namespace perf {
class TracePlaces;
}

class PerfProbe final : public Probe {
public:
    struct Options {
        std::string folder;                           ///< of the results; made when it is needed
        std::string program = "/usr/bin/perf";        ///< an absolute path
        std::size_t mostTraces = 4;                   ///< at the same time, of all sessions
        std::size_t mostFiles = 16;                   ///< results that are kept, at least 1
        std::uint64_t mostBytes = 64 * 1024 * 1024;   ///< of samples in a result, at least 1; with them the trace ends
        std::chrono::milliseconds startLimit{10'000}; ///< for perf to begin
        std::chrono::milliseconds stopLimit{5'000};   ///< to pause
        std::chrono::milliseconds endLimit{30'000};   ///< to put its result in order and to end
    };

    /// Delegates are called on `queue`, which may be of any kind but not serial with items that wait for a completion:
    /// one call at a time for each session, in order. `clock` and `queue` outlive this and its sessions.
    PerfProbe(Options options, const Clock& clock, WorkQueue& queue);

    /// Null for another template than 1.
    std::shared_ptr<ProbeTraceConfig> makeProbeTraceConfig(int templateNumber) override;
    std::shared_ptr<ProbeTraceSession> createProbeTraceSession(const ProbeTraceConfig& config) override;

private:
    const Options options_;
    const std::shared_ptr<perf::TracePlaces> places_;
    const Clock& clock_;
    WorkQueue& queue_;
};

} // namespace vela::platform
