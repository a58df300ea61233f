// A session's properties, its start, its stop and its release.
#include "session/Session_test.h"
#include "session/VelaReportingSession.h"

#include <atomic>
#include <limits>

namespace vela {

namespace {

using namespace std::chrono_literals;
using ::testing::Contains;
using ::testing::ElementsAre;
using ::testing::IsEmpty;

using VelaReportingSessionTest = SessionTest;

// Creation and properties.

TEST_F(VelaReportingSessionTest, CreationIsLoggedBeforeTheTraceEvent) {
    spoor_.setObserver([this](std::uint32_t) { EXPECT_EQ(log_.lines().size(), 1U); });
    session();
    EXPECT_THAT(log_.lines(), ElementsAre(sessionLine(LogLevel::Info, "created reporting session for ID: 42")));
    EXPECT_THAT(spoor_.codes(), ElementsAre(0x21044828));
}

TEST_F(VelaReportingSessionTest, LinesAreAboutTheReporter) {
    session().start();
    queues_.runUntilIdle();
    for (const auto& record : log_.records()) {
        EXPECT_EQ(record.reporter, std::optional<std::int64_t>(42)) << record.text;
    }
}

TEST_F(VelaReportingSessionTest, ReporterIDsAreSigned64BitNumbers) {
    const auto lowest = makeSession(std::numeric_limits<std::int64_t>::min());
    EXPECT_EQ(lowest->reporterID(), std::numeric_limits<std::int64_t>::min());
    EXPECT_EQ(linesSaying("created reporting session for ID: -9223372036854775808"), 1U);
}

TEST_F(VelaReportingSessionTest, ANewSessionHasNothingYet) {
    const auto fresh = makeSession(42);
    EXPECT_FALSE(fresh->started());
    EXPECT_FALSE(fresh->beaconReportingEnabled());
    EXPECT_FALSE(fresh->getBeaconReportingStartedState());
    EXPECT_EQ(fresh->serviceType(), 65535);
    EXPECT_EQ(fresh->serviceName(), "unknown");
    EXPECT_EQ(fresh->configuration(), Dictionary());
    EXPECT_EQ(fresh->reporterID(), 42);
    EXPECT_THAT(fresh->processIdentifiers(), ElementsAre(7, 1));
    EXPECT_FALSE(listExists(*fresh));
    EXPECT_EQ(fresh->beaconReportingSession(), nullptr);
    EXPECT_EQ(fresh->beaconReportingAgentToken(), Value());
    EXPECT_FALSE(fresh->shouldReportOrientation());
}

TEST_F(VelaReportingSessionTest, CreationMakesNoQueue) {
    session();
    EXPECT_EQ(queues_.liveQueues(), 0U);
}

TEST_F(VelaReportingSessionTest, SettingTheTypeLogsItsName) {
    session();
    log_.clear();
    session().setServiceType(3);
    EXPECT_EQ(session().serviceType(), 3);
    EXPECT_EQ(session().serviceName(), "haptics");
    EXPECT_THAT(log_.lines(), ElementsAre(sessionLine(LogLevel::Info, "setting service type haptics")));
}

TEST_F(VelaReportingSessionTest, ATypeThatIsNoneStaysAndIsNamedTelephony) {
    session().setServiceType(14);
    EXPECT_EQ(session().serviceType(), 14);
    EXPECT_EQ(session().serviceName(), "telephony");
    EXPECT_EQ(linesSaying("setting service type telephony"), 1U);
}

TEST_F(VelaReportingSessionTest, TheTypeMayBeSetAfterTheStart) {
    session().start();
    session().setServiceType(9);
    EXPECT_EQ(session().serviceName(), "audiodeviceusage");
    session().setServiceType(65535);
    EXPECT_EQ(session().serviceName(), "unknown");
}

TEST_F(VelaReportingSessionTest, ConfigurationsAreMerged) {
    session().setConfiguration(Dictionary{{"a", 1}, {"b", 2}});
    session().setConfiguration(Dictionary{{"b", 3}, {"c", 4}});
    EXPECT_EQ(session().configuration(), (Dictionary{{"a", 1}, {"b", 3}, {"c", 4}}));
}

TEST_F(VelaReportingSessionTest, NoConfigurationIsIgnored) {
    session().setConfiguration(Dictionary{{"a", 1}});
    session().setConfiguration(std::nullopt);
    EXPECT_EQ(session().configuration(), (Dictionary{{"a", 1}}));
}

TEST_F(VelaReportingSessionTest, UpdatingTheConfigurationMergesAsWell) {
    session().updateConfigurationWithContentsOfConfiguration({{"a", 1}, {"b", 2}});
    session().updateConfigurationWithContentsOfConfiguration({{"a", "one"}});
    EXPECT_EQ(session().configuration(), (Dictionary{{"a", "one"}, {"b", 2}}));
}

TEST_F(VelaReportingSessionTest, DescriptionOfANewSession) {
    EXPECT_EQ(session().description(),
              "reporterID=42,serviceName=unknown,ownerPid=7,HostApplicationDisplayID=Unknown,started=0");
}

TEST_F(VelaReportingSessionTest, DescriptionOfAConfiguredStartedSession) {
    session().setServiceType(4);
    session().setConfiguration(Dictionary{{"HostApplicationDisplayID", "com.example.clock"}});
    session().start();
    EXPECT_EQ(session().description(),
              "reporterID=42,serviceName=alarms,ownerPid=7,HostApplicationDisplayID=com.example.clock,started=1");
}

TEST_F(VelaReportingSessionTest, DescriptionWithoutProcesses) {
    const auto orphan = VelaReportingSession::initWithID(-1, {}, platform_);
    EXPECT_EQ(orphan->description(),
              "reporterID=-1,serviceName=unknown,ownerPid=0,HostApplicationDisplayID=Unknown,started=0");
}

TEST_F(VelaReportingSessionTest, TheStartedStateIsOnePollableFlag) {
    const std::atomic<bool>* const flag = &session().getBeaconReportingStartedState();
    beacon_.setDiscovery(BeaconDiscovery::FindsBackends);
    session().start();
    EXPECT_FALSE(*flag);
    queues_.runUntilIdle();
    EXPECT_TRUE(*flag);
    session().stop();
    queues_.runUntilIdle();
    EXPECT_FALSE(*flag);
    EXPECT_EQ(flag, &session().getBeaconReportingStartedState());
}

// Start.

TEST_F(VelaReportingSessionTest, StartLogsAndTraces) {
    session();
    forget();
    session().start();
    EXPECT_THAT(log_.lines(), ElementsAre(sessionLine(LogLevel::Debug, "starting session owned by 42")));
    EXPECT_THAT(spoor_.codes(), ElementsAre(0x2104482C));
    EXPECT_TRUE(session().started());
    EXPECT_TRUE(listExists(session()));
    EXPECT_THAT(recorded(), IsEmpty());
}

TEST_F(VelaReportingSessionTest, StartDoesNotWaitForBeacon) {
    session().start();
    EXPECT_THAT(beacon_.calls(), IsEmpty());
    EXPECT_EQ(queues_.pendingItems(), 1U);
    EXPECT_EQ(queues_.liveQueues(), 1U);
}

TEST_F(VelaReportingSessionTest, StartTwiceKeepsTheMessageList) {
    session().start();
    send({{"a", 1}});
    forget();
    const std::size_t queued = queues_.pendingItems();
    session().start();
    EXPECT_THAT(log_.lines(), ElementsAre(sessionLine(LogLevel::Debug, "starting session owned by 42"),
                                          sessionLine(LogLevel::Info, "42 is already started")));
    EXPECT_THAT(recorded(), ElementsAre("Generic_Start_1 {a = 1; audiotag = GenericStart;}"));
    EXPECT_EQ(countOf(session(), "Generic_Start"), 1U);
    EXPECT_THAT(spoor_.codes(), IsEmpty());
    EXPECT_EQ(queues_.pendingItems(), queued);
    queues_.runUntilIdle();
    EXPECT_EQ(beacon_.callsOf(BeaconOperation::CreateSession).size(), 1U);
}

TEST_F(VelaReportingSessionTest, WithoutBeaconStartQueuesNothing) {
    session().setBeaconReportingEnabled(false);
    session().start();
    EXPECT_EQ(queues_.liveQueues(), 0U);
    EXPECT_EQ(queues_.pendingItems(), 0U);
    EXPECT_TRUE(session().started());
}

TEST_F(VelaReportingSessionTest, AfterAStopAStartBeginsAFreshList) {
    session().start();
    send({{"a", 1}});
    send({{"a", 2}});
    session().stop();
    EXPECT_FALSE(listExists(session()));
    EXPECT_EQ(countOf(session(), "Generic_Start"), std::nullopt);
    session().start();
    EXPECT_THAT(recorded(), IsEmpty());
    send({{"a", 2}}); // repeats the last one of the run before
    EXPECT_THAT(recordedKeys(), ElementsAre("Generic_Start_1"));
}

// Stop.

TEST_F(VelaReportingSessionTest, StopOfASessionThatIsNotStartedOnlyLogs) {
    session();
    forget();
    session().stop();
    EXPECT_THAT(log_.lines(), ElementsAre(sessionLine(LogLevel::Debug, "ending session 42")));
    EXPECT_THAT(spoor_.codes(), IsEmpty());
    EXPECT_EQ(queues_.pendingItems(), 0U);
}

TEST_F(VelaReportingSessionTest, StopLogsTwiceAndTraces) {
    session().setBeaconReportingEnabled(false);
    session().start();
    forget();
    spoor_.setObserver([this](std::uint32_t) { EXPECT_EQ(log_.lines().size(), 2U); });
    session().stop();
    spoor_.setObserver(nullptr);
    const std::vector<CapturedLine> lines = log_.lines();
    ASSERT_GE(lines.size(), 2U);
    EXPECT_EQ(lines[0], sessionLine(LogLevel::Debug, "ending session 42"));
    EXPECT_EQ(lines[1], sessionLine(LogLevel::Debug, "ending session 42"));
    EXPECT_EQ(linesSaying("ending session 42"), 2U);
    EXPECT_THAT(spoor_.codes(), ElementsAre(0x21044830));
    EXPECT_FALSE(session().started());
    EXPECT_FALSE(listExists(session()));
}

TEST_F(VelaReportingSessionTest, ASecondStopOnlyLogs) {
    runningSession().stop();
    queues_.runUntilIdle();
    forget();
    session().stop();
    EXPECT_THAT(log_.lines(), ElementsAre(sessionLine(LogLevel::Debug, "ending session 42")));
    EXPECT_THAT(spoor_.codes(), IsEmpty());
}

TEST_F(VelaReportingSessionTest, AStopWithoutMessagesSendsNeitherVolumeNorSummary) {
    runningSession().stop();
    queues_.runUntilIdle();
    EXPECT_EQ(linesSaying("sending volume event for reporter 42"), 0U);
    EXPECT_EQ(linesSaying("sending summary event for reporter 42"), 0U);
    EXPECT_THAT(beacon_.operations(), ElementsAre(BeaconOperation::Flush, BeaconOperation::EndSession));
    EXPECT_THAT(analytics_.events, IsEmpty());
}

TEST_F(VelaReportingSessionTest, StopSendsTheVolumeMessageToBeaconAndAnalytics) {
    runningSession().setConfiguration(Dictionary{{"HostApplicationDisplayID", "com.example.player"}});
    sendOnePlayback();
    queues_.runUntilIdle();
    forget();
    session().stop();
    queues_.runUntilIdle();
    const Dictionary volume{{"session_selected_format", "unknown"},
                            {"active_devices", "unknown"},
                            {"HostApplicationDisplayID", "com.example.player"},
                            {"NexoSessionVolume", 0.5},
                            {"NexoSessionVolumeBucketed", "0.5"},
                            {"play_seconds", 10.0F},
                            {"spatial-audio-accessory-feature", false},
                            {"spatializationEnabled", false},
                            {"ringerstate", false},
                            {"mChannelsPerFrame", -1},
                            {"play_secondsBucketed", "10"},
                            {"msgidx", 1},
                            {"msgcnt", 1}};
    ASSERT_EQ(analytics_.events.size(), 1U);
    EXPECT_EQ(analytics_.events[0].message, volume);
    EXPECT_EQ(analytics_.events[0].category, 14U);
    EXPECT_EQ(analytics_.events[0].type, 11U);
    EXPECT_EQ(analytics_.events[0].session, &session());
    const auto sent = beacon_.callsOf(BeaconOperation::Send);
    ASSERT_EQ(sent.size(), 2U);
    EXPECT_EQ(sent[0].category, 14);
    EXPECT_EQ(sent[0].type, 11);
    EXPECT_EQ(sent[0].payload, volume.setting(Key("audiotag"), "VolumeSummary"));
    EXPECT_EQ(sent[1].category, 65535);
    EXPECT_EQ(linesSaying("sending volume event for reporter 42"), 1U);
    EXPECT_THAT(log_.lines(), Contains(sessionLine(LogLevel::Default, "sending volume event for reporter 42")));
}

TEST_F(VelaReportingSessionTest, WithoutAnApplicationVolumeMessagesNameUnknown) {
    runningSession();
    sendOnePlayback();
    session().stop();
    ASSERT_EQ(analytics_.events.size(), 1U);
    EXPECT_EQ(analytics_.events[0].message.find("HostApplicationDisplayID"), Value("Unknown"));
}

TEST_F(VelaReportingSessionTest, VolumeMessagesOfHalfASecondAreNotSent) {
    runningSession();
    send({{"session_output_running", true}, {"NexoSessionVolume", 0.5}, {"velareporting_timestamp", 1000.0}}, 4, 1);
    send({{"session_output_running", false}, {"velareporting_timestamp", 1000.5}}, 4, 2);
    session().stop();
    EXPECT_THAT(analytics_.events, IsEmpty());
    EXPECT_EQ(linesSaying("sending volume event for reporter 42"), 0U);
}

TEST_F(VelaReportingSessionTest, EachVolumeMessageIsSentAndThenHandedToAnalytics) {
    runningSession();
    sendOnePlayback(0.25);
    sendOnePlayback(0.75);
    session().stop();
    ASSERT_EQ(analytics_.events.size(), 2U);
    // Four messages of the client, then each volume message is recorded before analytics sees it.
    EXPECT_EQ(analytics_.events[0].recordedBefore, 5U);
    EXPECT_EQ(analytics_.events[0].message.find("NexoSessionVolume"), Value(0.25));
    EXPECT_EQ(analytics_.events[0].message.find("msgidx"), Value(1));
    EXPECT_EQ(analytics_.events[1].recordedBefore, 6U);
    EXPECT_EQ(analytics_.events[1].message.find("NexoSessionVolume"), Value(0.75));
    EXPECT_EQ(analytics_.events[1].message.find("msgcnt"), Value(2));
    EXPECT_FALSE(analytics_.events[1].message.contains("audiotag"));
    EXPECT_EQ(linesSaying("sending volume event for reporter 42"), 1U);
}

TEST_F(VelaReportingSessionTest, VolumeThenSummaryThenTheEndOfBeacon) {
    runningSession();
    sendOnePlayback();
    session().stop();
    queues_.runUntilIdle();
    EXPECT_THAT(beacon_.operations(),
                ElementsAre(BeaconOperation::Send, BeaconOperation::Send, BeaconOperation::Send, BeaconOperation::Send,
                            BeaconOperation::Flush, BeaconOperation::EndSession));
    const auto sent = beacon_.callsOf(BeaconOperation::Send);
    EXPECT_EQ(sent[2].payload.find("audiotag"), Value("VolumeSummary"));
    EXPECT_EQ(sent[3].payload.find("audiotag"), Value("UndefinedUnknown"));
}

TEST_F(VelaReportingSessionTest, StopDoesNotWaitForTheEndOfBeacon) {
    runningSession().stop();
    EXPECT_THAT(beacon_.calls(), IsEmpty());
    EXPECT_EQ(queues_.pendingItems(), 1U);
    EXPECT_FALSE(session().started());
}

TEST_F(VelaReportingSessionTest, WithoutBeaconASessionStillRecordsAndHandsOverItsVolume) {
    session().setBeaconReportingEnabled(false);
    session().start();
    sendOnePlayback();
    EXPECT_THAT(recordedKeys(), ElementsAre("Playback_Start_1", "Playback_Stop_1"));
    session().stop();
    EXPECT_EQ(analytics_.events.size(), 1U);
    EXPECT_EQ(linesSaying("sending volume event for reporter 42"), 1U);
    EXPECT_EQ(linesSaying("sending summary event for reporter 42"), 1U);
    EXPECT_EQ(queues_.liveQueues(), 0U);
    EXPECT_THAT(beacon_.calls(), IsEmpty());
}

TEST_F(VelaReportingSessionTest, StopReadsTheApplicationOfItsOwnTime) {
    runningSession().setConfiguration(Dictionary{{"HostApplicationDisplayID", "before"}});
    sendOnePlayback();
    session().setConfiguration(Dictionary{{"HostApplicationDisplayID", "after"}});
    session().stop();
    ASSERT_EQ(analytics_.events.size(), 1U);
    EXPECT_EQ(analytics_.events[0].message.find("HostApplicationDisplayID"), Value("after"));
}

TEST_F(VelaReportingSessionTest, StopLeavesTheTransactionAlone) {
    int replies = 0;
    session().start();
    session().setTransactionCompleteBlock([&](std::optional<platform::IpcError>, bool) { ++replies; });
    session().stop();
    EXPECT_EQ(replies, 0);
    EXPECT_TRUE(session().completeTransaction());
    EXPECT_EQ(replies, 1);
}

// Release.

TEST_F(VelaReportingSessionTest, ReleaseTracesAndThenLogs) {
    session();
    forget();
    spoor_.setObserver([this](std::uint32_t) { EXPECT_THAT(log_.lines(), IsEmpty()); });
    release();
    EXPECT_THAT(spoor_.codes(), ElementsAre(0x21044834));
    EXPECT_THAT(log_.lines(), ElementsAre(sessionLine(LogLevel::Info, "deallocing this session 42")));
}

TEST_F(VelaReportingSessionTest, ReleasedWithoutStopItSendsNothingMore) {
    makeInternalBuild();
    runningSession();
    sendOnePlayback();
    queues_.runUntilIdle();
    forget();
    release();
    EXPECT_THAT(beacon_.operations(), ElementsAre(BeaconOperation::EndSession));
    EXPECT_THAT(analytics_.events, IsEmpty());
    EXPECT_THAT(fileSystem_.files(), IsEmpty());
    EXPECT_THAT(log_.lines(), ElementsAre(sessionLine(LogLevel::Info, "deallocing this session 42")));
}

TEST_F(VelaReportingSessionTest, QueuedWorkKeepsTheSessionUntilItHasRun) {
    runningSession();
    send({{"a", 1}});
    release();
    EXPECT_EQ(linesSaying("deallocing this session 42"), 0U);
    queues_.runUntilIdle();
    EXPECT_THAT(beacon_.operations(), ElementsAre(BeaconOperation::Send, BeaconOperation::EndSession));
    EXPECT_EQ(log_.lines().back(), sessionLine(LogLevel::Info, "deallocing this session 42"));
}

TEST_F(VelaReportingSessionTest, AStoppedSessionThatIsReleasedEndsItsBeaconSessionFirst) {
    runningSession().stop();
    release();
    queues_.runUntilIdle();
    EXPECT_THAT(beacon_.operations(), ElementsAre(BeaconOperation::Flush, BeaconOperation::EndSession));
    EXPECT_EQ(log_.lines().back(), sessionLine(LogLevel::Info, "deallocing this session 42"));
}

TEST_F(VelaReportingSessionTest, ASessionWhoseDiscoveryNeverAnswersIsReleasedAfterNineSeconds) {
    session().start();
    release();
    queues_.advance(8'999ms);
    EXPECT_EQ(linesSaying("deallocing this session 42"), 0U);
    queues_.advance(1ms);
    EXPECT_EQ(linesSaying("deallocing this session 42"), 1U);
    EXPECT_EQ(queues_.liveQueues(), 0U);
    EXPECT_EQ(beacon_.waitingDiscoveries(), 1U);
}

TEST_F(VelaReportingSessionTest, AnAnswerAfterTheReleaseTouchesNothing) {
    session().start();
    release();
    queues_.advance(9s);
    log_.clear();
    beacon_.findBackends();
    queues_.runUntilIdle();
    EXPECT_THAT(log_.lines(), IsEmpty());
}

TEST_F(VelaReportingSessionTest, TheAnswerMayDropTheLastReference) {
    session().start();
    queues_.runUntilIdle();
    release();
    beacon_.findBackends();
    queues_.runUntilIdle();
    EXPECT_EQ(linesSaying("continuing with backends!"), 1U);
    EXPECT_EQ(log_.lines().back(), sessionLine(LogLevel::Info, "deallocing this session 42"));
}

TEST_F(VelaReportingSessionTest, TraceEventsOfAWholeLife) {
    beacon_.setDiscovery(BeaconDiscovery::FindsBackends);
    session().start();
    send({{"a", 1}});
    session().stop();
    release();
    queues_.runUntilIdle();
    EXPECT_THAT(spoor_.codes(), ElementsAre(0x21044828, 0x2104482C, 0x21044838, 0x21044830, 0x21044838, 0x21044834));
}

TEST_F(VelaReportingSessionTest, TraceEventsLieAboveWhatTraceRunsCollect) {
    beacon_.setDiscovery(BeaconDiscovery::FindsBackends);
    session().start();
    send({{"a", 1}});
    session().stop();
    release();
    queues_.runUntilIdle();
    for (const std::uint32_t code : spoor_.codes()) {
        EXPECT_GT(code, 0x2104408AU);
    }
}

TEST_F(VelaReportingSessionTest, AThousandSessionsThatWaitForBackendsHoldNoThreadAndCarryOnAfterNineSeconds) {
    constexpr std::int64_t kSessions = 1'000;
    std::vector<std::shared_ptr<VelaReportingSession>> sessions;
    int replies = 0;
    for (std::int64_t id = 0; id < kSessions; ++id) {
        sessions.push_back(makeSession(id));
        sessions.back()->setBeaconReportingEnabled(true);
        sessions.back()->start();
        sessions.back()->setTransactionCompleteBlock([&](std::optional<platform::IpcError>, bool) { ++replies; });
    }
    queues_.runUntilIdle();
    EXPECT_EQ(queues_.suspendedQueues(), 1'000U);
    EXPECT_EQ(queues_.blockingDepth(), 0U);
    EXPECT_EQ(queues_.pendingItems(), 0U);
    queues_.advance(8'999ms);
    EXPECT_EQ(replies, 0);
    queues_.advance(1ms);
    EXPECT_EQ(replies, 1'000);
    EXPECT_EQ(queues_.suspendedQueues(), 0U);
    EXPECT_EQ(linesSaying("timed out waiting for backends"), 1'000U);
}

} // namespace

} // namespace vela
