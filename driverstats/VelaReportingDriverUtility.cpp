#include "driverstats/VelaReportingDriverUtility.h"

#include "common/VelaReportingVocabulary.h"
#include "driverstats/VelaReportingDriverStatistics.h"

#include <cassert>
#include <optional>
#include <string>
#include <string_view>
#include <utility>

namespace vela {

namespace {

using platform::HwStats;
using platform::HwStatsChannel;
using platform::HwStatsChannels;
using platform::HwStatsSamples;

struct DriverName {
    std::optional<std::string_view> group;
    std::optional<std::string_view> subGroup;
};

/// The third and the last leave the group open: their subgroups count in whatever group they appear.
constexpr DriverName kDrivers[] = {
    {"Tarn", {}}, {"Speaker", {}}, {{}, "MCA"},   {"Haptics", "Stats"}, {"StateTransitionTimes_ms", {}},
    {"Rx", {}},   {"Tx", {}},      {{}, "Brook"},
};

/// Of a sampling and of a difference alike.
void logSamplingError(const platform::HwStatsError& error) {
    driverLog().error("HwStatsCreateSamples error %li", error.code);
}

/// What changed since the previous samples of `driver`, or null.
std::shared_ptr<const HwStatsSamples> changesSince(const VelaReportingDriverSnapShot& snapShot,
                                                   const VelaReportingDriver& driver, const HwStatsSamples& current,
                                                   HwStats& hwStats) {
    // A driver that could not be sampled then has none; what that means is the library's to say.
    const auto previous = snapShot.find(driver.description());
    auto changes = hwStats.createSamplesDelta(previous == snapShot.end() ? nullptr : previous->second.get(), current);
    if (changes.thing == nullptr && changes.error) {
        logSamplingError(*changes.error);
    }
    return std::move(changes.thing);
}

std::shared_ptr<const HwStatsSamples> latestSamples(const VelaReportingIOChannelSubscription& subscription,
                                                    HwStats& hwStats) {
    driverLog().info("getting latest samples");
    auto samples = hwStats.createSamples(*subscription.subscription, *subscription.subscribedChannels);
    driverLog().info("done getting latest samples");
    if (samples.thing == nullptr && samples.error) {
        logSamplingError(*samples.error);
    }
    return std::move(samples.thing);
}

} // namespace

VelaReportingDriverUtility::VelaReportingDriverUtility(HwStats& hwStats, VelaReportingSessionEventHandler& analytics)
    : hwStats_(hwStats),
      analytics_(analytics) {
    driverLog().info("creating hwstatsing driver utility");
    for (const DriverName& name : kDrivers) {
        subscribe(VelaReportingDriver::driverWithGroupName(name.group, name.subGroup));
    }
}

void VelaReportingDriverUtility::subscribe(const VelaReportingDriver& driver) {
    const auto& group = driver.groupName();
    const auto& subGroup = driver.subGroupName();
    const auto channels = hwStats_.copyChannelsInGroup(group, subGroup);
    if (channels.error) {
        driverLog().error("error %li getting channels for driver %@-%@", channels.error->code, group, subGroup);
    }
    if (channels.thing == nullptr) {
        return;
    }
    if (hwStats_.channelCount(*channels.thing) < 1) {
        driverLog().info("couldn't find any channels for driver group %@-%@", group, subGroup);
        return;
    }
    auto answer = hwStats_.createSubscription(*channels.thing);
    if (answer.subscription != nullptr && answer.subscribed != nullptr) {
        VelaReportingIOChannelSubscription subscription(driver);
        subscription.subscription = std::move(answer.subscription);
        subscription.subscribedChannels = std::move(answer.subscribed);
        ioChannelSubscriptions_.push_back(std::move(subscription));
        // The line says "group" twice, and is searched for like that.
        driverLog().info("subscribed to group group %@-%@", group, subGroup);
    } else if (answer.error) {
        driverLog().error("error %li creating subscription for %@-%@", answer.error->code, group, subGroup);
    }
}

VelaReportingDriverSnapShot VelaReportingDriverUtility::getSnapShot() const {
    VelaReportingDriverSnapShot snapShot;
    for (const VelaReportingIOChannelSubscription& subscription : ioChannelSubscriptions_) {
        driverLog().info("sampling driver %@", subscription.driver);
        auto samples = hwStats_.createSamples(*subscription.subscription, *subscription.subscribedChannels);
        if (samples.thing != nullptr) {
            snapShot.insert_or_assign(subscription.driver.description(), std::move(samples.thing));
        } else if (samples.error) {
            logSamplingError(*samples.error);
        }
    }
    return snapShot;
}

void VelaReportingDriverUtility::sendDriverLogsForSession(const std::shared_ptr<VelaReportingSession>& session) const {
    assert(session != nullptr);
    VelaReportingDriverStatistics statistics;
    for (const VelaReportingIOChannelSubscription& subscription : ioChannelSubscriptions_) {
        const auto samples = latestSamples(subscription, hwStats_);
        if (samples == nullptr || !session->driverSnapShot()) {
            continue;
        }
        const auto changes = changesSince(*session->driverSnapShot(), subscription.driver, *samples, hwStats_);
        if (changes == nullptr) {
            continue;
        }
        hwStats_.iterate(*changes, [&statistics](const HwStatsChannel& channel) {
            processChannel(channel, statistics);
            return 0; // go on
        });
    }
    send(statistics.simple.build(), AudioEventTypeSimple, session);
    send(statistics.histogram.build(), AudioEventTypeHistogram, session);
    send(statistics.state.build(), AudioEventTypeState, session);
}

void VelaReportingDriverUtility::send(const Dictionary& driverStats, std::uint16_t type,
                                      const std::shared_ptr<VelaReportingSession>& session) const {
    if (driverStats.empty()) {
        return;
    }
    session->sendMessage(driverStats, AudioEventCategoryHwStatsing, type, {});
    analytics_.handleEvent(driverStats, AudioEventCategoryHwStatsing, type, session);
}

} // namespace vela
