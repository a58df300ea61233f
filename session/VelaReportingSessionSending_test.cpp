// What becomes of a message on its sender's thread, and the way of single messages.
#include "session/Session_test.h"

#include <cstdio>
#include <set>

namespace vela {

namespace {

using namespace std::chrono_literals;
using ::testing::ElementsAre;
using ::testing::IsEmpty;

class VelaReportingSessionSendingTest : public SessionTest {
protected:
    void sendSingle(const Dictionary& message, std::uint16_t serviceType = 3, std::uint32_t category = 0x10000004,
                    std::uint16_t type = 2) {
        VelaReportingSession::sendSingleMessage(platform_, message, category, type, serviceType, {{"ignored", 1}}, {});
    }
};

TEST_F(VelaReportingSessionSendingTest, SendingIsLogged) {
    runningSession();
    send({{"a", 1}});
    EXPECT_THAT(log_.lines(), ElementsAre(sessionLine(LogLevel::Debug, "sending message for session owned by 42")));
}

TEST_F(VelaReportingSessionSendingTest, SpacesInKeysBecomeUnderscoresBeforeTheTagIsSet) {
    runningSession();
    send({{"audio tag", "mine"}, {"a b c", "x y"}});
    EXPECT_THAT(recorded(),
                ElementsAre("Generic_Start_1 {audio_tag = mine; a_b_c = \"x y\"; audiotag = GenericStart;}"));
}

TEST_F(VelaReportingSessionSendingTest, AClientsTagIsOverwritten) {
    runningSession();
    send({{"audiotag", "mine"}, {"a", 1}});
    EXPECT_THAT(recorded(), ElementsAre("Generic_Start_1 {audiotag = GenericStart; a = 1;}"));
}

TEST_F(VelaReportingSessionSendingTest, TheClientsMessageStaysAsItIs) {
    runningSession();
    const Dictionary message{{"a b", 1}, {"velareporting_timestamp", 1.5}};
    send(message);
    queues_.runUntilIdle();
    EXPECT_EQ(message, (Dictionary{{"a b", 1}, {"velareporting_timestamp", 1.5}}));
}

TEST_F(VelaReportingSessionSendingTest, TheTimeIsKeptInTheListAndTakenOffWhatIsForwarded) {
    runningSession();
    send({{"velareporting_timestamp", 1.5}, {"a", 1}});
    queues_.runUntilIdle();
    EXPECT_THAT(recorded(),
                ElementsAre("Generic_Start_1 {velareporting_timestamp = 1.5; a = 1; audiotag = GenericStart;}"));
    EXPECT_THAT(sentPayloads(), ElementsAre(Dictionary{{"a", 1}, {"audiotag", "GenericStart"}}));
}

TEST_F(VelaReportingSessionSendingTest, OnInternalBuildsTheTimeIsForwarded) {
    makeInternalBuild();
    runningSession();
    send({{"velareporting_timestamp", 1.5}, {"a", 1}});
    queues_.runUntilIdle();
    EXPECT_THAT(sentPayloads(),
                ElementsAre(Dictionary{{"velareporting_timestamp", 1.5}, {"a", 1}, {"audiotag", "GenericStart"}}));
    EXPECT_THAT(recorded(),
                ElementsAre("Generic_Start_1 {velareporting_timestamp = 1.5; a = 1; audiotag = GenericStart;}"));
}

TEST_F(VelaReportingSessionSendingTest, OtherTimesAreForwarded) {
    runningSession();
    send({{"systemuptime_sec", 7}, {"processuptime_ms", 8}});
    queues_.runUntilIdle();
    EXPECT_THAT(sentPayloads(), ElementsAre(Dictionary{
                                    {"systemuptime_sec", 7}, {"processuptime_ms", 8}, {"audiotag", "GenericStart"}}));
}

TEST_F(VelaReportingSessionSendingTest, AMessageWithoutATimeGetsNone) {
    makeInternalBuild();
    runningSession();
    send({{"a", 1}});
    queues_.runUntilIdle();
    EXPECT_THAT(recorded(), ElementsAre("Generic_Start_1 {a = 1; audiotag = GenericStart;}"));
    EXPECT_THAT(sentPayloads(), ElementsAre(Dictionary{{"a", 1}, {"audiotag", "GenericStart"}}));
}

TEST_F(VelaReportingSessionSendingTest, AnEmptyMessageIsTaggedAndSent) {
    runningSession();
    send({});
    queues_.runUntilIdle();
    EXPECT_THAT(recorded(), ElementsAre("Generic_Start_1 {audiotag = GenericStart;}"));
    EXPECT_THAT(sentPayloads(), ElementsAre(Dictionary{{"audiotag", "GenericStart"}}));
}

TEST_F(VelaReportingSessionSendingTest, EveryMessageTracesAfterItWasRecorded) {
    runningSession();
    spoor_.setObserver([this](std::uint32_t) { EXPECT_EQ(recordedKeys().size(), 1U); });
    send({{"a", 1}});
    send({{"a", 1}}); // redundant
    EXPECT_THAT(spoor_.codes(), ElementsAre(0x21044838, 0x21044838));
    spoor_.setObserver(nullptr);
}

TEST_F(VelaReportingSessionSendingTest, TheStartedStateIsSampledAfterTheTraceEvent) {
    session();
    spoor_.setObserver([this](std::uint32_t code) {
        if (code == 0x21044838) {
            session().start();
        }
    });
    send({{"a", 1}});
    spoor_.setObserver(nullptr);
    beacon_.setDiscovery(BeaconDiscovery::FindsBackends);
    queues_.runUntilIdle();
    EXPECT_EQ(sentPayloads().size(), 1U);
}

TEST_F(VelaReportingSessionSendingTest, SyncIsQueuedAsWell) {
    runningSession().sendMessage({{"a", 1}}, 1, 1, true, {});
    EXPECT_THAT(beacon_.calls(), IsEmpty());
    EXPECT_EQ(queues_.pendingItems(), 1U);
}

TEST_F(VelaReportingSessionSendingTest, TheReplyComesOnceWithoutAnErrorBeforeTheBeaconWork) {
    int replies = 0;
    runningSession().sendMessage({{"a", 1}}, 1, 1, true, [&](const std::optional<platform::Failure>& error) {
        EXPECT_FALSE(error.has_value());
        EXPECT_EQ(queues_.pendingItems(), 1U); // queued already
        EXPECT_THAT(beacon_.calls(), IsEmpty());
        ++replies;
    });
    EXPECT_EQ(replies, 1);
    queues_.runUntilIdle();
    EXPECT_EQ(replies, 1);
    EXPECT_EQ(sentPayloads().size(), 1U);
}

TEST_F(VelaReportingSessionSendingTest, TheShortFormIsTheSame) {
    int replies = 0;
    runningSession().sendMessage({{"a", 1}}, 1, 1, [&](const std::optional<platform::Failure>&) { ++replies; });
    EXPECT_EQ(replies, 1);
    queues_.runUntilIdle();
    EXPECT_EQ(sentPayloads().size(), 1U);
}

TEST_F(VelaReportingSessionSendingTest, RedundantMessagesAreAnsweredToo) {
    int replies = 0;
    const auto reply = [&](const std::optional<platform::Failure>&) { ++replies; };
    runningSession().sendMessage({{"a", 1}}, 1, 1, reply);
    session().sendMessage({{"a", 1}}, 1, 1, reply);
    EXPECT_EQ(replies, 2);
    EXPECT_EQ(queues_.pendingItems(), 2U);
}

TEST_F(VelaReportingSessionSendingTest, WithoutBeaconAMessageIsRecordedAndAnsweredAndGoesNowhere) {
    int replies = 0;
    session().setBeaconReportingEnabled(false);
    session().start();
    session().sendMessage({{"a", 1}}, 1, 1, [&](const std::optional<platform::Failure>&) { ++replies; });
    EXPECT_EQ(replies, 1);
    EXPECT_EQ(countOf(session(), "Generic_Start"), 1U);
    EXPECT_EQ(queues_.liveQueues(), 0U);
    queues_.advance(5s);
    EXPECT_THAT(beacon_.calls(), IsEmpty());
}

TEST_F(VelaReportingSessionSendingTest, ARepeatIsLoggedAndNeitherRecordedNorForwarded) {
    runningSession();
    send({{"a", 1}, {"velareporting_timestamp", 1.0}, {"systemuptime_sec", 1}, {"processuptime_ms", 1}});
    log_.clear();
    send({{"a", 1}, {"velareporting_timestamp", 2.0}, {"systemuptime_sec", 2}, {"processuptime_ms", 2}});
    EXPECT_THAT(log_.lines(), ElementsAre(sessionLine(LogLevel::Debug, "sending message for session owned by 42"),
                                          sessionLine(LogLevel::Debug, "dropping redundant event")));
    EXPECT_THAT(recordedKeys(), ElementsAre("Generic_Start_1"));
    queues_.runUntilIdle();
    EXPECT_EQ(sentPayloads().size(), 1U);
}

TEST_F(VelaReportingSessionSendingTest, ErrorsAreSentHoweverOftenTheyRepeat) {
    runningSession();
    for (int repeat = 0; repeat < 3; ++repeat) {
        send({{"a", 1}}, 11, 1);
        send({{"a", 1}}, 4, 6);
    }
    queues_.runUntilIdle();
    EXPECT_EQ(sentPayloads().size(), 6U);
    EXPECT_EQ(countOf(session(), "Error_Start"), 3U);
    EXPECT_EQ(countOf(session(), "Playback_Error"), 3U);
}

TEST_F(VelaReportingSessionSendingTest, ATestSessionRecordsAndSummarisesButNeverReachesBeacon) {
    makeInternalBuild();
    session().setServiceType(11);
    session().start();
    sendOnePlayback();
    EXPECT_THAT(recordedKeys(), ElementsAre("Playback_Start_1", "Playback_Stop_1"));
    session().stop();
    queues_.advance(5s);
    EXPECT_THAT(beacon_.calls(), IsEmpty());
    EXPECT_EQ(analytics_.events.size(), 1U);
    EXPECT_EQ(fileSystem_.files().size(), 1U);
    EXPECT_EQ(linesSaying("sending summary event for reporter 42"), 1U);
}

// Before the start and after the stop.

TEST_F(VelaReportingSessionSendingTest, BeforeTheStartNothingIsRecordedOrRedundant) {
    session();
    log_.clear();
    send({{"a", 1}});
    send({{"a", 1}});
    EXPECT_FALSE(listExists(session()));
    EXPECT_EQ(linesSaying("dropping redundant event"), 0U);
    queues_.advance(1s);
    EXPECT_EQ(beacon_.callsOf(BeaconOperation::SendOne).size(), 2U);
}

TEST_F(VelaReportingSessionSendingTest, AfterTheStopMessagesAreSentAsSingleOnes) {
    runningSession().stop();
    send({{"a", 1}});
    queues_.advance(1s);
    EXPECT_EQ(beacon_.callsOf(BeaconOperation::SendOne).size(), 1U);
}

TEST_F(VelaReportingSessionSendingTest, ANeverStartedSessionSendsOneMessageAfterASecond) {
    session().setServiceType(3);
    session().setConfiguration(Dictionary{{"HostApplicationDisplayID", "com.example.player"}});
    log_.clear();
    send({{"a b", 1}, {"velareporting_timestamp", 1.5}}, 0x10000004, 2);
    queues_.runUntilIdle();
    EXPECT_THAT(log_.lines(),
                ElementsAre(sessionLine(LogLevel::Debug, "sending message for session owned by 42"),
                            beaconLine(LogLevel::Debug, "entering beaconreporting sendBeaconReportingMessage"),
                            beaconLine(LogLevel::Debug, "session not started, will send as a single message"),
                            beaconLine(LogLevel::Debug, "sending single message after delta 0 for service 3")));
    queues_.advance(999ms);
    EXPECT_THAT(beacon_.calls(), IsEmpty());
    queues_.advance(1ms);
    const auto calls = beacon_.calls();
    ASSERT_EQ(calls.size(), 1U);
    EXPECT_EQ(calls[0].operation, BeaconOperation::SendOne);
    EXPECT_EQ(calls[0].sessionInfo,
              (Dictionary{{"client_type", 19}, {"client_version", 2.1F}, {"session_id", std::int64_t{-1}}}));
    EXPECT_EQ(calls[0].userInfo, (Dictionary{{"client_name", "com.orvex.vela"}, {"service_name", "haptics"}}));
    EXPECT_EQ(calls[0].category, 4);
    EXPECT_EQ(calls[0].type, 2);
    EXPECT_EQ(calls[0].payload, (Dictionary{{"a_b", 1}, {"audiotag", "DSP_PlaybackStop"}}));
}

TEST_F(VelaReportingSessionSendingTest, ANeverStartedSessionWithoutBeaconSendsNothing) {
    session().setBeaconReportingEnabled(false);
    send({{"a", 1}});
    queues_.advance(5s);
    EXPECT_THAT(beacon_.calls(), IsEmpty());
}

TEST_F(VelaReportingSessionSendingTest, ANeverStartedTestSessionSendsSingleMessagesLikeAnyOther) {
    session().setServiceType(11);
    send({{"a", 1}});
    queues_.advance(1s);
    const auto calls = beacon_.callsOf(BeaconOperation::SendOne);
    ASSERT_EQ(calls.size(), 1U);
    EXPECT_EQ(calls[0].userInfo.find("service_name"), Value("test"));
}

TEST_F(VelaReportingSessionSendingTest, SingleMessagesOfASessionTraceTwice) {
    session();
    spoor_.clear();
    send({{"a", 1}});
    EXPECT_THAT(spoor_.codes(), ElementsAre(0x21044838));
    queues_.advance(1s);
    EXPECT_THAT(spoor_.codes(), ElementsAre(0x21044838, 0x21044838));
}

// Single messages.

TEST_F(VelaReportingSessionSendingTest, ASingleMessageIsNotTagged) {
    sendSingle({{"a b", 1}, {"velareporting_timestamp", 1.5}});
    queues_.advance(1s);
    const auto calls = beacon_.callsOf(BeaconOperation::SendOne);
    ASSERT_EQ(calls.size(), 1U);
    EXPECT_EQ(calls[0].payload, (Dictionary{{"a_b", 1}, {"velareporting_timestamp", 1.5}}));
    EXPECT_FALSE(calls[0].userInfo.contains("ignored"));
    EXPECT_THAT(keysOf(calls[0].sessionInfo), ElementsAre("client_type", "client_version", "session_id"));
    EXPECT_EQ(calls[0].sessionInfo.find("client_version").kind(), ValueKind::Real32);
    EXPECT_THAT(keysOf(calls[0].userInfo), ElementsAre("client_name", "service_name"));
}

TEST_F(VelaReportingSessionSendingTest, ASingleMessageThatIsSentIsLogged) {
    sendSingle({{"a b", 1}});
    queues_.advance(1s);
    EXPECT_THAT(log_.lines(),
                ElementsAre(beaconLine(LogLevel::Debug, "sending single message after delta 0 for service 3"),
                            beaconLine(LogLevel::Debug, "sending single message"),
                            beaconLine(LogLevel::Debug, "message {a_b = 1;} : category 268435460 : type 2")));
}

TEST_F(VelaReportingSessionSendingTest, ASingleMessageThatFailsIsAnError) {
    beacon_.failSends("the store is full");
    sendSingle({{"a", 1}});
    queues_.advance(1s);
    EXPECT_THAT(log_.lines(),
                ElementsAre(beaconLine(LogLevel::Debug, "sending single message after delta 0 for service 3"),
                            beaconLine(LogLevel::Debug, "sending single message"),
                            beaconLine(LogLevel::Error, "sendOneMessageWithSessionInfo the store is full")));
}

TEST_F(VelaReportingSessionSendingTest, TheReplyOfASingleMessageComesAfterItWasSent) {
    int replies = 0;
    VelaReportingSession::sendSingleMessage(platform_, {{"a", 1}}, 1, 1, 3, {},
                                            [&](const std::optional<platform::Failure>& error) {
                                                EXPECT_FALSE(error.has_value());
                                                EXPECT_EQ(beacon_.callsOf(BeaconOperation::SendOne).size(), 1U);
                                                ++replies;
                                            });
    EXPECT_EQ(replies, 0);
    queues_.advance(1s);
    EXPECT_EQ(replies, 1);
}

TEST_F(VelaReportingSessionSendingTest, TheReplyOfASingleMessageThatFailsHasTheError) {
    std::optional<platform::Failure> told;
    beacon_.failSends("the store is full");
    VelaReportingSession::sendSingleMessage(platform_, {{"a", 1}}, 1, 1, 3, {},
                                            [&](const std::optional<platform::Failure>& error) { told = error; });
    queues_.advance(1s);
    ASSERT_TRUE(told.has_value());
    EXPECT_EQ(told->description, "the store is full");
}

TEST_F(VelaReportingSessionSendingTest, EqualSingleMessagesAreAllSent) {
    sendSingle({{"a", 1}});
    sendSingle({{"a", 1}});
    queues_.advance(1s);
    EXPECT_EQ(beacon_.callsOf(BeaconOperation::SendOne).size(), 2U);
}

TEST_F(VelaReportingSessionSendingTest, AlarmsLogADeltaBelowSixtyButWaitOneSecond) {
    std::set<std::string> different;
    for (int message = 0; message < 500; ++message) {
        sendSingle({{"a", message}}, 4);
    }
    for (const CapturedLine& line : log_.lines()) {
        int delta = -1;
        char rest = 0;
        ASSERT_EQ(
            std::sscanf(line.message.c_str(), "sending single message after delta %d for service 4%c", &delta, &rest),
            1)
            << line.message;
        EXPECT_GE(delta, 0);
        EXPECT_LT(delta, 60);
        different.insert(line.message);
    }
    // Of sixty numbers drawn 500 times fewer than 40 come once in far more than 10^15 runs.
    EXPECT_GE(different.size(), 40U);
    queues_.advance(999ms);
    EXPECT_THAT(beacon_.calls(), IsEmpty());
    queues_.advance(1ms);
    EXPECT_EQ(beacon_.callsOf(BeaconOperation::SendOne).size(), 500U);
}

TEST_F(VelaReportingSessionSendingTest, OtherTypesThanAlarmsHaveNoDelta) {
    for (const std::uint16_t type : {std::uint16_t{0}, std::uint16_t{3}, std::uint16_t{5}, std::uint16_t{65535}}) {
        log_.clear();
        sendSingle({{"a", 1}}, type);
        EXPECT_THAT(log_.lines(),
                    ElementsAre(beaconLine(LogLevel::Debug, "sending single message after delta 0 for service " +
                                                                std::to_string(type))));
    }
}

TEST_F(VelaReportingSessionSendingTest, ASingleMessageOutlivesItsSession) {
    session().setServiceType(3);
    send({{"a", 1}});
    release();
    queues_.runUntilIdle();
    EXPECT_EQ(log_.lines().back(), sessionLine(LogLevel::Info, "deallocing this session 42"));
    EXPECT_EQ(queues_.liveQueues(), 0U);
    queues_.advance(1s);
    EXPECT_EQ(beacon_.callsOf(BeaconOperation::SendOne).size(), 1U);
    EXPECT_EQ(log_.lines().back(), beaconLine(LogLevel::Debug, "message {a = 1; audiotag = GenericStart;} : category 1 "
                                                               ": type 1"));
}

TEST_F(VelaReportingSessionSendingTest, MessagesDuringTheWaitDelayNobody) {
    session().start();
    queues_.runUntilIdle();
    int replies = 0;
    for (int message = 0; message < 100; ++message) {
        session().sendMessage({{"a", message}}, 1, 1, [&](const std::optional<platform::Failure>&) { ++replies; });
    }
    EXPECT_EQ(replies, 100);
    EXPECT_EQ(countOf(session(), "Generic_Start"), 100U);
    beacon_.findBackends();
    queues_.runUntilIdle();
    EXPECT_EQ(sentPayloads().size(), 100U);
}

} // namespace

} // namespace vela
