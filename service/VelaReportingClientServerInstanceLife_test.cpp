// Stop and destruction of sessions, and the end of their connection.
#include "service/RecordedInstance_test.h"

namespace vela {

namespace {

using ::testing::ElementsAre;
using ::testing::IsEmpty;

class VelaReportingClientServerInstanceLifeTest : public ServiceTest {};
class VelaReportingClientServerInstanceStepsTest : public RecordedInstanceTest {};

// Stop.

TEST_F(VelaReportingClientServerInstanceLifeTest, AStopOfNothingAnswers) {
    const Client client = connect(7);
    client.create(42);
    setActiveSessionCount(3);
    log_.clear();
    EXPECT_EQ(client.stop(0), true);
    EXPECT_EQ(client.stop(41), true);
    EXPECT_EQ(client.stop(42), true);
    EXPECT_EQ(activeSessionCount(), 3U);
    EXPECT_THAT(log_.lines(), ElementsAre(serviceLine(LogLevel::Debug, "stopping session for reporter 0"),
                                          serviceLine(LogLevel::Debug, "stopping session for reporter 41"),
                                          serviceLine(LogLevel::Default, "stopping 41"),
                                          serviceLine(LogLevel::Debug, "stopping session for reporter 42"),
                                          serviceLine(LogLevel::Default, "stopping 42")));
}

TEST_F(VelaReportingClientServerInstanceLifeTest, AStopLogsWhatIsLeft) {
    const Client client = connect(7);
    client.running(1);
    client.running(2);
    log_.clear();
    EXPECT_EQ(client.stop(2), true);
    EXPECT_EQ(activeSessionCount(), 1U);
    EXPECT_THAT(
        serviceLines(),
        ElementsAre(serviceLine(LogLevel::Debug, "stopping session for reporter 2"),
                    serviceLine(LogLevel::Default, "sessions for client 7 : (" + shown(1, "muse", 7, true) + ", " +
                                                       shown(2, "muse", 7, false) + ")"),
                    serviceLine(LogLevel::Default, "1 active reporting session(s) (" + shown(1, "muse", 7, true) + ")"),
                    serviceLine(LogLevel::Default, "stopping 2")));
}

TEST_F(VelaReportingClientServerInstanceStepsTest, AStopTakesItsStepsInOrder) {
    client_.create(42);
    client_.start(42);
    steps();
    std::optional<bool> hadSnapShot;
    fakes_.spoor.setObserver([&](std::uint32_t code) {
        if (code == kTraceStop) {
            hadSnapShot = client_.session(42)->driverSnapShot().has_value();
            steps_.emplace_back("session stops");
        }
    });
    client_.stop(42);
    EXPECT_THAT(steps(), ElementsAre("driver logs 42, blocking", "session stops", "count 0", "active"));
    EXPECT_EQ(hadSnapShot, false);
}

TEST_F(VelaReportingClientServerInstanceStepsTest, AStopAnswersAStartThatWaitsBehindTheCountAndBeforeTheLine) {
    fakes_.beacon.setDiscovery(BeaconDiscovery::Waits);
    client_.create(42);
    client_.operations().startReportingSessionForID(
        42, nullptr, [this](const std::optional<platform::IpcError>&, bool) { steps_.emplace_back("start replied"); });
    queues_.runUntilIdle();
    steps();
    client_.stop(42);
    EXPECT_THAT(steps(), ElementsAre("driver logs 42, blocking", "session stops, blocking", "count 0", "start replied",
                                     "active"));
}

TEST_F(VelaReportingClientServerInstanceLifeTest, APendingStartIsAnsweredBeforeItsStop) {
    fakes_.beacon.setDiscovery(BeaconDiscovery::Waits);
    const Client client = connect(7);
    client.create(42);
    std::vector<std::string> answers;
    client.operations().startReportingSessionForID(
        42, nullptr, [&](const std::optional<platform::IpcError>&, bool) { answers.emplace_back("start"); });
    client.operations().stopReportingSessionForID(
        42, [&](const std::optional<platform::IpcError>&, bool) { answers.emplace_back("stop"); });
    queues_.runUntilIdle();
    EXPECT_THAT(answers, ElementsAre("start", "stop"));
}

TEST_F(VelaReportingClientServerInstanceLifeTest, DriverMessagesAreSentBeforeTheSummary) {
    publishFrames();
    const Client client = connect(7);
    client.running(42);
    client.stop(42);
    const auto sent = fakes_.beacon.callsOf(BeaconOperation::Send);
    ASSERT_EQ(sent.size(), 2U);
    EXPECT_EQ(sent[0].category, 12);
    EXPECT_EQ(sent[1].category, 65535);
    EXPECT_EQ(sent[1].payload.find("Simple_Frames"), Value("3"));
}

// Destroy.

TEST_F(VelaReportingClientServerInstanceLifeTest, DestroyTakesASessionOffTheMap) {
    const Client client = connect(7);
    client.create(42);
    log_.clear();
    EXPECT_EQ(client.destroy(42), true);
    EXPECT_EQ(client.session(42), nullptr);
    EXPECT_EQ(client.destroy(42), true);
    EXPECT_THAT(serviceLines(), ElementsAre(serviceLine(LogLevel::Debug, "destroying session for reporter 42"),
                                            serviceLine(LogLevel::Default, "destroying 42"),
                                            serviceLine(LogLevel::Debug, "destroying session for reporter 42"),
                                            serviceLine(LogLevel::Default, "destroying 42")));
    EXPECT_EQ(linesSaying("ending session 42"), 0U);
    EXPECT_EQ(linesSaying("deallocing this session 42"), 1U);
}

TEST_F(VelaReportingClientServerInstanceStepsTest, DestroyStopsAStartedSessionAndNothingElse) {
    fakes_.beacon.setDiscovery(BeaconDiscovery::Waits);
    client_.create(42);
    const auto pending = newAnswer<bool>();
    client_.operations().startReportingSessionForID(42, nullptr, Answer<bool>::into(pending));
    queues_.runUntilIdle();
    const auto session = client_.session(42);
    steps();
    EXPECT_EQ(client_.destroy(42), true);
    EXPECT_THAT(steps(), ElementsAre("session stops, blocking"));
    EXPECT_EQ(recordingDelegate_->count, 1U);
    EXPECT_TRUE(session->driverSnapShot().has_value());
    EXPECT_EQ(pending->calls, 0); // the session still holds it
}

// The end of the connection.

TEST_F(VelaReportingClientServerInstanceStepsTest, TheEndStopsStartedSessionsAndRemovesTheClient) {
    client_.create(1);
    client_.create(2);
    client_.create(3);
    client_.start(3);
    client_.start(1);
    recordingDelegate_->clients = {client_.instance()};
    steps();
    log_.clear();
    client_.instance()->handleConnectionError();
    EXPECT_THAT(log_.lines(), IsEmpty());
    EXPECT_THAT(steps(), IsEmpty());
    queues_.runUntilIdle();
    EXPECT_THAT(steps(), ElementsAre("session stops, blocking", "session stops, blocking", "remove 7"));
    EXPECT_THAT(client_.instance()->clientReportingSessions(), IsEmpty());
    EXPECT_EQ(recordingDelegate_->count, 2U);
    EXPECT_EQ(linesSaying("ending session 2"), 0U);
    EXPECT_EQ(linesSaying("ending session 3"), 2U);
    EXPECT_THAT(serviceLines(), ElementsAre(serviceLine(LogLevel::Default, "removing 7 from the server client list")));
}

TEST_F(VelaReportingClientServerInstanceLifeTest, ASecondEndDoesNothing) {
    const Client client = connect(7);
    client.instance()->handleConnectionError();
    client.instance()->handleConnectionError();
    queues_.runUntilIdle();
    EXPECT_THAT(log_.lines(), ElementsAre(serviceLine(LogLevel::Default, "removing 7 from the server client list")));
}

TEST_F(VelaReportingClientServerInstanceLifeTest, CallsMadeBeforeTheEndAreHandledFirst) {
    const Client client = connect(7);
    const auto session = client.running(42);
    for (int number = 0; number < 500; ++number) {
        client.operations().sendMessage({{"number", number}}, 1, 1, to({42}), Answer<>::into(newAnswer<>()));
    }
    client.connection->end();
    queues_.runUntilIdle();
    EXPECT_EQ(fakes_.beacon.callsOf(BeaconOperation::Send).size(), 501U); // with the summary
}

TEST_F(VelaReportingClientServerInstanceLifeTest, AfterSixLossesNoNewSessionReportsInRealTime) {
    const Client client = connect(7);
    for (std::int64_t reporterID = 1; reporterID <= 3; ++reporterID) {
        client.running(reporterID);
        client.destroy(reporterID);
        client.running(10);
        client.create(10); // replaced while started
    }
    EXPECT_EQ(activeSessionCount(), 6U);
    client.create(20);
    EXPECT_FALSE(client.session(20)->beaconReportingEnabled());
    client.start(20);
    EXPECT_FALSE(client.session(20)->beaconReportingEnabled());
    client.connection->end();
    queues_.runUntilIdle();
    EXPECT_EQ(activeSessionCount(), 7U);
}

} // namespace

} // namespace vela
