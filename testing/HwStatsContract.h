// What every HwStats does, as a test suite that runs on the fake and on the real one.
//
// A harness has: `platform::HwStats& hwStats()`, which has sources for the groups "Rx" and "Tx" and for "Haptics" with
// "Stats", and none for "Nobody"; and `void setCounter(group, subGroup, name, value)`, by which a driver of that group
// publishes a counter or changes it.
#pragma once

#include "platform/HwStats.h"

#include <cstdint>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <memory>
#include <optional>
#include <string>
#include <vector>

namespace vela::testing {

template <class Harness>
class HwStatsContract : public ::testing::Test {
protected:
    using Name = std::optional<std::string>;
    using Subscription = platform::HwStats::SubscriptionAnswer;

    platform::HwStats& hwStats() { return harness_.hwStats(); }
    Subscription subscribe(const Name& group, const Name& subGroup = {}) {
        const auto channels = hwStats().copyChannelsInGroup(group, subGroup);
        EXPECT_NE(channels.thing, nullptr);
        return channels.thing == nullptr ? Subscription{} : hwStats().createSubscription(*channels.thing);
    }
    std::shared_ptr<const platform::HwStatsSamples> sample(const Subscription& subscription) {
        return hwStats().createSamples(*subscription.subscription, *subscription.subscribed).thing;
    }
    /// "frames=5" of each counter.
    std::vector<std::string> countersOf(const platform::HwStatsSamples& samples) {
        std::vector<std::string> counters;
        hwStats().iterate(samples, [&](const platform::HwStatsChannel& channel) {
            EXPECT_EQ(channel.format, static_cast<std::uint8_t>(platform::HwStatsFormat::Simple));
            counters.push_back(channel.channelName.value_or("-") + "=" + std::to_string(channel.simpleValue));
            return 0;
        });
        return counters;
    }

    Harness harness_;
};

TYPED_TEST_SUITE_P(HwStatsContract);

TYPED_TEST_P(HwStatsContract, AGroupOfADriverHasChannelsAndNoError) {
    this->harness_.setCounter("Rx", {}, "frames", 1);
    const auto channels = this->hwStats().copyChannelsInGroup("Rx", std::nullopt);
    ASSERT_NE(channels.thing, nullptr);
    EXPECT_FALSE(channels.error.has_value());
    EXPECT_GE(this->hwStats().channelCount(*channels.thing), 1);
}

TYPED_TEST_P(HwStatsContract, AGroupThatNobodyFeedsHasNoChannelsAndNoError) {
    const auto channels = this->hwStats().copyChannelsInGroup("Nobody", std::nullopt);
    EXPECT_FALSE(channels.error.has_value());
    EXPECT_TRUE(channels.thing == nullptr || this->hwStats().channelCount(*channels.thing) == 0);
}

TYPED_TEST_P(HwStatsContract, ASubscriptionHasItsChannelsAndNoError) {
    this->harness_.setCounter("Rx", {}, "frames", 1);
    const auto subscription = this->subscribe("Rx");
    EXPECT_NE(subscription.subscription, nullptr);
    EXPECT_NE(subscription.subscribed, nullptr);
    EXPECT_FALSE(subscription.error.has_value());
}

TYPED_TEST_P(HwStatsContract, ASamplingFindsTheGroupsOwnChannels) {
    this->harness_.setCounter("Rx", {}, "frames", 5);
    this->harness_.setCounter("Tx", {}, "frames", 7);
    this->harness_.setCounter("Haptics", "Stats", "plays", 9);
    const auto rx = this->sample(this->subscribe("Rx"));
    const auto tx = this->sample(this->subscribe("Tx"));
    const auto haptics = this->sample(this->subscribe("Haptics", "Stats"));
    ASSERT_TRUE(rx != nullptr && tx != nullptr && haptics != nullptr);
    EXPECT_THAT(this->countersOf(*rx), ::testing::ElementsAre("frames=5"));
    EXPECT_THAT(this->countersOf(*tx), ::testing::ElementsAre("frames=7"));
    EXPECT_THAT(this->countersOf(*haptics), ::testing::ElementsAre("plays=9"));
}

TYPED_TEST_P(HwStatsContract, SamplesAreOfTheirMoment) {
    this->harness_.setCounter("Rx", {}, "frames", 5);
    const auto subscription = this->subscribe("Rx");
    const auto samples = this->sample(subscription);
    this->harness_.setCounter("Rx", {}, "frames", 6);
    EXPECT_THAT(this->countersOf(*samples), ::testing::ElementsAre("frames=5"));
    EXPECT_THAT(this->countersOf(*this->sample(subscription)), ::testing::ElementsAre("frames=6"));
}

TYPED_TEST_P(HwStatsContract, ADifferenceIsWhatChanged) {
    this->harness_.setCounter("Rx", {}, "frames", 5);
    const auto subscription = this->subscribe("Rx");
    const auto before = this->sample(subscription);
    this->harness_.setCounter("Rx", {}, "frames", 12);
    const auto after = this->sample(subscription);
    const auto difference = this->hwStats().createSamplesDelta(before.get(), *after);
    ASSERT_NE(difference.thing, nullptr);
    EXPECT_FALSE(difference.error.has_value());
    EXPECT_THAT(this->countersOf(*difference.thing), ::testing::ElementsAre("frames=7"));
    EXPECT_THAT(this->countersOf(*after), ::testing::ElementsAre("frames=12")) << "the samples stay";
}

TYPED_TEST_P(HwStatsContract, NothingChangesFromSamplesToThemselves) {
    this->harness_.setCounter("Rx", {}, "frames", 5);
    const auto samples = this->sample(this->subscribe("Rx"));
    const auto difference = this->hwStats().createSamplesDelta(samples.get(), *samples);
    ASSERT_NE(difference.thing, nullptr);
    EXPECT_THAT(this->countersOf(*difference.thing), ::testing::ElementsAre("frames=0"));
}

TYPED_TEST_P(HwStatsContract, WithoutEarlierSamplesThereIsAnErrorAndNoDifference) {
    this->harness_.setCounter("Rx", {}, "frames", 5);
    const auto samples = this->sample(this->subscribe("Rx"));
    const auto difference = this->hwStats().createSamplesDelta(nullptr, *samples);
    EXPECT_EQ(difference.thing, nullptr);
    ASSERT_TRUE(difference.error.has_value());
    EXPECT_NE(difference.error->code, 0);
}

TYPED_TEST_P(HwStatsContract, IteratingEndsWhenTheCallerAnswersOtherThanZero) {
    this->harness_.setCounter("Rx", {}, "frames", 5);
    this->harness_.setCounter("Rx", {}, "drops", 6);
    const auto samples = this->sample(this->subscribe("Rx"));
    int calls = 0;
    this->hwStats().iterate(*samples, [&](const platform::HwStatsChannel&) {
        ++calls;
        return 1;
    });
    EXPECT_EQ(calls, 1);
    EXPECT_EQ(this->countersOf(*samples).size(), 2U);
}

TYPED_TEST_P(HwStatsContract, ASubscriptionNeedsTheFirstChannelSetNoLonger) {
    this->harness_.setCounter("Rx", {}, "frames", 5);
    auto channels = this->hwStats().copyChannelsInGroup("Rx", std::nullopt).thing;
    const auto subscription = this->hwStats().createSubscription(*channels);
    channels.reset();
    EXPECT_THAT(this->countersOf(*this->sample(subscription)), ::testing::ElementsAre("frames=5"));
}

REGISTER_TYPED_TEST_SUITE_P(HwStatsContract, AGroupOfADriverHasChannelsAndNoError,
                            AGroupThatNobodyFeedsHasNoChannelsAndNoError, ASubscriptionHasItsChannelsAndNoError,
                            ASamplingFindsTheGroupsOwnChannels, SamplesAreOfTheirMoment, ADifferenceIsWhatChanged,
                            NothingChangesFromSamplesToThemselves, WithoutEarlierSamplesThereIsAnErrorAndNoDifference,
                            IteratingEndsWhenTheCallerAnswersOtherThanZero,
                            ASubscriptionNeedsTheFirstChannelSetNoLonger);

} // namespace vela::testing
