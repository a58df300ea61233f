#include "service/ServiceLog.h"
#include "service/Service_test.h"

namespace vela {

namespace {

using ::testing::EndsWith;
using ::testing::StartsWith;

class ServiceLogTest : public ServiceTest {
protected:
    std::shared_ptr<VelaReportingSession> makeSession(std::int64_t reporterID) {
        return VelaReportingSession::initWithID(reporterID, {7}, sessionPlatform_);
    }

    struct NoAnalytics final : VelaReportingSessionEventHandler {
        void handleEvent(const Dictionary&, std::uint32_t, std::uint32_t,
                         const std::shared_ptr<VelaReportingSession>&) override {}
    };
    NoAnalytics analytics_;
    VelaReportingSessionPlatform sessionPlatform_{fakes_.beacon, clock_,  fakes_.fileSystem, fakes_.json,
                                                  fakes_.spoor,  queues_, analytics_,        ""};
};

TEST_F(ServiceLogTest, SessionsAreAListOfTheirDescriptions) {
    const std::vector<std::shared_ptr<VelaReportingSession>> sessions{makeSession(42), makeSession(-1)};
    std::string text;
    appendDescription(text, VelaReportingSessionListText{sessions});
    EXPECT_EQ(text, "(\"reporterID=42,serviceName=unknown,ownerPid=7,HostApplicationDisplayID=Unknown,started=0\", "
                    "\"reporterID=-1,serviceName=unknown,ownerPid=7,HostApplicationDisplayID=Unknown,started=0\")");
}

TEST_F(ServiceLogTest, NoSessionsAreAnEmptyList) {
    std::string text;
    appendDescription(text, VelaReportingSessionListText{{}});
    EXPECT_EQ(text, "()");
}

TEST_F(ServiceLogTest, ThousandsOfSessionsMakeABoundedText) {
    std::vector<std::shared_ptr<VelaReportingSession>> sessions;
    for (std::int64_t reporterID = 10'000; reporterID < 15'000; ++reporterID) {
        sessions.push_back(makeSession(reporterID));
    }
    std::string text;
    appendDescription(text, VelaReportingSessionListText{sessions});
    // 90 bytes each: the 183rd passes 16 KiB.
    EXPECT_THAT(text, StartsWith("(\"reporterID=10000,"));
    EXPECT_THAT(text, EndsWith("\"reporterID=10182,serviceName=unknown,ownerPid=7,HostApplicationDisplayID=Unknown,"
                               "started=0\", \"and 4817 more\")"));
}

TEST_F(ServiceLogTest, OneLongApplicationNameEndsTheList) {
    std::vector<std::shared_ptr<VelaReportingSession>> sessions{makeSession(1), makeSession(2)};
    sessions[0]->setConfiguration(Dictionary{{"HostApplicationDisplayID", std::string_view(std::string(20'000, 'a'))}});
    std::string text;
    appendDescription(text, VelaReportingSessionListText{sessions});
    EXPECT_THAT(text, EndsWith("aaa,started=0\", \"and 1 more\")"));
}

TEST_F(ServiceLogTest, ReportersAreAList) {
    const auto textOf = [](const ReporterIDs& reporterIDs) {
        std::string text;
        appendDescription(text, VelaReportingReporterListText{reporterIDs});
        return text;
    };
    EXPECT_EQ(textOf(std::nullopt), "(null)");
    EXPECT_EQ(textOf(std::vector<std::int64_t>{}), "()");
    EXPECT_EQ(textOf(std::vector<std::int64_t>{7, 8}), "(7, 8)");
    EXPECT_THAT(textOf(std::vector<std::int64_t>(1'002, 5)), EndsWith(", 5, 5, \"and 2 more\")"));
}

} // namespace

} // namespace vela
