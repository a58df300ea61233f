#include "platform/hwstats/HwStatsGroups.h"

#include <algorithm>
#include <array>
#include <cassert>
#include <string_view>

namespace vela::platform {

namespace {

constexpr std::array<std::string_view, 7> kSourceNames = {"channels", "alsa-playback", "alsa-capture",  "cpuidle",
                                                          "devfreq",  "runtime-pm",    "force-feedback"};

std::vector<HwStatsSource> sourcesOf(const std::vector<std::string>& names) {
    std::vector<HwStatsSource> sources;
    for (const std::string& name : names) {
        const auto* const found = std::ranges::find(kSourceNames, name);
        assert(found != kSourceNames.end() && "the settings know the names");
        const auto source = static_cast<HwStatsSource>(found - kSourceNames.begin());
        if (found != kSourceNames.end() && std::ranges::find(sources, source) == sources.end()) {
            sources.push_back(source);
        }
    }
    return sources;
}

} // namespace

std::vector<HwStatsGroup> hwStatsGroupsOf(const Settings& settings) {
    const Settings::Drivers& drivers = settings.drivers;
    return {{{"Tarn", {}}, sourcesOf(drivers.tarn)},
            {{"Speaker", {}}, sourcesOf(drivers.speaker)},
            {{{}, "MCA"}, sourcesOf(drivers.mca)},
            {{"Haptics", "Stats"}, sourcesOf(drivers.haptics)},
            {{"StateTransitionTimes_ms", {}}, sourcesOf(drivers.stateTransitionTimes)},
            {{"Rx", {}}, sourcesOf(drivers.rx)},
            {{"Tx", {}}, sourcesOf(drivers.tx)},
            {{{}, "Brook"}, sourcesOf(drivers.brook)}};
}

} // namespace vela::platform
