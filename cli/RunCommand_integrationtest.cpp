// `velactl run` beside a service whose replies the test holds back and whose end it chooses.
#include "platform/dbus/ServiceEndpoint_integrationtest.h"
#include "testing/RunProgram.h"
#include "testing/RunningProgram.h"

#include <fstream>
#include <string>

namespace vela {
namespace {

using ::testing::ElementsAre;

class RunCommandTest : public ::testing::Test {
protected:
    std::vector<std::string> words(const std::string& content) const {
        const std::string path = folder_ / "calls.jsonl";
        std::ofstream(path) << content;
        return {VELACTL, "run", path};
    }
    std::vector<std::string> environment() const { return {"VELA_REPORTING_ADDRESS=unix:path=" + endpoint_.path()}; }

    const testing::TemporaryFolder folder_;
    platform::dbus::RunningEndpoint endpoint_;
};

TEST_F(RunCommandTest, CallsBehindAKillServiceThatAreNotAnsweredAreAFailure) {
    endpoint_.service->keepReplies();
    testing::RunningProgram velactl(words(R"({"call":"killService"}
{"call":"createReportingSession","args":[1]}
{"call":"destroyReportingSession","args":[2]}
)"),
                                    environment());
    EXPECT_THAT(endpoint_.journal.waitFor(4), ElementsAre("connected", "kill", "create 1", "destroy 2"));
    endpoint_.stop();
    EXPECT_EQ(velactl.waitForEnd(), 3);
    EXPECT_EQ(velactl.out(), "{\"line\":1,\"call\":\"killService\"}\n");
    EXPECT_EQ(velactl.error(), "velactl: the service closed the connection\n");
}

TEST_F(RunCommandTest, RepliesBehindAKillServiceArePrinted) {
    endpoint_.service->keepReplies();
    testing::RunningProgram velactl(words("{\"call\":\"killService\"}\n{\"call\":\"getAllReporters\"}\n"),
                                    environment());
    EXPECT_THAT(endpoint_.journal.waitFor(3), ElementsAre("connected", "kill", "all"));
    endpoint_.stop();
    EXPECT_EQ(velactl.waitForEnd(), 0);
    EXPECT_EQ(velactl.out(), "{\"line\":1,\"call\":\"killService\"}\n"
                             "{\"line\":2,\"call\":\"getAllReporters\",\"reply\":[1,-2]}\n");
    EXPECT_EQ(velactl.error(), "");
}

TEST_F(RunCommandTest, ACallBeforeTheKillServiceThatIsNotAnsweredIsAFailure) {
    endpoint_.service->keepReplies();
    testing::RunningProgram velactl(words(R"({"call":"createReportingSession","args":[1]}
{"call":"killService"}
)"),
                                    environment());
    EXPECT_THAT(endpoint_.journal.waitFor(3), ElementsAre("connected", "create 1", "kill"));
    endpoint_.stop();
    EXPECT_EQ(velactl.waitForEnd(), 3);
    EXPECT_EQ(velactl.out(), "{\"line\":2,\"call\":\"killService\"}\n");
    EXPECT_EQ(velactl.error(), "velactl: the service closed the connection\n");
}

TEST_F(RunCommandTest, AServiceThatIsKilledEndsTheLastPause) {
    endpoint_.service->keepReplies();
    testing::RunningProgram velactl(words("{\"call\":\"killService\"}\n{\"sleep\":86400}\n"), environment());
    EXPECT_THAT(endpoint_.journal.waitFor(2), ElementsAre("connected", "kill"));
    endpoint_.stop();
    EXPECT_EQ(velactl.waitForEnd(), 0);
    EXPECT_EQ(velactl.out(), "{\"line\":1,\"call\":\"killService\"}\n");
}

TEST_F(RunCommandTest, CallsThatAKilledServiceIsNotSentAreAFailure) {
    endpoint_.service->keepReplies();
    testing::RunningProgram velactl(words(R"({"call":"killService"}
{"sleep":86400}
{"call":"getAllReporters"}
)"),
                                    environment());
    EXPECT_THAT(endpoint_.journal.waitFor(2), ElementsAre("connected", "kill"));
    endpoint_.stop();
    EXPECT_EQ(velactl.waitForEnd(), 3);
    EXPECT_EQ(velactl.out(), "{\"line\":1,\"call\":\"killService\"}\n");
    EXPECT_EQ(velactl.error(), "velactl: the service closed the connection\n");
}

TEST_F(RunCommandTest, RepliesArePrintedDuringAPause) {
    endpoint_.service->keepReplies();
    testing::RunningProgram velactl(words("{\"call\":\"createReportingSession\",\"args\":[1]}\n{\"sleep\":86400}\n"),
                                    environment());
    EXPECT_THAT(endpoint_.journal.waitFor(2), ElementsAre("connected", "create 1"));
    for (auto& answer : endpoint_.service->takeReplies()) {
        answer();
    }
    EXPECT_TRUE(testing::waitUntil([&velactl] {
        return velactl.out() == "{\"line\":1,\"call\":\"createReportingSession\",\"reply\":true}\n";
    })) << velactl.out();
    EXPECT_TRUE(velactl.runs());
}

TEST_F(RunCommandTest, AServiceThatEndsDuringAPauseIsAFailure) {
    testing::RunningProgram velactl(words("{\"call\":\"createReportingSession\",\"args\":[1]}\n{\"sleep\":86400}\n"),
                                    environment());
    EXPECT_THAT(endpoint_.journal.waitFor(2), ElementsAre("connected", "create 1"));
    EXPECT_TRUE(testing::waitUntil([&velactl] { return !velactl.out().empty(); }));
    endpoint_.stop();
    EXPECT_EQ(velactl.waitForEnd(), 3);
    EXPECT_EQ(velactl.out(), "{\"line\":1,\"call\":\"createReportingSession\",\"reply\":true}\n");
    EXPECT_EQ(velactl.error(), "velactl: the service closed the connection\n");
}

TEST_F(RunCommandTest, AFileThatCannotBeOpenedIsToldInTheSystemsWords) {
    const testing::ProgramRun run = testing::runProgram({VELACTL, "run", folder_ / "none.jsonl"}, environment());
    EXPECT_EQ(run.status, 1);
    EXPECT_EQ(run.error, "velactl: " + (folder_ / "none.jsonl") + " cannot be read: No such file or directory\n");
}

} // namespace
} // namespace vela
