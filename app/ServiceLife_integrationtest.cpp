// How the built service begins and ends, and what becomes of clients that go away.
#include "app/RunningService_integrationtest.h"

#include <filesystem>
#include <sys/resource.h>
#include <sys/un.h>

namespace vela {

namespace {

using ::testing::HasSubstr;
using ::testing::Not;

/// A client process: velactl run with a file of its own, which ends in a pause that outlives the test.
class ClientProcess {
public:
    ClientProcess(const RunningService& service, const std::string& lines)
        : file_(service.folder("client.jsonl")),
          program_(write(lines), environmentOf(service)) {}

    testing::RunningProgram& program() { return program_; }

private:
    std::vector<std::string> write(const std::string& lines) {
        std::ofstream(file_) << lines << "\n{\"sleep\":600}\n";
        return {VELACTL, "run", file_};
    }
    static std::vector<std::string> environmentOf(const RunningService& service) {
        return {"VELA_REPORTING_ADDRESS=" + service.address()};
    }

    const std::string file_;
    testing::RunningProgram program_;
};

constexpr const char* kStartedSession = R"({"call":"createReportingSession","args":[42]}
{"call":"startReportingSessionForID","args":[42]}
{"call":"sendMessage","args":[{"a":1},4,1,[42]]})";

TEST(ServiceLifeTest, SigtermEndsItWithZeroAndStopsNoSession) {
    RunningService service({"device.InternalBuild=true"});
    ServiceClient client = service.client();
    client.call("createReportingSession", "[42]");
    client.answer("startReportingSessionForID", client.send("startReportingSessionForID", "[42]"));
    client.call("sendMessage", R"([{"a":1},4,1,[42]])");
    service.program().signal(SIGTERM);
    EXPECT_EQ(service.program().waitForEnd(), 0);
    EXPECT_THAT(service.log(), Not(HasSubstr("ending session")));
    EXPECT_FALSE(std::filesystem::exists(service.root()));
    EXPECT_FALSE(std::filesystem::exists(service.socket()));
}

TEST(ServiceLifeTest, SigintEndsItAsWell) {
    RunningService service;
    service.program().signal(SIGINT);
    EXPECT_EQ(service.program().waitForEnd(), 0);
}

TEST(ServiceLifeTest, NothingTakesThePlaceOfAStandardDescriptorThatIsClosed) {
    const testing::TemporaryFolder folder;
    const std::string command = "exec '" VELA_REPORTINGD "' --set paths.root=" + (folder / "root") +
                                " --set paths.state=" + (folder / "state") +
                                " --set paths.runtime=" + (folder / "run") + " --set log.target=stderr <&- >&- 2>&-";
    const testing::RunningProgram program({"/bin/sh", "-c", command}, {"PATH=/usr/bin:/bin"});
    ASSERT_TRUE(testing::waitUntil(
        [&] { return std::filesystem::exists(folder / ("run/" + std::string(platform::dbus::kSocketName))); }));
    for (const char* const descriptor : {"0", "1", "2"}) {
        EXPECT_EQ(std::filesystem::read_symlink("/proc/" + std::to_string(program.pid()) + "/fd/" + descriptor),
                  "/dev/null");
    }
}

TEST(ServiceLifeTest, TheServiceIsSetUpBeforeItTakesClients) {
    RunningService service;
    service.client().call("getAllReporters");
    const std::string log = service.log();
    EXPECT_LT(log.find("listening for features"), log.find("creating hwstatsing driver utility"));
    EXPECT_LT(log.find("creating hwstatsing driver utility"), log.find("newConnection: "));
}

TEST(ServiceLifeTest, ASecondServiceAtTheSameSocketIsRefused) {
    RunningService service;
    std::vector<std::string> words = service.commandLine();
    words.insert(words.end(), {"--set", "paths.state=" + service.folder("other-state")});
    const testing::ProgramRun second = testing::runProgram(words, RunningService::environment());
    EXPECT_EQ(second.status, 1);
    EXPECT_THAT(second.error, HasSubstr(service.socket()));
    EXPECT_EQ(service.client().call("getAllReporters"), "[]");
}

TEST(ServiceLifeTest, ASecondServiceOnTheSameStoreIsRefused) {
    RunningService service;
    std::vector<std::string> words = service.commandLine();
    words.insert(words.end(), {"--set", "paths.runtime=" + service.folder("other-runtime")});
    const testing::ProgramRun second = testing::runProgram(words, RunningService::environment());
    EXPECT_EQ(second.status, 1);
    EXPECT_THAT(second.error, HasSubstr("deliveries.db is in use by another service"));
}

TEST(ServiceLifeTest, ASocketThatAKilledServiceLeftIsReplaced) {
    RunningService service;
    service.program().signal(SIGKILL);
    service.program().waitForEnd();
    ASSERT_TRUE(std::filesystem::exists(service.socket()));
    service.start();
    EXPECT_EQ(service.client().call("getAllReporters"), "[]");
}

TEST(ServiceLifeTest, AClientThatIsKilledIsForgotten) {
    RunningService service;
    ClientProcess client(service, kStartedSession);
    ASSERT_TRUE(service.waitForLine("sending message for session owned by 42"));
    client.program().signal(SIGKILL);
    EXPECT_TRUE(service.waitForLine("ending session 42"));
    EXPECT_TRUE(
        service.waitForLine("removing " + std::to_string(client.program().pid()) + " from the server client list"));
    EXPECT_TRUE(
        service.waitForLine("dealloc " + std::to_string(client.program().pid()) + " from the server client list"));
    EXPECT_EQ(service.linesWith("invalidationHandler: connection exited process=velactl uptime_sec="), 1U);
    EXPECT_EQ(service.client().call("getAllReporters"), "[]");
}

TEST(ServiceLifeTest, WhatAClientSentBeforeItClosedIsHandledBeforeItsSessionsEnd) {
    constexpr std::size_t kMessages = 500;
    RunningService service;
    {
        ServiceClient client = service.client();
        client.send("createReportingSession", "[42]");
        client.send("startReportingSessionForID", "[42]");
        for (std::size_t number = 0; number < kMessages; ++number) {
            client.send("sendMessage", R"([{"number":)" + std::to_string(number) + "},4,1,[42]]");
        }
    }
    EXPECT_TRUE(service.waitForLine("from the server client list"));
    EXPECT_EQ(service.linesWith("sending message for reporter (42)"), kMessages);
    const std::string log = service.log();
    EXPECT_GT(log.find("ending session 42"), log.rfind("sending message for reporter (42)"));
}

TEST(ServiceLifeTest, ASoftLimitOfDescriptorsDoesNotBoundItsClients) {
    rlimit before{};
    ASSERT_EQ(getrlimit(RLIMIT_NOFILE, &before), 0);
    if (before.rlim_max < 1000) {
        GTEST_SKIP() << "no more than " << before.rlim_max << " descriptors";
    }
    const rlimit narrow{128, before.rlim_max};
    ASSERT_EQ(setrlimit(RLIMIT_NOFILE, &narrow), 0);
    RunningService service({"limits.clients_per_user=1000"});
    const rlimit wide{before.rlim_max, before.rlim_max};
    ASSERT_EQ(setrlimit(RLIMIT_NOFILE, &wide), 0);
    {
        std::vector<ServiceClient> clients;
        clients.reserve(300);
        for (int count = 0; count < 300; ++count) {
            clients.push_back(service.client());
        }
        EXPECT_EQ(clients.back().call("createReportingSession", "[42]"), "true");
        EXPECT_EQ(clients.back().call("startReportingSessionForID", "[42]"), "true");
        EXPECT_EQ(clients.back().call("stopReportingSessionForID", "[42]"), "true");
    }
    EXPECT_EQ(service.linesWith("Too many open files"), 0U);
    setrlimit(RLIMIT_NOFILE, &before);
}

TEST(ServiceLifeTest, AStartWaitsForItsBackEndsWhileOthersGoOn) {
    RunningService service;
    ServiceClient client = service.client();
    for (int session = 1; session <= 100; ++session) {
        const std::string id = "[" + std::to_string(session) + "]";
        client.send("createReportingSession", id);
        client.send("startReportingSessionForID", id);
    }
    EXPECT_EQ(client.call("sendMessage", R"([{"a":1},4,1,[100]])"), "null");
}

TEST(ServiceLifeTest, TheSessionFileStandsBelowTheRoot) {
    RunningService service({"device.InternalBuild=true"});
    ServiceClient client = service.client();
    client.call("createReportingSession", "[42]");
    client.call("setServiceType", R"(["muse",42])");
    client.send("startReportingSessionForID", "[42]");
    client.call("sendMessage", R"([{"a":1},"Playback","Start",[42]])");
    EXPECT_EQ(client.call("stopReportingSessionForID", "[42]"), "true");
    const std::filesystem::path folder =
        service.root() + "/private/var/mobile/Library/Logs/Wreckage/DiagnosticLogs/Audio/Reporting";
    ASSERT_TRUE(std::filesystem::is_directory(folder));
    std::vector<std::filesystem::path> files;
    for (const auto& entry : std::filesystem::directory_iterator(folder)) {
        files.push_back(entry.path());
    }
    ASSERT_EQ(files.size(), 1U);
    std::ostringstream content;
    content << std::ifstream(files.front()).rdbuf();
    EXPECT_THAT(content.str(), HasSubstr("\"Playback_Start_1\": {\n      \"a\": 1,\n"));
}

TEST(ServiceLifeTest, APostedNotificationReachesEverySession) {
    RunningService service;
    ServiceClient client = service.client();
    client.call("createReportingSession", "[42]");
    const testing::ProgramRun posted = service.velactl(
        {"notify", "com.orvex.lobby.ringerstate", "1", "--set", "paths.runtime=" + service.folder("runtime")});
    EXPECT_EQ(posted.status, 0) << posted.error;
    EXPECT_TRUE(service.waitForLine("feature 3 changes"));
    EXPECT_TRUE(service.waitForLine("ringerstate = 1"));
    EXPECT_TRUE(service.waitForLine("sending message for session owned by 42"));
}

TEST(ServiceLifeTest, PreferencesAreReadAtTheStartOfASession) {
    RunningService service;
    const testing::ProgramRun written = service.velactl({"defaults", "write", "com.orvex.vela", "device_name",
                                                         "Kitchen", "--set", "paths.state=" + service.folder("state")});
    EXPECT_EQ(written.status, 0) << written.error;
    ServiceClient client = service.client();
    client.call("createReportingSession", "[42]");
    client.answer("startReportingSessionForID", client.send("startReportingSessionForID", "[42]"));
    EXPECT_EQ(jsonText(readJson(service.velactl({"sessions", "--json"}).out)->ref().dictionary().find("messages")),
              "1");
}

TEST(ServiceLifeTest, TheFirstConnectionStartsTheServiceOnDemand) {
    const testing::TemporaryFolder folder;
    const std::string socket = folder / "socket";
    std::vector<std::string> words{"/usr/bin/systemd-socket-activate",
                                   "-l",
                                   socket,
                                   VELA_REPORTINGD,
                                   "--set",
                                   "paths.root=" + (folder / "root"),
                                   "--set",
                                   "paths.state=" + (folder / "state"),
                                   "--set",
                                   "paths.runtime=" + (folder / "runtime"),
                                   "--set",
                                   "log.target=stderr"};
    if (!std::filesystem::exists(words.front())) {
        GTEST_SKIP() << "systemd-socket-activate is not installed";
    }
    testing::RunningProgram activator(words, RunningService::environment());
    // The socket's file is there a moment before it listens.
    ASSERT_TRUE(testing::waitUntil([&] { return activator.error().find("Listening on") != std::string::npos; }));
    EXPECT_EQ(ServiceClient(socket).call("createReportingSession", "[42]"), "true");
    EXPECT_EQ(ServiceClient(socket).call("getAllReporters"), "[]");
    EXPECT_THAT(activator.error(), HasSubstr("serving at the socket of the service manager"));
    activator.signal(SIGTERM); // it has become the service
    EXPECT_EQ(activator.waitForEnd(), 0);
    EXPECT_TRUE(std::filesystem::exists(socket)) << "a socket of the service manager stays";
}

} // namespace

} // namespace vela
