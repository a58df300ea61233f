#include "service/Service_test.h"
#include "service/VelaReportingServiceDelegate.h"

namespace vela {

namespace {

using ::testing::ElementsAre;
using ::testing::IsEmpty;

class VelaReportingServiceDelegateTest : public ServiceTest {};

// The beginning.

TEST_F(VelaReportingServiceDelegateTest, BeginsWithReportingOnAndNobody) {
    EXPECT_TRUE(service().isReportingEnabled());
    EXPECT_EQ(activeSessionCount(), 0U);
    onQueue([this] { EXPECT_THAT(service().getAllClients(), IsEmpty()); });
    EXPECT_EQ(service().ledger(), Dictionary());
}

TEST_F(VelaReportingServiceDelegateTest, HasOneReportingQueue) {
    EXPECT_EQ(service().reportingQueue().name(), "com.orvex.vela.reporting.server");
    EXPECT_EQ(queues_.qualityOf("com.orvex.vela.reporting.server"), platform::QualityOfService::UserInteractive);
    EXPECT_EQ(queues_.liveQueues(), 1U);
}

TEST_F(VelaReportingServiceDelegateTest, ListensForFeaturesBeforeTheSamplerIsMade) {
    fakes_.notifications.failRegistration("com.orvex.vela.reporting", 9);
    service();
    const auto lines = log_.lines();
    ASSERT_GE(lines.size(), 5U);
    EXPECT_THAT(lines[0].message, ::testing::StartsWith("listening for features "));
    EXPECT_EQ(lines[1], serviceLine(LogLevel::Default, "notify setup result 0 token 1"));
    EXPECT_EQ(lines[2], serviceLine(LogLevel::Default, "notify setup result 9 token -1"));
    EXPECT_EQ(lines[3], serviceLine(LogLevel::Default, "notify setup result 0 token 2"));
    EXPECT_EQ(lines[4], (CapturedLine{LogLevel::Info, "velard", "VelaReportingDriverUtility",
                                      "creating hwstatsing driver utility"}));
}

TEST_F(VelaReportingServiceDelegateTest, DefaultsAreReadOnceAtTheBeginning) {
    fakes_.preferences.set("com.orvex.vela", "device_name", "Kitchen");
    service();
    fakes_.preferences.set("com.orvex.vela", "device_name", "Cellar");
    fakes_.preferences.set("com.orvex.vela", "disable_reporting", true);
    EXPECT_EQ(service().getDefaults(), (Dictionary{{"device_name", "Kitchen"}, {"disable_reporting", false}}));
}

TEST_F(VelaReportingServiceDelegateTest, DisableReportingInTheDefaultsLeavesReportingOn) {
    fakes_.preferences.set("com.orvex.vela", "disable_reporting", true);
    EXPECT_EQ(service().getDefaults(), (Dictionary{{"disable_reporting", true}}));
    EXPECT_TRUE(service().isReportingEnabled());
    EXPECT_TRUE(connect(7).send({{"a", 1}}, 1, 1, std::nullopt));
}

TEST_F(VelaReportingServiceDelegateTest, OnlyAnInternalBuildCapturesIssues) {
    EXPECT_EQ(service().snagStateManager(), nullptr);
}

TEST_F(VelaReportingServiceDelegateTest, AnInternalBuildCapturesIssues) {
    makeInternalBuild();
    EXPECT_NE(service().snagStateManager(), nullptr);
}

TEST_F(VelaReportingServiceDelegateTest, ANotificationDuringTheBeginningFindsAUsableService) {
    fakes_.preferences.set("com.orvex.vela", "device_name", "Kitchen");
    std::size_t handled = 0;
    // The sampler is made last but one: its first call comes when everything is registered and little else is there.
    fakes_.hwStats.setObserver([&](std::string_view) {
        if (std::exchange(handled, 1) == 0) {
            fakes_.notifications.post("com.orvex.vela.reporting");
            queues_.runUntilIdle();
        }
    });
    service();
    EXPECT_EQ(handled, 1U);
    EXPECT_EQ(linesSaying("feature 2 changes"), 1U);
    EXPECT_EQ(linesSaying("getting features"), 1U);
}

// The registry.

TEST_F(VelaReportingServiceDelegateTest, ClientsStandInTheOrderOfTheirAcceptance) {
    const Client first = connect(8);
    const Client second = connect(7);
    const Client third = connect(8);
    onQueue([&] {
        EXPECT_THAT(service().getAllClients(), ElementsAre(first.instance(), second.instance(), third.instance()));
    });
}

TEST_F(VelaReportingServiceDelegateTest, AClientIsRemovedByIdentityAndNotByPid) {
    const Client first = connect(7);
    const Client second = connect(7);
    onQueue([&] {
        service().removeClient(*second.instance());
        EXPECT_THAT(service().getAllClients(), ElementsAre(first.instance()));
    });
}

TEST_F(VelaReportingServiceDelegateTest, RemovingAClientThatIsNotThereChangesNothing) {
    const Client first = connect(7);
    const Client second = connect(7);
    onQueue([&] {
        service().removeClient(*second.instance());
        service().removeClient(*second.instance());
        EXPECT_THAT(service().getAllClients(), ElementsAre(first.instance()));
    });
}

// Looking sessions up.

TEST_F(VelaReportingServiceDelegateTest, ReporterZeroIsNeverFoundAndNothingIsLogged) {
    connect(7).create(0);
    log_.clear();
    EXPECT_EQ(service().findReportingSessionForID(0), nullptr);
    EXPECT_THAT(log_.lines(), IsEmpty());
}

TEST_F(VelaReportingServiceDelegateTest, WithReportingOffNothingIsFoundOrLogged) {
    connect(7).create(42);
    log_.clear();
    service().setReportingEnabled(false);
    EXPECT_EQ(service().findReportingSessionForID(42), nullptr);
    EXPECT_THAT(log_.lines(), IsEmpty());
}

TEST_F(VelaReportingServiceDelegateTest, ASessionIsFoundWhetherStartedOrNot) {
    const Client client = connect(7);
    client.create(-9);
    log_.clear();
    EXPECT_EQ(service().findReportingSessionForID(-9), client.session(-9));
    EXPECT_THAT(log_.lines(), ElementsAre(serviceLine(LogLevel::Info, "found reporting session -9 for client 7")));
    client.start(-9);
    EXPECT_EQ(service().findReportingSessionForID(-9), client.session(-9));
}

TEST_F(VelaReportingServiceDelegateTest, AReporterOfTwoClientsIsTheFirstOnes) {
    const Client first = connect(8);
    const Client second = connect(7);
    second.create(42);
    first.create(42);
    log_.clear();
    EXPECT_EQ(service().findReportingSessionForID(42), first.session(42));
    EXPECT_THAT(log_.lines(), ElementsAre(serviceLine(LogLevel::Info, "found reporting session 42 for client 8")));
}

TEST_F(VelaReportingServiceDelegateTest, AReporterThatNobodyHasIsAnError) {
    connect(7).create(42);
    log_.clear();
    EXPECT_EQ(service().findReportingSessionForID(43), nullptr);
    EXPECT_THAT(log_.lines(), ElementsAre(serviceLine(LogLevel::Error, "failed to find reporting session 43")));
}

TEST_F(VelaReportingServiceDelegateTest, ALookUpInsideTheLockedRegionDoesNotHang) {
    connect(7).create(42);
    const auto connection = std::make_shared<testing::FakeIpcConnection>(8);
    connections_.push_back(connection);
    std::shared_ptr<VelaReportingSession> found;
    connection->setObserver([&](std::string_view call) {
        if (call == "setExportedObject") {
            found = service().findReportingSessionForID(42);
        }
    });
    service().shouldAcceptNewConnection(connection);
    EXPECT_NE(found, nullptr);
}

// Active sessions.

TEST_F(VelaReportingServiceDelegateTest, ActiveSessionsAreTheStartedOnesInTheRegistrysOrder) {
    const Client first = connect(8);
    const Client second = connect(7);
    connect(9);
    second.running(1);
    first.running(30);
    first.create(20);
    first.running(-10);
    log_.clear();
    EXPECT_THAT(service().getAllActiveReportingSessions(),
                ElementsAre(first.session(-10), first.session(30), second.session(1)));
    EXPECT_THAT(
        log_.lines(),
        ElementsAre(serviceLine(LogLevel::Default, "sessions for client 8 : (" + shown(-10, "muse", 8, true) + ", " +
                                                       shown(20, "unknown", 8, false) + ", " +
                                                       shown(30, "muse", 8, true) + ")"),
                    serviceLine(LogLevel::Default, "sessions for client 7 : (" + shown(1, "muse", 7, true) + ")"),
                    serviceLine(LogLevel::Default, "sessions for client 9 : ()")));
}

TEST_F(VelaReportingServiceDelegateTest, ActiveSessionsAreThereWithReportingOff) {
    const Client client = connect(7);
    client.running(1);
    service().setReportingEnabled(false);
    EXPECT_THAT(service().getAllActiveReportingSessions(), ElementsAre(client.session(1)));
}

// The drivers' sampler and issue capture.

TEST_F(VelaReportingServiceDelegateTest, SnapshotsAndDriverLogsAreTheSamplers) {
    publishFrames();
    const Client client = connect(7);
    const auto session = client.running(42);
    EXPECT_EQ(service().getSnapShot().size(), 1U);
    EXPECT_EQ(service().getSnapShot().count("Haptics-Stats"), 1U);
    onQueue([&] { service().sendDriverLogsForSession(session); });
    const auto sent = fakes_.beacon.callsOf(BeaconOperation::Send);
    ASSERT_EQ(sent.size(), 1U);
    EXPECT_EQ(sent[0].category, 12);
    EXPECT_EQ(sent[0].type, 16);
    EXPECT_EQ(sent[0].payload.find("Simple_Frames"), Value(3));
}

TEST_F(VelaReportingServiceDelegateTest, IssueCaptureGetsTheEventAsItIs) {
    makeInternalBuild();
    const Client client = connect(7);
    const auto session = client.running(42, 3);
    onQueue([&] {
        service().handleEventForSnag({{"Haptic_Active_Hardware_Time_Seconds", 1}}, 0x10000004, 8, session, "player");
        service().handleEventForSnag({{"Haptic_Active_Hardware_Time_Seconds", 2}}, 0x10000004, 8, session, "player");
    });
    const auto requests = fakes_.malady.requests();
    ASSERT_EQ(requests.size(), 1U);
    EXPECT_EQ(requests[0].signature.type, "haptics");
    EXPECT_EQ(requests[0].signature.subType, "DSP_Playback");
    EXPECT_EQ(requests[0].signature.detectedProcess, "player");
}

TEST_F(VelaReportingServiceDelegateTest, WithoutAnInternalBuildNoIssueIsCaptured) {
    const Client client = connect(7);
    const auto session = client.running(42, 3);
    onQueue([&] {
        service().handleEventForSnag({{"Haptic_Active_Hardware_Time_Seconds", 1}}, 4, 8, session, "player");
        service().handleEventForSnag({{"Haptic_Active_Hardware_Time_Seconds", 2}}, 4, 8, session, "player");
    });
    EXPECT_THAT(fakes_.malady.requests(), IsEmpty());
}

// The end.

TEST_F(VelaReportingServiceDelegateTest, TheEndTakesBackTheRegistrations) {
    service();
    EXPECT_EQ(fakes_.notifications.registrations().size(), 3U);
    delegate_.reset();
    EXPECT_THAT(fakes_.notifications.registrations(), IsEmpty());
    EXPECT_EQ(queues_.liveQueues(), 0U);
}

TEST_F(VelaReportingServiceDelegateTest, CallsAfterTheEndOfTheServiceAreDropped) {
    const Client client = connect(7);
    client.running(42);
    delegate_.reset();
    EXPECT_EQ(client.create(1), std::nullopt);
    EXPECT_EQ(client.serviceType(42), std::nullopt);
    EXPECT_EQ(client.validate(42), std::nullopt);
    EXPECT_EQ(client.allReporters(), std::nullopt);
    EXPECT_EQ(client.start(42), std::nullopt);
    EXPECT_EQ(client.stop(42), std::nullopt);
    EXPECT_FALSE(client.send({{"a", 1}}, 1, 1, std::nullopt));
    EXPECT_EQ(client.instance()->findReportingSessionForID(43, true), nullptr);
    client.connection->breakStream();
    EXPECT_EQ(linesSaying("deallocing this session 42"), 1U);
}

TEST_F(VelaReportingServiceDelegateTest, CallsThatWaitWhenTheServiceEndsAreDropped) {
    const Client client = connect(7);
    const auto answer = newAnswer<bool>();
    client.operations().createReportingSession(1, Answer<bool>::into(answer));
    delegate_.reset();
    queues_.runUntilIdle();
    EXPECT_EQ(answer->calls, 0);
    EXPECT_EQ(answer.use_count(), 1);
}

} // namespace

} // namespace vela
