#include "common/SettingsTable.h"
#include "platform/hwstats/ChannelPublisher.h"
#include "platform/hwstats/ChannelTables_test.h"
#include "platform/hwstats/LinuxHwStats.h"
#include "platform/hwstats/SystemTree_test.h"
#include "testing/FakeHwStats.h"
#include "testing/HwStatsContract.h"
#include "testing/ManualClock.h"
#include "testing/TemporaryFolder.h"

#include <filesystem>
#include <fstream>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <map>

namespace vela::platform {
namespace {

using hwstats::ChannelPublisher;
using ::testing::ElementsAre;
using ::testing::IsEmpty;

// --- What every one does ---

using Name = std::optional<std::string>;

class FakeHarness {
public:
    testing::FakeHwStats& hwStats() { return hwStats_; }
    void setCounter(const Name& group, const Name& subGroup, const std::string& name, std::int64_t value) {
        auto& channels = channels_[{group, subGroup}];
        auto found = std::ranges::find(channels, name, &HwStatsChannel::channelName);
        if (found == channels.end()) {
            HwStatsChannel channel;
            channel.format = static_cast<std::uint8_t>(HwStatsFormat::Simple);
            channel.channelName = name;
            found = channels.insert(found, std::move(channel));
        }
        found->simpleValue = value;
        hwStats_.set(group, subGroup, {.channels = channels});
    }

private:
    testing::FakeHwStats hwStats_;
    std::map<std::pair<Name, Name>, std::vector<HwStatsChannel>> channels_;
};

const std::vector<HwStatsSource> kChannelFiles{HwStatsSource::Channels};

class LinuxHarness {
public:
    LinuxHwStats& hwStats() { return hwStats_; }
    void setCounter(const Name& group, const Name& subGroup, const std::string& name, std::int64_t value) {
        auto& publisher = publishers_[{group.value_or("") + "/" + subGroup.value_or(""), name}];
        if (publisher == nullptr) {
            publisher = *ChannelPublisher::create(
                folder_.path(), name, {"Driver", group, subGroup, {{HwStatsFormat::Simple, name, {}, {}, {}}}});
        }
        publisher->channels()[0].set(value);
    }

private:
    const testing::TemporaryFolder folder_;
    testing::ManualClock clock_;
    LinuxHwStats hwStats_{
        {folder_.path(),
         "",
         {{{"Rx", {}}, kChannelFiles}, {{"Tx", {}}, kChannelFiles}, {{"Haptics", "Stats"}, kChannelFiles}}},
        clock_};
    std::map<std::pair<std::string, std::string>, std::unique_ptr<ChannelPublisher>> publishers_;
};

using Harnesses = ::testing::Types<FakeHarness, LinuxHarness>;

class HarnessNames {
public:
    template <class Harness>
    static std::string GetName(int) { // NOLINT(readability-identifier-naming): GoogleTest's own
        return std::is_same_v<Harness, FakeHarness> ? "Fake" : "Linux";
    }
};

} // namespace
} // namespace vela::platform

namespace vela::testing {
INSTANTIATE_TYPED_TEST_SUITE_P(HwStats, HwStatsContract, platform::Harnesses, platform::HarnessNames);
} // namespace vela::testing

namespace vela::platform {
namespace {

// --- What this one does ---

class LinuxHwStatsTest : public ::testing::Test {
protected:
    using Subscription = HwStats::SubscriptionAnswer;

    std::unique_ptr<ChannelPublisher> publish(const std::string& publisher, const Name& group,
                                              const Name& subGroup = {}) const {
        std::filesystem::create_directories(folder_ / "hwstats");
        hwstats::ChannelTable table = hwstats::exampleTable();
        table.group = group;
        table.subGroup = subGroup;
        return *ChannelPublisher::create(folder_ / "hwstats", publisher, table);
    }
    Subscription subscribe(const Name& group, const Name& subGroup = {}) {
        return hwStats_.createSubscription(*hwStats_.copyChannelsInGroup(group, subGroup).thing);
    }
    std::shared_ptr<const HwStatsSamples> sample(const Subscription& subscription) {
        const auto samples = hwStats_.createSamples(*subscription.subscription, *subscription.subscribed);
        error_ = samples.error;
        return samples.thing;
    }
    std::vector<std::string> linesOf(const HwStatsSamples& samples) {
        std::vector<std::string> lines;
        hwStats_.iterate(samples, [&](const HwStatsChannel& channel) {
            lines.push_back(hwstats::lineOf(channel));
            return 0;
        });
        return lines;
    }
    std::vector<std::string> changesSince(const std::shared_ptr<const HwStatsSamples>& before,
                                          const Subscription& subscription) {
        return linesOf(*hwStats_.createSamplesDelta(before.get(), *sample(subscription)).thing);
    }
    std::int32_t countOf(const Name& group, const Name& subGroup = {}) {
        return hwStats_.channelCount(*hwStats_.copyChannelsInGroup(group, subGroup).thing);
    }

    const testing::TemporaryFolder folder_;
    const hwstats::SystemTree tree_{};
    testing::ManualClock clock_;
    LinuxHwStats hwStats_{{folder_ / "hwstats",
                           tree_.root(),
                           {{{"Tarn", {}}, {HwStatsSource::Channels, HwStatsSource::CpuIdle}},
                            {{"Speaker", {}}, kChannelFiles},
                            {{{}, "MCA"}, {HwStatsSource::Channels, HwStatsSource::AlsaPlayback}},
                            {{"Haptics", "Stats"}, {HwStatsSource::ForceFeedback}},
                            {{"Rx", {}}, {}}},
                           std::chrono::minutes(5)},
                          clock_};
    std::optional<HwStatsError> error_;
};

TEST_F(LinuxHwStatsTest, AGroupHasAChannelForEachSourceBeforeAnybodyPublishes) {
    EXPECT_EQ(countOf("Tarn"), 2);
    EXPECT_EQ(countOf("Speaker"), 1);
    EXPECT_EQ(countOf({}, "MCA"), 2);
    EXPECT_EQ(countOf("Haptics", "Stats"), 1);
    EXPECT_EQ(countOf("Rx"), 0) << "it has no source";
    EXPECT_EQ(countOf("Rx", "Other"), 0);
    EXPECT_EQ(countOf("Nobody", "Stats"), 0);
}

TEST_F(LinuxHwStatsTest, ANameThatIsNoGroupsOwnTakesPartInAllThatFit) {
    EXPECT_EQ(countOf("Speaker", "MCA"), 2) << "channel files of either group";
    EXPECT_EQ(countOf("Nobody"), 1) << "a subgroup MCA of it";
    EXPECT_EQ(countOf({}, {}), 6) << "channel files of three groups, and three sources of others";
    const auto publisher = publish("p", "Speaker", "MCA");
    EXPECT_EQ(linesOf(*sample(subscribe("Speaker", "MCA"))).size(), 3U);
    EXPECT_THAT(linesOf(*sample(subscribe("Rx"))), IsEmpty());
}

TEST_F(LinuxHwStatsTest, APublisherThatStartsLaterIsSampledAndCountsWhole) {
    const auto subscription = subscribe("Speaker");
    const auto before = sample(subscription);
    ASSERT_NE(before, nullptr);
    EXPECT_THAT(linesOf(*before), IsEmpty());
    EXPECT_FALSE(error_.has_value()) << "a folder that is not there is no error";
    const auto publisher = publish("p", "Speaker");
    publisher->channels()[0].add(5);
    publisher->channels()[1].record(12);
    publisher->channels()[2].enter(1, 1);
    publisher->channels()[2].enter(hwstats::kNoState, 101);
    EXPECT_THAT(changesSince(before, subscription),
                ElementsAre("Driver/Speaker/- frames: 5", "Driver/Speaker/- busy[us]: 12..12 0-10:0 10-20:1",
                            "Driver/Speaker/- stream: idle 0x 0, running 1x 100"));
}

TEST_F(LinuxHwStatsTest, ARestartedPublisherCountsSinceItsRestart) {
    const auto subscription = subscribe("Speaker");
    auto publisher = publish("p", "Speaker");
    publisher->channels()[0].add(100);
    const auto before = sample(subscription);
    publisher.reset();
    publisher = publish("p", "Speaker");
    publisher->channels()[0].add(120);
    EXPECT_EQ(changesSince(before, subscription)[0], "Driver/Speaker/- frames: 120");
}

TEST_F(LinuxHwStatsTest, APublisherThatEndedSinceIsStillReported) {
    const auto subscription = subscribe("Speaker");
    auto publisher = publish("p", "Speaker");
    const auto before = sample(subscription);
    publisher->channels()[0].add(3);
    publisher.reset();
    EXPECT_EQ(changesSince(before, subscription)[0], "Driver/Speaker/- frames: 3");
    EXPECT_THAT(changesSince(sample(subscription), subscription), IsEmpty()) << "but not ever after";
}

TEST_F(LinuxHwStatsTest, TheTimeInAStateGoesOnWhileItsPublisherLives) {
    const auto subscription = subscribe("Speaker");
    const auto publisher = publish("p", "Speaker");
    publisher->channels()[2].enter(1, hwstats::nanosecondsOf(clock_));
    const auto before = sample(subscription);
    clock_.advance(std::chrono::seconds(2));
    const auto changes = hwStats_.createSamplesDelta(before.get(), *sample(subscription)).thing;
    EXPECT_EQ(linesOf(*changes)[2], "Driver/Speaker/- stream: idle 0x 0, running 0x 2000000000");
    double cycle = 0;
    hwStats_.iterate(*changes, [&](const HwStatsChannel& channel) {
        cycle = channel.states.empty() ? cycle : channel.states[1].dutyCycle;
        return 0;
    });
    EXPECT_DOUBLE_EQ(cycle, 1.0);
}

TEST_F(LinuxHwStatsTest, ASubgroupIsFoundInAnyGroup) {
    const auto one = publish("p", "Speaker", "MCA");
    const auto other = publish("p", "Anything", "MCA");
    const auto none = publish("p", Name(), "MCA");
    const auto strange = publish("p", "Anything", "Other");
    const auto lines = linesOf(*sample(subscribe({}, "MCA")));
    ASSERT_EQ(lines.size(), 9U);
    EXPECT_EQ(lines[0], "Driver/-/MCA frames: 0");
    EXPECT_EQ(lines[3], "Driver/Anything/MCA frames: 0");
    EXPECT_EQ(lines[6], "Driver/Speaker/MCA frames: 0");
    EXPECT_EQ(linesOf(*sample(subscribe("Speaker"))).size(), 3U);
}

TEST_F(LinuxHwStatsTest, AGroupWithoutTheSourceHasNoChannelFiles) {
    const auto publisher = publish("p", "Haptics", "Stats");
    EXPECT_THAT(linesOf(*sample(subscribe("Haptics", "Stats"))), IsEmpty());
}

TEST_F(LinuxHwStatsTest, KernelNumbersCarryTheNamesOfTheirGroup) {
    tree_.write("/sys/devices/system/cpu/cpu0/cpuidle/state0/name", "C1");
    tree_.write("/sys/devices/system/cpu/cpu0/cpuidle/state0/usage", "4");
    tree_.write("/sys/devices/system/cpu/cpu0/cpuidle/state0/time", "5");
    tree_.write("/proc/asound/card0/pcm0p/sub0/status", "closed\n");
    const auto tarn = subscribe("Tarn");
    const auto before = sample(tarn);
    EXPECT_THAT(linesOf(*before), ElementsAre("cpuidle/Tarn/- cpu0: C1 4x 5000"));
    EXPECT_EQ(linesOf(*sample(subscribe({}, "MCA")))[0], "card0/-/MCA pcm0p sub0 frames: 0");
    tree_.write("/sys/devices/system/cpu/cpu0/cpuidle/state0/usage", "6");
    tree_.write("/sys/devices/system/cpu/cpu0/cpuidle/state0/time", "15");
    EXPECT_THAT(changesSince(before, tarn), ElementsAre("cpuidle/Tarn/- cpu0: C1 2x 10000"));
}

TEST_F(LinuxHwStatsTest, ANewKernelCounterDoesNotCount) {
    const auto tarn = subscribe("Tarn");
    const auto before = sample(tarn);
    tree_.write("/sys/devices/system/cpu/cpu0/cpuidle/state0/name", "C1");
    tree_.write("/sys/devices/system/cpu/cpu0/cpuidle/state0/usage", "4");
    tree_.write("/sys/devices/system/cpu/cpu0/cpuidle/state0/time", "5");
    EXPECT_THAT(changesSince(before, tarn), IsEmpty());
}

TEST_F(LinuxHwStatsTest, AFolderThatCannotBeReadIsAnErrorBesideTheSamples) {
    std::ofstream(folder_ / "hwstats") << "in the way";
    EXPECT_NE(sample(subscribe("Speaker")), nullptr);
    ASSERT_TRUE(error_.has_value());
    EXPECT_EQ(error_->code, ENOTDIR);
}

TEST_F(LinuxHwStatsTest, TwoPublishersOfOneDriverKeepTwoNames) {
    const auto first = publish("a", "Speaker");
    const auto second = publish("b", "Speaker");
    const auto lines = linesOf(*sample(subscribe("Speaker")));
    EXPECT_EQ(lines[0], "Driver/Speaker/- frames: 0");
    EXPECT_EQ(lines[3], "Driver/Speaker/- frames.2: 0");
}

TEST_F(LinuxHwStatsTest, ObjectsOfAnotherLibraryAreRefused) {
    testing::FakeHwStats other;
    other.set("Speaker", {}, {.channels = {HwStatsChannel()}});
    const auto channels = other.copyChannelsInGroup("Speaker", {}).thing;
    const auto subscription = other.createSubscription(*channels);
    const auto samples = other.createSamples(*subscription.subscription, *subscription.subscribed).thing;
    EXPECT_EQ(hwStats_.channelCount(*channels), 0);
    EXPECT_EQ(hwStats_.createSubscription(*channels).error->code, EINVAL);
    EXPECT_EQ(hwStats_.createSamples(*subscription.subscription, *channels).error->code, EINVAL);
    EXPECT_EQ(hwStats_.createSamplesDelta(samples.get(), *samples).error->code, EINVAL);
    EXPECT_THAT(linesOf(*samples), IsEmpty());
}

TEST(HwStatsGroupsTest, TheSettingsChooseTheSourcesOfEachGroup) {
    Settings settings;
    for (const SettingDescription& setting : settingsTable()) {
        if (setting.section == "drivers") {
            *std::get<std::vector<std::string>*>(setting.slot(settings)) =
                std::get<std::vector<std::string>>(setting.standard);
        }
    }
    settings.drivers.rx = {"alsa-capture", "channels", "alsa-capture"};
    settings.drivers.tx = {};
    settings.paths.runtime = "/run/vela";
    const LinuxHwStatsOptions options = hwStatsOptionsOf(settings);
    EXPECT_EQ(options.channelFolder, "/run/vela/hwstats");
    EXPECT_EQ(options.systemRoot, "");
    std::vector<std::string> groups;
    for (const HwStatsGroup& group : options.groups) {
        groups.push_back(group.name.group.value_or("-") + "/" + group.name.subGroup.value_or("-") + " " +
                         std::to_string(group.sources.size()));
    }
    EXPECT_THAT(groups, ElementsAre("Tarn/- 4", "Speaker/- 1", "-/MCA 1", "Haptics/Stats 2",
                                    "StateTransitionTimes_ms/- 1", "Rx/- 2", "Tx/- 0", "-/Brook 1"));
    using enum HwStatsSource;
    EXPECT_THAT(options.groups[0].sources, ElementsAre(Channels, CpuIdle, DevFreq, RuntimePm));
    EXPECT_THAT(options.groups[3].sources, ElementsAre(Channels, ForceFeedback));
    EXPECT_THAT(options.groups[5].sources, ElementsAre(AlsaCapture, Channels));
}

} // namespace
} // namespace vela::platform
