// The C and the C++ functions that publish channels, and what they refuse.
#include "client/include/vela/channels.hpp"
#include "platform/hwstats/ChannelFileNames.h"
#include "platform/hwstats/LinuxHwStats.h"
#include "platform/linux/LinuxClock.h"
#include "testing/TemporaryFolder.h"

#include <filesystem>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <string>
#include <vector>

namespace vela::client {
namespace {

using ::testing::ElementsAre;
using ::testing::HasSubstr;
using ::testing::IsEmpty;

constexpr std::int64_t kBounds[] = {0, 10, 20};
constexpr const char* kStates[] = {"idle", "running"};

class ChannelsTest : public ::testing::Test {
protected:
    /// "frames=5", "busy=0,1", "stream=idle:1,running:1": what the service would see.
    std::vector<std::string> published() {
        platform::LinuxClock clock;
        platform::LinuxHwStats hwStats({folder_.path(), "/nonexistent", {{{"Speaker", {}}, {{}}}}}, clock);
        const auto subscription = hwStats.createSubscription(*hwStats.copyChannelsInGroup("Speaker", {}).thing);
        std::vector<std::string> texts;
        hwStats.iterate(*hwStats.createSamples(*subscription.subscription, *subscription.subscribed).thing,
                        [&](const platform::HwStatsChannel& channel) {
                            texts.push_back(textOf(channel));
                            return 0;
                        });
        return texts;
    }
    static std::string textOf(const platform::HwStatsChannel& channel) {
        std::string text = *channel.channelName + "=";
        for (const auto& bucket : channel.buckets) {
            text += std::to_string(bucket.hits) + ",";
        }
        for (const auto& state : channel.states) {
            text += state.name + ":" + std::to_string(state.inTransitions) + ",";
        }
        return channel.buckets.empty() && channel.states.empty() ? text + std::to_string(channel.simpleValue)
                                                                 : text.substr(0, text.size() - 1);
    }
    reporting::ChannelsOptions options() const {
        return {.driver = "Driver", .group = "Speaker", .folder = folder_.path().c_str()};
    }
    /// The status and text of a creation that must fail.
    std::string refusal(const VelaReportingChannelsOptions* options, const VelaReportingChannelDefinition* definitions,
                        std::size_t count) {
        VelaReportingError error{};
        error.size = sizeof(error);
        auto* channels = reinterpret_cast<VelaReportingChannels*>(this);
        const VelaReportingStatus status = VelaReportingChannelsCreate(options, definitions, count, &channels, &error);
        EXPECT_EQ(channels, nullptr);
        EXPECT_TRUE(std::filesystem::is_empty(folder_.path()));
        return std::string(VelaReportingStatusText(status)) + ": " + &error.text[0];
    }
    VelaReportingChannelsOptions rawOptions() const {
        VelaReportingChannelsOptions options{};
        options.size = sizeof(options);
        options.driver = "Driver";
        options.group = "Speaker";
        options.folder = folder_.path().c_str();
        return options;
    }

    const testing::TemporaryFolder folder_;
};

TEST_F(ChannelsTest, EveryFormatIsPublished) {
    const reporting::Channels channels(options(),
                                       {reporting::counter("frames"), reporting::histogram("busy", "us", kBounds),
                                        reporting::states("stream", kStates)});
    ASSERT_TRUE(static_cast<bool>(channels)) << channels.errorText();
    const reporting::Counter frames(channels[0]);
    const reporting::Histogram busy(channels[1]);
    const reporting::StateChannel stream(channels[2]);
    frames.set(4);
    frames.add(1);
    busy.record(15);
    stream.enter(0);
    stream.enter(1);
    stream.enterAt(0, UINT64_MAX);
    stream.leave();
    EXPECT_THAT(published(), ElementsAre("frames=5", "busy=0,1", "stream=idle:2,running:1"));
}

TEST_F(ChannelsTest, TheFileIsNamedByTheProgramUnlessThereIsAPublisher) {
    reporting::ChannelsOptions named = options();
    const reporting::Channels byDefault(named, {reporting::counter("frames")});
    named.publisher = "player";
    const reporting::Channels byName(named, {reporting::counter("frames")});
    EXPECT_TRUE(std::filesystem::exists(folder_ / "client_test-Driver-Speaker-.channels"));
    EXPECT_TRUE(std::filesystem::exists(folder_ / "player-Driver-Speaker-.channels"));
}

TEST_F(ChannelsTest, ChannelsMayBeMoved) {
    reporting::Channels first(options(), {reporting::counter("frames")});
    VelaReportingChannel* const frames = first[0];
    const reporting::Channels second(std::move(first));
    EXPECT_EQ(second[0], frames);
    VelaReportingCounterAdd(frames, 3);
    EXPECT_THAT(published(), ElementsAre("frames=3"));
}

TEST_F(ChannelsTest, WithoutChannelsUpdatesDoNothing) {
    VelaReportingCounterAdd(nullptr, 1);
    VelaReportingCounterSet(nullptr, 1);
    VelaReportingHistogramRecord(nullptr, 1);
    VelaReportingStateEnter(nullptr, 0);
    VelaReportingStateEnterAt(nullptr, 0, 0);
    VelaReportingChannelsDestroy(nullptr);
    EXPECT_EQ(VelaReportingChannelsGet(nullptr, 0), nullptr);
    const reporting::Channels channels(options(), {reporting::counter("frames")});
    EXPECT_EQ(channels[1], nullptr);
}

TEST_F(ChannelsTest, WhatIsMissingIsRefused) {
    constexpr const char* kMissing =
        "invalid argument: a driver, a group, a definition or something in one is missing, or there are too many";
    const VelaReportingChannelDefinition counter = VelaReportingCounterDefinition("frames");
    EXPECT_EQ(refusal(nullptr, &counter, 1), "invalid argument: options or channels are missing");
    VelaReportingChannelsOptions options = rawOptions();
    EXPECT_EQ(refusal(&options, nullptr, 1), kMissing);
    EXPECT_EQ(refusal(&options, &counter, 4'097), kMissing);
    EXPECT_EQ(refusal(&options, &counter, 0), "invalid argument: a driver has 1 to 4096 channels");
    options.driver = nullptr;
    EXPECT_EQ(refusal(&options, &counter, 1), kMissing);
    options = rawOptions();
    options.group = nullptr;
    EXPECT_EQ(refusal(&options, &counter, 1), kMissing);
    options = rawOptions();
    options.size = sizeof(options.size);
    EXPECT_EQ(refusal(&options, &counter, 1), "invalid argument: options or channels are missing");
    const VelaReportingChannelDefinition nameless = VelaReportingCounterDefinition(nullptr);
    options = rawOptions();
    EXPECT_EQ(refusal(&options, &nameless, 1), kMissing);
    const char* const noState[] = {"a", nullptr};
    const VelaReportingChannelDefinition state = VelaReportingStateDefinition("s", noState, 2);
    EXPECT_EQ(refusal(&options, &state, 1), kMissing);
    const VelaReportingChannelDefinition many = VelaReportingStateDefinition("s", kStates, SIZE_MAX);
    EXPECT_EQ(refusal(&options, &many, 1), kMissing);
    EXPECT_EQ(VelaReportingChannelsCreate(&options, &counter, 1, nullptr, nullptr), VelaReportingStatusInvalidArgument);
}

TEST_F(ChannelsTest, WhatCannotBeIsRefusedInWords) {
    const VelaReportingChannelsOptions options = rawOptions();
    const std::int64_t falling[] = {2, 1};
    const VelaReportingChannelDefinition histogram = VelaReportingHistogramDefinition("h", nullptr, falling, 2);
    EXPECT_EQ(refusal(&options, &histogram, 1),
              "invalid argument: a histogram has 1 to 512 buckets with rising bounds");
    VelaReportingChannelDefinition strange = VelaReportingCounterDefinition("x");
    strange.format = 0;
    EXPECT_EQ(refusal(&options, &strange, 1),
              "invalid argument: a channel is of no known format or has parts that do not suit it");
}

TEST_F(ChannelsTest, AFolderThatIsNotThereIsNamed) {
    VelaReportingChannelsOptions options = rawOptions();
    const std::string missing = folder_ / "none";
    options.folder = missing.c_str();
    const VelaReportingChannelDefinition counter = VelaReportingCounterDefinition("frames");
    EXPECT_EQ(refusal(&options, &counter, 1), "out of resources: open " + missing + ": No such file or directory");
}

/// As a later version of the header would have them.
struct LargerDefinition {
    VelaReportingChannelDefinition known;
    std::uint64_t later;
};

TEST_F(ChannelsTest, DefinitionsOfALaterHeaderAreTakenWhileTheyAskForNothingNew) {
    LargerDefinition definitions[2] = {{VelaReportingCounterDefinition("a"), 0},
                                       {VelaReportingCounterDefinition("b"), 0}};
    definitions[0].known.size = sizeof(LargerDefinition);
    definitions[1].known.size = sizeof(LargerDefinition);
    const VelaReportingChannelsOptions options = rawOptions();
    definitions[1].later = 1;
    EXPECT_THAT(refusal(&options, &definitions[0].known, 2), HasSubstr("invalid argument"));
    definitions[1].later = 0;
    VelaReportingChannels* channels = nullptr;
    ASSERT_EQ(VelaReportingChannelsCreate(&options, &definitions[0].known, 2, &channels, nullptr),
              VelaReportingStatusOk);
    EXPECT_THAT(published(), ElementsAre("a=0", "b=0"));
    VelaReportingChannelsDestroy(channels);
}

} // namespace
} // namespace vela::client
