// The C++ header and the examples.
#include "client/Client_integrationtest.h"
#include "client/include/vela/reporting.hpp"
#include "testing/RunProgram.h"

#include <array>
#include <vector>

namespace vela::client {

namespace {

using reporting::Field;
using reporting::Value;
using ::testing::ElementsAre;

constexpr std::chrono::milliseconds kLong{kPatience};

class ReportingHeaderTest : public ClientTest {
protected:
    reporting::Client client_{{.address = address_.c_str(), .queueBytes = 0, .patience = kLong}};
};

TEST_F(ReportingHeaderTest, EveryKindOfValue) {
    const std::array<std::byte, 2> bytes = {std::byte{0}, std::byte{255}};
    const Value values[] = {1, "x"};
    const Field inner[] = {{"a", 1.5}};
    const std::string text = "text";
    client_.sendMessage({{"bool", true},
                         {"int", -5},
                         {"unsigned", 7U},
                         {"large", UINT64_MAX},
                         {"double", 0.25},
                         {"float", 0.5F},
                         {"text", "literal"},
                         {"view", std::string_view(text)},
                         {"date", reporting::Date{5}},
                         {"data", std::span<const std::byte>(bytes)},
                         {"array", std::span<const Value>(values)},
                         {"dictionary", std::span<const Field>(inner)}},
                        1, 2, {42, 43});
    service_.waitForCalls(1);
    EXPECT_THAT(
        service_.texts(),
        ElementsAre(
            R"(sendMessage {"bool":true,"int":-5,"unsigned":7,"large":18446744073709551615,"double":0.25,"float":0.5,)"
            R"("text":"literal","view":"text","date":"1970-01-01T00:00:05Z","data":"AP8=","array":[1,"x"],)"
            R"("dictionary":{"a":1.5}} 1 2 [42,43])"));
}

TEST_F(ReportingHeaderTest, ListsOfSessions) {
    client_.sendMessage({}, 1, 2, reporting::ReporterIDs::all());
    client_.sendMessage({}, 1, 2, std::span<const std::int64_t>());
    const std::vector<std::int64_t> ids = {1, 2, 3};
    client_.sendMessage({}, 1, 2, std::span<const std::int64_t>(ids));
    service_.waitForCalls(3);
    EXPECT_THAT(service_.texts(),
                ElementsAre("sendMessage {} 1 2 all", "sendMessage {} 1 2 []", "sendMessage {} 1 2 [1,2,3]"));
}

TEST_F(ReportingHeaderTest, ASessionLivesAsLongAsItsObject) {
    {
        const reporting::Session session(client_, 42);
        EXPECT_EQ(session.status(), VelaReportingStatusOk);
        EXPECT_EQ(session.reporterID(), 42);
        session.setServiceType(11);
        session.setConfiguration({{"HostApplicationDisplayID", "app"}});
        session.start();
        session.sendMessage({{"a", 1}}, 1, 3);
        session.stop();
    }
    service_.waitForCalls(7);
    EXPECT_THAT(service_.texts(), ElementsAre("createReportingSession 42", "setServiceType 11 42",
                                              R"(setConfiguration {"HostApplicationDisplayID":"app"} 42)",
                                              "startReportingSessionForID 42", R"(sendMessage {"a":1} 1 3 [42])",
                                              "stopReportingSessionForID 42", "destroyReportingSession 42"));
}

TEST_F(ReportingHeaderTest, CallsThatWait) {
    reporting::Error error{};
    EXPECT_EQ(client_.createReportingSession(42, kLong, &error), VelaReportingStatusOk);
    EXPECT_EQ(client_.setServiceType(11, 42, kLong), VelaReportingStatusOk);
    EXPECT_EQ(client_.setConfiguration({{"a", 1}}, 42, kLong), VelaReportingStatusOk);
    EXPECT_EQ(client_.startReportingSessionForID(42, reporting::kForever), VelaReportingStatusOk);
    EXPECT_EQ(client_.sendMessage({{"a", 1}}, 1, 2, {42}, kLong), VelaReportingStatusOk);
    EXPECT_EQ(client_.serviceTypeOf(42, kLong), 11);
    EXPECT_EQ(client_.reporter(42, kLong)->reporterID, 42);
    std::array<std::int64_t, 2> ids{};
    EXPECT_EQ(client_.allReporters(ids, kLong), 3U);
    EXPECT_THAT(ids, ElementsAre(42, -7));
    EXPECT_EQ(client_.stopReportingSessionForID(42, kLong), VelaReportingStatusOk);
    EXPECT_EQ(client_.destroyReportingSession(42, kLong), VelaReportingStatusOk);
    EXPECT_EQ(client_.killService(kLong), VelaReportingStatusOk);
}

TEST_F(ReportingHeaderTest, ErrorsNeedNoSize) {
    service_.setDisabled(true);
    reporting::Error error{};
    EXPECT_EQ(client_.sendMessage({}, 1, 2, reporting::ReporterIDs::all(), kLong, &error), VelaReportingStatusRefused);
    EXPECT_STREQ(error.name, "com.orvex.audio.reporting.Code1");
    EXPECT_EQ(client_.serviceTypeOf(42, kLong, &error), std::nullopt);
}

TEST_F(ReportingHeaderTest, AClientThatDidNotComeAboutAnswersInvalidArgument) {
    const reporting::Client none({.address = "nonsense"});
    EXPECT_FALSE(none);
    EXPECT_EQ(none.status(), VelaReportingStatusInvalidArgument);
    EXPECT_EQ(none.createReportingSession(1), VelaReportingStatusInvalidArgument);
    EXPECT_FALSE(none.state().connected);
}

TEST_F(ReportingHeaderTest, AClientCanBeMoved) {
    reporting::Client other(std::move(client_));
    EXPECT_TRUE(other);
    other.createReportingSession(1);
    service_.waitForCalls(1);
    client_ = std::move(other);
    EXPECT_EQ(client_.status(), VelaReportingStatusOk);
    EXPECT_EQ(client_.state().connections, 1U);
    EXPECT_EQ(client_.end(), VelaReportingStatusOk);
}

class ReportingExampleTest : public ClientTest {
protected:
    testing::ProgramRun run(const char* program) const {
        return testing::runProgram({program}, {"VELA_REPORTING_ADDRESS=" + address_});
    }
};

TEST_F(ReportingExampleTest, InC) {
    const testing::ProgramRun run = this->run(VELA_EXAMPLE_C);
    EXPECT_EQ(run.status, 0) << run.error;
    EXPECT_EQ(run.out, "dropped 0, done\n");
    service_.waitForCalls(7);
    EXPECT_THAT(
        service_.texts(),
        ElementsAre("createReportingSession 4711", "setServiceType 11 4711",
                    R"(setConfiguration {"HostApplicationDisplayID":"example.c"} 4711)",
                    "startReportingSessionForID 4711",
                    R"(sendMessage {"sample_rate":48000.0,"frames":512,"overload":false,"channels":["left","right"]})"
                    " 1 3 [4711]",
                    "stopReportingSessionForID 4711", "destroyReportingSession 4711"));
}

TEST_F(ReportingExampleTest, InCpp) {
    const testing::ProgramRun run = this->run(VELA_EXAMPLE_CPP);
    EXPECT_EQ(run.status, 0) << run.error;
    EXPECT_EQ(run.out, "service type 11\ndropped 0, done\n");
    service_.waitForCalls(8);
    EXPECT_THAT(
        service_.texts(),
        ElementsAre("createReportingSession 4712", "setServiceType 11 4712",
                    R"(setConfiguration {"HostApplicationDisplayID":"example.cpp"} 4712)",
                    "startReportingSessionForID 4712", "reporterID 4712",
                    R"(sendMessage {"sample_rate":48000.0,"frames":512,"overload":false,"channels":["left","right"]})"
                    " 1 3 [4712]",
                    "stopReportingSessionForID 4712", "destroyReportingSession 4712"));
}

} // namespace

} // namespace vela::client
