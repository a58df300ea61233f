#include "backends/VelaReportingJouleUtility.h"
#include "session/Session_test.h"
#include "testing/FakeJoule.h"

namespace vela {

namespace {

using ::testing::ElementsAre;
using ::testing::IsEmpty;

CapturedLine jouleError(std::string message) {
    return {LogLevel::Error, "velarp", "VelaReportingJouleUtility", std::move(message)};
}

class VelaReportingJouleUtilityTest : public SessionTest {
protected:
    void SetUp() override {
        session_ = makeSession(42);
        log_.clear();
    }
    void TearDown() override {
        session_.reset();
        SessionTest::TearDown();
    }

    /// Without a session there is no configuration.
    void forgetSession() {
        session_.reset();
        log_.clear();
    }
    void handle(const Dictionary& message, std::uint32_t type = AudioEventTypeJoule,
                std::uint32_t category = AudioEventCategoryPerformance) {
        bridge_.handleEvent(message, category, type, session_);
    }
    void setApplicationName(const char* name) {
        session_->setConfiguration(Dictionary{{"HostApplicationDisplayID", name}});
    }
    /// "28 Lumen_Haptics {EngineOnDuration = 1;}"
    std::vector<std::string> events() const {
        std::vector<std::string> texts;
        for (const auto& event : joule_.events()) {
            EXPECT_TRUE(event.options.empty());
            texts.push_back(std::to_string(event.clientIdentifier) + " " + event.name + " " +
                            textualForm(Value(event.payload)));
        }
        return texts;
    }

    testing::FakeJoule joule_;
    VelaReportingJouleUtility bridge_{joule_};
    std::shared_ptr<VelaReportingSession> session_;
};

TEST_F(VelaReportingJouleUtilityTest, EngineTimeIsPostedWithApplicationAndEnd) {
    setApplicationName("player");
    handle({{"velareporting_timestamp", 1000.5}, {"EngineOnTime", 12}, {"other", true}});
    EXPECT_THAT(events(), ElementsAre("28 Lumen_Haptics {EngineOnDuration = 12; ApplicationName = player; "
                                      "TimestampEnd = 1000.5;}"));
    EXPECT_THAT(log_.lines(), IsEmpty());
}

TEST_F(VelaReportingJouleUtilityTest, EngineTimeIsPostedAloneWhereNothingElseIsKnown) {
    forgetSession();
    handle({{"EngineOnTime", 12}});
    EXPECT_THAT(events(), ElementsAre("28 Lumen_Haptics {EngineOnDuration = 12;}"));
    EXPECT_THAT(log_.lines(), ElementsAre(jouleError("failed to get app name for joule"),
                                          jouleError("failed to get VelaReporting timestamp for joule")));
}

TEST_F(VelaReportingJouleUtilityTest, WithoutAnyConfigurationTheNameIsMissed) {
    forgetSession();
    handle({{"EngineOnTime", 12}, {"velareporting_timestamp", 7.0}});
    EXPECT_THAT(events(), ElementsAre("28 Lumen_Haptics {EngineOnDuration = 12; TimestampEnd = 7;}"));
    EXPECT_THAT(log_.lines(), ElementsAre(jouleError("failed to get app name for joule")));
}

TEST_F(VelaReportingJouleUtilityTest, AnEmptyConfigurationGivesUnknown) {
    handle({{"EngineOnTime", 12}, {"velareporting_timestamp", 7.0}});
    EXPECT_THAT(events(),
                ElementsAre("28 Lumen_Haptics {EngineOnDuration = 12; ApplicationName = Unknown; TimestampEnd = 7;}"));
    EXPECT_THAT(log_.lines(), IsEmpty());
}

TEST_F(VelaReportingJouleUtilityTest, AConfigurationWithoutANameGivesUnknown) {
    session_->setConfiguration(Dictionary{{"colour", "blue"}});
    handle({{"EngineOnTime", 12}, {"velareporting_timestamp", 7.0}});
    EXPECT_THAT(events(),
                ElementsAre("28 Lumen_Haptics {EngineOnDuration = 12; ApplicationName = Unknown; TimestampEnd = 7;}"));
    EXPECT_THAT(log_.lines(), IsEmpty());
}

TEST_F(VelaReportingJouleUtilityTest, WithoutATimestampTheEndIsMissed) {
    setApplicationName("player");
    handle({{"EngineOnTime", 12}});
    EXPECT_THAT(events(), ElementsAre("28 Lumen_Haptics {EngineOnDuration = 12; ApplicationName = player;}"));
    EXPECT_THAT(log_.lines(), ElementsAre(jouleError("failed to get VelaReporting timestamp for joule")));
}

TEST_F(VelaReportingJouleUtilityTest, ItsLinesHaveThePrefixOfEveryLine) {
    forgetSession();
    handle({{"EngineOnTime", 12}, {"velareporting_timestamp", 7.0}});
    const auto records = log_.records();
    ASSERT_EQ(records.size(), 1U);
    const std::string line = std::to_string(records[0].lineNumber);
    EXPECT_EQ(records[0].text, "VelaReportingJouleUtility:" + line + std::string(5 - line.size(), ' ') +
                                   " failed to get app name for joule");
}

TEST_F(VelaReportingJouleUtilityTest, ValuesAreCopiedAsTheyAre) {
    setApplicationName("player");
    const Value values[] = {Value(12), Value(0), Value(12.5), Value("12"), Value(true), Value(Array{1, "two"})};
    for (const Value& value : values) {
        handle(Dictionary().setting(Key("EngineOnTime"), value).setting(Key("velareporting_timestamp"), value));
        const Dictionary payload = joule_.events().back().payload;
        EXPECT_EQ(payload.find("EngineOnDuration"), value.ref());
        EXPECT_EQ(payload.find("TimestampEnd"), value.ref());
    }
    EXPECT_EQ(joule_.events().size(), std::size(values));
}

TEST_F(VelaReportingJouleUtilityTest, AMessageWithBothTimesIsOneOfTheEngine) {
    setApplicationName("player");
    handle({{"Haptic_Active_Hardware_Time_Seconds", 3}, {"EngineOnTime", 0}, {"velareporting_timestamp", 7.0}});
    EXPECT_THAT(events(),
                ElementsAre("28 Lumen_Haptics {EngineOnDuration = 0; ApplicationName = player; TimestampEnd = 7;}"));
}

TEST_F(VelaReportingJouleUtilityTest, AnActiveHardwareTimeIsALeakedSession) {
    handle({{"Haptic_Active_Hardware_Time_Seconds", 3.5}, {"velareporting_timestamp", 7.0}});
    EXPECT_THAT(events(), ElementsAre("28 LeakedHapticsSessionInfo {Haptic_Active_Hardware_Time_Seconds = 3.5;}"));
    EXPECT_THAT(log_.lines(), IsEmpty());
}

TEST_F(VelaReportingJouleUtilityTest, ALeakedSessionNamesItsActiveClients) {
    handle({{"Active_Clients", Array{"a", "b"}}, {"Haptic_Active_Hardware_Time_Seconds", 3}});
    EXPECT_THAT(events(), ElementsAre("28 LeakedHapticsSessionInfo {Haptic_Active_Hardware_Time_Seconds = 3; "
                                      "Active_Clients = (a, b);}"));
    EXPECT_THAT(log_.lines(), IsEmpty());
}

TEST_F(VelaReportingJouleUtilityTest, ActiveClientsAloneGiveNothing) {
    handle({{"Active_Clients", 2}});
    EXPECT_THAT(events(), IsEmpty());
    EXPECT_THAT(log_.lines(), IsEmpty());
}

TEST_F(VelaReportingJouleUtilityTest, AMessageWithNeitherTimeGivesNothing) {
    handle({{"velareporting_timestamp", 7.0}});
    handle({});
    EXPECT_THAT(events(), IsEmpty());
    EXPECT_THAT(log_.lines(), IsEmpty());
}

TEST_F(VelaReportingJouleUtilityTest, MessagesOfOtherTypesGiveNothing) {
    for (const std::uint32_t type : {0U, 7U, 9U, 65535U, 65544U}) {
        handle({{"EngineOnTime", 1}, {"Haptic_Active_Hardware_Time_Seconds", 2}, {"Active_Clients", 3}}, type);
    }
    EXPECT_THAT(events(), IsEmpty());
    EXPECT_THAT(log_.lines(), IsEmpty());
}

TEST_F(VelaReportingJouleUtilityTest, TheCategoryDoesNotMatter) {
    for (const std::uint32_t category : {0U, 13U, 0xFFFFFFFFU}) {
        handle({{"Haptic_Active_Hardware_Time_Seconds", 2}}, AudioEventTypeJoule, category);
    }
    EXPECT_EQ(joule_.events().size(), 3U);
}

TEST_F(VelaReportingJouleUtilityTest, TheMessageStaysAsItIs) {
    const Dictionary message{{"EngineOnTime", 1}, {"velareporting_timestamp", 7.0}};
    handle(message);
    EXPECT_EQ(message, (Dictionary{{"EngineOnTime", 1}, {"velareporting_timestamp", 7.0}}));
}

} // namespace

} // namespace vela
