// Every operation over the socket of the built service.
#include "app/RunningService_integrationtest.h"

namespace vela {

namespace {

using ::testing::HasSubstr;
using ::testing::Not;

class ServiceProtocolTest : public ::testing::Test {
protected:
    RunningService service_;
    ServiceClient client_ = service_.client();
};

TEST_F(ServiceProtocolTest, ASessionLivesFromCreateToDestroy) {
    EXPECT_EQ(client_.call("createReportingSession", "[42]"), "true");
    EXPECT_EQ(client_.call("setServiceType", R"(["muse",42])"), "true");
    EXPECT_EQ(client_.call("getServiceNameForReporterID", "[42]"), "1");
    EXPECT_EQ(client_.call("setConfiguration", R"([{"HostApplicationDisplayID":"com.example.player"},42])"), "true");
    EXPECT_EQ(client_.call("reporterID", "[42]"), R"({"reporterID":42,"serviceType":1})");
    EXPECT_EQ(client_.call("getAllReporters"), "[42]");
    const std::uint32_t started = client_.send("startReportingSessionForID", "[42]");
    EXPECT_EQ(client_.call("sendMessage", R"([{"a":1},4,1,[42]])"), "null");
    EXPECT_EQ(client_.answer("startReportingSessionForID", started), "true");
    EXPECT_EQ(client_.call("stopReportingSessionForID", "[42]"), "true");
    EXPECT_EQ(client_.call("destroyReportingSession", "[42]"), "true");
    EXPECT_EQ(client_.call("getAllReporters"), "[]");
}

TEST_F(ServiceProtocolTest, WhatNobodyHasIsNoError) {
    EXPECT_EQ(client_.call("setServiceType", "[1,7]"), "true");
    EXPECT_EQ(client_.call("setConfiguration", "[{},7]"), "true");
    EXPECT_EQ(client_.call("startReportingSessionForID", "[7]"), "true");
    EXPECT_EQ(client_.call("stopReportingSessionForID", "[7]"), "true");
    EXPECT_EQ(client_.call("destroyReportingSession", "[7]"), "true");
    EXPECT_EQ(client_.call("getServiceNameForReporterID", "[7]"), "65535");
    EXPECT_EQ(client_.call("getServiceNameForReporterID", "[0]"), "65535");
    EXPECT_EQ(client_.call("reporterID", "[7]"), R"({"reporterID":0,"serviceType":65535})");
    EXPECT_EQ(client_.call("sendMessage", R"([{"a":1},4,1,[7]])"), "null");
}

TEST_F(ServiceProtocolTest, AnotherClientsSessionMayBeReadAndSentToButNotChanged) {
    client_.call("createReportingSession", "[42]");
    ServiceClient other = service_.client();
    EXPECT_EQ(other.call("setServiceType", "[3,42]"), "true");
    EXPECT_EQ(other.call("getServiceNameForReporterID", "[42]"), "65535");
    EXPECT_EQ(other.call("reporterID", "[42]"), R"({"reporterID":42,"serviceType":65535})");
    EXPECT_EQ(other.call("destroyReportingSession", "[42]"), "true");
    EXPECT_EQ(other.call("getAllReporters"), "[42]");
}

TEST_F(ServiceProtocolTest, AMessageToNobodyGoesToAThrowAwaySession) {
    EXPECT_EQ(client_.call("sendMessage", R"([{"a":1},4,1])"), "null");
    EXPECT_TRUE(service_.waitForLine("active reporting sessions 0 : ()"));
    EXPECT_TRUE(service_.waitForLine("created reporting session for ID: 1"));
    EXPECT_TRUE(service_.waitForLine("sending single message"));
    EXPECT_TRUE(service_.waitForLine("deallocing this session 1"));
    EXPECT_EQ(client_.call("getAllReporters"), "[]");
}

TEST_F(ServiceProtocolTest, AnEmptyListIsNoBroadcast) {
    EXPECT_EQ(client_.call("sendMessage", R"([{"a":1},4,1,[]])"), "null");
    EXPECT_EQ(service_.linesWith("active reporting sessions"), 0U);
}

TEST_F(ServiceProtocolTest, TheSixthSessionStartsWithoutRealTimeReporting) {
    for (int session = 1; session <= 6; ++session) {
        const std::string id = "[" + std::to_string(session) + "]";
        client_.call("createReportingSession", id);
        client_.send("startReportingSessionForID", id);
    }
    client_.call("getAllReporters");
    const testing::ProgramRun sessions = service_.velactl({"sessions", "--json"});
    EXPECT_THAT(sessions.out, HasSubstr(R"("reporterID":5)"));
    std::istringstream lines(sessions.out);
    std::vector<std::string> enabled;
    for (std::string line; std::getline(lines, line);) {
        enabled.push_back(jsonText(readJson(line)->ref().dictionary().find("beaconReportingEnabled")));
    }
    EXPECT_THAT(enabled, ::testing::ElementsAre("true", "true", "true", "true", "true", "false"));
}

TEST_F(ServiceProtocolTest, EveryKindOfValueArrives) {
    client_.call("createReportingSession", "[42]");
    client_.call("setConfiguration",
                 R"([{"b":true,"i":-1,"u":18446744073709551615,"r":1.5,"s":"\u00e4","d":{"$data":"AQI="},)"
                 R"("t":{"$date":1.5},"a":[1,"two",[]],"o":{"k":{}},"HostApplicationDisplayID":"x"},42])");
    client_.call("sendMessage", R"([{"nested":{"list":[1,2.5,{"$date":0}]}},4,1,[42]])");
    EXPECT_EQ(client_.call("getAllReporters"), "[42]");
}

TEST_F(ServiceProtocolTest, KillServiceEndsTheProcessWithTwoAndWithoutAReply) {
    const std::uint32_t serial = client_.send("killService", "[]");
    EXPECT_EQ(client_.answer("killService", serial), "the service closed the connection");
    EXPECT_EQ(service_.program().waitForEnd(), 2);
    EXPECT_EQ(service_.linesWith("DESTROYING SERVICE"), 1U);
}

TEST_F(ServiceProtocolTest, AMessageOverTheLimitIsRefusedAndNothingElse) {
    const std::string large(2 * 1024 * 1024, 'x');
    EXPECT_THAT(client_.call("sendMessage", R"([{"a":")" + large + R"("},4,1,[42]])"),
                HasSubstr("org.freedesktop.DBus.Error.LimitsExceeded: "));
    EXPECT_EQ(client_.call("getAllReporters"), "[]");
}

TEST_F(ServiceProtocolTest, WhatAClientSaysCannotForgeALine) {
    client_.call("createReportingSession", "[42]");
    client_.call("setConfiguration", R"([{"HostApplicationDisplayID":"x\nservice: forged"},42])");
    client_.call("sendMessage", R"([{"a":"b\nforged"},4,1,[42]])");
    const std::uint32_t started = client_.send("startReportingSessionForID", "[42]");
    client_.answer("startReportingSessionForID", started);
    EXPECT_THAT(service_.log(), Not(HasSubstr("\nservice: forged")));
    EXPECT_THAT(service_.log(), Not(HasSubstr("\nforged")));
}

} // namespace

} // namespace vela
