// A session's real-time reporting: set-up, wait for back ends, transaction, queued messages and end.
#include "session/Session_test.h"

#include <limits>

namespace vela {

namespace {

using namespace std::chrono_literals;
using ::testing::Contains;
using ::testing::ElementsAre;
using ::testing::IsEmpty;

class VelaReportingSessionBeaconTest : public SessionTest {
protected:
    Dictionary sessionInfo() {
        const auto calls = beacon_.callsOf(BeaconOperation::CreateSession);
        return calls.size() == 1 ? calls[0].sessionInfo : Dictionary();
    }
    Dictionary userInfo() {
        const auto calls = beacon_.callsOf(BeaconOperation::CreateSession);
        return calls.size() == 1 ? calls[0].userInfo : Dictionary();
    }
    void startAndRun() {
        session();
        forget();
        session().start();
        queues_.runUntilIdle();
    }
    /// Stores a block that counts its calls.
    void storeBlock() {
        session().setTransactionCompleteBlock([this](std::optional<platform::IpcError> error, bool done) {
            EXPECT_FALSE(error.has_value());
            EXPECT_TRUE(done);
            ++replies_;
        });
    }
    int replies_ = 0;
};

// Set-up.

TEST_F(VelaReportingSessionBeaconTest, TheSetUpInItsOrder) {
    startAndRun();
    EXPECT_THAT(beacon_.operations(),
                ElementsAre(BeaconOperation::NewToken, BeaconOperation::CreateSession, BeaconOperation::Discover));
    EXPECT_THAT(log_.lines(), ElementsAre(sessionLine(LogLevel::Debug, "starting session owned by 42"),
                                          beaconLine(LogLevel::Debug, "entering beaconreporting setupBeaconReporting"),
                                          beaconLine(LogLevel::Default, "waiting to find backends")));
    EXPECT_EQ(queues_.suspendedQueues(), 1U);
    EXPECT_EQ(queues_.blockingDepth(), 0U);
}

TEST_F(VelaReportingSessionBeaconTest, TheTokenHasNoParentAndIsKept) {
    startAndRun();
    EXPECT_EQ(beacon_.callsOf(BeaconOperation::NewToken)[0].token, Value());
    EXPECT_EQ(session().beaconReportingAgentToken(), Value("token 1"));
    EXPECT_NE(session().beaconReportingSession(), nullptr);
}

TEST_F(VelaReportingSessionBeaconTest, SessionInformationHasSixEntriesInOrder) {
    session().setServiceType(3);
    startAndRun();
    EXPECT_EQ(sessionInfo(), (Dictionary{{"client_type", 19},
                                         {"client_version", 2.1F},
                                         {"session_id", std::int64_t{42}},
                                         {"batch_events", true},
                                         {"hierarchy_token", "token 1"},
                                         {"contains_real_time_events", false}}));
    EXPECT_THAT(keysOf(sessionInfo()), ElementsAre("client_type", "client_version", "session_id", "batch_events",
                                                   "hierarchy_token", "contains_real_time_events"));
}

TEST_F(VelaReportingSessionBeaconTest, TheClientVersionIsA32BitFloat) {
    startAndRun();
    EXPECT_EQ(sessionInfo().find("client_version").kind(), ValueKind::Real32);
    EXPECT_EQ(sessionInfo().find("client_version").real(), static_cast<double>(2.1F));
    EXPECT_EQ(sessionInfo().find("session_id").kind(), ValueKind::Integer);
    EXPECT_EQ(sessionInfo().find("batch_events").kind(), ValueKind::Boolean);
}

TEST_F(VelaReportingSessionBeaconTest, TheWholeReporterIDIsTheSessionID) {
    const auto negative = makeSession(std::numeric_limits<std::int64_t>::min() + 1);
    negative->setBeaconReportingEnabled(true);
    negative->start();
    queues_.runUntilIdle();
    EXPECT_EQ(sessionInfo().find("session_id"), Value(std::int64_t{-9223372036854775807}));
}

TEST_F(VelaReportingSessionBeaconTest, ApiUsageIsNotBatched) {
    session().setServiceType(12);
    startAndRun();
    EXPECT_EQ(sessionInfo().find("batch_events"), Value(false));
    EXPECT_EQ(sessionInfo().find("contains_real_time_events"), Value(true));
}

TEST_F(VelaReportingSessionBeaconTest, AnUnknownTypeIsBatched) {
    startAndRun();
    EXPECT_EQ(sessionInfo().find("batch_events"), Value(true));
    EXPECT_EQ(sessionInfo().find("contains_real_time_events"), Value(false));
    EXPECT_EQ(userInfo().find("service_name"), Value("unknown_session"));
}

TEST_F(VelaReportingSessionBeaconTest, UserInformationNamesClientAndService) {
    session().setServiceType(3);
    startAndRun();
    EXPECT_EQ(userInfo(), (Dictionary{{"client_name", "com.orvex.vela"}, {"service_name", "haptics_session"}}));
}

TEST_F(VelaReportingSessionBeaconTest, ConfigurationEntriesFollowInTheUserInformation) {
    session().setConfiguration(Dictionary{{"colour", "blue"}, {"level", 3}});
    startAndRun();
    EXPECT_EQ(
        userInfo(),
        (Dictionary{
            {"client_name", "com.orvex.vela"}, {"service_name", "unknown_session"}, {"colour", "blue"}, {"level", 3}}));
}

TEST_F(VelaReportingSessionBeaconTest, AConfigurationMayOverrideClientAndServiceName) {
    session().setConfiguration(Dictionary{{"service_name", "mine"}, {"client_name", "com.example"}});
    startAndRun();
    EXPECT_EQ(userInfo(), (Dictionary{{"client_name", "com.example"}, {"service_name", "mine"}}));
}

TEST_F(VelaReportingSessionBeaconTest, TheApplicationIsTheClientBundleID) {
    session().setConfiguration(Dictionary{{"HostApplicationDisplayID", "com.example.player"}});
    startAndRun();
    EXPECT_EQ(sessionInfo().size(), 7U);
    EXPECT_EQ(keysOf(sessionInfo()).back(), "client_bundle_id");
    EXPECT_EQ(sessionInfo().find("client_bundle_id"), Value("com.example.player"));
    EXPECT_EQ(userInfo().find("HostApplicationDisplayID"), Value("com.example.player"));
}

TEST_F(VelaReportingSessionBeaconTest, TheSetUpUsesWhatHeldAtTheStart) {
    session().setServiceType(3);
    session().setConfiguration(Dictionary{{"a", 1}});
    session().start();
    session().setServiceType(12);
    session().setConfiguration(Dictionary{{"a", 2}, {"HostApplicationDisplayID", "late"}});
    queues_.runUntilIdle();
    EXPECT_EQ(userInfo(),
              (Dictionary{{"client_name", "com.orvex.vela"}, {"service_name", "haptics_session"}, {"a", 1}}));
    EXPECT_EQ(sessionInfo().find("batch_events"), Value(true));
    EXPECT_FALSE(sessionInfo().contains("client_bundle_id"));
}

TEST_F(VelaReportingSessionBeaconTest, ATestSessionIsNotSetUp) {
    session().setServiceType(11);
    startAndRun();
    EXPECT_THAT(beacon_.calls(), IsEmpty());
    EXPECT_THAT(log_.linesOf("velari"),
                ElementsAre(beaconLine(LogLevel::Debug, "entering beaconreporting setupBeaconReporting")));
    EXPECT_EQ(queues_.suspendedQueues(), 0U);
    EXPECT_EQ(session().beaconReportingAgentToken(), Value());
}

// Discovery and wait.

TEST_F(VelaReportingSessionBeaconTest, BackendsThatAreFoundInsideTheCall) {
    beacon_.setDiscovery(BeaconDiscovery::FindsBackends);
    beacon_.setBackends({"store", "network"});
    startAndRun();
    EXPECT_THAT(log_.linesOf("velari"),
                ElementsAre(beaconLine(LogLevel::Debug, "entering beaconreporting setupBeaconReporting"),
                            beaconLine(LogLevel::Default, "list of backends (store, network)"),
                            beaconLine(LogLevel::Default, "waiting to find backends"),
                            beaconLine(LogLevel::Default, "continuing with backends!")));
    EXPECT_TRUE(session().getBeaconReportingStartedState());
    EXPECT_NE(session().beaconReportingSession(), nullptr);
    EXPECT_EQ(queues_.pendingTimers(), 0U);
}

TEST_F(VelaReportingSessionBeaconTest, BackendsThatAreFoundLater) {
    startAndRun();
    queues_.advance(4s);
    log_.clear();
    beacon_.findBackends();
    queues_.runUntilIdle();
    EXPECT_THAT(log_.lines(), ElementsAre(beaconLine(LogLevel::Default, "list of backends (store)"),
                                          beaconLine(LogLevel::Default, "continuing with backends!")));
    EXPECT_TRUE(session().getBeaconReportingStartedState());
    EXPECT_EQ(log_.records()[0].reporter, std::optional<std::int64_t>(42));
}

TEST_F(VelaReportingSessionBeaconTest, AnEmptyListOfBackendsCountsAsFound) {
    beacon_.setBackends({});
    startAndRun();
    log_.clear();
    beacon_.findBackends();
    queues_.runUntilIdle();
    EXPECT_THAT(log_.lines(), ElementsAre(beaconLine(LogLevel::Default, "list of backends ()"),
                                          beaconLine(LogLevel::Default, "continuing with backends!")));
    EXPECT_TRUE(session().getBeaconReportingStartedState());
}

TEST_F(VelaReportingSessionBeaconTest, NoBackends) {
    startAndRun();
    log_.clear();
    beacon_.findNone();
    queues_.runUntilIdle();
    EXPECT_THAT(log_.lines(),
                ElementsAre(beaconLine(LogLevel::Error, "no backends found, this session won't get sent to the server"),
                            beaconLine(LogLevel::Default, "failed to find backend")));
    EXPECT_FALSE(session().getBeaconReportingStartedState());
    EXPECT_EQ(session().beaconReportingSession(), nullptr);
    EXPECT_EQ(session().beaconReportingAgentToken(), Value());
}

TEST_F(VelaReportingSessionBeaconTest, TheWaitLastsNineSeconds) {
    startAndRun();
    log_.clear();
    queues_.advance(8'999ms);
    EXPECT_THAT(log_.lines(), IsEmpty());
    EXPECT_NE(session().beaconReportingSession(), nullptr);
    queues_.advance(1ms);
    EXPECT_THAT(log_.lines(), ElementsAre(beaconLine(LogLevel::Default, "timed out waiting for backends")));
    EXPECT_EQ(session().beaconReportingSession(), nullptr);
    EXPECT_EQ(session().beaconReportingAgentToken(), Value());
    EXPECT_TRUE(session().started());
}

TEST_F(VelaReportingSessionBeaconTest, ADiscoveryThatIsLostTimesOutAsWell) {
    beacon_.setDiscovery(BeaconDiscovery::Lost);
    startAndRun();
    queues_.advance(9s);
    EXPECT_EQ(log_.lines().back(), beaconLine(LogLevel::Default, "timed out waiting for backends"));
}

TEST_F(VelaReportingSessionBeaconTest, AnAnswerAfterTheTimeOutSetsTheFlagButNothingIsSent) {
    startAndRun();
    queues_.advance(9s);
    beacon_.findBackends();
    EXPECT_TRUE(session().getBeaconReportingStartedState());
    EXPECT_EQ(session().beaconReportingSession(), nullptr);
    send({{"a", 1}});
    queues_.runUntilIdle();
    EXPECT_THAT(sentPayloads(), IsEmpty());
}

TEST_F(VelaReportingSessionBeaconTest, ALateAnswerSatisfiesTheWaitOfTheNextStart) {
    startAndRun();
    queues_.advance(9s);
    beacon_.findBackends();
    session().stop();
    queues_.runUntilIdle();
    log_.clear();
    session().start();
    queues_.runUntilIdle();
    // The end had cleared the flag, so the taken answer says nothing of back ends.
    EXPECT_THAT(log_.linesOf("velari"),
                ElementsAre(beaconLine(LogLevel::Debug, "entering beaconreporting setupBeaconReporting"),
                            beaconLine(LogLevel::Default, "waiting to find backends"),
                            beaconLine(LogLevel::Default, "failed to find backend")));
    EXPECT_EQ(queues_.suspendedQueues(), 0U);
}

TEST_F(VelaReportingSessionBeaconTest, AnAnswerOfTheFirstStartDuringTheWaitOfTheSecondIsTakenForIts) {
    startAndRun();
    session().stop();
    session().start();
    queues_.advance(9s); // the first wait ends, its end runs, the second wait begins
    EXPECT_EQ(beacon_.waitingDiscoveries(), 2U);
    log_.clear();
    beacon_.findBackends();
    queues_.runUntilIdle();
    EXPECT_EQ(log_.lines().back(), beaconLine(LogLevel::Default, "continuing with backends!"));
}

TEST_F(VelaReportingSessionBeaconTest, MessagesQueuedDuringTheWaitAreSentInOrderWhenBackendsAreFound) {
    startAndRun();
    for (int number = 1; number <= 3; ++number) {
        send({{"number", number}});
    }
    queues_.advance(4s);
    EXPECT_THAT(sentPayloads(), IsEmpty());
    beacon_.findBackends();
    queues_.runUntilIdle();
    EXPECT_THAT(sentPayloads(), ElementsAre(Dictionary{{"number", 1}, {"audiotag", "GenericStart"}},
                                            Dictionary{{"number", 2}, {"audiotag", "GenericStart"}},
                                            Dictionary{{"number", 3}, {"audiotag", "GenericStart"}}));
}

TEST_F(VelaReportingSessionBeaconTest, MessagesQueuedDuringTheWaitAreDroppedWhenItTimesOut) {
    startAndRun();
    for (int number = 1; number <= 3; ++number) {
        send({{"number", number}});
    }
    queues_.advance(9s);
    EXPECT_THAT(sentPayloads(), IsEmpty());
    EXPECT_EQ(queues_.pendingItems(), 0U);
    EXPECT_THAT(recordedKeys(), ElementsAre("Generic_Start_1", "Generic_Start_2", "Generic_Start_3"));
}

TEST_F(VelaReportingSessionBeaconTest, StopDuringTheWaitDeliversItsMessagesFirst) {
    startAndRun();
    send({{"a", 1}});
    session().stop();
    release();
    queues_.advance(4s);
    beacon_.clearCalls();
    beacon_.findBackends();
    queues_.runUntilIdle();
    EXPECT_THAT(beacon_.operations(), ElementsAre(BeaconOperation::Send, BeaconOperation::Send, BeaconOperation::Flush,
                                                  BeaconOperation::EndSession));
}

// Start's transaction.

TEST_F(VelaReportingSessionBeaconTest, TheStartIsAnsweredWhenBackendsAreFound) {
    startAndRun();
    storeBlock();
    EXPECT_EQ(replies_, 0);
    beacon_.findBackends();
    queues_.runUntilIdle();
    EXPECT_EQ(replies_, 1);
    queues_.advance(20s);
    EXPECT_EQ(replies_, 1);
}

TEST_F(VelaReportingSessionBeaconTest, TheStartIsAnsweredWhenThereAreNoBackends) {
    startAndRun();
    storeBlock();
    beacon_.findNone();
    queues_.runUntilIdle();
    EXPECT_EQ(replies_, 1);
}

TEST_F(VelaReportingSessionBeaconTest, TheStartIsAnsweredWhenTheWaitTimesOut) {
    startAndRun();
    storeBlock();
    queues_.advance(8'999ms);
    EXPECT_EQ(replies_, 0);
    queues_.advance(1ms);
    EXPECT_EQ(replies_, 1);
}

TEST_F(VelaReportingSessionBeaconTest, TheOutcomeIsLoggedBeforeTheStartIsAnswered) {
    startAndRun();
    session().setTransactionCompleteBlock([this](std::optional<platform::IpcError>, bool) {
        EXPECT_EQ(linesSaying("timed out waiting for backends"), 1U);
        ++replies_;
    });
    queues_.advance(9s);
    EXPECT_EQ(replies_, 1);
}

TEST_F(VelaReportingSessionBeaconTest, WithoutBeaconTheStartIsAnsweredAtOnce) {
    session().setBeaconReportingEnabled(false);
    session().start();
    storeBlock();
    EXPECT_EQ(replies_, 1);
}

TEST_F(VelaReportingSessionBeaconTest, AfterTheOutcomeTheStartIsAnsweredAtOnce) {
    beacon_.setDiscovery(BeaconDiscovery::FindsNone);
    startAndRun();
    storeBlock();
    EXPECT_EQ(replies_, 1);
}

TEST_F(VelaReportingSessionBeaconTest, TheStartOfATestSessionIsAnsweredWhenItsSetUpRan) {
    session().setServiceType(11);
    session().start();
    storeBlock();
    EXPECT_EQ(replies_, 0);
    queues_.runUntilIdle();
    EXPECT_EQ(replies_, 1);
}

TEST_F(VelaReportingSessionBeaconTest, TheOutcomeOfTheFirstStartDoesNotAnswerTheSecond) {
    session().start();
    session().stop();
    queues_.advance(5s);
    session().start();
    storeBlock();
    queues_.advance(4s);
    EXPECT_EQ(linesSaying("timed out waiting for backends"), 1U);
    EXPECT_EQ(replies_, 0);
    queues_.advance(9s);
    EXPECT_EQ(linesSaying("timed out waiting for backends"), 2U);
    EXPECT_EQ(replies_, 1);
}

TEST_F(VelaReportingSessionBeaconTest, AReleasedSessionStillAnswersItsStart) {
    session().start();
    storeBlock();
    release();
    queues_.advance(9s);
    EXPECT_EQ(replies_, 1);
}

// The queued step of a message.

TEST_F(VelaReportingSessionBeaconTest, AMessageThatIsSentIsLogged) {
    beacon_.setDescription("BeaconSession 1");
    runningSession();
    send({{"a b", 1}}, 0x10000004, 1);
    log_.clear();
    queues_.runUntilIdle();
    EXPECT_THAT(log_.lines(),
                ElementsAre(beaconLine(LogLevel::Debug, "entering beaconreporting sendBeaconReportingMessage"),
                            beaconLine(LogLevel::Debug, "BeaconReportingAgent BeaconSession 1 : message {\"a b\" = 1;} "
                                                        ": category 268435460 : type 1")));
    const auto sent = beacon_.callsOf(BeaconOperation::Send);
    ASSERT_EQ(sent.size(), 1U);
    EXPECT_EQ(sent[0].category, 4);
    EXPECT_EQ(sent[0].type, 1);
    EXPECT_EQ(sent[0].payload, (Dictionary{{"a_b", 1}, {"audiotag", "DSP_PlaybackStart"}}));
}

TEST_F(VelaReportingSessionBeaconTest, TheCategoryOfASummaryIsShownAsMinusOne) {
    runningSession();
    send({{"a", 1}}, 0xFFFFFFFF, 65535);
    queues_.runUntilIdle();
    EXPECT_EQ(log_.lines().back(),
              beaconLine(LogLevel::Debug,
                         "BeaconReportingAgent FakeBeaconSession : message {a = 1;} : category -1 : type 65535"));
    EXPECT_EQ(beacon_.callsOf(BeaconOperation::Send)[0].category, 65535);
}

TEST_F(VelaReportingSessionBeaconTest, TheLineShowsTheTimeThatTheForwardedMessageLacks) {
    runningSession();
    send({{"velareporting_timestamp", 1.5}, {"a", 1}});
    queues_.runUntilIdle();
    EXPECT_EQ(log_.lines().back(),
              beaconLine(LogLevel::Debug, "BeaconReportingAgent FakeBeaconSession : message {velareporting_timestamp = "
                                          "1.5; a = 1;} : category 1 : type 1"));
    EXPECT_THAT(sentPayloads(), ElementsAre(Dictionary{{"a", 1}, {"audiotag", "GenericStart"}}));
}

TEST_F(VelaReportingSessionBeaconTest, AFailedSendIsPassedOverInSilence) {
    runningSession();
    beacon_.failSends("the store is full");
    send({{"a", 1}});
    log_.clear();
    queues_.runUntilIdle();
    EXPECT_THAT(log_.lines(),
                ElementsAre(beaconLine(LogLevel::Debug, "entering beaconreporting sendBeaconReportingMessage")));
    EXPECT_EQ(sentPayloads().size(), 1U);
}

TEST_F(VelaReportingSessionBeaconTest, WhatIsNotForwardedIsSilent) {
    runningSession();
    send({{"a", 1}});
    queues_.runUntilIdle();
    send({{"a", 1}}); // redundant
    forget();
    queues_.runUntilIdle();
    EXPECT_THAT(log_.lines(),
                ElementsAre(beaconLine(LogLevel::Debug, "entering beaconreporting sendBeaconReportingMessage")));
    EXPECT_THAT(beacon_.calls(), IsEmpty());
}

TEST_F(VelaReportingSessionBeaconTest, AMessageIsNotSentWithoutABeaconSession) {
    beacon_.setDiscovery(BeaconDiscovery::FindsNone);
    startAndRun();
    forget();
    send({{"a", 1}});
    queues_.runUntilIdle();
    EXPECT_THAT(beacon_.calls(), IsEmpty());
}

TEST_F(VelaReportingSessionBeaconTest, AMessageIsNotSentWhileTheTypeIsTest) {
    runningSession().setServiceType(11);
    send({{"a", 1}});
    queues_.runUntilIdle();
    EXPECT_THAT(sentPayloads(), IsEmpty());
    session().setServiceType(3);
    send({{"a", 2}});
    queues_.runUntilIdle();
    EXPECT_EQ(sentPayloads().size(), 1U);
}

TEST_F(VelaReportingSessionBeaconTest, AMessageOfAStartedRunIsNeverSentAsASingleOne) {
    runningSession();
    session().stop();
    session().start();
    beacon_.setDiscovery(BeaconDiscovery::FindsNone);
    send({{"a", 1}});
    session().stop();
    queues_.runUntilIdle();
    EXPECT_THAT(sentPayloads(), IsEmpty());
    EXPECT_THAT(beacon_.callsOf(BeaconOperation::SendOne), IsEmpty());
}

TEST_F(VelaReportingSessionBeaconTest, AMessageKeepsTheStartedStateOfItsSending) {
    send({{"a", 1}}); // not started
    beacon_.setDiscovery(BeaconDiscovery::FindsBackends);
    session().start();
    queues_.runUntilIdle();
    EXPECT_THAT(sentPayloads(), IsEmpty());
    queues_.advance(1s);
    EXPECT_EQ(beacon_.callsOf(BeaconOperation::SendOne).size(), 1U);
}

// End.

TEST_F(VelaReportingSessionBeaconTest, TheEndFlushesAndClears) {
    runningSession().stop();
    log_.clear();
    queues_.runUntilIdle();
    EXPECT_THAT(log_.lines(), ElementsAre(beaconLine(LogLevel::Debug, "entering beaconreporting endBeaconReporting"),
                                          beaconLine(LogLevel::Debug, "stopping and setting session to nil")));
    EXPECT_THAT(beacon_.operations(), ElementsAre(BeaconOperation::Flush, BeaconOperation::EndSession));
    EXPECT_EQ(session().beaconReportingSession(), nullptr);
    EXPECT_EQ(session().beaconReportingAgentToken(), Value());
    EXPECT_FALSE(session().getBeaconReportingStartedState());
}

TEST_F(VelaReportingSessionBeaconTest, TheEndWithoutABeaconSessionFlushesNothing) {
    beacon_.setDiscovery(BeaconDiscovery::FindsNone);
    startAndRun();
    session().stop();
    forget();
    queues_.runUntilIdle();
    EXPECT_THAT(beacon_.calls(), IsEmpty());
    EXPECT_THAT(log_.lines(), ElementsAre(beaconLine(LogLevel::Debug, "entering beaconreporting endBeaconReporting"),
                                          beaconLine(LogLevel::Debug, "stopping and setting session to nil")));
}

TEST_F(VelaReportingSessionBeaconTest, ATypeThatBecameTestLeavesTheBeaconSessionSet) {
    runningSession().setServiceType(11);
    session().stop();
    forget();
    queues_.runUntilIdle();
    EXPECT_THAT(log_.lines(), ElementsAre(beaconLine(LogLevel::Debug, "entering beaconreporting endBeaconReporting")));
    EXPECT_THAT(beacon_.calls(), IsEmpty());
    EXPECT_NE(session().beaconReportingSession(), nullptr);
    EXPECT_EQ(session().beaconReportingAgentToken(), Value("token 1"));
    EXPECT_TRUE(session().getBeaconReportingStartedState());
}

TEST_F(VelaReportingSessionBeaconTest, ATypeThatWasTestAtTheStartLeavesMessagesWithoutASession) {
    session().setServiceType(11);
    startAndRun();
    session().setServiceType(3);
    send({{"a", 1}});
    session().stop();
    queues_.runUntilIdle();
    EXPECT_THAT(beacon_.calls(), IsEmpty());
    EXPECT_THAT(log_.lines(), Contains(beaconLine(LogLevel::Debug, "stopping and setting session to nil")));
}

TEST_F(VelaReportingSessionBeaconTest, ARestartMakesANewBeaconSessionAndToken) {
    runningSession().stop();
    session().start();
    queues_.runUntilIdle();
    EXPECT_EQ(session().beaconReportingAgentToken(), Value("token 2"));
    EXPECT_THAT(beacon_.operations(),
                ElementsAre(BeaconOperation::Flush, BeaconOperation::EndSession, BeaconOperation::NewToken,
                            BeaconOperation::CreateSession, BeaconOperation::Discover));
}

} // namespace

} // namespace vela
