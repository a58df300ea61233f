#include "platform/perf/PerfProbe.h"

#include "platform/perf/PerfTraceSession.h"
#include "platform/perf/TracePlaces.h"

#include <utility>

namespace vela::platform {

PerfProbe::PerfProbe(Options options, const Clock& clock, WorkQueue& queue)
    : options_(std::move(options)),
      places_(std::make_shared<perf::TracePlaces>(options_.mostTraces)),
      clock_(clock),
      queue_(queue) {}

std::shared_ptr<ProbeTraceConfig> PerfProbe::makeProbeTraceConfig(int templateNumber) {
    constexpr int kProfile = 1;
    return templateNumber == kProfile ? std::make_shared<ProbeTraceConfig>() : nullptr;
}

// There is one kind of configuration, and nothing to choose in it.
std::shared_ptr<ProbeTraceSession> PerfProbe::createProbeTraceSession(const ProbeTraceConfig&) {
    return std::make_shared<perf::PerfTraceSession>(options_, places_, clock_, queue_);
}

} // namespace vela::platform
