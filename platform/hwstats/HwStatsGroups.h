// Which sources feed which groups of channels: section [drivers] of the settings. Plain data and pure functions.
#pragma once

#include "common/Settings.h"

#include <cstdint>
#include <optional>
#include <string>
#include <vector>

namespace vela::platform {

/// A part that is absent takes in any.
struct HwStatsGroupName {
    std::optional<std::string> group;
    std::optional<std::string> subGroup;

    friend bool operator==(const HwStatsGroupName&, const HwStatsGroupName&) = default;
};

/// In the order of the settings' choices.
enum class HwStatsSource : std::uint8_t {
    Channels,      ///< channel files whose driver names the group
    AlsaPlayback,  ///< playback streams of sound cards
    AlsaCapture,   ///< capture streams of sound cards
    CpuIdle,       ///< idle states of the processors
    DevFreq,       ///< frequencies of devices
    RuntimePm,     ///< runtime power management of devices
    ForceFeedback, ///< input devices with force feedback
};

struct HwStatsGroup {
    HwStatsGroupName name;
    std::vector<HwStatsSource> sources;
};

/// The groups that the service asks for, in its order. A source that is named twice counts once.
std::vector<HwStatsGroup> hwStatsGroupsOf(const Settings& settings);

} // namespace vela::platform
