#include "platform/absent/AbsentFacilities.h"
#include "testing/ManualClock.h"
#include "testing/ManualWorkQueues.h"
#include "testing/Record.h"

#include <cerrno>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <memory>
#include <string>
#include <vector>

namespace vela::platform {

namespace {

using ::testing::ElementsAre;
using ::testing::IsEmpty;

TEST(AbsentBeaconTest, ADiscoveryFindsNoBackEnd) {
    AbsentBeacon beacon;
    const auto session = beacon.createBeaconSession({}, {});
    int answers = 0;
    session->startBeaconBackendDiscovery([&](std::optional<Array> backends) {
        EXPECT_FALSE(backends.has_value());
        ++answers;
    });
    EXPECT_EQ(answers, 1);
}

TEST(AbsentBeaconTest, EverySendFailsWithWords) {
    AbsentBeacon beacon;
    const auto sent = beacon.createBeaconSession({}, {})->sendBeaconMessage(1, 2, {{"a", 1}});
    ASSERT_FALSE(sent);
    EXPECT_EQ(sent.failure().code, ENOTSUP);
    EXPECT_EQ(sent.failure().description, "this device has no Beacon");
    EXPECT_EQ(beacon.sendOneBeaconMessage({}, {}, 1, 2, {}).failure().code, ENOTSUP);
}

TEST(AbsentBeaconTest, ATokenMayStandInADictionary) {
    AbsentBeacon beacon;
    EXPECT_TRUE(beacon.newBeaconHierarchyToken({}));
    EXPECT_TRUE(beacon.newBeaconHierarchyToken(beacon.newBeaconHierarchyToken({})));
}

TEST(AbsentTallyTest, NobodyUsesAnEventAndItsPayloadIsDestroyedUnbuilt) {
    AbsentTally tally;
    EXPECT_FALSE(tally.tallyIsEventUsed("com.orvex.audio"));
    int built = 0;
    int destroyed = 0;
    tally.tallySendEventLazy("com.orvex.audio", [&built, trace = testing::Trace([&destroyed] { ++destroyed; })] {
        ++built;
        return Dictionary();
    });
    EXPECT_EQ(built, 0);
    EXPECT_EQ(destroyed, 1);
}

TEST(AbsentJouleAndTelemTest, WhatTheyAreGivenIsDropped) {
    AbsentJoule joule;
    AbsentTelem telem;
    const Dictionary payload{{"a", "b"}};
    joule.jouleLogRegisteredEvent(1, "event", payload, {});
    telem.telemPostMetric(1, "record", payload);
    EXPECT_EQ(payload, (Dictionary{{"a", "b"}}));
}

TEST(AbsentMaladyTest, ASnapshotIsAnsweredWithItsAbsence) {
    AbsentMalady malady;
    std::vector<Dictionary> replies;
    malady.createReporter()->requestSnapshot({}, 0, std::nullopt, std::nullopt,
                                             [&](const Dictionary& reply) { replies.push_back(reply); });
    EXPECT_THAT(replies, ElementsAre(Dictionary{{"success", false}, {"error", "this device has no Malady reporter"}}));
}

TEST(AbsentMaladyTest, NobodyNeedsToTakeTheReply) {
    AbsentMalady malady;
    malady.createReporter()->requestSnapshot({}, 0, std::nullopt, std::nullopt, {});
}

TEST(AbsentHwStatsTest, AGroupHasNoChannelsAndThatIsNoError) {
    AbsentHwStats hwStats;
    const auto answer = hwStats.copyChannelsInGroup("Haptics", std::nullopt);
    ASSERT_NE(answer.thing, nullptr);
    EXPECT_FALSE(answer.error.has_value());
    EXPECT_EQ(hwStats.channelCount(*answer.thing), 0);
}

TEST(AbsentHwStatsTest, NothingCanBeSubscribedToOrSampled) {
    AbsentHwStats hwStats;
    const auto channels = hwStats.copyChannelsInGroup({}, {}).thing;
    const auto subscription = hwStats.createSubscription(*channels);
    EXPECT_EQ(subscription.subscription, nullptr);
    EXPECT_EQ(subscription.subscribed, nullptr);
    ASSERT_TRUE(subscription.error.has_value());
    EXPECT_EQ(subscription.error->code, ENOTSUP);
    const HwStatsSubscription none;
    const auto samples = hwStats.createSamples(none, *channels);
    EXPECT_EQ(samples.thing, nullptr);
    EXPECT_TRUE(samples.error.has_value());
    const HwStatsSamples noSamples;
    EXPECT_EQ(hwStats.createSamplesDelta(nullptr, noSamples).thing, nullptr);
    int channelsSeen = 0;
    hwStats.iterate(noSamples, [&](const HwStatsChannel&) { return ++channelsSeen; });
    EXPECT_EQ(channelsSeen, 0);
}

class AbsentOnQueuesTest : public ::testing::Test {
protected:
    testing::ManualClock clock_;
    testing::ManualWorkQueues queues_{clock_};
};

TEST_F(AbsentOnQueuesTest, ATraceSessionDoesNotStartButCompletesOnItsQueue) {
    AbsentSpoor spoor;
    const auto queue = queues_.makeSerialQueue("Tracing Queue", QualityOfService::Default);
    const auto session = spoor.createSession();
    int completions = 0;
    session->setCompletionHandler([&] {
        EXPECT_TRUE(queue->isCurrent());
        ++completions;
    });
    session->setWallTimesEnabled(true);
    EXPECT_EQ(session->eventsRange(1, 2, [](const SpoorEvent&) {}), 0);
    EXPECT_EQ(session->start(*queue), ENOTSUP);
    spoor.emit(0x21040000);
    EXPECT_EQ(session->end(), 0);
    EXPECT_EQ(completions, 0);
    queues_.runUntilIdle();
    EXPECT_EQ(completions, 1);
    EXPECT_EQ(session->end(), 0);
    queues_.runUntilIdle();
    EXPECT_EQ(completions, 1);
}

TEST_F(AbsentOnQueuesTest, ATraceSessionThatNobodyStartedHasNoEnd) {
    const auto session = AbsentSpoor().createSession();
    session->setCompletionHandler([] { FAIL(); });
    EXPECT_EQ(session->end(), ENOTSUP);
}

class Delegate final : public ProbeTraceDelegate {
public:
    void performanceTraceDidStart(const std::optional<Failure>& error) override { note("start", error); }
    void performanceTraceDidStop(const std::optional<Failure>& error) override { note("stop", error); }
    void performanceTraceDidComplete(const std::string& url, const std::string&,
                                     const std::optional<Failure>& error) override {
        note("complete" + url, error);
    }

    std::vector<std::string> told;
    ProbeTraceSession* leaveAtStart = nullptr;

private:
    void note(const std::string& what, const std::optional<Failure>& error) {
        told.push_back(what + ": " + (error ? error->description : ""));
        if (leaveAtStart != nullptr) {
            leaveAtStart->setDelegate({});
        }
    }
};

TEST_F(AbsentOnQueuesTest, APerformanceTraceFailsToStartAndItsEndIsTold) {
    AbsentProbe probe(queues_.background());
    const auto delegate = std::make_shared<Delegate>();
    const auto session = probe.createProbeTraceSession(*probe.makeProbeTraceConfig(1));
    session->setDelegate(delegate);
    session->startProbeTrace();
    EXPECT_THAT(delegate->told, IsEmpty());
    queues_.runUntilIdle();
    session->stopProbeTrace();
    queues_.runUntilIdle();
    EXPECT_THAT(delegate->told, ElementsAre("start: this device has no performance-trace service",
                                            "complete: this device has no performance-trace service"));
}

TEST_F(AbsentOnQueuesTest, ADelegateThatIsTakenOffIsToldNothingMore) {
    AbsentProbe probe(queues_.background());
    const auto delegate = std::make_shared<Delegate>();
    const auto session = probe.createProbeTraceSession(*probe.makeProbeTraceConfig(1));
    delegate->leaveAtStart = session.get();
    session->setDelegate(delegate);
    session->startProbeTrace();
    queues_.runUntilIdle();
    EXPECT_THAT(delegate->told, ElementsAre("start: this device has no performance-trace service"));
}

TEST_F(AbsentOnQueuesTest, ADelegateAndASessionThatAreGoneAreNotMissed) {
    AbsentProbe probe(queues_.background());
    auto delegate = std::make_shared<Delegate>();
    auto session = probe.createProbeTraceSession(*probe.makeProbeTraceConfig(1));
    session->setDelegate(delegate);
    session->startProbeTrace();
    session.reset();
    delegate.reset();
    queues_.runUntilIdle();
    EXPECT_EQ(queues_.pendingItems(), 0U);
}

TEST(AbsentMetricsheetTest, NoFileCanBeOpened) {
    EXPECT_EQ(AbsentMetricsheet().openWriter("/tmp/results.msj", "VelaReporting", 4), nullptr);
}

} // namespace

} // namespace vela::platform
