// One live subscription to the channels of one driver. Written once, by who makes it.
#pragma once

#include "driverstats/VelaReportingDriver.h"
#include "platform/HwStats.h"

#include <memory>
#include <utility>

namespace vela {

struct VelaReportingIOChannelSubscription {
    explicit VelaReportingIOChannelSubscription(VelaReportingDriver subscribedDriver)
        : driver(std::move(subscribedDriver)) {}

    std::shared_ptr<const platform::HwStatsSubscription> subscription;
    /// The set to sample with, as the library answered it.
    std::shared_ptr<const platform::HwStatsChannels> subscribedChannels;
    VelaReportingDriver driver;
};

} // namespace vela
