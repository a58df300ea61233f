#include "service/RecordedInstance_test.h"

namespace vela {

namespace {

using namespace std::chrono_literals;
using ::testing::ElementsAre;
using ::testing::IsEmpty;

class VelaReportingClientServerInstanceMessagesTest : public ServiceTest {
protected:
    std::shared_ptr<Answer<>> beginSend(const Client& client, std::uint16_t type, ReporterIDs reporterIDs) {
        auto answer = newAnswer<>();
        client.operations().sendMessage({{"Haptic_Active_Hardware_Time_Seconds", 1}}, 4, type, std::move(reporterIDs),
                                        Answer<>::into(answer));
        return answer;
    }
};

class VelaReportingClientServerInstanceMessageStepsTest : public RecordedInstanceTest {};

// Order.

TEST_F(VelaReportingClientServerInstanceMessageStepsTest, ByIDTheBridgesComeFirstAndTheSessionLast) {
    client_.create(42);
    sessionOfAnother(5);
    steps();
    EXPECT_TRUE(client_.send({{"a", 1}}, 1, 1, to({42, 5})));
    EXPECT_THAT(steps(), ElementsAre("tally 42", "joule 42", "telem 42", "snag 42 of nobody", "session sends", "find 5",
                                     "tally 5", "joule 5", "telem 5", "snag 5 of nobody", "session sends"));
}

TEST_F(VelaReportingClientServerInstanceMessageStepsTest, InABroadcastTheSessionComesFirst) {
    client_.create(1);
    client_.create(2);
    recordingDelegate_->active = {client_.session(2), client_.session(1)};
    steps();
    EXPECT_TRUE(client_.send({{"a", 1}}, 1, 1, std::nullopt));
    EXPECT_THAT(steps(), ElementsAre("active", "session sends", "tally 2", "joule 2", "telem 2", "snag 2 of nobody",
                                     "session sends", "tally 1", "joule 1", "telem 1", "snag 1 of nobody"));
}

TEST_F(VelaReportingClientServerInstanceMessageStepsTest, ToAStandaloneSessionTheBridgesComeFirst) {
    EXPECT_TRUE(client_.send({{"a", 1}}, 1, 1, std::nullopt));
    EXPECT_THAT(steps(), ElementsAre("active", "tally 1", "joule 1", "telem 1", "snag 1 of nobody", "session sends"));
}

TEST_F(VelaReportingClientServerInstanceMessageStepsTest, ZeroIsSkippedUnknownOnesAreLookedUpAndRepeatsDelivered) {
    client_.create(7);
    steps();
    EXPECT_TRUE(client_.send({{"a", 1}}, 1, 1, to({0, 9, 7, 7})));
    EXPECT_THAT(steps(), ElementsAre("find 9", "tally 7", "joule 7", "telem 7", "snag 7 of nobody", "session sends",
                                     "tally 7", "joule 7", "telem 7", "snag 7 of nobody", "session sends"));
}

TEST_F(VelaReportingClientServerInstanceMessageStepsTest, AnEmptyListIsNoBroadcast) {
    client_.create(7);
    recordingDelegate_->active = {client_.session(7)};
    steps();
    EXPECT_TRUE(client_.send({{"a", 1}}, 1, 1, to({})));
    EXPECT_THAT(steps(), IsEmpty());
}

TEST_F(VelaReportingClientServerInstanceMessageStepsTest, WithReportingDisabledTheErrorIsAnsweredAndNothingDelivered) {
    recordingDelegate_->enabled = false;
    client_.create(42);
    steps();
    log_.clear();
    for (const ReporterIDs& reporterIDs : {ReporterIDs(std::nullopt), to({42})}) {
        const auto answer = newAnswer<>();
        client_.operations().sendMessage({{"a", 1}}, 1, 1, reporterIDs, Answer<>::into(answer));
        queues_.runUntilIdle();
        EXPECT_EQ(answer->calls, 1);
        EXPECT_EQ(answer->error, std::pair(std::string("com.orvex.audio.reporting"), 1));
    }
    EXPECT_THAT(steps(), IsEmpty());
    EXPECT_THAT(log_.lines(), ElementsAre(serviceLine(LogLevel::Debug, "sending message for reporter (null)"),
                                          serviceLine(LogLevel::Debug, "sending message for reporter (42)")));
}

TEST_F(VelaReportingClientServerInstanceMessageStepsTest, TheReplyComesAfterEveryDelivery) {
    client_.create(42);
    steps();
    client_.operations().sendMessage(
        {{"a", 1}}, 1, 1, to({42}), [this](const std::optional<platform::IpcError>&) { steps_.emplace_back("reply"); });
    queues_.runUntilIdle();
    EXPECT_EQ(steps().back(), "reply");
}

TEST_F(VelaReportingClientServerInstanceMessageStepsTest, TheBridgesAndIssueCaptureGetTheMessageAsItIs) {
    const Dictionary message{{"a b", 1}, {"epochTime", 2.5}};
    client_.create(42);
    recordingDelegate_->active = {client_.session(42)};
    client_.send(message, 0x10000004, 8, to({42}));
    client_.send(message, 0xFFFFFFFF, 65535, std::nullopt);
    const Handled byID{message, 0x10000004, 8};
    const Handled toAll{message, 0xFFFFFFFF, 65535};
    EXPECT_THAT(handled_, ElementsAre(byID, byID, byID, byID, toAll, toAll, toAll, toAll));
}

TEST_F(VelaReportingClientServerInstanceMessageStepsTest, AMessageOfNoSessionReachesTheBridgesAsItIs) {
    client_.send({{"a b", 1}}, 0x10000004, 8, std::nullopt);
    const Handled alone{{{"a b", 1}}, 0x10000004, 8};
    EXPECT_THAT(handled_, ElementsAre(alone, alone, alone, alone));
}

// The sender's process.

TEST_F(VelaReportingClientServerInstanceMessageStepsTest, IssueCaptureGetsTheNameOfAProcessThatIsGoneSince) {
    makeInternalBuild();
    client_.create(42);
    steps();
    client_.operations().sendMessage({{"a", 1}}, 1, 8, to({42}), Answer<>::into(newAnswer<>()));
    fakes_.processes.remove(7);
    queues_.runUntilIdle();
    EXPECT_THAT(steps(), ElementsAre("tally 42", "joule 42", "telem 42", "snag 42 of player", "session sends"));
}

TEST_F(VelaReportingClientServerInstanceMessageStepsTest, AProcessThatWasGoneHasNoNameAsItsNumberMayBeAnothers) {
    makeInternalBuild();
    client_.create(42);
    steps();
    client_.connection->loseProcess();
    client_.send({{"a", 1}}, 1, 8, to({42}));
    EXPECT_THAT(steps(), ElementsAre("tally 42", "joule 42", "telem 42", "snag 42 of nobody", "session sends"));
}

TEST_F(VelaReportingClientServerInstanceMessagesTest, TheNameIsAskedForOnlyWhereIssueCaptureUsesIt) {
    const Client client = connect(7);
    client.create(42);
    const std::uint64_t before = fakes_.processes.reads();
    client.send({{"a", 1}}, 1, 8, to({42}));
    EXPECT_EQ(fakes_.processes.reads(), before);
}

TEST_F(VelaReportingClientServerInstanceMessagesTest, OnAnInternalBuildOnlyEnergyMessagesAskForTheName) {
    makeInternalBuild();
    const Client client = connect(7);
    client.create(42);
    const std::uint64_t before = fakes_.processes.reads();
    client.send({{"a", 1}}, 1, 7, to({42}));
    EXPECT_EQ(fakes_.processes.reads(), before);
    client.send({{"a", 1}}, 1, 8, to({42}));
    EXPECT_EQ(fakes_.processes.reads(), before + 1);
}

TEST_F(VelaReportingClientServerInstanceMessagesTest, TwoEnergyMessagesOfAClientAreCapturedUnderItsName) {
    makeInternalBuild();
    const Client client = connect(8);
    client.running(42, 3);
    client.send({{"Haptic_Active_Hardware_Time_Seconds", 1}}, 4, 8, to({42}));
    client.send({{"Haptic_Active_Hardware_Time_Seconds", 2}}, 4, 8, std::nullopt);
    const auto requests = fakes_.malady.requests();
    ASSERT_EQ(requests.size(), 1U);
    EXPECT_EQ(requests[0].signature.detectedProcess, "recorder");
}

// What is delivered.

TEST_F(VelaReportingClientServerInstanceMessagesTest, TheMessageIsLoggedWithItsReporters) {
    const Client client = connect(7);
    client.create(1);
    log_.clear();
    client.send({{"a", 1}}, 1, 1, to({1, 2}));
    EXPECT_THAT(serviceLines(), ElementsAre(serviceLine(LogLevel::Debug, "sending message for reporter (1, 2)"),
                                            serviceLine(LogLevel::Error, "failed to find reporting session 2")));
}

TEST_F(VelaReportingClientServerInstanceMessagesTest, TheBridgesGetTheClientsOwnMessage) {
    const Client client = connect(7);
    client.running(42);
    fakes_.tally.setBuildsAtOnce(true);
    const Dictionary message{{"a key", 1}, {"velareporting_timestamp", 12.5}, {"HostApplicationDisplayID", "app"}};
    client.send(message, 0x10000004, 1, to({42}));
    const auto events = fakes_.tally.events();
    ASSERT_EQ(events.size(), 2U);
    EXPECT_EQ(events[0].name, "com.orvex.vela.DSP_Playback.Start");
    EXPECT_EQ(events[0].payload, message);
    const auto sent = fakes_.beacon.callsOf(BeaconOperation::Send);
    ASSERT_EQ(sent.size(), 1U);
    EXPECT_EQ(sent[0].category, 4);
    EXPECT_EQ(sent[0].payload.find("audiotag"), Value("DSP_PlaybackStart"));
}

TEST_F(VelaReportingClientServerInstanceMessagesTest, ARedundantMessageStillReachesTheBridges) {
    const Client client = connect(7);
    client.running(42);
    client.send({{"a", 1}}, 1, 1, to({42, 42}));
    EXPECT_EQ(fakes_.tally.events().size(), 4U);
    EXPECT_EQ(fakes_.beacon.callsOf(BeaconOperation::Send).size(), 1U);
    EXPECT_EQ(linesSaying("dropping redundant event"), 1U);
}

TEST_F(VelaReportingClientServerInstanceMessagesTest, AMessageForNobodyIsDroppedAndAnswered) {
    EXPECT_TRUE(connect(7).send({{"a", 1}}, 1, 1, to({42})));
    EXPECT_THAT(fakes_.tally.events(), IsEmpty());
    queues_.advance(10s);
    EXPECT_THAT(fakes_.beacon.calls(), IsEmpty());
}

TEST_F(VelaReportingClientServerInstanceMessagesTest, ByIDAMessageReachesAnotherClientsSessionStartedOrNot) {
    const Client owner = connect(8);
    const Client sender = connect(7);
    owner.create(42);
    sender.send({{"a", 1}}, 1, 1, to({42}));
    queues_.advance(1s);
    EXPECT_EQ(fakes_.beacon.callsOf(BeaconOperation::SendOne).size(), 1U);
    EXPECT_EQ(fakes_.tally.events().size(), 2U);
}

TEST_F(VelaReportingClientServerInstanceMessagesTest, ABroadcastReachesStartedSessionsOnly) {
    const Client first = connect(8);
    const Client second = connect(7);
    first.running(1);
    first.create(2);
    second.running(3);
    fakes_.beacon.clearCalls();
    log_.clear();
    second.send({{"a", 1}}, 1, 1, std::nullopt);
    EXPECT_EQ(fakes_.beacon.callsOf(BeaconOperation::Send).size(), 2U);
    EXPECT_EQ(fakes_.tally.events().size(), 4U);
    EXPECT_EQ(serviceLines().back(),
              serviceLine(LogLevel::Default, "active reporting sessions 2 : (" + shown(1, "muse", 8, true) + ", " +
                                                 shown(3, "muse", 7, true) + ")"));
    EXPECT_EQ(serviceLines().size(), 4U); // one more for each client, and the message's
}

// The stand-alone session.

TEST_F(VelaReportingClientServerInstanceMessagesTest, ABroadcastToNobodyGoesToAStandaloneSession) {
    fakes_.preferences.set("com.orvex.vela", "device_name", "Kitchen");
    fakes_.preferences.set("com.orvex.vela", "disable_reporting", true);
    fakes_.tally.setBuildsAtOnce(true);
    const Client client = connect(7);
    setActiveSessionCount(9);
    log_.clear();
    EXPECT_TRUE(client.send({{"a", 1}}, 1, 1, std::nullopt));
    EXPECT_EQ(linesSaying("active reporting sessions 0 : ()"), 1U);
    EXPECT_EQ(linesSaying("created reporting session for ID: 1"), 1U);
    EXPECT_EQ(linesSaying("setting service type standalone"), 1U);
    const auto events = fakes_.tally.events();
    ASSERT_EQ(events.size(), 2U);
    EXPECT_EQ(events[1].name, "com.orvex.standalone.Generic.Start");
    EXPECT_EQ(events[1].payload, (Dictionary{{"a", 1}, {"HostApplicationDisplayID", "Unknown"}}));
    EXPECT_EQ(client.allReporters(), std::vector<std::int64_t>());
    EXPECT_EQ(service().findReportingSessionForID(1), nullptr);
    EXPECT_EQ(activeSessionCount(), 9U);
    EXPECT_EQ(linesSaying("deallocing this session 1"), 1U);
    EXPECT_EQ(queues_.liveQueues(), 1U);
}

TEST_F(VelaReportingClientServerInstanceMessagesTest, AStandaloneMessageIsSentAloneASecondLater) {
    fakes_.preferences.set("com.orvex.vela", "device_name", "Kitchen");
    connect(7).send({{"a", 1}}, 1, 1, std::nullopt);
    queues_.advance(999ms);
    EXPECT_THAT(fakes_.beacon.calls(), IsEmpty());
    queues_.advance(1ms);
    const auto calls = fakes_.beacon.calls();
    ASSERT_EQ(calls.size(), 1U);
    EXPECT_EQ(calls[0].operation, BeaconOperation::SendOne);
    EXPECT_EQ(calls[0].userInfo.find("service_name"), Value("standalone"));
    EXPECT_EQ(calls[0].userInfo.size(), 2U); // nothing of the defaults
    EXPECT_EQ(calls[0].payload, (Dictionary{{"a", 1}, {"audiotag", "GenericStart"}}));
}

TEST_F(VelaReportingClientServerInstanceMessageStepsTest, TheStandaloneSessionIsTheServicesOwnWithItsDefaults) {
    recordingDelegate_->defaults = {{"HostApplicationDisplayID", "service"}, {"disable_reporting", true}};
    recordingDelegate_->count = 9;
    std::string description;
    fakes_.spoor.setObserver(nullptr);
    // The bridges see it before its message is sent.
    struct Looking final : VelaReportingSessionEventHandler {
        void handleEvent(const Dictionary&, std::uint32_t, std::uint32_t,
                         const std::shared_ptr<VelaReportingSession>& session) override {
            description = session->description();
            configuration = session->configuration();
            enabled = session->beaconReportingEnabled();
        }
        std::string description;
        Dictionary configuration;
        bool enabled = false;
    };
    auto looking = std::make_unique<Looking>();
    const Looking& seen = *looking;
    const auto context = std::make_shared<const VelaReportingServiceContext>(
        VelaReportingServicePlatform{platform_}, std::move(looking),
        std::make_unique<RecordingBridge>("joule", steps_, handled_),
        std::make_unique<RecordingBridge>("telem", steps_, handled_));
    client_.connection->setExportedObject(
        VelaReportingClientServerInstance::initWithPID(7, recordingDelegate_, context));
    client_.send({{"a", 1}}, 1, 1, std::nullopt);
    EXPECT_EQ(seen.description,
              "reporterID=1,serviceName=standalone,ownerPid=100,HostApplicationDisplayID=service,started=0");
    EXPECT_EQ(seen.configuration, (Dictionary{{"HostApplicationDisplayID", "service"}, {"disable_reporting", true}}));
    EXPECT_TRUE(seen.enabled);
    queues_.advance(1s);
}

} // namespace

} // namespace vela
