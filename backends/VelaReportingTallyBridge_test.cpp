#include "backends/VelaReportingTallyBridge.h"
#include "session/Session_test.h"
#include "testing/FakeTally.h"

#include <atomic>
#include <thread>

namespace vela {

namespace {

using ::testing::ElementsAre;
using ::testing::IsEmpty;

class VelaReportingTallyBridgeTest : public SessionTest {
protected:
    void SetUp() override {
        session_ = makeSession(42);
        session_->setServiceType(AudioServiceTypeHaptics);
        log_.clear();
    }
    void TearDown() override {
        tally_.dropAll();
        session_.reset();
        SessionTest::TearDown();
    }

    void handle(const Dictionary& message, std::uint32_t category = AudioEventCategoryVolume,
                std::uint32_t type = AudioEventTypeSummary) {
        bridge_.handleEvent(message, category, type, session_);
    }
    std::vector<std::string> eventNames() const {
        std::vector<std::string> names;
        for (const auto& event : tally_.events()) {
            names.push_back(event.name);
        }
        return names;
    }
    /// Payload of the framework-wide event of a message.
    Dictionary payloadOf(const Dictionary& message) {
        tally_.setUsed([](std::string_view name) { return name.starts_with("com.orvex.vela."); });
        handle(message);
        return tally_.buildAll().at(0);
    }

    testing::FakeTally tally_;
    VelaReportingTallyBridge bridge_{tally_};
    std::shared_ptr<VelaReportingSession> session_;
};

TEST_F(VelaReportingTallyBridgeTest, EveryNameIsAskedForAndSentBeforeTheNextIsAskedFor) {
    handle({{"a", 1}});
    EXPECT_THAT(tally_.calls(),
                ElementsAre("isEventUsed com.orvex.vela.Volume.Summary", "send com.orvex.vela.Volume.Summary",
                            "isEventUsed com.orvex.haptics.Volume.Summary", "send com.orvex.haptics.Volume.Summary"));
}

TEST_F(VelaReportingTallyBridgeTest, NamesTakeCategoryTypeAndServiceAsStrings) {
    handle({}, AudioEventCategoryPerformance, AudioEventTypeJoule);
    EXPECT_THAT(eventNames(), ElementsAre("com.orvex.vela.Performance.Joule", "com.orvex.haptics.Performance.Joule"));
}

TEST_F(VelaReportingTallyBridgeTest, ACategorysFlagStandsBeforeIt) {
    handle({}, 0x10000004, AudioEventTypeStart);
    EXPECT_THAT(eventNames(), ElementsAre("com.orvex.vela.DSP_Playback.Start", "com.orvex.haptics.DSP_Playback.Start"));
}

TEST_F(VelaReportingTallyBridgeTest, CategoriesAndTypesWithoutANameAreOfferedToo) {
    handle({}, 0, 0);
    handle({}, AudioEventCategoryAll, AudioEventTypeUnknown);
    EXPECT_THAT(eventNames(), ElementsAre("com.orvex.vela.Undefined.Generic", "com.orvex.haptics.Undefined.Generic",
                                          "com.orvex.vela.Undefined.Unknown", "com.orvex.haptics.Undefined.Unknown"));
}

TEST_F(VelaReportingTallyBridgeTest, MessagesOfTheOtherBridgesAreOfferedToo) {
    handle({}, AudioEventCategoryError, AudioEventTypeIssueDetector);
    EXPECT_THAT(eventNames(),
                ElementsAre("com.orvex.vela.Error.IssueDetector", "com.orvex.haptics.Error.IssueDetector"));
}

TEST_F(VelaReportingTallyBridgeTest, AServiceTypeThatIsNoneCountsAsTelephony) {
    session_->setServiceType(14);
    handle({});
    EXPECT_EQ(eventNames().at(1), "com.orvex.telephony.Volume.Summary");
}

TEST_F(VelaReportingTallyBridgeTest, ASessionWithoutAServiceTypeIsUnknown) {
    const auto untyped = makeSession(43);
    bridge_.handleEvent({}, AudioEventCategoryVolume, AudioEventTypeSummary, untyped);
    EXPECT_EQ(eventNames().at(1), "com.orvex.unknown.Volume.Summary");
    tally_.dropAll();
}

TEST_F(VelaReportingTallyBridgeTest, TheServiceTypeIsTheOneAtTheCall) {
    handle({});
    session_->setServiceType(AudioServiceTypeAlarms);
    handle({});
    EXPECT_THAT(eventNames(), ElementsAre("com.orvex.vela.Volume.Summary", "com.orvex.haptics.Volume.Summary",
                                          "com.orvex.vela.Volume.Summary", "com.orvex.alarms.Volume.Summary"));
}

TEST_F(VelaReportingTallyBridgeTest, OnlyTheFrameworkWideNameMayBeUsed) {
    tally_.setUsed([](std::string_view name) { return name == "com.orvex.vela.Volume.Summary"; });
    handle({});
    EXPECT_THAT(tally_.calls(),
                ElementsAre("isEventUsed com.orvex.vela.Volume.Summary", "send com.orvex.vela.Volume.Summary",
                            "isEventUsed com.orvex.haptics.Volume.Summary"));
}

TEST_F(VelaReportingTallyBridgeTest, OnlyTheServicesNameMayBeUsed) {
    tally_.setUsed([](std::string_view name) { return name == "com.orvex.haptics.Volume.Summary"; });
    handle({});
    EXPECT_THAT(tally_.calls(),
                ElementsAre("isEventUsed com.orvex.vela.Volume.Summary", "isEventUsed com.orvex.haptics.Volume.Summary",
                            "send com.orvex.haptics.Volume.Summary"));
}

TEST_F(VelaReportingTallyBridgeTest, WhereNoNameIsUsedThereIsNoBuilder) {
    tally_.setUsed(false);
    handle({{"a", 1}});
    EXPECT_THAT(tally_.calls(), ElementsAre("isEventUsed com.orvex.vela.Volume.Summary",
                                            "isEventUsed com.orvex.haptics.Volume.Summary"));
    EXPECT_EQ(tally_.unbuilt(), 0U);
    EXPECT_EQ(session_.use_count(), 1);
}

TEST_F(VelaReportingTallyBridgeTest, ThePayloadIsTheMessageAndTheApplicationsName) {
    session_->setConfiguration(Dictionary{{"HostApplicationDisplayID", "com.example.player"}});
    const Dictionary payload = payloadOf({{"b", 1}, {"a", "two"}});
    EXPECT_EQ(textualForm(Value(payload)), "{b = 1; a = two; HostApplicationDisplayID = com.example.player;}");
}

TEST_F(VelaReportingTallyBridgeTest, TheMessagesOwnApplicationNameWins) {
    session_->setConfiguration(Dictionary{{"HostApplicationDisplayID", "com.example.player"}});
    EXPECT_EQ(payloadOf({{"HostApplicationDisplayID", "mine"}, {"a", 1}}),
              (Dictionary{{"HostApplicationDisplayID", "mine"}, {"a", 1}}));
}

TEST_F(VelaReportingTallyBridgeTest, TheMessagesOwnApplicationNameWinsWhateverItIs) {
    session_->setConfiguration(Dictionary{{"HostApplicationDisplayID", "com.example.player"}});
    EXPECT_EQ(payloadOf({{"HostApplicationDisplayID", ""}}), (Dictionary{{"HostApplicationDisplayID", ""}}));
    EXPECT_EQ(payloadOf({{"HostApplicationDisplayID", 0}}), (Dictionary{{"HostApplicationDisplayID", 0}}));
}

TEST_F(VelaReportingTallyBridgeTest, AConfigurationWithoutTheKeyGivesUnknown) {
    session_->setConfiguration(Dictionary{{"colour", "blue"}});
    EXPECT_EQ(payloadOf({{"a", 1}}), (Dictionary{{"a", 1}, {"HostApplicationDisplayID", "Unknown"}}));
}

TEST_F(VelaReportingTallyBridgeTest, AnEmptyConfigurationGivesUnknown) {
    EXPECT_EQ(payloadOf({{"a", 1}}), (Dictionary{{"a", 1}, {"HostApplicationDisplayID", "Unknown"}}));
}

TEST_F(VelaReportingTallyBridgeTest, WithoutAnyConfigurationTheKeyStaysAbsent) {
    session_.reset();
    EXPECT_EQ(payloadOf({{"a", 1}}), (Dictionary{{"a", 1}}));
}

TEST_F(VelaReportingTallyBridgeTest, NoKeyIsCleanedOrRemovedAndNothingIsTagged) {
    const Dictionary message{{"a b", 1}, {"velareporting_timestamp", 1000.5}, {"_throttle_seconds", 2.0F}};
    EXPECT_EQ(textualForm(Value(payloadOf(message))),
              "{\"a b\" = 1; velareporting_timestamp = 1000.5; _throttle_seconds = 2; "
              "HostApplicationDisplayID = Unknown;}");
}

TEST_F(VelaReportingTallyBridgeTest, TheConfigurationIsReadWhenThePayloadIsBuilt) {
    session_->setConfiguration(Dictionary{{"HostApplicationDisplayID", "before"}});
    handle({{"a", 1}});
    session_->setConfiguration(Dictionary{{"HostApplicationDisplayID", "after"}});
    EXPECT_THAT(tally_.buildAll(), ElementsAre((Dictionary{{"a", 1}, {"HostApplicationDisplayID", "after"}}),
                                               (Dictionary{{"a", 1}, {"HostApplicationDisplayID", "after"}})));
}

TEST_F(VelaReportingTallyBridgeTest, TheTwoPayloadsAreFilledIndependently) {
    // The framework-wide one is built before a configuration comes, the service's own after it.
    tally_.setBuildsAtOnce(true);
    tally_.setObserver([this](std::string_view call) {
        if (call == "isEventUsed com.orvex.haptics.Volume.Summary") {
            session_->setConfiguration(Dictionary{{"HostApplicationDisplayID", "late"}});
        }
    });
    handle({{"a", 1}});
    EXPECT_EQ(tally_.events().at(0).payload, (Dictionary{{"a", 1}, {"HostApplicationDisplayID", "Unknown"}}));
    EXPECT_EQ(tally_.events().at(1).payload, (Dictionary{{"a", 1}, {"HostApplicationDisplayID", "late"}}));
}

TEST_F(VelaReportingTallyBridgeTest, TheInputIsTheSameBeforeAndAfter) {
    session_->setConfiguration(Dictionary{{"HostApplicationDisplayID", "com.example.player"}});
    const Dictionary message{{"a", 1}};
    handle(message);
    EXPECT_EQ(message, (Dictionary{{"a", 1}}));
    tally_.buildAll();
    EXPECT_EQ(message, (Dictionary{{"a", 1}}));
}

TEST_F(VelaReportingTallyBridgeTest, ABuilderKeepsMessageAndSession) {
    {
        const Dictionary message{{"a", "only here"}};
        handle(message);
    }
    session_->setConfiguration(Dictionary{{"HostApplicationDisplayID", "com.example.player"}});
    const std::weak_ptr<VelaReportingSession> released = session_;
    session_.reset();
    EXPECT_FALSE(released.expired());
    EXPECT_EQ(tally_.buildAll().at(1),
              (Dictionary{{"a", "only here"}, {"HostApplicationDisplayID", "com.example.player"}}));
    EXPECT_TRUE(released.expired());
}

TEST_F(VelaReportingTallyBridgeTest, ABuilderThatIsNeverRunReleasesTheSession) {
    handle({{"a", 1}});
    const std::weak_ptr<VelaReportingSession> released = session_;
    session_.reset();
    tally_.dropAll();
    EXPECT_TRUE(released.expired());
}

TEST_F(VelaReportingTallyBridgeTest, ABuilderWorksAfterTheSessionStopped) {
    session_->setConfiguration(Dictionary{{"HostApplicationDisplayID", "com.example.player"}});
    session_->start();
    handle({{"a", 1}});
    session_->stop();
    queues_.runUntilIdle();
    EXPECT_EQ(tally_.buildAll().at(0), (Dictionary{{"a", 1}, {"HostApplicationDisplayID", "com.example.player"}}));
}

TEST_F(VelaReportingTallyBridgeTest, ItLogsNothing) {
    handle({{"a", 1}});
    tally_.buildAll();
    tally_.setUsed(false);
    handle({{"a", 1}});
    EXPECT_THAT(log_.lines(), IsEmpty());
}

TEST_F(VelaReportingTallyBridgeTest, PayloadsAreBuiltWhileTheConfigurationChanges) {
    constexpr int kMessages = 200;
    for (int i = 0; i < kMessages; ++i) {
        handle({{"a", i}});
    }
    std::atomic<int> named = 0;
    std::thread builder([this, &named] {
        for (const Dictionary& payload : tally_.buildAll()) {
            const ValueRef name = payload.find("HostApplicationDisplayID");
            named += name == Value("Unknown") || name == Value("x") ? 1 : 0;
        }
    });
    for (int i = 0; i < kMessages; ++i) {
        session_->setConfiguration(Dictionary{{"HostApplicationDisplayID", "x"}, {"level", i}});
    }
    session_.reset(); // the last reference may fall on the builder's thread
    builder.join();
    EXPECT_EQ(named, 2 * kMessages);
}

} // namespace

} // namespace vela
