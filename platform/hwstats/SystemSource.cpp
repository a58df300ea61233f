#include "platform/hwstats/SystemSource.h"

#include "platform/hwstats/AlsaSource.h"
#include "platform/hwstats/ForceFeedbackSource.h"
#include "platform/hwstats/PowerSources.h"

namespace vela::platform::hwstats {

std::unique_ptr<SystemSource> makeSystemSource(HwStatsSource kind, const HwStatsGroupName& group) {
    switch (kind) {
    case HwStatsSource::Channels:
        return nullptr;
    case HwStatsSource::AlsaPlayback:
        return std::make_unique<AlsaSource>(group, true);
    case HwStatsSource::AlsaCapture:
        return std::make_unique<AlsaSource>(group, false);
    case HwStatsSource::CpuIdle:
        return std::make_unique<CpuIdleSource>(group);
    case HwStatsSource::DevFreq:
        return std::make_unique<DevFreqSource>(group);
    case HwStatsSource::RuntimePm:
        return std::make_unique<RuntimePmSource>(group);
    case HwStatsSource::ForceFeedback:
        return std::make_unique<ForceFeedbackSource>(group);
    }
    return nullptr;
}

} // namespace vela::platform::hwstats
