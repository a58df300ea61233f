// What the channels of one driver are called and how they are divided, apart from their values. Plain data; immutable
// once it is shared, which all samples of a driver do.
#pragma once

#include "platform/HwStats.h"

#include <cstddef>
#include <cstdint>
#include <optional>
#include <string>
#include <vector>

namespace vela::platform::hwstats {

struct ChannelDescription {
    HwStatsFormat format = HwStatsFormat::Simple; ///< Simple, Histogram or State
    std::string name;
    std::optional<std::string> unit;
    std::vector<std::int64_t> bounds; ///< of a histogram, rising: bucket i is [bounds[i], bounds[i + 1])
    std::vector<std::string> states;  ///< of a state channel

    /// Buckets of a histogram, states of a state channel.
    std::size_t parts() const {
        return format == HwStatsFormat::Histogram ? bounds.size() - (bounds.empty() ? 0 : 1) : states.size();
    }
    /// 64-bit words of its values in a sample:
    ///
    ///     Simple     value
    ///     Histogram  least, greatest, hits of each bucket
    ///     State      transitions into and residency of each state
    std::size_t words() const {
        switch (format) {
        case HwStatsFormat::Histogram:
            return 2 + parts();
        case HwStatsFormat::State:
            return 2 * parts();
        default:
            return 1;
        }
    }

    friend bool operator==(const ChannelDescription&, const ChannelDescription&) = default;
};

struct ChannelTable {
    std::optional<std::string> driverName;
    std::optional<std::string> group;
    std::optional<std::string> subGroup;
    std::vector<ChannelDescription> channels;

    friend bool operator==(const ChannelTable&, const ChannelTable&) = default;
};

} // namespace vela::platform::hwstats
