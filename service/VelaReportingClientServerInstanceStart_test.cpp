// The start of a client's sessions.
#include "service/RecordedInstance_test.h"

namespace vela {

namespace {

using namespace std::chrono_literals;
using ::testing::ElementsAre;

class VelaReportingClientServerInstanceStartTest : public ServiceTest {
protected:
    /// The call alone: its reply may be seconds away.
    std::shared_ptr<Answer<bool>> beginStart(const Client& client, std::int64_t reporterID,
                                             std::shared_ptr<void> underWay = nullptr) {
        auto answer = newAnswer<bool>();
        client.operations().startReportingSessionForID(reporterID, std::move(underWay), Answer<bool>::into(answer));
        queues_.runUntilIdle();
        return answer;
    }
};

class VelaReportingClientServerInstanceStartStepsTest : public RecordedInstanceTest {};

// Start.

TEST_F(VelaReportingClientServerInstanceStartTest, AStartOfNothingAnswersAndCountsNothing) {
    const Client client = connect(7);
    EXPECT_EQ(client.start(0), true);
    EXPECT_EQ(client.start(42), true);
    EXPECT_EQ(activeSessionCount(), 0U);
    EXPECT_THAT(log_.lines(), ElementsAre(serviceLine(LogLevel::Debug, "starting session for reporter 0"),
                                          serviceLine(LogLevel::Debug, "starting session for reporter 42")));
}

TEST_F(VelaReportingClientServerInstanceStartTest, AStartOfAStartedSessionAnswersAtOnceAndCountsNothing) {
    const Client client = connect(7);
    client.running(42);
    log_.clear();
    EXPECT_EQ(client.start(42), true);
    EXPECT_EQ(activeSessionCount(), 1U);
    EXPECT_THAT(log_.lines(), ElementsAre(serviceLine(LogLevel::Debug, "starting session for reporter 42")));
}

TEST_F(VelaReportingClientServerInstanceStartTest, AStartLogsTheFeaturesTheSessionsAndTheCount) {
    const Client client = connect(7);
    client.create(42);
    log_.clear();
    EXPECT_EQ(client.start(42), true);
    EXPECT_THAT(serviceLines(), ElementsAre(serviceLine(LogLevel::Debug, "starting session for reporter 42"),
                                            serviceLine(LogLevel::Default, "getting features"),
                                            serviceLine(LogLevel::Default, "sessions for client 7 : (" +
                                                                               shown(42, "unknown", 7, true) + ")"),
                                            serviceLine(LogLevel::Default, "1 active reporting session(s) (" +
                                                                               shown(42, "unknown", 7, true) + ")")));
}

TEST_F(VelaReportingClientServerInstanceStartTest, TheFifthSessionReportsInRealTimeAndTheSixthDoesNot) {
    const Client client = connect(7);
    for (std::int64_t reporterID = 1; reporterID <= 6; ++reporterID) {
        client.running(reporterID);
    }
    EXPECT_TRUE(client.session(5)->beaconReportingEnabled());
    EXPECT_FALSE(client.session(6)->beaconReportingEnabled());
    EXPECT_TRUE(client.session(6)->started());
    EXPECT_EQ(activeSessionCount(), 6U);
    EXPECT_EQ(fakes_.beacon.callsOf(BeaconOperation::CreateSession).size(), 5U);
}

TEST_F(VelaReportingClientServerInstanceStartTest, AStartDecidesAnewWhatTheCreationSaid) {
    const Client client = connect(7);
    setActiveSessionCount(5);
    client.create(1);
    EXPECT_TRUE(client.session(1)->beaconReportingEnabled());
    client.start(1);
    EXPECT_FALSE(client.session(1)->beaconReportingEnabled());
}

TEST_F(VelaReportingClientServerInstanceStartStepsTest, AStartTakesItsStepsInOrder) {
    recordingDelegate_->features = Dictionary{{"ringerstate", true}};
    client_.create(42);
    steps();
    std::optional<bool> hadSnapShot;
    fakes_.spoor.setObserver([&](std::uint32_t code) {
        if (code == kTraceStart) {
            hadSnapShot = client_.session(42)->driverSnapShot().has_value();
            steps_.emplace_back("session starts");
        } else if (code == kTraceSend) {
            steps_.emplace_back("session sends");
        }
    });
    client_.start(42);
    EXPECT_THAT(steps(),
                ElementsAre("count 1", "session starts", "snapshot, blocking", "features", "session sends", "active"));
    EXPECT_EQ(hadSnapShot, false);
    EXPECT_TRUE(client_.session(42)->driverSnapShot().has_value());
}

TEST_F(VelaReportingClientServerInstanceStartStepsTest, ATestSessionIsAnsweredBetweenTheFeaturesAndTheCount) {
    fakes_.device.setFeature("AudioAnalytics", "Tracing", true);
    recordingDelegate_->features = Dictionary{{"ringerstate", true}};
    client_.create(42);
    client_.setServiceType(AudioServiceTypeTest, 42);
    steps();
    client_.operations().startReportingSessionForID(
        42, nullptr, [this](const std::optional<platform::IpcError>&, bool) { steps_.emplace_back("reply"); });
    queues_.runNext();
    EXPECT_THAT(steps(), ElementsAre("count 1", "session starts", "snapshot, blocking", "features", "session sends",
                                     "reply", "active"));
}

TEST_F(VelaReportingClientServerInstanceStartStepsTest, WithTheLogOffNobodyGathersTheActiveSessions) {
    client_.create(42);
    setLogDestination(&log_, LogLevel::Error);
    steps();
    client_.start(42);
    client_.stop(42);
    EXPECT_THAT(steps(), ElementsAre("count 1", "session starts", "snapshot, blocking", "features",
                                     "driver logs 42, blocking", "session stops, blocking", "count 0"));
}

// The reply of a start.

TEST_F(VelaReportingClientServerInstanceStartTest, AStartIsAnsweredWhenBackendsAreFound) {
    fakes_.beacon.setDiscovery(BeaconDiscovery::Waits);
    const Client client = connect(7);
    client.create(42);
    const auto answer = beginStart(client, 42);
    EXPECT_EQ(answer->calls, 0);
    fakes_.beacon.findBackends();
    queues_.runUntilIdle();
    EXPECT_EQ(answer->calls, 1);
    EXPECT_EQ(answer->error, std::nullopt);
    EXPECT_EQ(answer->values, std::tuple(true));
}

TEST_F(VelaReportingClientServerInstanceStartTest, AStartIsAnsweredWhenNoneAreFound) {
    fakes_.beacon.setDiscovery(BeaconDiscovery::FindsNone);
    const Client client = connect(7);
    client.create(42);
    EXPECT_EQ(beginStart(client, 42)->values, std::tuple(true));
}

TEST_F(VelaReportingClientServerInstanceStartTest, AStartIsAnsweredAfterNineSecondsAtTheLatest) {
    fakes_.beacon.setDiscovery(BeaconDiscovery::Lost);
    const Client client = connect(7);
    client.create(42);
    const auto answer = beginStart(client, 42);
    queues_.advance(8'999ms);
    EXPECT_EQ(answer->calls, 0);
    queues_.advance(1ms);
    EXPECT_EQ(answer->calls, 1);
}

TEST_F(VelaReportingClientServerInstanceStartTest, AStartWithoutBeaconIsAnsweredAtOnce) {
    const Client client = connect(7);
    setActiveSessionCount(6);
    client.create(42);
    EXPECT_EQ(beginStart(client, 42)->calls, 1);
}

TEST_F(VelaReportingClientServerInstanceStartTest, AStartIsUnderWayUntilItsItemEndsAndNotUntilItsReply) {
    fakes_.beacon.setDiscovery(BeaconDiscovery::Waits);
    const Client client = connect(7);
    client.create(42);
    auto underWay = std::make_shared<int>(0);
    const std::weak_ptr<int> watched = underWay;
    const auto answer = newAnswer<bool>();
    client.operations().startReportingSessionForID(42, std::move(underWay), Answer<bool>::into(answer));
    EXPECT_FALSE(watched.expired());
    queues_.runNext();
    EXPECT_TRUE(watched.expired());
    EXPECT_EQ(answer->calls, 0);
}

TEST_F(VelaReportingClientServerInstanceStartTest, ABlockThatIsHeldAlreadyIsCalledAtTheStart) {
    fakes_.beacon.setDiscovery(BeaconDiscovery::Waits);
    const Client client = connect(7);
    client.create(42);
    const auto first = beginStart(client, 42);
    client.session(42)->stop(); // not by the client: the block stays
    EXPECT_EQ(first->calls, 0);
    const auto second = beginStart(client, 42);
    EXPECT_EQ(first->calls, 1);
    EXPECT_EQ(first->values, std::tuple(true));
    EXPECT_EQ(second->calls, 0);
}

TEST_F(VelaReportingClientServerInstanceStartTest, WithTracingOnATestSessionIsAnsweredTwice) {
    fakes_.device.setFeature("AudioAnalytics", "Tracing", true);
    const Client client = connect(7);
    client.create(42);
    client.setServiceType(11, 42);
    const auto answer = newAnswer<bool>();
    client.operations().startReportingSessionForID(42, nullptr, Answer<bool>::into(answer));
    queues_.runNext();
    EXPECT_EQ(answer->calls, 1);
    EXPECT_EQ(answer->values, std::tuple(true));
    queues_.runUntilIdle();
    EXPECT_EQ(answer->calls, 2); // of which the endpoint sends the first
}

TEST_F(VelaReportingClientServerInstanceStartTest, WithTracingOnOtherSessionsAreAnsweredOnce) {
    fakes_.device.setFeature("AudioAnalytics", "Tracing", true);
    const Client client = connect(7);
    client.create(42);
    client.setServiceType(10, 42);
    EXPECT_EQ(beginStart(client, 42)->calls, 1);
}

TEST_F(VelaReportingClientServerInstanceStartTest, WithTracingOffATestSessionIsAnsweredOnce) {
    const Client client = connect(7);
    client.create(42);
    client.setServiceType(11, 42);
    EXPECT_EQ(beginStart(client, 42)->calls, 1);
}

} // namespace

} // namespace vela
