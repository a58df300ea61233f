#include "backends/VelaReportingUtilitySnagStateManager.h"
#include "session/Session_test.h"
#include "testing/FakeMalady.h"

#include <thread>

namespace vela {

namespace {

using ::testing::ElementsAre;
using ::testing::IsEmpty;

CapturedLine snagLine(std::string message) {
    return {LogLevel::Info, "velarb", "VelaReportingSnagStateManagerUtility", std::move(message)};
}

Dictionary leak(int seconds) { return {{"Haptic_Active_Hardware_Time_Seconds", seconds}}; }

class VelaReportingUtilitySnagStateManagerTest : public SessionTest {
protected:
    void SetUp() override {
        session_ = makeSession(42);
        session_->setServiceType(AudioServiceTypeHaptics);
        log_.clear();
    }
    void TearDown() override {
        session_.reset();
        SessionTest::TearDown();
    }

    void handle(const Dictionary& message, std::uint32_t category = AudioEventCategoryPerformance,
                std::uint32_t type = AudioEventTypeJoule) {
        manager_.handleEvent(message, category, type, session_, "hapticsd");
    }

    testing::FakeMalady malady_;
    VelaReportingUtilitySnagStateManager manager_{malady_};
    std::shared_ptr<VelaReportingSession> session_;
};

TEST_F(VelaReportingUtilitySnagStateManagerTest, ANewOneIsIdle) {
    EXPECT_EQ(manager_.leakedHapticsSessionCounter(), 0);
    EXPECT_EQ(manager_.maladyReporter(), nullptr);
    EXPECT_EQ(manager_.messageCache(), Dictionary());
    EXPECT_EQ(malady_.reportersMade(), 0U);
}

TEST_F(VelaReportingUtilitySnagStateManagerTest, TheFirstMessageIsCountedAndKept) {
    handle(leak(1));
    EXPECT_EQ(manager_.leakedHapticsSessionCounter(), 1);
    EXPECT_EQ(manager_.messageCache(), leak(1));
    EXPECT_THAT(malady_.requests(), IsEmpty());
    EXPECT_THAT(log_.lines(), ElementsAre(snagLine("Incrementing Snag counter. hapticsd")));
}

TEST_F(VelaReportingUtilitySnagStateManagerTest, ARepeatedMessageChangesNothing) {
    handle(leak(1));
    log_.clear();
    handle(leak(1));
    EXPECT_EQ(manager_.leakedHapticsSessionCounter(), 1);
    EXPECT_EQ(manager_.messageCache(), leak(1));
    EXPECT_THAT(malady_.requests(), IsEmpty());
    EXPECT_THAT(log_.lines(), IsEmpty());
}

TEST_F(VelaReportingUtilitySnagStateManagerTest, KeysInAnotherOrderAreARepeatedMessage) {
    handle({{"Haptic_Active_Hardware_Time_Seconds", 1}, {"Active_Clients", 2}});
    handle({{"Active_Clients", 2}, {"Haptic_Active_Hardware_Time_Seconds", 1}});
    EXPECT_EQ(manager_.leakedHapticsSessionCounter(), 1);
}

TEST_F(VelaReportingUtilitySnagStateManagerTest, ADifferentMessageMakesACaptureAndIsNotCounted) {
    handle(leak(1));
    log_.clear();
    handle(leak(2));
    EXPECT_EQ(manager_.leakedHapticsSessionCounter(), 0);
    EXPECT_EQ(manager_.messageCache(), Dictionary());
    EXPECT_EQ(malady_.requests().size(), 1U);
    EXPECT_NE(manager_.maladyReporter(), nullptr);
    EXPECT_THAT(log_.lines(), ElementsAre(snagLine("Getting snapshot with Malady Reporter")));
}

TEST_F(VelaReportingUtilitySnagStateManagerTest, MessagesThatDifferInTheirTimeAreDifferent) {
    handle({{"Haptic_Active_Hardware_Time_Seconds", 1}, {"velareporting_timestamp", 1000.0}});
    handle({{"Haptic_Active_Hardware_Time_Seconds", 1}, {"velareporting_timestamp", 1001.0}});
    EXPECT_EQ(malady_.requests().size(), 1U);
}

TEST_F(VelaReportingUtilitySnagStateManagerTest, ValuesOfAnotherKindAreDifferent) {
    handle({{"Haptic_Active_Hardware_Time_Seconds", 1}});
    handle({{"Haptic_Active_Hardware_Time_Seconds", 1.0}});
    EXPECT_EQ(malady_.requests().size(), 1U);
}

TEST_F(VelaReportingUtilitySnagStateManagerTest, TheSignatureNamesServiceCategoryTypeAndProcess) {
    handle(leak(1));
    handle(leak(2), 0x10000004);
    const auto requests = malady_.requests();
    ASSERT_EQ(requests.size(), 1U);
    EXPECT_EQ(requests[0].signature.domain, "AudioAnalytics");
    EXPECT_EQ(requests[0].signature.type, "haptics");
    EXPECT_EQ(requests[0].signature.subType, "DSP_Playback");
    EXPECT_EQ(requests[0].signature.subtypeContext, "Joule");
    EXPECT_EQ(requests[0].signature.detectedProcess, "hapticsd");
    EXPECT_EQ(requests[0].signature.triggerThresholdValues, std::nullopt);
}

TEST_F(VelaReportingUtilitySnagStateManagerTest, ASnapshotTakesNoTimeAndHasNeitherEventNorPayload) {
    handle(leak(1));
    handle(leak(2));
    const auto requests = malady_.requests();
    ASSERT_EQ(requests.size(), 1U);
    EXPECT_EQ(requests[0].seconds, 0);
    EXPECT_EQ(requests[0].event, std::nullopt);
    EXPECT_EQ(requests[0].payload, std::nullopt);
}

TEST_F(VelaReportingUtilitySnagStateManagerTest, AServiceTypeThatIsNoneCountsAsTelephony) {
    session_->setServiceType(14);
    handle(leak(1));
    handle(leak(2));
    EXPECT_EQ(malady_.requests().at(0).signature.type, "telephony");
}

TEST_F(VelaReportingUtilitySnagStateManagerTest, AProcessWithoutANameIsCountedAndCaptured) {
    manager_.handleEvent(leak(1), AudioEventCategoryPerformance, AudioEventTypeJoule, session_, std::nullopt);
    manager_.handleEvent(leak(2), AudioEventCategoryPerformance, AudioEventTypeJoule, session_, std::nullopt);
    EXPECT_THAT(log_.lines(), ElementsAre(snagLine("Incrementing Snag counter. (null)"),
                                          snagLine("Getting snapshot with Malady Reporter")));
    EXPECT_EQ(malady_.requests().at(0).signature.detectedProcess, "");
}

TEST_F(VelaReportingUtilitySnagStateManagerTest, ThingsHappenInOrderAtACapture) {
    handle(leak(1));
    log_.clear();
    malady_.setObserver([this](const testing::FakeMalady::Request& request) {
        EXPECT_THAT(log_.lines(), ElementsAre(snagLine("Getting snapshot with Malady Reporter")));
        EXPECT_EQ(request.reporter, 1U);
        EXPECT_NE(manager_.maladyReporter(), nullptr);
        EXPECT_EQ(manager_.leakedHapticsSessionCounter(), 1);
        EXPECT_EQ(manager_.messageCache(), leak(1));
    });
    handle(leak(2));
    EXPECT_EQ(malady_.requests().size(), 1U);
}

TEST_F(VelaReportingUtilitySnagStateManagerTest, TheCountBeginsAgainAfterACapture) {
    handle(leak(1));
    handle(leak(2));
    handle(leak(2)); // the same as the one that was captured: it was not kept
    EXPECT_EQ(manager_.leakedHapticsSessionCounter(), 1);
    EXPECT_EQ(manager_.messageCache(), leak(2));
    EXPECT_EQ(malady_.requests().size(), 1U);
}

TEST_F(VelaReportingUtilitySnagStateManagerTest, EveryCaptureHasAReporterOfItsOwn) {
    for (int seconds = 1; seconds <= 4; ++seconds) {
        handle(leak(seconds));
    }
    const auto requests = malady_.requests();
    ASSERT_EQ(requests.size(), 2U);
    EXPECT_EQ(requests[0].reporter, 1U);
    EXPECT_EQ(requests[1].reporter, 2U);
    EXPECT_EQ(malady_.reportersAlive(), 1U);
}

TEST_F(VelaReportingUtilitySnagStateManagerTest, ClientsAndSessionsAreCountedTogether) {
    const auto other = makeSession(43);
    other->setServiceType(AudioServiceTypeAlarms);
    manager_.handleEvent(leak(1), AudioEventCategoryPerformance, AudioEventTypeJoule, session_, "one");
    manager_.handleEvent(leak(2), AudioEventCategoryPerformance, AudioEventTypeJoule, other, "two");
    const auto requests = malady_.requests();
    ASSERT_EQ(requests.size(), 1U);
    EXPECT_EQ(requests[0].signature.type, "alarms");
    EXPECT_EQ(requests[0].signature.detectedProcess, "two");
}

TEST_F(VelaReportingUtilitySnagStateManagerTest, AFirstMessageToTwoSessionsIsCountedOnce) {
    const auto other = makeSession(43);
    for (const auto& session : {session_, other}) {
        manager_.handleEvent(leak(1), AudioEventCategoryPerformance, AudioEventTypeJoule, session, "hapticsd");
    }
    EXPECT_EQ(manager_.leakedHapticsSessionCounter(), 1);
    EXPECT_THAT(malady_.requests(), IsEmpty());
}

TEST_F(VelaReportingUtilitySnagStateManagerTest, ASecondMessageToTwoSessionsIsCapturedAtOneAndCountedAtTheOther) {
    const auto other = makeSession(43);
    handle(leak(1));
    for (const auto& session : {session_, other}) {
        manager_.handleEvent(leak(2), AudioEventCategoryPerformance, AudioEventTypeJoule, session, "hapticsd");
    }
    EXPECT_EQ(malady_.requests().size(), 1U);
    EXPECT_EQ(malady_.requests()[0].signature.type, "haptics");
    EXPECT_EQ(manager_.leakedHapticsSessionCounter(), 1);
    EXPECT_EQ(manager_.messageCache(), leak(2));
}

TEST_F(VelaReportingUtilitySnagStateManagerTest, MessagesOfOtherTypesChangeNothing) {
    for (const std::uint32_t type : {0U, 7U, 9U, 65535U, 65544U}) {
        handle(leak(1), AudioEventCategoryPerformance, type);
    }
    EXPECT_EQ(manager_.leakedHapticsSessionCounter(), 0);
    EXPECT_THAT(log_.lines(), IsEmpty());
}

TEST_F(VelaReportingUtilitySnagStateManagerTest, MessagesWithoutTheKeyChangeNothing) {
    handle({{"EngineOnTime", 1}});
    handle({});
    EXPECT_EQ(manager_.leakedHapticsSessionCounter(), 0);
    EXPECT_THAT(log_.lines(), IsEmpty());
}

TEST_F(VelaReportingUtilitySnagStateManagerTest, OtherMessagesBetweenDoNotDisarm) {
    handle(leak(1));
    handle({{"EngineOnTime", 1}});
    handle(leak(2), AudioEventCategoryPerformance, AudioEventTypeStart);
    EXPECT_EQ(manager_.leakedHapticsSessionCounter(), 1);
    handle(leak(3));
    EXPECT_EQ(malady_.requests().size(), 1U);
}

TEST_F(VelaReportingUtilitySnagStateManagerTest, TheKeysValueDoesNotMatter) {
    handle({{"Haptic_Active_Hardware_Time_Seconds", false}});
    handle({{"Haptic_Active_Hardware_Time_Seconds", "none"}});
    EXPECT_EQ(malady_.requests().size(), 1U);
}

TEST_F(VelaReportingUtilitySnagStateManagerTest, TheCategoryDoesNotMatter) {
    handle(leak(1), 0);
    handle(leak(2), AudioEventCategoryAll);
    ASSERT_EQ(malady_.requests().size(), 1U);
    EXPECT_EQ(malady_.requests()[0].signature.subType, "Undefined");
}

TEST_F(VelaReportingUtilitySnagStateManagerTest, TheReplyIsLogged) {
    handle(leak(1));
    handle(leak(2));
    log_.clear();
    malady_.reply(0, {{"path", "here"}, {"success", true}});
    EXPECT_THAT(log_.lines(), ElementsAre(snagLine("Response from maladyReporter : {path = here; success = 1;}")));
}

TEST_F(VelaReportingUtilitySnagStateManagerTest, AReplyMayComeOnAnotherThreadAfterTheManagerIsGone) {
    auto manager = std::make_unique<VelaReportingUtilitySnagStateManager>(malady_);
    for (int seconds = 1; seconds <= 2; ++seconds) {
        manager->handleEvent(leak(seconds), AudioEventCategoryPerformance, AudioEventTypeJoule, session_, "hapticsd");
    }
    manager.reset();
    log_.clear();
    std::thread([this] { malady_.reply(0, {}); }).join();
    EXPECT_THAT(log_.lines(), ElementsAre(snagLine("Response from maladyReporter : {}")));
}

TEST_F(VelaReportingUtilitySnagStateManagerTest, AReplyMayNeverCome) {
    handle(leak(1));
    handle(leak(2));
    log_.clear();
    malady_.takeReply(0).reset();
    EXPECT_THAT(log_.lines(), IsEmpty());
}

} // namespace

} // namespace vela
