// The built service as other programs' clients see it: the common D-Bus tools, and velactl.
#include "app/RunningService_integrationtest.h"

#include <filesystem>

namespace vela {

namespace {

using ::testing::ContainsRegex;
using ::testing::HasSubstr;
using ::testing::StartsWith;

constexpr const char* kObject = "/com/orvex/vela/reporting/server";
constexpr const char* kInterface = "com.orvex.vela.reporting.VelaReportingServiceProtocol";
constexpr const char* kName = "com.orvex.vela.reporting.server";

class ServiceToolsTest : public ::testing::Test {
protected:
    static bool isInstalled(const std::string& program) { return std::filesystem::exists("/usr/bin/" + program); }

    testing::ProgramRun gdbus(const std::string& method, const std::vector<std::string>& arguments) {
        std::vector<std::string> words{
            "/usr/bin/gdbus", "call",  "--address", service_.address(),         "--dest", kName,
            "--object-path",  kObject, "--method",  kInterface + ("." + method)};
        words.insert(words.end(), arguments.begin(), arguments.end());
        return service_.run(words);
    }
    testing::ProgramRun busctl(const std::vector<std::string>& arguments) {
        std::vector<std::string> words{"/usr/bin/busctl", "--address=" + service_.address()};
        words.insert(words.end(), arguments.begin(), arguments.end());
        return service_.run(words);
    }
    std::string file(const std::string& content) {
        std::string path = service_.folder("calls.jsonl");
        std::ofstream(path) << content;
        return path;
    }

    RunningService service_;
};

TEST_F(ServiceToolsTest, GdbusCallsOperations) {
    if (!isInstalled("gdbus")) {
        GTEST_SKIP() << "gdbus is not installed";
    }
    EXPECT_EQ(gdbus("createReportingSession", {"42"}).out, "(true,)\n");
    EXPECT_EQ(gdbus("getServiceNameForReporterID", {"42"}).out, "(uint16 65535,)\n");
    EXPECT_EQ(gdbus("sendMessage", {"{'a': <1>}", "4", "1", "[[42]]"}).out, "()\n");
    EXPECT_EQ(gdbus("sendMessage", {"{'a': <1>}", "4", "1", "[]"}).out, "()\n");
    EXPECT_EQ(gdbus("reporterID", {"42"}).out, "({'reporterID': <int64 0>, 'serviceType': <uint16 65535>},)\n");
    EXPECT_EQ(gdbus("getAllReporters", {}).out, "(@ax [],)\n");
    const testing::ProgramRun wrong = gdbus("sendMessage", {"{'a': <1>}", "4", "1", "[[1],[2]]"});
    EXPECT_EQ(wrong.status, 1);
    EXPECT_THAT(wrong.error, HasSubstr("org.freedesktop.DBus.Error.InvalidArgs"));
}

TEST_F(ServiceToolsTest, BusctlIntrospectsAndCalls) {
    if (!isInstalled("busctl")) {
        GTEST_SKIP() << "busctl is not installed";
    }
    const testing::ProgramRun introspected = busctl({"introspect", kName, kObject, kInterface});
    EXPECT_THAT(introspected.out, ContainsRegex("\\.sendMessage +method +a\\{sv\\}uqaax +- "));
    EXPECT_THAT(introspected.out, ContainsRegex("\\.reporterID +method +x +a\\{sv\\} "));
    EXPECT_EQ(busctl({"call", kName, kObject, kInterface, "createReportingSession", "x", "42"}).out, "b true\n");
    EXPECT_EQ(busctl({"call", kName, kObject, kInterface, "setServiceType", "qx", "1", "42"}).out, "b true\n");
    EXPECT_EQ(busctl({"call", kName, kObject, kInterface, "reporterID", "x", "42"}).out,
              "a{sv} 2 \"reporterID\" x 0 \"serviceType\" q 65535\n");
}

TEST_F(ServiceToolsTest, VelactlCallsAnOperation) {
    const testing::ProgramRun created = service_.velactl({"call", "createReportingSession", "42"});
    EXPECT_EQ(created.out, "true\n");
    EXPECT_EQ(created.status, 0);
    EXPECT_EQ(service_.velactl({"call", "sendMessage", R"({"a":1})", "Playback", "Start"}).out, "null\n");
    EXPECT_EQ(service_.velactl({"call", "reporterID", "42"}).out, "{\"reporterID\":0,\"serviceType\":65535}\n");
}

TEST_F(ServiceToolsTest, VelactlTellsWrongCallsBeforeItConnects) {
    const testing::ProgramRun none = service_.velactl({"call", "createSession"});
    EXPECT_EQ(none.status, 2);
    EXPECT_THAT(none.error, StartsWith("velactl: there is no operation \"createSession\"; usage: "));
    EXPECT_EQ(service_.velactl({"call", "setServiceType", "rock", "1"}).status, 2);
    EXPECT_EQ(service_.velactl({"call", "setServiceType", "{", "1"}).status, 2);
}

TEST_F(ServiceToolsTest, WithoutAServiceVelactlEndsWithThree) {
    const testing::ProgramRun run = testing::runProgram({VELACTL, "call", "getAllReporters"},
                                                        {"VELA_REPORTING_ADDRESS=unix:path=/nonexistent/socket"});
    EXPECT_EQ(run.status, 3);
    EXPECT_EQ(run.error, "velactl: no service: unix:path=/nonexistent/socket: No such file or directory\n");
}

TEST_F(ServiceToolsTest, VelactlRunsAFileOverOneConnection) {
    const std::string path = file(R"(# a session
{"call":"createReportingSession","args":[42]}

{"call":"startReportingSessionForID","args":[42]}
{"sleep":0.01}
{"call":"sendMessage","args":[{"a":1},"Playback","Start",[42]]}
{"call":"getAllReporters"}
)");
    const testing::ProgramRun run = service_.velactl({"run", path});
    EXPECT_EQ(run.out, "{\"line\":2,\"call\":\"createReportingSession\",\"reply\":true}\n"
                       "{\"line\":4,\"call\":\"startReportingSessionForID\",\"reply\":true}\n"
                       "{\"line\":6,\"call\":\"sendMessage\"}\n"
                       "{\"line\":7,\"call\":\"getAllReporters\",\"reply\":[42]}\n");
    EXPECT_EQ(run.status, 0) << run.error;
}

TEST_F(ServiceToolsTest, AFileWithAFaultSendsNothing) {
    const std::string path = file("{\"call\":\"createReportingSession\",\"args\":[42]}\n{\"call\":\"create\"}\n");
    const testing::ProgramRun run = service_.velactl({"run", path});
    EXPECT_EQ(run.status, 1);
    EXPECT_EQ(run.error, "velactl: " + path + ":2: there is no operation \"create\"\n");
    EXPECT_EQ(service_.linesWith("newConnection"), 0U);
}

TEST_F(ServiceToolsTest, AFolderIsNoFileToRun) {
    const testing::ProgramRun run = service_.velactl({"run", "/"});
    EXPECT_EQ(run.status, 1);
    EXPECT_EQ(run.error, "velactl: / cannot be read to its end\n");
}

TEST_F(ServiceToolsTest, VelactlShowsSessionsAndStatus) {
    EXPECT_EQ(service_.velactl({"sessions"}).out, "No sessions\n");
    ServiceClient client = service_.client();
    client.call("createReportingSession", "[42]");
    client.call("setServiceType", R"(["muse",42])");
    client.call("setConfiguration", R"([{"HostApplicationDisplayID":"com.example.player"},42])");
    const testing::ProgramRun table = service_.velactl({"sessions"});
    EXPECT_THAT(table.out, StartsWith("REPORTER  SERVICE  OWNER"));
    EXPECT_THAT(table.out, HasSubstr("42        muse     "));
    EXPECT_THAT(table.out, HasSubstr("com.example.player  no"));
    const testing::ProgramRun status = service_.velactl({"status"});
    EXPECT_THAT(status.out, StartsWith("vela-reportingd " VELA_VERSION " is running\n1 session, 0 started\n"));
    EXPECT_THAT(service_.velactl({"status", "--json"}).out,
                StartsWith("{\"version\":\"" VELA_VERSION "\",\"sessions\":1,\"started\":0,\"ledger\":{"));
}

TEST_F(ServiceToolsTest, VelactlKillsTheService) {
    EXPECT_EQ(service_.velactl({"call", "killService"}).status, 0);
    EXPECT_EQ(service_.program().waitForEnd(), 2);
}

TEST_F(ServiceToolsTest, VelactlCallsWhatStandsBehindTheMarkOfTheLastOption) {
    const testing::ProgramRun run = service_.velactl({"call", "--", "createReportingSession", "42"});
    EXPECT_EQ(run.out, "true\n");
    EXPECT_EQ(run.status, 0) << run.error;
    EXPECT_EQ(service_.velactl({"call", "--json", "createReportingSession", "-17"}).out, "true\n");
}

TEST_F(ServiceToolsTest, VelactlRunShowsTheCallThatEndedTheService) {
    const testing::ProgramRun run = service_.velactl({"run", file("{\"call\":\"killService\"}\n")});
    EXPECT_EQ(run.out, "{\"line\":1,\"call\":\"killService\"}\n");
    EXPECT_EQ(run.error, "");
    EXPECT_EQ(run.status, 0);
    EXPECT_EQ(service_.program().waitForEnd(), 2);
}

} // namespace

} // namespace vela
