// Connections: how they are taken, and what their end sets in motion.
#include "service/Service_test.h"

namespace vela {

namespace {

using namespace std::chrono_literals;
using ::testing::ElementsAre;
using ::testing::IsEmpty;
using ::testing::SizeIs;

class VelaReportingServiceDelegateConnectionTest : public ServiceTest {
protected:
    std::vector<CapturedLine> linesOfTheEndOf(const Client& client) {
        log_.clear();
        client.connection->end();
        return serviceLines();
    }
    std::vector<std::string> eventNames() const {
        std::vector<std::string> names;
        for (const auto& event : fakes_.tally.events()) {
            names.push_back(event.name);
        }
        return names;
    }
};

TEST_F(VelaReportingServiceDelegateConnectionTest, EveryConnectionIsTakenAndLogged) {
    service();
    log_.clear();
    const auto connection = std::make_shared<testing::FakeIpcConnection>(7, "connection 3 of process 7");
    connections_.push_back(connection);
    EXPECT_TRUE(service().shouldAcceptNewConnection(connection));
    EXPECT_THAT(log_.lines(), ElementsAre(serviceLine(LogLevel::Default, "newConnection: connection 3 of process 7"),
                                          serviceLine(LogLevel::Default, "new client with pid 7")));
    EXPECT_TRUE(connection->resumed());
}

TEST_F(VelaReportingServiceDelegateConnectionTest, EverythingIsInPlaceBeforeTheConnectionResumes) {
    const auto connection = std::make_shared<testing::FakeIpcConnection>(7);
    connections_.push_back(connection);
    std::size_t pendingAtResume = 0;
    connection->setObserver([&](std::string_view call) {
        if (call == "resume") {
            pendingAtResume = queues_.pendingItems();
        }
    });
    service().shouldAcceptNewConnection(connection);
    EXPECT_THAT(connection->calls(),
                ElementsAre("setExportedObject", "setInterruptionHandler", "setInvalidationHandler", "resume"));
    EXPECT_EQ(pendingAtResume, 1U);
}

TEST_F(VelaReportingServiceDelegateConnectionTest, AClientIsRegisteredOnTheReportingQueue) {
    const Client client = accept(7);
    EXPECT_EQ(client.instance()->processIdentifier(), 7);
    EXPECT_EQ(client.instance()->clientStartDate(), std::nullopt);
    EXPECT_EQ(client.instance()->clientProcessName(), std::nullopt);
    EXPECT_EQ(fakes_.processes.reads(), 0U);
    clock_.advance(5s);
    queues_.runUntilIdle();
    EXPECT_EQ(client.instance()->clientStartDate(), platform::WallTime(1'700'000'005s));
    EXPECT_EQ(client.instance()->clientProcessName(), "player");
    onQueue([&] { EXPECT_THAT(service().getAllClients(), ElementsAre(client.instance())); });
}

TEST_F(VelaReportingServiceDelegateConnectionTest, AProcessThatIsGoneHasNoNameAsItsNumberMayBeAnothers) {
    const Client client = accept(7);
    client.connection->loseProcess();
    queues_.runUntilIdle();
    EXPECT_NE(client.instance()->clientStartDate(), std::nullopt);
    EXPECT_EQ(client.instance()->clientProcessName(), std::nullopt);
}

TEST_F(VelaReportingServiceDelegateConnectionTest, ACallRightAfterAcceptanceFindsItsClientRegistered) {
    const Client client = accept(7);
    EXPECT_EQ(client.create(42), true);
    EXPECT_EQ(client.allReporters(), (std::vector<std::int64_t>{42}));
}

TEST_F(VelaReportingServiceDelegateConnectionTest, AnInterruptionIsLoggedAndEndsTheClient) {
    const Client client = connect(7);
    client.running(42);
    log_.clear();
    client.connection->interrupt();
    EXPECT_THAT(serviceLines(), ElementsAre(serviceLine(LogLevel::Default, "interruptionHandler: connection exited")));
    queues_.runUntilIdle();
    EXPECT_THAT(serviceLines(), ElementsAre(serviceLine(LogLevel::Default, "interruptionHandler: connection exited"),
                                            serviceLine(LogLevel::Default, "removing 7 from the server client list")));
    EXPECT_THAT(fakes_.tally.events(), IsEmpty());
}

TEST_F(VelaReportingServiceDelegateConnectionTest, TheUptimeIsToldAtOnceAndTheClientRemovedLater) {
    const Client client = connect(7);
    clock_.advance(12'900ms);
    EXPECT_THAT(linesOfTheEndOf(client),
                ElementsAre(serviceLine(LogLevel::Default,
                                        "invalidationHandler: connection exited process=player uptime_sec=12")));
    EXPECT_THAT(eventNames(), ElementsAre("com.orvex.vela.velareportingclientuptime"));
    queues_.runUntilIdle();
    EXPECT_EQ(serviceLines().back(), serviceLine(LogLevel::Default, "dealloc 7 from the server client list"));
    EXPECT_EQ(linesSaying("removing 7 from the server client list"), 1U);
}

TEST_F(VelaReportingServiceDelegateConnectionTest, TheUptimeEventIsSentWithoutAskingWhoUsesIt) {
    const Client client = connect(7);
    clock_.advance(12'900ms);
    client.connection->end();
    EXPECT_THAT(fakes_.tally.calls(), ElementsAre("send com.orvex.vela.velareportingclientuptime"));
    EXPECT_THAT(fakes_.tally.buildAll(), ElementsAre(Dictionary{{"processName", "player"}, {"seconds", 12.9}}));
}

TEST_F(VelaReportingServiceDelegateConnectionTest, AClientThatLeavesBeforeItsRegistrationHasNoUptime) {
    const Client client = accept(7);
    clock_.advance(3s);
    EXPECT_THAT(
        linesOfTheEndOf(client),
        ElementsAre(
            serviceLine(LogLevel::Default, "clientStartDate is nil. clientpid=7 clientprocessname=unknown"),
            serviceLine(LogLevel::Default, "invalidationHandler: connection exited process=(null) uptime_sec=-1"),
            serviceLine(LogLevel::Default, "clientProcessName is nil. clientpid=7")));
    EXPECT_THAT(fakes_.tally.events(), IsEmpty());
    queues_.runUntilIdle();
    EXPECT_EQ(linesSaying("removing 7 from the server client list"), 1U);
    onQueue([this] { EXPECT_THAT(service().getAllClients(), IsEmpty()); });
}

TEST_F(VelaReportingServiceDelegateConnectionTest, ATimeOfDayThatWasSetBackStillGivesAPositiveUptime) {
    const Client client = connect(7);
    clock_.setNow(platform::WallTime(1'699'999'995'500ms));
    EXPECT_THAT(
        linesOfTheEndOf(client),
        ElementsAre(
            serviceLine(LogLevel::Default, "clientStartDate is in the past. clientpid=7 clientprocessname=player"),
            serviceLine(LogLevel::Default, "invalidationHandler: connection exited process=player uptime_sec=4")));
    EXPECT_THAT(fakes_.tally.buildAll(), ElementsAre(Dictionary{{"processName", "player"}, {"seconds", 4.5}}));
}

TEST_F(VelaReportingServiceDelegateConnectionTest, ATimeOfDayThatWasSetBackWithoutANameSaysUnknown) {
    const Client client = connect(99);
    clock_.setNow(platform::WallTime(1'699'999'999s));
    EXPECT_THAT(
        linesOfTheEndOf(client),
        ElementsAre(
            serviceLine(LogLevel::Default, "clientStartDate is in the past. clientpid=99 clientprocessname=unknown"),
            serviceLine(LogLevel::Default, "invalidationHandler: connection exited process=(null) uptime_sec=1"),
            serviceLine(LogLevel::Default, "clientProcessName is nil. clientpid=99")));
}

TEST_F(VelaReportingServiceDelegateConnectionTest, AnUptimeOfNothingIsNoTimeInThePast) {
    EXPECT_THAT(linesOfTheEndOf(connect(7)),
                ElementsAre(serviceLine(LogLevel::Default,
                                        "invalidationHandler: connection exited process=player uptime_sec=0")));
    EXPECT_THAT(fakes_.tally.buildAll(), ElementsAre(Dictionary{{"processName", "player"}, {"seconds", 0.0}}));
}

TEST_F(VelaReportingServiceDelegateConnectionTest, WithoutANameNoUptimeEventIsSent) {
    const Client client = connect(99);
    EXPECT_NE(client.instance()->clientStartDate(), std::nullopt);
    EXPECT_EQ(client.instance()->clientProcessName(), std::nullopt);
    EXPECT_THAT(linesOfTheEndOf(client),
                ElementsAre(serviceLine(LogLevel::Default,
                                        "invalidationHandler: connection exited process=(null) uptime_sec=0"),
                            serviceLine(LogLevel::Default, "clientProcessName is nil. clientpid=99")));
    EXPECT_THAT(fakes_.tally.events(), IsEmpty());
}

TEST_F(VelaReportingServiceDelegateConnectionTest, ABrokenStreamTellsItsUptimeOnceAndRemovesTheClientOnce) {
    const Client client = connect(7);
    client.running(42);
    log_.clear();
    client.connection->breakStream();
    queues_.runUntilIdle();
    EXPECT_THAT(serviceLines(),
                ElementsAre(serviceLine(LogLevel::Default, "interruptionHandler: connection exited"),
                            serviceLine(LogLevel::Default,
                                        "invalidationHandler: connection exited process=player uptime_sec=0"),
                            serviceLine(LogLevel::Default, "removing 7 from the server client list"),
                            serviceLine(LogLevel::Default, "dealloc 7 from the server client list")));
    EXPECT_THAT(fakes_.tally.events(), SizeIs(1));
}

TEST_F(VelaReportingServiceDelegateConnectionTest, TheHandlersDoNotKeepTheClient) {
    const Client client = connect(7);
    const std::weak_ptr<VelaReportingClientServerInstance> instance = client.instance();
    client.connection->interrupt();
    queues_.runUntilIdle();
    EXPECT_FALSE(instance.expired()); // the connection still exports it
    client.connection->setExportedObject(nullptr);
    EXPECT_TRUE(instance.expired());
    EXPECT_EQ(linesSaying("dealloc 7 from the server client list"), 1U);
    log_.clear();
    client.connection->breakStream();
    EXPECT_THAT(
        log_.lines(),
        ElementsAre(
            serviceLine(LogLevel::Default, "interruptionHandler: connection exited"),
            serviceLine(LogLevel::Default, "clientStartDate is nil. clientpid=7 clientprocessname=unknown"),
            serviceLine(LogLevel::Default, "invalidationHandler: connection exited process=(null) uptime_sec=-1"),
            serviceLine(LogLevel::Default, "clientProcessName is nil. clientpid=7")));
}

} // namespace

} // namespace vela
