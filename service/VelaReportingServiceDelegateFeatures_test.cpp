#include "service/Service_test.h"

#include <limits>

namespace vela {

namespace {

using namespace std::chrono_literals;
using ::testing::ElementsAre;
using ::testing::IsEmpty;
using Registration = testing::FakeNotifications::Registration;

constexpr char kSpatial[] = "com.orvex.lobby.spatial-audio-accessory-feature.changed";
constexpr char kDevice[] = "com.orvex.vela.reporting";
constexpr char kRinger[] = "com.orvex.lobby.ringerstate";

class VelaReportingServiceDelegateFeaturesTest : public ServiceTest {
protected:
    std::optional<Dictionary> state() { return service().getFeaturesState(); }
    void setRinger(std::optional<std::uint64_t> state) { fakes_.notifications.setState(kRinger, state); }
    void setDeviceName(Value name) { fakes_.preferences.set("com.orvex.vela", "device_name", std::move(name)); }
    void post(std::string_view name) {
        fakes_.notifications.post(name);
        queues_.runUntilIdle();
    }
    static std::vector<std::string> keysOf(const Dictionary& dictionary) {
        std::vector<std::string> keys;
        for (const auto& entry : dictionary) {
            keys.emplace_back(entry.key.text());
        }
        return keys;
    }
    static std::vector<std::string> recordedBy(VelaReportingSession& session) {
        VelaReportingSessionMessageList& list = session.nestedAggregatedPayloadData();
        const MutexLock lock(list.mutex());
        std::vector<std::string> keys;
        for (const StoredMessage& stored : list.messages()) {
            keys.push_back(list.keyOf(stored));
        }
        return keys;
    }
};

// The table.

TEST_F(VelaReportingServiceDelegateFeaturesTest, TheTableHasThreeEntriesAndTheirTokens) {
    EXPECT_EQ(service().features(),
              (Array{Dictionary{{"defaults_domain", "com.orvex.lobby"},
                                {"feature_domain", "spatial-audio-accessory-feature"},
                                {"notification", "com.orvex.lobby.spatial-audio-accessory-feature.changed"},
                                {"notify_token", 1}},
                     Dictionary{{"defaults_domain", "com.orvex.vela"},
                                {"feature_domain", "device_name"},
                                {"notification", "com.orvex.vela.reporting"},
                                {"notify_token", 2}},
                     Dictionary{{"feature_domain", "ringerstate"},
                                {"notification", "com.orvex.lobby.ringerstate"},
                                {"notify_token", 3}}}));
    EXPECT_THAT(fakes_.notifications.registrations(),
                ElementsAre(Registration{kSpatial, 1}, Registration{kDevice, 2}, Registration{kRinger, 3}));
}

TEST_F(VelaReportingServiceDelegateFeaturesTest, TheTableIsLoggedBeforeItHasTokens) {
    service();
    EXPECT_THAT(
        serviceLines(),
        ElementsAre(
            serviceLine(LogLevel::Info,
                        "listening for features ({defaults_domain = com.orvex.lobby; feature_domain = "
                        "\"spatial-audio-accessory-feature\"; notification = "
                        "\"com.orvex.lobby.spatial-audio-accessory-feature.changed\";}, {defaults_domain = "
                        "com.orvex.vela; feature_domain = device_name; notification = com.orvex.vela.reporting;}, "
                        "{feature_domain = ringerstate; notification = com.orvex.lobby.ringerstate;})"),
            serviceLine(LogLevel::Default, "notify setup result 0 token 1"),
            serviceLine(LogLevel::Default, "notify setup result 0 token 2"),
            serviceLine(LogLevel::Default, "notify setup result 0 token 3")));
}

TEST_F(VelaReportingServiceDelegateFeaturesTest, AFailedRegistrationIsLoggedAndTheOthersGoOn) {
    fakes_.notifications.failRegistration(kDevice, 9);
    service();
    EXPECT_EQ(linesSaying("notify setup result 0 token 1"), 1U);
    EXPECT_EQ(linesSaying("notify setup result 9 token -1"), 1U);
    EXPECT_EQ(linesSaying("notify setup result 0 token 2"), 1U);
    EXPECT_EQ(service().features()[1].dictionary().find("notify_token"), Value(-1));
    EXPECT_EQ(service().features()[2].dictionary().find("notify_token"), Value(2));
}

TEST_F(VelaReportingServiceDelegateFeaturesTest, APreferenceIsReadWhetherItsRegistrationWorkedOrNot) {
    fakes_.notifications.failRegistration(kDevice, 9);
    setDeviceName("Kitchen");
    EXPECT_EQ(state()->find("device_name"), Value("Kitchen"));
}

TEST_F(VelaReportingServiceDelegateFeaturesTest, ARingerThatCouldNotBeRegisteredHasNoState) {
    fakes_.notifications.failRegistration(kRinger, 9);
    setRinger(1);
    EXPECT_EQ(state(), std::nullopt);
    EXPECT_EQ(service().features()[2].dictionary().find("notify_token"), Value(-1));
}

// The state.

TEST_F(VelaReportingServiceDelegateFeaturesTest, AnEntryThatIsNotRegisteredYetAddsNothing) {
    setRinger(1);
    setDeviceName("Kitchen");
    std::vector<std::string> told;
    fakes_.notifications.setObserver([&](std::string_view name) {
        if (name != kRinger) {
            return;
        }
        log_.clear();
        post(kDevice);
        for (const CapturedLine& line : log_.lines()) {
            if (line.message.starts_with("defaults ")) {
                told.push_back(line.message);
            }
        }
    });
    service();
    ASSERT_EQ(told.size(), 1U);
    EXPECT_THAT(told[0], ::testing::HasSubstr("device_name = Kitchen"));
    EXPECT_THAT(told[0], ::testing::Not(::testing::HasSubstr("ringerstate")));
    EXPECT_TRUE(state()->contains("ringerstate"));
}

TEST_F(VelaReportingServiceDelegateFeaturesTest, WithoutAnyStateThereIsNone) {
    service();
    log_.clear();
    EXPECT_EQ(state(), std::nullopt);
    EXPECT_THAT(log_.lines(), ElementsAre(serviceLine(LogLevel::Default, "getting features")));
}

TEST_F(VelaReportingServiceDelegateFeaturesTest, StatesComeInTheTablesOrderAndThenTheirTimes) {
    fakes_.preferences.set("com.orvex.lobby", "spatial-audio-accessory-feature", true);
    setDeviceName("Kitchen");
    setRinger(1);
    service();
    clock_.advance(250ms);
    EXPECT_EQ(state(), (Dictionary{{"spatial-audio-accessory-feature", true},
                                   {"device_name", "Kitchen"},
                                   {"ringerstate", true},
                                   {"velareporting_timestamp", 1'700'000'000.25},
                                   {"systemuptime_sec", 3'600}}));
    EXPECT_THAT(keysOf(*state()), ElementsAre("spatial-audio-accessory-feature", "device_name", "ringerstate",
                                              "velareporting_timestamp", "systemuptime_sec"));
}

TEST_F(VelaReportingServiceDelegateFeaturesTest, TheUptimeIsRoundedToTheNearestSecond) {
    setRinger(1);
    service();
    clock_.advance(490ms);
    EXPECT_EQ(state()->find("systemuptime_sec"), Value(3'600));
    clock_.advance(10ms);
    EXPECT_EQ(state()->find("systemuptime_sec"), Value(3'601));
}

TEST_F(VelaReportingServiceDelegateFeaturesTest, APreferenceIsTakenAsItIsStored) {
    for (const Value& value : {Value("on"), Value(2), Value(Dictionary{{"a", Array{1}}})}) {
        fakes_.preferences.set("com.orvex.lobby", "spatial-audio-accessory-feature", value);
        EXPECT_EQ(Value(state()->find("spatial-audio-accessory-feature")), value);
    }
}

TEST_F(VelaReportingServiceDelegateFeaturesTest, PreferencesAreReadAfreshEachTime) {
    setDeviceName("Kitchen");
    EXPECT_EQ(state()->find("device_name"), Value("Kitchen"));
    setDeviceName("Cellar");
    EXPECT_EQ(state()->find("device_name"), Value("Cellar"));
    fakes_.preferences.remove("com.orvex.vela", "device_name");
    EXPECT_EQ(state(), std::nullopt);
}

TEST_F(VelaReportingServiceDelegateFeaturesTest, ARingerIsOnInStateOneOnly) {
    setRinger(1);
    EXPECT_EQ(state()->find("ringerstate"), Value(true));
    for (const std::uint64_t off :
         {std::uint64_t{0}, std::uint64_t{2}, std::uint64_t{1} << 63U, std::numeric_limits<std::uint64_t>::max()}) {
        setRinger(off);
        EXPECT_EQ(state()->find("ringerstate"), Value(false)) << off;
    }
}

// A start.

TEST_F(VelaReportingServiceDelegateFeaturesTest, AStartWithoutAnyStateSendsNothing) {
    const auto session = connect(7).running(42);
    EXPECT_THAT(recordedBy(*session), IsEmpty());
    EXPECT_THAT(fakes_.beacon.callsOf(BeaconOperation::Send), IsEmpty());
}

TEST_F(VelaReportingServiceDelegateFeaturesTest, AStartSendsTheStateToItsSessionOnly) {
    setRinger(1);
    const Client client = connect(7);
    client.running(1);
    const auto session = client.running(2);
    EXPECT_THAT(recordedBy(*client.session(1)), ElementsAre("Setup_Setup_1"));
    EXPECT_THAT(recordedBy(*session), ElementsAre("Setup_Setup_1"));
    const auto sent = fakes_.beacon.callsOf(BeaconOperation::Send);
    ASSERT_EQ(sent.size(), 2U);
    EXPECT_EQ(sent[0].category, 8);
    EXPECT_EQ(sent[0].type, 5);
    // The time is taken off what leaves the device, the uptime is not.
    EXPECT_EQ(sent[0].payload,
              (Dictionary{{"ringerstate", true}, {"systemuptime_sec", 3'600}, {"audiotag", "SetupSetup"}}));
    EXPECT_THAT(fakes_.tally.calls(), IsEmpty());
}

TEST_F(VelaReportingServiceDelegateFeaturesTest, TheRecordedStateKeepsItsTimes) {
    setRinger(1);
    const auto session = connect(7).running(42);
    VelaReportingSessionMessageList& list = session->nestedAggregatedPayloadData();
    const MutexLock lock(list.mutex());
    ASSERT_EQ(list.messages().size(), 1U);
    EXPECT_EQ(list.messages()[0].message, (Dictionary{{"ringerstate", true},
                                                      {"velareporting_timestamp", 1'700'000'000.0},
                                                      {"systemuptime_sec", 3'600},
                                                      {"audiotag", "SetupSetup"}}));
}

TEST_F(VelaReportingServiceDelegateFeaturesTest, OnAnInternalBuildTheTimeIsSentAsWell) {
    makeInternalBuild();
    setRinger(1);
    connect(7).running(42);
    const auto sent = fakes_.beacon.callsOf(BeaconOperation::Send);
    ASSERT_EQ(sent.size(), 1U);
    EXPECT_EQ(sent[0].payload.find("velareporting_timestamp"), Value(1'700'000'000.0));
}

TEST_F(VelaReportingServiceDelegateFeaturesTest, TheClientsOwnSetupMessagesAreCountedWithThem) {
    setRinger(1);
    const Client client = connect(7);
    const auto session = client.running(42);
    client.send({{"a", 1}}, 8, 5, to({42}));
    EXPECT_THAT(recordedBy(*session), ElementsAre("Setup_Setup_1", "Setup_Setup_2"));
}

// A change.

TEST_F(VelaReportingServiceDelegateFeaturesTest, AChangeIsHandledOnTheReportingQueue) {
    setRinger(1);
    connect(7).running(42);
    log_.clear();
    fakes_.notifications.post(kRinger);
    EXPECT_THAT(log_.lines(), IsEmpty());
    queues_.runUntilIdle();
    EXPECT_THAT(
        serviceLines(),
        ElementsAre(serviceLine(LogLevel::Info, "feature 3 changes"),
                    serviceLine(LogLevel::Default, "getting features"),
                    serviceLine(LogLevel::Info, "defaults {ringerstate = 1; velareporting_timestamp = 1700000000; "
                                                "systemuptime_sec = 3600;}")));
}

TEST_F(VelaReportingServiceDelegateFeaturesTest, EveryNotificationTellsTheWholeState) {
    const auto session = connect(7).running(42);
    setDeviceName("Kitchen");
    post(kSpatial);
    EXPECT_EQ(linesSaying("feature 1 changes"), 1U);
    EXPECT_EQ(recordedBy(*session).size(), 1U);
    setDeviceName("Cellar");
    post(kDevice);
    EXPECT_EQ(linesSaying("feature 2 changes"), 1U);
    EXPECT_EQ(recordedBy(*session).size(), 2U);
}

TEST_F(VelaReportingServiceDelegateFeaturesTest, AChangeReachesEverySessionOfEveryClientAndNoBridge) {
    setRinger(1);
    const Client first = connect(7);
    const Client second = connect(8);
    const auto started = first.running(1);
    first.create(2);
    const auto other = second.running(3);
    setActiveSessionCount(6);
    second.create(4); // neither started nor real-time
    setRinger(0);
    fakes_.beacon.clearCalls();
    fakes_.spoor.clear();
    post(kRinger);
    EXPECT_THAT(recordedBy(*started), ElementsAre("Setup_Setup_1", "Setup_Setup_2"));
    EXPECT_THAT(recordedBy(*other), ElementsAre("Setup_Setup_1", "Setup_Setup_2"));
    EXPECT_EQ(fakes_.spoor.codes().size(), 4U); // one send for each session
    EXPECT_EQ(fakes_.beacon.callsOf(BeaconOperation::Send).size(), 2U);
    EXPECT_THAT(fakes_.beacon.callsOf(BeaconOperation::SendOne), IsEmpty());
    queues_.advance(1s);
    const auto single = fakes_.beacon.callsOf(BeaconOperation::SendOne);
    ASSERT_EQ(single.size(), 1U);
    EXPECT_EQ(single[0].payload.find("ringerstate"), Value(false));
    EXPECT_THAT(fakes_.tally.calls(), IsEmpty());
    EXPECT_THAT(fakes_.joule.events(), IsEmpty());
    EXPECT_THAT(fakes_.telem.metrics(), IsEmpty());
}

TEST_F(VelaReportingServiceDelegateFeaturesTest, AChangeToTheSameStateIsRedundant) {
    setRinger(1);
    const auto session = connect(7).running(42);
    clock_.advance(60s);
    post(kRinger);
    EXPECT_THAT(recordedBy(*session), ElementsAre("Setup_Setup_1"));
    EXPECT_EQ(linesSaying("dropping redundant event"), 1U);
}

TEST_F(VelaReportingServiceDelegateFeaturesTest, AChangeToNoStateAtAllIsSentAsATagAlone) {
    setRinger(1);
    const auto session = connect(7).running(42);
    setRinger(std::nullopt);
    fakes_.beacon.clearCalls();
    post(kRinger);
    EXPECT_EQ(linesSaying("defaults (null)"), 1U);
    const auto sent = fakes_.beacon.callsOf(BeaconOperation::Send);
    ASSERT_EQ(sent.size(), 1U);
    EXPECT_EQ(sent[0].payload, (Dictionary{{"audiotag", "SetupSetup"}}));
    EXPECT_THAT(recordedBy(*session), ElementsAre("Setup_Setup_1", "Setup_Setup_2"));
}

} // namespace

} // namespace vela
