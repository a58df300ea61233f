#include "driverstats/Channels_test.h"
#include "driverstats/VelaReportingDriverUtility.h"
#include "session/Session_test.h"
#include "testing/FakeHwStats.h"

#include <algorithm>
#include <atomic>
#include <thread>

namespace vela {

namespace {

using platform::HwStatsFormat;
using ::testing::ElementsAre;
using testing::FakeHwStats;
using ::testing::IsEmpty;

CapturedLine info(std::string message) { return driverLine(LogLevel::Info, std::move(message)); }
CapturedLine error(std::string message) { return driverLine(LogLevel::Error, std::move(message)); }

class VelaReportingDriverUtilityTest : public SessionTest {
protected:
    void SetUp() override {
        session_ = makeSession(42);
        log_.clear();
    }
    void TearDown() override {
        session_.reset();
        utility_.reset();
        SessionTest::TearDown();
    }

    /// Made at the first use, with the drivers set until then.
    VelaReportingDriverUtility& utility() {
        if (utility_ == nullptr) {
            utility_ = std::make_unique<VelaReportingDriverUtility>(hwStats_, analytics_);
        }
        return *utility_;
    }
    /// The utility is made; what that said and called is forgotten.
    VelaReportingDriverUtility& quietUtility() {
        utility();
        log_.clear();
        hwStats_.clearCalls();
        return *utility_;
    }
    /// The session's snapshot is taken as at its start, then forgotten by the fakes.
    void takeSnapShot() {
        session_->setDriverSnapShot(utility().getSnapShot());
        log_.clear();
        hwStats_.clearCalls();
    }
    /// A stop's part of the drivers.
    void sendDriverLogs() { utility().sendDriverLogsForSession(session_); }

    std::vector<std::string> subscribed() {
        std::vector<std::string> descriptions;
        for (const auto& subscription : utility().ioChannelSubscriptions()) {
            descriptions.push_back(subscription.driver.description());
        }
        return descriptions;
    }
    /// "12 16 {key = 1;}" of what analytics was handed.
    std::vector<std::string> analyticsEvents() const {
        std::vector<std::string> events;
        for (const auto& event : analytics_.events) {
            EXPECT_EQ(event.session, session_.get());
            events.push_back(std::to_string(event.category) + " " + std::to_string(event.type) + " " +
                             textualForm(Value(event.message)));
        }
        return events;
    }
    std::vector<CapturedLine> driverLines() const { return log_.linesOf("velard"); }
    /// All eight drivers, each without channels.
    void setAllDrivers() {
        hwStats_.set("Tarn", {}, {});
        hwStats_.set("Speaker", {}, {});
        hwStats_.set({}, "MCA", {});
        hwStats_.set("Haptics", "Stats", {});
        hwStats_.set("StateTransitionTimes_ms", {}, {});
        hwStats_.set("Rx", {}, {});
        hwStats_.set("Tx", {}, {});
        hwStats_.set({}, "Brook", {});
    }

    FakeHwStats hwStats_;
    std::shared_ptr<VelaReportingSession> session_;
    std::unique_ptr<VelaReportingDriverUtility> utility_;
};

// Subscribing

TEST_F(VelaReportingDriverUtilityTest, ChannelsOfTheEightDriversAreAskedForInOrder) {
    utility();
    EXPECT_THAT(hwStats_.calls(),
                ElementsAre("copyChannelsInGroup Tarn/none", "copyChannelsInGroup Speaker/none",
                            "copyChannelsInGroup none/MCA", "copyChannelsInGroup Haptics/Stats",
                            "copyChannelsInGroup StateTransitionTimes_ms/none", "copyChannelsInGroup Rx/none",
                            "copyChannelsInGroup Tx/none", "copyChannelsInGroup none/Brook"));
}

TEST_F(VelaReportingDriverUtilityTest, WithoutADriverThereAreNoSubscriptionsAndAnEmptySnapshot) {
    EXPECT_THAT(utility().ioChannelSubscriptions(), IsEmpty());
    EXPECT_THAT(utility().getSnapShot(), IsEmpty());
    EXPECT_THAT(driverLines(), ElementsAre(info("creating hwstatsing driver utility")));
}

TEST_F(VelaReportingDriverUtilityTest, DriversThatAreThereAreSubscribedToInTheTablesOrder) {
    setAllDrivers();
    EXPECT_THAT(subscribed(), ElementsAre("Tarn-(null)", "Speaker-(null)", "(null)-MCA", "Haptics-Stats",
                                          "StateTransitionTimes_ms-(null)", "Rx-(null)", "Tx-(null)", "(null)-Brook"));
    EXPECT_THAT(driverLines(),
                ElementsAre(info("creating hwstatsing driver utility"), info("subscribed to group group Tarn-(null)"),
                            info("subscribed to group group Speaker-(null)"),
                            info("subscribed to group group (null)-MCA"),
                            info("subscribed to group group Haptics-Stats"),
                            info("subscribed to group group StateTransitionTimes_ms-(null)"),
                            info("subscribed to group group Rx-(null)"), info("subscribed to group group Tx-(null)"),
                            info("subscribed to group group (null)-Brook")));
}

TEST_F(VelaReportingDriverUtilityTest, ASubscriptionIsMadeFromTheDriversChannels) {
    hwStats_.set("Haptics", "Stats", {});
    utility();
    const auto calls = hwStats_.calls();
    ASSERT_EQ(calls.size(), 10U);
    EXPECT_EQ(calls[3], "copyChannelsInGroup Haptics/Stats");
    EXPECT_EQ(calls[4], "channelCount Haptics/Stats");
    EXPECT_EQ(calls[5], "createSubscription Haptics/Stats");
    EXPECT_EQ(calls[6], "copyChannelsInGroup StateTransitionTimes_ms/none");
}

TEST_F(VelaReportingDriverUtilityTest, OnlyTheSubscribedChannelsAreKept) {
    setAllDrivers();
    utility();
    EXPECT_EQ(hwStats_.liveChannels(), 8U);
    EXPECT_EQ(hwStats_.liveSubscriptions(), 8U);
    for (const auto& subscription : utility().ioChannelSubscriptions()) {
        EXPECT_NE(subscription.subscription, nullptr);
        EXPECT_NE(subscription.subscribedChannels, nullptr);
    }
}

TEST_F(VelaReportingDriverUtilityTest, AnErrorWithoutChannelsIsLogged) {
    hwStats_.set("Haptics", "Stats", {.channelsThere = false, .channelsError = -536870201});
    EXPECT_THAT(subscribed(), IsEmpty());
    EXPECT_THAT(driverLines(), ElementsAre(info("creating hwstatsing driver utility"),
                                           error("error -536870201 getting channels for driver Haptics-Stats")));
}

TEST_F(VelaReportingDriverUtilityTest, AnErrorBesideChannelsIsLoggedAndTheDriverSubscribedTo) {
    hwStats_.set({}, "MCA", {.channelsError = 5});
    EXPECT_THAT(subscribed(), ElementsAre("(null)-MCA"));
    EXPECT_THAT(driverLines(), ElementsAre(info("creating hwstatsing driver utility"),
                                           error("error 5 getting channels for driver (null)-MCA"),
                                           info("subscribed to group group (null)-MCA")));
}

TEST_F(VelaReportingDriverUtilityTest, AnErrorsCodeHasItsWholeRange) {
    hwStats_.set("Rx", {}, {.channelsThere = false, .channelsError = std::numeric_limits<std::int64_t>::min()});
    utility();
    EXPECT_THAT(driverLines(), ElementsAre(info("creating hwstatsing driver utility"),
                                           error("error -9223372036854775808 getting channels for driver Rx-(null)")));
}

TEST_F(VelaReportingDriverUtilityTest, AGroupWithoutChannelsIsLoggedAndAbsentFromSnapshots) {
    hwStats_.set("Rx", {}, {.channelCount = 0});
    hwStats_.set("Tx", {}, {.channelCount = -1});
    hwStats_.set({}, "Brook", {.channelCount = 1});
    EXPECT_THAT(subscribed(), ElementsAre("(null)-Brook"));
    EXPECT_EQ(hwStats_.liveChannels(), 1U);
    EXPECT_THAT(driverLines(), ElementsAre(info("creating hwstatsing driver utility"),
                                           info("couldn't find any channels for driver group Rx-(null)"),
                                           info("couldn't find any channels for driver group Tx-(null)"),
                                           info("subscribed to group group (null)-Brook")));
    EXPECT_EQ(utility().getSnapShot().count("Rx-(null)"), 0U);
}

TEST_F(VelaReportingDriverUtilityTest, AnErrorBesideAWholeSubscriptionIsNotLogged) {
    hwStats_.set("Rx", {}, {.subscriptionError = 7});
    EXPECT_THAT(subscribed(), ElementsAre("Rx-(null)"));
    EXPECT_THAT(driverLines(),
                ElementsAre(info("creating hwstatsing driver utility"), info("subscribed to group group Rx-(null)")));
}

TEST_F(VelaReportingDriverUtilityTest, ASubscriptionWithoutItsChannelsIsDropped) {
    hwStats_.set("Rx", {}, {.subscribedThere = false, .subscriptionError = -7});
    EXPECT_THAT(subscribed(), IsEmpty());
    EXPECT_THAT(driverLines(), ElementsAre(info("creating hwstatsing driver utility"),
                                           error("error -7 creating subscription for Rx-(null)")));
    EXPECT_EQ(hwStats_.liveSubscriptions(), 0U);
}

TEST_F(VelaReportingDriverUtilityTest, ChannelsWithoutASubscriptionAreDropped) {
    hwStats_.set({}, "Brook", {.subscriptionThere = false, .subscriptionError = 7});
    EXPECT_THAT(subscribed(), IsEmpty());
    EXPECT_THAT(driverLines(), ElementsAre(info("creating hwstatsing driver utility"),
                                           error("error 7 creating subscription for (null)-Brook")));
    EXPECT_EQ(hwStats_.liveChannels(), 0U);
}

TEST_F(VelaReportingDriverUtilityTest, AFailedSubscriptionWithoutAnErrorIsSilent) {
    hwStats_.set("Rx", {}, {.subscriptionThere = false});
    hwStats_.set("Tx", {}, {.subscriptionThere = false, .subscribedThere = false});
    EXPECT_THAT(subscribed(), IsEmpty());
    EXPECT_THAT(driverLines(), ElementsAre(info("creating hwstatsing driver utility")));
}

// Snapshots

TEST_F(VelaReportingDriverUtilityTest, ASnapshotHasTheSamplesByTheDriversDescriptions) {
    setAllDrivers();
    std::vector<std::string> keys;
    for (const auto& [key, samples] : utility().getSnapShot()) {
        EXPECT_NE(samples, nullptr);
        keys.push_back(key);
    }
    EXPECT_THAT(keys, ::testing::UnorderedElementsAre("Tarn-(null)", "Speaker-(null)", "(null)-MCA", "Haptics-Stats",
                                                      "StateTransitionTimes_ms-(null)", "Rx-(null)", "Tx-(null)",
                                                      "(null)-Brook"));
}

TEST_F(VelaReportingDriverUtilityTest, EachDriverIsSampledWithItsOwnSubscription) {
    hwStats_.set("Tarn", {}, {});
    hwStats_.set({}, "MCA", {});
    quietUtility().getSnapShot();
    EXPECT_THAT(hwStats_.calls(), ElementsAre("createSamples Tarn/none", "createSamples none/MCA"));
    EXPECT_THAT(log_.lines(), ElementsAre(info("sampling driver Tarn-(null)"), info("sampling driver (null)-MCA")));
}

TEST_F(VelaReportingDriverUtilityTest, AFailureToSampleLeavesTheOthers) {
    hwStats_.set("Tarn", {}, {});
    hwStats_.set("Rx", {}, {.samplesThere = false, .samplesError = -12});
    hwStats_.set("Tx", {}, {});
    const auto snapShot = quietUtility().getSnapShot();
    EXPECT_EQ(snapShot.size(), 2U);
    EXPECT_EQ(snapShot.count("Rx-(null)"), 0U);
    EXPECT_THAT(log_.lines(), ElementsAre(info("sampling driver Tarn-(null)"), info("sampling driver Rx-(null)"),
                                          error("HwStatsCreateSamples error -12"), info("sampling driver Tx-(null)")));
}

TEST_F(VelaReportingDriverUtilityTest, AFailureToSampleWithoutAnErrorIsSilent) {
    hwStats_.set("Rx", {}, {.samplesThere = false});
    EXPECT_THAT(quietUtility().getSnapShot(), IsEmpty());
    EXPECT_THAT(log_.lines(), ElementsAre(info("sampling driver Rx-(null)")));
}

TEST_F(VelaReportingDriverUtilityTest, AnErrorBesideSamplesIsNotLogged) {
    hwStats_.set("Rx", {}, {.samplesError = 5});
    EXPECT_EQ(quietUtility().getSnapShot().size(), 1U);
    EXPECT_THAT(log_.lines(), ElementsAre(info("sampling driver Rx-(null)")));
}

TEST_F(VelaReportingDriverUtilityTest, SnapshotsAreIndependentOfEachOther) {
    hwStats_.set("Rx", {}, {});
    const auto first = utility().getSnapShot();
    const auto second = utility().getSnapShot();
    EXPECT_NE(first.at("Rx-(null)"), second.at("Rx-(null)"));
    EXPECT_EQ(hwStats_.liveSamples(), 2U);
}

TEST_F(VelaReportingDriverUtilityTest, DriversThatAppearLaterAreNotSampled) {
    utility();
    hwStats_.set("Rx", {}, {});
    EXPECT_THAT(quietUtility().getSnapShot(), IsEmpty());
    EXPECT_THAT(hwStats_.calls(), IsEmpty());
}

// Sending

TEST_F(VelaReportingDriverUtilityTest, WhatChangedSinceTheSnapshotIsSent) {
    hwStats_.set("Rx", {}, {.channels = {simpleChannel("Frames_Dropped", 100)}});
    takeSnapShot();
    hwStats_.set("Rx", {}, {.channels = {simpleChannel("Frames_Dropped", 107)}});
    sendDriverLogs();
    EXPECT_THAT(analyticsEvents(), ElementsAre("12 16 {Rx_Simple_FramesDropped = 7;}"));
}

TEST_F(VelaReportingDriverUtilityTest, TheCallsOfADriverComeInOrder) {
    hwStats_.set("Rx", {}, {.channels = {simpleChannel("c", 1)}});
    hwStats_.set("Tx", {}, {.channels = {simpleChannel("c", 1)}});
    takeSnapShot();
    sendDriverLogs();
    EXPECT_THAT(hwStats_.calls(),
                ElementsAre("createSamples Rx/none", "createSamplesDelta Rx/none from 1 to 3", "iterate Rx/none",
                            "createSamples Tx/none", "createSamplesDelta Tx/none from 2 to 4", "iterate Tx/none"));
    EXPECT_THAT(log_.lines(), ElementsAre(info("getting latest samples"), info("done getting latest samples"),
                                          info("getting latest samples"), info("done getting latest samples")));
}

TEST_F(VelaReportingDriverUtilityTest, EachFormatIsOneMessageOfAllDrivers) {
    hwStats_.set("Rx", {},
                 {.delta = {{simpleChannel("a", 1), stateChannel("s", {{"on", 1, 2, 0.5}}),
                             histogramChannel("h", {bucket(0, 10, 3)})}}});
    hwStats_.set("Tx", {}, {.delta = {{simpleChannel("b", 2)}}});
    takeSnapShot();
    sendDriverLogs();
    EXPECT_THAT(analyticsEvents(),
                ElementsAre("12 16 {Rx_Simple_a = 1; Rx_Simple_b = 2;}",
                            "12 17 {Rx_Histogram_h = \"count=1,lower=0,upper=10,min=1,max=9,unit=ms::0-10:3\";}",
                            "12 18 {Rx_State_s = \"name:on,transition:1,residency:2,duty_cycle:0.500000;\";}"));
}

TEST_F(VelaReportingDriverUtilityTest, TheSessionHasAMessageBeforeAnalyticsHasIt) {
    hwStats_.set("Rx", {},
                 {.delta = {{simpleChannel("a", 1), stateChannel("s", {{"on", 1, 2, 0.5}}),
                             histogramChannel("h", {bucket(0, 10, 3)})}}});
    takeSnapShot();
    session_->start();
    sendDriverLogs();
    EXPECT_THAT(recordedKeysOf(session_->nestedAggregatedPayloadData()),
                ElementsAre("HwStatsing_Simple_1", "HwStatsing_Histogram_1", "HwStatsing_State_1"));
    ASSERT_EQ(analytics_.events.size(), 3U);
    EXPECT_EQ(analytics_.events[0].recordedBefore, 1U);
    EXPECT_EQ(analytics_.events[1].recordedBefore, 2U);
    EXPECT_EQ(analytics_.events[2].recordedBefore, 3U);
}

TEST_F(VelaReportingDriverUtilityTest, TheSessionTagsItsMessageAndAnalyticsGetsItUntagged) {
    hwStats_.set("Rx", {}, {.delta = {{simpleChannel("a", 1)}}});
    takeSnapShot();
    session_->start();
    sendDriverLogs();
    EXPECT_THAT(recordedBy(session_->nestedAggregatedPayloadData()),
                ElementsAre("HwStatsing_Simple_1 {Rx_Simple_a = 1; audiotag = HwStatsingSimple;}"));
    EXPECT_THAT(analyticsEvents(), ElementsAre("12 16 {Rx_Simple_a = 1;}"));
}

TEST_F(VelaReportingDriverUtilityTest, WithoutASnapshotEveryDriverIsSampledAndNothingSent) {
    setAllDrivers();
    quietUtility();
    sendDriverLogs();
    EXPECT_EQ(log_.lines().size(), 16U);
    const auto calls = hwStats_.calls();
    EXPECT_EQ(calls.size(), 8U);
    EXPECT_TRUE(
        std::all_of(calls.begin(), calls.end(), [](const auto& call) { return call.starts_with("createSamples "); }));
    EXPECT_THAT(analytics_.events, IsEmpty());
    EXPECT_EQ(hwStats_.liveSamples(), 0U);
}

TEST_F(VelaReportingDriverUtilityTest, ADriverThatIsNotInTheSnapshotHasNoPreviousSamples) {
    hwStats_.set("Rx", {}, {.channels = {simpleChannel("c", 5)}, .samplesThere = false});
    takeSnapShot();
    hwStats_.set("Rx", {}, {.channels = {simpleChannel("c", 5)}});
    sendDriverLogs();
    EXPECT_THAT(hwStats_.calls(), ElementsAre("createSamples Rx/none", "createSamplesDelta Rx/none from none to 1"));
    EXPECT_THAT(log_.lines(), ElementsAre(info("getting latest samples"), info("done getting latest samples"),
                                          error("HwStatsCreateSamples error -3")));
    EXPECT_THAT(analytics_.events, IsEmpty());
}

TEST_F(VelaReportingDriverUtilityTest, AnEmptySnapshotIsASnapshot) {
    hwStats_.set("Rx", {}, {});
    utility();
    session_->setDriverSnapShot(VelaReportingDriverSnapShot());
    quietUtility();
    sendDriverLogs();
    EXPECT_THAT(hwStats_.calls(), ElementsAre("createSamples Rx/none", "createSamplesDelta Rx/none from none to 1"));
}

TEST_F(VelaReportingDriverUtilityTest, AFailureToSampleIsLoggedAfterTheSamplingAndLeavesTheOthers) {
    hwStats_.set("Rx", {}, {.delta = {{simpleChannel("a", 1)}}});
    hwStats_.set("Tx", {}, {.delta = {{simpleChannel("b", 2)}}});
    takeSnapShot();
    hwStats_.set("Rx", {}, {.samplesThere = false, .samplesError = -12});
    sendDriverLogs();
    EXPECT_THAT(log_.linesOf("velard"),
                ElementsAre(info("getting latest samples"), info("done getting latest samples"),
                            error("HwStatsCreateSamples error -12"), info("getting latest samples"),
                            info("done getting latest samples")));
    EXPECT_THAT(analyticsEvents(), ElementsAre("12 16 {Rx_Simple_b = 2;}"));
}

TEST_F(VelaReportingDriverUtilityTest, AFailureToSampleWithoutAnErrorIsSilentHereToo) {
    hwStats_.set("Rx", {}, {});
    takeSnapShot();
    hwStats_.set("Rx", {}, {.samplesThere = false});
    sendDriverLogs();
    EXPECT_THAT(log_.lines(), ElementsAre(info("getting latest samples"), info("done getting latest samples")));
}

TEST_F(VelaReportingDriverUtilityTest, AFailedDifferenceIsLoggedLikeAFailedSampling) {
    hwStats_.set("Rx", {}, {.deltaThere = false, .deltaError = 9});
    hwStats_.set("Tx", {}, {.delta = {{simpleChannel("b", 2)}}});
    takeSnapShot();
    sendDriverLogs();
    EXPECT_THAT(log_.linesOf("velard"),
                ElementsAre(info("getting latest samples"), info("done getting latest samples"),
                            error("HwStatsCreateSamples error 9"), info("getting latest samples"),
                            info("done getting latest samples")));
    EXPECT_THAT(analyticsEvents(), ElementsAre("12 16 {Rx_Simple_b = 2;}"));
}

TEST_F(VelaReportingDriverUtilityTest, AFailedDifferenceWithoutAnErrorIsSilent) {
    hwStats_.set("Rx", {}, {.deltaThere = false});
    takeSnapShot();
    sendDriverLogs();
    EXPECT_THAT(log_.lines(), ElementsAre(info("getting latest samples"), info("done getting latest samples")));
    EXPECT_THAT(analytics_.events, IsEmpty());
}

TEST_F(VelaReportingDriverUtilityTest, ErrorsBesideSamplesAndDifferenceAreNotLogged) {
    hwStats_.set("Rx", {}, {.delta = {{simpleChannel("a", 1)}}, .samplesError = 1, .deltaError = 2});
    takeSnapShot();
    sendDriverLogs();
    EXPECT_THAT(log_.linesOf("velard"),
                ElementsAre(info("getting latest samples"), info("done getting latest samples")));
    EXPECT_THAT(analyticsEvents(), ElementsAre("12 16 {Rx_Simple_a = 1;}"));
}

TEST_F(VelaReportingDriverUtilityTest, WhereNothingChangedOnlyStatesAreSent) {
    const std::vector<platform::HwStatsChannel> channels = {
        simpleChannel("a", 100), histogramChannel("h", {bucket(0, 10, 50)}), stateChannel("s", {{"on", 7, 9, 0.5}})};
    hwStats_.set("Rx", {}, {.channels = channels});
    takeSnapShot();
    sendDriverLogs();
    EXPECT_THAT(analyticsEvents(), ElementsAre("12 18 {Rx_State_s = \"\";}"));
}

TEST_F(VelaReportingDriverUtilityTest, AReversedCounterIsDropped) {
    hwStats_.set("Rx", {}, {.channels = {simpleChannel("a", 100)}});
    takeSnapShot();
    hwStats_.set("Rx", {}, {.channels = {simpleChannel("a", 99)}});
    sendDriverLogs();
    EXPECT_THAT(analytics_.events, IsEmpty());
}

TEST_F(VelaReportingDriverUtilityTest, AnEmptyDifferenceSendsNothing) {
    hwStats_.set("Rx", {}, {});
    takeSnapShot();
    sendDriverLogs();
    EXPECT_THAT(analytics_.events, IsEmpty());
    EXPECT_THAT(log_.linesOf("velarr"), IsEmpty());
}

TEST_F(VelaReportingDriverUtilityTest, AnUnknownFormatDoesNotEndTheWalk) {
    hwStats_.set("Rx", {},
                 {.delta = {{simpleChannel("a", 1), channelOf(static_cast<HwStatsFormat>(7), "x"),
                             channelOf(HwStatsFormat::SimpleArray, "y"), channelOf(HwStatsFormat::None, "z"),
                             simpleChannel("b", 2)}}});
    takeSnapShot();
    sendDriverLogs();
    EXPECT_THAT(hwStats_.callbackAnswers(), ElementsAre(0, 0, 0, 0, 0));
    EXPECT_THAT(analyticsEvents(), ElementsAre("12 16 {Rx_Simple_a = 1; Rx_Simple_b = 2;}"));
}

TEST_F(VelaReportingDriverUtilityTest, OfOneKeyTheLaterDriversValueStays) {
    hwStats_.set("Rx", {}, {.delta = {{simpleChannel("a", 1), simpleChannel("b", 5)}}});
    hwStats_.set("Tx", {}, {.delta = {{simpleChannel("a", 2)}}});
    takeSnapShot();
    sendDriverLogs();
    EXPECT_THAT(analyticsEvents(), ElementsAre("12 16 {Rx_Simple_a = 2; Rx_Simple_b = 5;}"));
}

TEST_F(VelaReportingDriverUtilityTest, TheSnapshotStaysTheBase) {
    hwStats_.set("Rx", {}, {.channels = {simpleChannel("a", 10)}});
    takeSnapShot();
    hwStats_.set("Rx", {}, {.channels = {simpleChannel("a", 11)}});
    sendDriverLogs();
    hwStats_.set("Rx", {}, {.channels = {simpleChannel("a", 13)}});
    sendDriverLogs();
    EXPECT_THAT(analyticsEvents(), ElementsAre("12 16 {Rx_Simple_a = 1;}", "12 16 {Rx_Simple_a = 3;}"));
}

TEST_F(VelaReportingDriverUtilityTest, OnlyTheSnapshotsSamplesAreKept) {
    hwStats_.set("Rx", {}, {.channels = {simpleChannel("a", 10)}});
    hwStats_.set("Tx", {}, {.deltaThere = false});
    takeSnapShot();
    hwStats_.setObserver([this](std::string_view call) {
        // Before the second driver is sampled, everything of the first is gone but its part of the snapshot.
        if (call == "createSamples Tx/none") {
            EXPECT_EQ(hwStats_.liveSamples(), 2U);
        }
    });
    sendDriverLogs();
    EXPECT_EQ(hwStats_.liveSamples(), 2U);
}

TEST_F(VelaReportingDriverUtilityTest, DriverMessagesEndNoStretchOfPlayback) {
    hwStats_.set("Rx", {}, {.delta = {{simpleChannel("a", 1)}}});
    takeSnapShot();
    session_->start();
    session_->sendMessage(
        {{"session_output_running", true}, {"NexoSessionVolume", 0.5}, {"velareporting_timestamp", 1000.0}}, 4, 1, {});
    sendDriverLogs();
    session_->sendMessage({{"session_output_running", false}, {"velareporting_timestamp", 1010.0}}, 4, 2, {});
    session_->stop();
    queues_.runUntilIdle();
    const auto volume = std::find_if(analytics_.events.begin(), analytics_.events.end(),
                                     [](const auto& event) { return event.category == AudioEventCategoryVolume; });
    ASSERT_NE(volume, analytics_.events.end());
    EXPECT_EQ(volume->message.find("play_seconds").doubleValue(), 10);
}

TEST_F(VelaReportingDriverUtilityTest, ManySessionsMayTakeSnapshotsAndStopAtOnce) {
    hwStats_.set("Rx", {}, {.delta = {{simpleChannel("a", 1), stateChannel("s", {{"on", 1, 2, 0.5}})}}});
    utility();
    struct CountingAnalytics final : VelaReportingSessionEventHandler {
        std::atomic<int> events = 0;
        void handleEvent(const Dictionary&, std::uint32_t, std::uint32_t,
                         const std::shared_ptr<VelaReportingSession>&) override {
            ++events;
        }
    } analytics;
    const VelaReportingDriverUtility shared(hwStats_, analytics);
    std::vector<std::shared_ptr<VelaReportingSession>> sessions;
    for (std::int64_t reporter = 1; reporter <= 4; ++reporter) {
        sessions.push_back(makeSession(reporter));
    }
    std::vector<std::thread> threads;
    threads.reserve(sessions.size());
    for (const auto& session : sessions) {
        threads.emplace_back([&shared, &session] {
            for (int round = 0; round < 20; ++round) {
                session->setDriverSnapShot(shared.getSnapShot());
                shared.sendDriverLogsForSession(session);
            }
        });
    }
    for (std::thread& thread : threads) {
        thread.join();
    }
    EXPECT_EQ(analytics.events, 4 * 20 * 2);
    queues_.advance(std::chrono::seconds(2)); // the messages of sessions that never started
}

} // namespace

} // namespace vela
