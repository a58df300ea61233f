#include "service/Service_test.h"
#include "service/VelaReportingClientServerInstance.h"

namespace vela {

namespace {

using ::testing::Contains;
using ::testing::ElementsAre;
using ::testing::IsEmpty;
using ::testing::Not;

class VelaReportingClientServerInstanceTest : public ServiceTest {};

TEST_F(VelaReportingClientServerInstanceTest, ANewOneHasAPidAndNothingElse) {
    const auto instance = accept(7).instance();
    EXPECT_EQ(instance->processIdentifier(), 7);
    EXPECT_EQ(instance->clientStartDate(), std::nullopt);
    EXPECT_EQ(instance->clientProcessName(), std::nullopt);
    EXPECT_THAT(instance->clientReportingSessions(), IsEmpty());
    EXPECT_THAT(log_.lines(), Contains(serviceLine(LogLevel::Default, "new client with pid 7")));
}

TEST_F(VelaReportingClientServerInstanceTest, EveryCallReturnsAtOnceAndWorksOnTheReportingQueue) {
    const Client client = connect(7);
    const auto answer = newAnswer<bool>();
    const auto type = newAnswer<std::uint16_t>();
    const auto description = newAnswer<Dictionary>();
    const auto reporters = newAnswer<std::vector<std::int64_t>>();
    const auto sent = newAnswer<>();
    auto& operations = client.operations();
    operations.createReportingSession(1, Answer<bool>::into(answer));
    operations.setServiceType(1, 1, Answer<bool>::into(answer));
    operations.getServiceNameForReporterID(1, Answer<std::uint16_t>::into(type));
    operations.setConfiguration({}, 1, Answer<bool>::into(answer));
    operations.startReportingSessionForID(1, nullptr, Answer<bool>::into(answer));
    operations.sendMessage({}, 1, 1, std::nullopt, Answer<>::into(sent));
    operations.stopReportingSessionForID(1, Answer<bool>::into(answer));
    operations.destroyReportingSession(1, Answer<bool>::into(answer));
    operations.reporterID(1, Answer<Dictionary>::into(description));
    operations.getAllReporters(Answer<std::vector<std::int64_t>>::into(reporters));
    EXPECT_EQ(queues_.pendingItems(), 10U);
    EXPECT_THAT(log_.lines(), IsEmpty());
    EXPECT_EQ(answer->calls + type->calls + description->calls + reporters->calls + sent->calls, 0);
    queues_.runUntilIdle();
    EXPECT_EQ(answer->calls, 6);
    EXPECT_EQ(type->calls + description->calls + reporters->calls + sent->calls, 4);
}

// Create.

TEST_F(VelaReportingClientServerInstanceTest, CreateStoresASessionOfTheClientsProcess) {
    const Client client = connect(7);
    EXPECT_EQ(client.create(-42), true);
    const auto session = client.session(-42);
    ASSERT_NE(session, nullptr);
    EXPECT_EQ(session->reporterID(), -42);
    EXPECT_THAT(session->processIdentifiers(), ElementsAre(7));
    EXPECT_FALSE(session->started());
    EXPECT_THAT(serviceLines(), ElementsAre(serviceLine(LogLevel::Debug, "creating session for reporter -42"),
                                            serviceLine(LogLevel::Default, "session created for reporter -42")));
}

TEST_F(VelaReportingClientServerInstanceTest, LinesAboutAReporterBearItsNumber) {
    connect(7).create(42);
    for (const auto& record : log_.records()) {
        EXPECT_EQ(record.reporter, 42) << record.line;
    }
}

TEST_F(VelaReportingClientServerInstanceTest, CreateEnablesBeaconUpToFiveActiveSessions) {
    const Client client = connect(7);
    setActiveSessionCount(5);
    client.create(1);
    EXPECT_TRUE(client.session(1)->beaconReportingEnabled());
    setActiveSessionCount(6);
    client.create(2);
    EXPECT_FALSE(client.session(2)->beaconReportingEnabled());
}

TEST_F(VelaReportingClientServerInstanceTest, CreateOverAStartedSessionDropsItWithoutAStop) {
    const Client client = connect(7);
    client.running(42);
    const auto pending = client.session(42);
    log_.clear();
    EXPECT_EQ(client.create(42), true);
    EXPECT_NE(client.session(42), pending);
    EXPECT_TRUE(pending->started());
    EXPECT_FALSE(client.session(42)->started());
    EXPECT_EQ(activeSessionCount(), 1U);
    EXPECT_EQ(linesSaying("ending session 42"), 0U);
}

TEST_F(VelaReportingClientServerInstanceTest, AReplacedSessionIsReleasedBeforeTheNewOneIsAnnounced) {
    const Client client = connect(7);
    client.create(42);
    log_.clear();
    client.create(42);
    const auto lines = log_.lines();
    ASSERT_EQ(lines.size(), 4U);
    EXPECT_EQ(lines[1].message, "created reporting session for ID: 42");
    EXPECT_EQ(lines[2].message, "deallocing this session 42");
    EXPECT_EQ(lines[3].message, "session created for reporter 42");
}

TEST_F(VelaReportingClientServerInstanceTest, ReporterZeroIsStoredAndOnlyWhatNamesItLeavesItAlone) {
    const Client client = connect(7);
    EXPECT_EQ(client.create(0), true);
    const auto session = client.session(0);
    EXPECT_EQ(client.allReporters(), (std::vector<std::int64_t>{0}));
    EXPECT_EQ(client.setConfiguration({{"a", 1}}, 0), true);
    EXPECT_EQ(session->configuration(), (Dictionary{{"a", 1}}));
    session->setServiceType(3);
    EXPECT_EQ(client.validate(0), (Dictionary{{"reporterID", 0}, {"serviceType", 3}}));
    log_.clear();
    EXPECT_EQ(client.setServiceType(4, 0), true);
    EXPECT_EQ(session->serviceType(), 3);
    EXPECT_EQ(client.serviceType(0), 65535);
    EXPECT_EQ(client.start(0), true);
    EXPECT_FALSE(session->started());
    EXPECT_TRUE(client.send({{"a", 1}}, 1, 1, to({0})));
    EXPECT_EQ(client.stop(0), true);
    EXPECT_EQ(client.destroy(0), true);
    EXPECT_EQ(client.session(0), session);
    EXPECT_THAT(log_.lines(), ElementsAre(serviceLine(LogLevel::Debug, "setting service type 4 for reporter 0"),
                                          serviceLine(LogLevel::Debug, "fetching seviceType"),
                                          serviceLine(LogLevel::Debug, "starting session for reporter 0"),
                                          serviceLine(LogLevel::Debug, "sending message for reporter (0)"),
                                          serviceLine(LogLevel::Debug, "stopping session for reporter 0"),
                                          serviceLine(LogLevel::Debug, "destroying session for reporter 0")));
}

// Service types.

TEST_F(VelaReportingClientServerInstanceTest, SettingTheTypeSaysSoWithTwoSpaces) {
    const Client client = connect(7);
    client.create(42);
    log_.clear();
    EXPECT_EQ(client.setServiceType(3, 42), true);
    EXPECT_EQ(client.session(42)->serviceType(), 3);
    EXPECT_THAT(serviceLines(), ElementsAre(serviceLine(LogLevel::Debug, "setting service type 3 for reporter 42"),
                                            serviceLine(LogLevel::Default, "service type 3 set for reporter  42")));
}

TEST_F(VelaReportingClientServerInstanceTest, SettingTheTypeOfAnUnknownReporterChangesNothing) {
    const Client client = connect(7);
    EXPECT_EQ(client.setServiceType(3, 42), true);
    EXPECT_THAT(log_.lines(), ElementsAre(serviceLine(LogLevel::Debug, "setting service type 3 for reporter 42")));
}

TEST_F(VelaReportingClientServerInstanceTest, TheTypeIsTheNumberAsItWasSet) {
    const Client client = connect(7);
    client.create(42);
    for (const std::uint16_t type : std::initializer_list<std::uint16_t>{0, 13, 14, 100, 65535}) {
        client.setServiceType(type, 42);
        EXPECT_EQ(client.serviceType(42), type);
    }
}

TEST_F(VelaReportingClientServerInstanceTest, TheTypeIsAnsweredBeforeItsLine) {
    const Client client = connect(7);
    client.create(42);
    client.setServiceType(3, 42);
    log_.clear();
    std::vector<CapturedLine> before;
    client.operations().getServiceNameForReporterID(
        42, [&](const std::optional<platform::IpcError>&, std::uint16_t) { before = log_.lines(); });
    queues_.runUntilIdle();
    EXPECT_THAT(before, ElementsAre(serviceLine(LogLevel::Debug, "fetching seviceType")));
    EXPECT_EQ(log_.lines().back(), serviceLine(LogLevel::Default, "returning service type 3 for reporter  42"));
}

TEST_F(VelaReportingClientServerInstanceTest, AnUnknownReporterHasTheUnknownType) {
    const Client client = connect(7);
    EXPECT_EQ(client.serviceType(42), 65535);
    EXPECT_THAT(log_.lines(),
                ElementsAre(serviceLine(LogLevel::Debug, "fetching seviceType"),
                            serviceLine(LogLevel::Error, "failed to find reporting session 42"),
                            serviceLine(LogLevel::Default, "returning service type 65535 for reporter  42")));
}

// Configuration.

TEST_F(VelaReportingClientServerInstanceTest, AConfigurationIsMerged) {
    const Client client = connect(7);
    client.create(42);
    log_.clear();
    EXPECT_EQ(client.setConfiguration({{"a", 1}, {"b", 2}}, 42), true);
    EXPECT_EQ(client.setConfiguration({{"b", 3}}, 42), true);
    EXPECT_EQ(client.session(42)->configuration(), (Dictionary{{"a", 1}, {"b", 3}}));
    EXPECT_THAT(log_.lines(), ElementsAre(serviceLine(LogLevel::Debug, "setting configuration"),
                                          serviceLine(LogLevel::Debug, "setting configuration")));
}

TEST_F(VelaReportingClientServerInstanceTest, AConfigurationOfAnUnknownReporterGoesNowhere) {
    EXPECT_EQ(connect(7).setConfiguration({{"a", 1}}, 42), true);
    EXPECT_THAT(log_.lines(), ElementsAre(serviceLine(LogLevel::Debug, "setting configuration")));
}

// Other clients' sessions, and this one's.

TEST_F(VelaReportingClientServerInstanceTest, AnotherClientsSessionIsReadButNotChanged) {
    const Client owner = connect(8);
    const Client other = connect(7);
    owner.create(42);
    owner.setServiceType(3, 42);
    EXPECT_EQ(other.serviceType(42), 3);
    EXPECT_EQ(other.validate(42), (Dictionary{{"reporterID", 42}, {"serviceType", 3}}));
    EXPECT_EQ(other.setServiceType(1, 42), true);
    EXPECT_EQ(other.setConfiguration({{"a", 1}}, 42), true);
    EXPECT_EQ(other.start(42), true);
    const auto session = owner.session(42);
    EXPECT_EQ(session->serviceType(), 3);
    EXPECT_EQ(session->configuration(), Dictionary());
    EXPECT_FALSE(session->started());
    owner.start(42);
    EXPECT_EQ(other.stop(42), true);
    EXPECT_EQ(other.destroy(42), true);
    EXPECT_TRUE(session->started());
    EXPECT_EQ(owner.session(42), session);
    EXPECT_EQ(activeSessionCount(), 1U);
}

TEST_F(VelaReportingClientServerInstanceTest, ItsOwnSessionComesFirstAndSilently) {
    const Client earlier = connect(8);
    const Client client = connect(7);
    earlier.create(42);
    client.create(42);
    client.setServiceType(3, 42);
    log_.clear();
    EXPECT_EQ(client.serviceType(42), 3);
    service().setReportingEnabled(false);
    EXPECT_EQ(client.serviceType(42), 3);
    EXPECT_THAT(log_.lines(), Not(Contains(serviceLine(LogLevel::Info, "found reporting session 42 for client 8"))));
    EXPECT_EQ(log_.lines().size(), 4U);
}

TEST_F(VelaReportingClientServerInstanceTest, TheAnswerComesBehindTheLineButForTheServiceType) {
    const Client client = connect(7);
    std::string lineAtReply;
    const auto noting = [&](const std::optional<platform::IpcError>&, const auto&) {
        lineAtReply = log_.lines().back().message;
    };
    const auto lineAtReplyOf = [&](const auto& call) {
        lineAtReply = "no reply";
        call();
        queues_.runUntilIdle();
        return lineAtReply;
    };
    platform::ReportingServiceProtocol& operations = client.operations();
    EXPECT_EQ(lineAtReplyOf([&] { operations.createReportingSession(42, noting); }), "session created for reporter 42");
    EXPECT_EQ(lineAtReplyOf([&] { operations.setServiceType(3, 42, noting); }), "service type 3 set for reporter  42");
    EXPECT_EQ(lineAtReplyOf([&] { operations.getServiceNameForReporterID(42, noting); }), "fetching seviceType");
    EXPECT_EQ(lineAtReplyOf([&] { operations.reporterID(42, noting); }), "validating reporter 42");
    EXPECT_EQ(lineAtReplyOf([&] { operations.stopReportingSessionForID(42, noting); }), "stopping 42");
    EXPECT_EQ(lineAtReplyOf([&] { operations.destroyReportingSession(42, noting); }), "destroying 42");
}

TEST_F(VelaReportingClientServerInstanceTest, ValidationAnswersBehindTwoLinesOfOneText) {
    const Client client = connect(7);
    client.create(42);
    log_.clear();
    EXPECT_EQ(client.validate(42), (Dictionary{{"reporterID", 42}, {"serviceType", 65535}}));
    EXPECT_EQ(client.validate(43), (Dictionary{{"reporterID", 0}, {"serviceType", 65535}}));
    EXPECT_THAT(log_.lines(), ElementsAre(serviceLine(LogLevel::Debug, "validating reporter 42"),
                                          serviceLine(LogLevel::Default, "validating reporter 42"),
                                          serviceLine(LogLevel::Debug, "validating reporter 43"),
                                          serviceLine(LogLevel::Error, "failed to find reporting session 43"),
                                          serviceLine(LogLevel::Default, "validating reporter 43")));
}

TEST_F(VelaReportingClientServerInstanceTest, AllReportersAreThoseOfEveryClientRepeatedOnesToo) {
    const Client first = connect(8);
    const Client second = connect(7);
    second.create(42);
    second.running(1);
    first.create(42);
    log_.clear();
    EXPECT_EQ(second.allReporters(), (std::vector<std::int64_t>{42, 1, 42}));
    EXPECT_THAT(log_.lines(), IsEmpty());
}

// The end of the process.

using VelaReportingClientServerInstanceDeathTest = VelaReportingClientServerInstanceTest;

TEST_F(VelaReportingClientServerInstanceDeathTest, KillServiceEndsTheProcessWithTwoOnTheCallersThread) {
    const Client client = connect(7);
    const auto answer = newAnswer<bool>();
    const auto kill = [&] {
        // Its line goes to standard error, where the test sees it.
        struct StandardError final : platform::LogSink {
            void write(const platform::LogRecord& record) override {
                static_cast<void>(std::fprintf(stderr, "%d %.*s\n", static_cast<int>(record.level),
                                               static_cast<int>(record.message.size()), record.message.data()));
            }
            std::uint64_t lost() const override { return 0; }
        };
        static StandardError sink;
        setLogDestination(&sink, LogLevel::Debug);
        client.operations().killService(Answer<bool>::into(answer)); // the queue does not run
    };
    EXPECT_EXIT(kill(), ::testing::ExitedWithCode(2), "^2 DESTROYING SERVICE\n$");
    EXPECT_EQ(answer->calls, 0);
}

} // namespace

} // namespace vela
