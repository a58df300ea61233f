// Channels as the tests of this folder need them.
#pragma once

#include "platform/HwStats.h"
#include "testing/CapturingLog.h"

#include <cstdint>
#include <string>
#include <utility>
#include <vector>

namespace vela {

inline platform::HwStatsChannel channelOf(platform::HwStatsFormat format, std::string name) {
    platform::HwStatsChannel channel;
    channel.format = static_cast<std::uint8_t>(format);
    channel.group = "Rx";
    channel.channelName = std::move(name);
    return channel;
}

inline platform::HwStatsChannel simpleChannel(std::string name, std::int64_t value) {
    platform::HwStatsChannel channel = channelOf(platform::HwStatsFormat::Simple, std::move(name));
    channel.simpleValue = value;
    return channel;
}

inline platform::HwStatsBucket bucket(std::int64_t lower, std::int64_t upper, std::int64_t hits) {
    return {lower, upper, 0, hits};
}

inline platform::HwStatsChannel histogramChannel(std::string name, std::vector<platform::HwStatsBucket> buckets) {
    platform::HwStatsChannel channel = channelOf(platform::HwStatsFormat::Histogram, std::move(name));
    channel.buckets = std::move(buckets);
    channel.histogramMin = 1;
    channel.histogramMax = 9;
    channel.unitLabel = "ms";
    return channel;
}

inline platform::HwStatsChannel stateChannel(std::string name, std::vector<platform::HwStatsState> states) {
    platform::HwStatsChannel channel = channelOf(platform::HwStatsFormat::State, std::move(name));
    channel.states = std::move(states);
    return channel;
}

inline testing::CapturedLine driverLine(platform::LogLevel level, std::string message) {
    return {level, "velard", "VelaReportingDriverUtility", std::move(message)};
}

} // namespace vela
