#include "platform/perf/PerfProbe.h"

#include "platform/perf/PerfTraceSession.h"

namespace vela::platform {

std::shared_ptr<ProbeTraceConfig> PerfProbe::makeProbeTraceConfig(int templateNumber) {
    constexpr int kProfile = 1;
    return templateNumber == kProfile ? std::make_shared<ProbeTraceConfig>() : nullptr;
}

// There is one kind of configuration, and nothing to choose in it.
std::shared_ptr<ProbeTraceSession> PerfProbe::createProbeTraceSession(const ProbeTraceConfig&) {
    return std::make_shared<perf::PerfTraceSession>(options_, clock_, queue_);
}

} // namespace vela::platform
