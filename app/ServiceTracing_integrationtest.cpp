// A trace of the running service from its parameters file to its results, with two processes that emit and take the
// time themselves. Once as the user that runs the test, and once as an ordinary one, for whom the kernel's trace buffer
// is closed.
#include "app/ForkedClient_integrationtest.h"
#include "app/RunningService_integrationtest.h"

#include <algorithm>
#include <array>
#include <chrono>
#include <cstdint>
#include <filesystem>
#include <fstream>
#include <grp.h>
#include <map>
#include <pwd.h>
#include <thread>
#include <vela/trace.h>

namespace vela {

namespace {

/// Not "nobody", whom no file belongs to.
constexpr const char* kOtherUser = "daemon";
constexpr int kPairs = 50;
/// The kernel's clock for traces may lag behind the one that programs read, by the time that it takes to set it.
constexpr std::int64_t kClockNanoseconds = 50'000;

constexpr std::string_view kParameters = R"({ Children = (
    { Name = "Two players"; TraceType = spoor; Children = (
        { Name = first; Type = Interval; SpoorCodeBegin = 0x21040010; SpoorCodeEnd = 0x21040014; },
        { Name = second; Type = Interval; SpoorCodeBegin = 0x21040020; SpoorCodeEnd = 0x21040024;
          EventsMatchedBy = Thread; } ); } ); })";
constexpr std::uint32_t kFirstBegin = 0x21040010;
constexpr std::uint32_t kSecondBegin = 0x21040020;
constexpr std::uint32_t kToEnd = 4;

constexpr const char* kResults =
    "/private/var/mobile/Library/Logs/Wreckage/DiagnosticLogs/Audio/Traces/tracing_results.msj";

std::int64_t nowNanoseconds() { return std::chrono::steady_clock::now().time_since_epoch().count(); }

/// What one interval lasted at least and at most, by the emitter's own clock.
struct Bounds {
    std::int64_t least = 0;
    std::int64_t most = 0;
};

/// A process that emits pairs, and reports the bounds of each.
ForkedClient emitter(const RunningService& service, std::uint32_t beginCode) {
    return ForkedClient([&service, beginCode](const ForkedClient::Report& report) {
        setenv("VELA_RUNTIME", service.folder("runtime").c_str(), 1); // NOLINT(concurrency-mt-unsafe): one thread
        for (int pair = 0; pair < kPairs; ++pair) {
            const std::int64_t before = nowNanoseconds();
            vela_trace_emit(beginCode, pair);
            const std::int64_t begun = nowNanoseconds();
            while (nowNanoseconds() < begun + 1000 * pair) {
            }
            const std::int64_t ending = nowNanoseconds();
            vela_trace_emit(beginCode + kToEnd);
            const std::int64_t after = nowNanoseconds();
            report(std::to_string(ending - begun) + " " + std::to_string(after - before));
        }
        ForkedClient::stay();
    });
}

std::vector<Bounds> boundsOf(const ForkedClient& client) {
    std::vector<Bounds> bounds(kPairs);
    for (Bounds& each : bounds) {
        std::istringstream(client.report()) >> each.least >> each.most;
    }
    return bounds;
}

/// The durations of each interval in the results file, in its order.
std::map<std::string, std::vector<std::int64_t>> resultsOf(const std::string& path) {
    std::map<std::string, std::vector<std::int64_t>> results;
    std::ifstream file(path);
    std::string line;
    std::getline(file, line); // the head
    while (std::getline(file, line)) {
        const auto value = readJson(line);
        if (value && value->ref().isDictionary()) {
            const Dictionary result = value->ref().dictionary();
            results[std::string(result.find(Key("name")).text())].push_back(
                static_cast<std::int64_t>(result.find(Key("value")).doubleValue()));
        }
    }
    return results;
}

/// Why the durations are not those that the emitter saw, or "".
std::string differenceOf(const std::vector<std::int64_t>& durations, const std::vector<Bounds>& bounds) {
    if (durations.size() != bounds.size()) {
        return std::to_string(durations.size()) + " durations";
    }
    for (std::size_t i = 0; i < bounds.size(); ++i) {
        if (durations[i] < bounds[i].least - kClockNanoseconds || durations[i] > bounds[i].most + kClockNanoseconds) {
            return "pair " + std::to_string(i) + " lasted " + std::to_string(durations[i]) + " ns, not " +
                   std::to_string(bounds[i].least) + " to " + std::to_string(bounds[i].most);
        }
    }
    return "";
}

/// Session 42 traces what kParameters names.
void startTracing(const RunningService& service, ServiceClient& client) {
    const std::string parameters = service.folder("points.plist");
    std::ofstream(parameters) << kParameters;
    client.call("createReportingSession", "[42]");
    client.call("setServiceType", "[11,42]");
    client.call("setConfiguration", R"([{"VelaReportingKilnPlistFilePath":")" + parameters + R"("},42])");
    client.call("startReportingSessionForID", "[42]");
}

/// Runs a trace, and answers what is wrong with its results, or "".
std::string tracedRun() {
    const RunningService service({R"(features."AudioAnalytics/Tracing"=true)"});
    ServiceClient client = service.client();
    startTracing(service, client);
    const ForkedClient first = emitter(service, kFirstBegin);
    const ForkedClient second = emitter(service, kSecondBegin);
    const std::vector<Bounds> firstBounds = boundsOf(first);
    const std::vector<Bounds> secondBounds = boundsOf(second);
    if (client.call("stopReportingSessionForID", "[42]") != "true") {
        return "the session was not stopped";
    }
    auto results = resultsOf(service.root() + kResults);
    if (results.size() != 2) {
        return std::to_string(results.size()) + " intervals have results; the service said:\n" + service.log();
    }
    const std::string difference = differenceOf(results["first"], firstBounds);
    return difference.empty() ? differenceOf(results["second"], secondBounds) : difference;
}

/// Deliveries of the energy log in a service's store, whether it runs or not.
std::size_t storedJoules(const RunningService& service) {
    const testing::ProgramRun run = service.velactl(
        {"deliveries", "--backend", "joule", "--json", "--set", "paths.state=" + service.folder("state")});
    return static_cast<std::size_t>(std::ranges::count(run.out, '\n'));
}

TEST(ServiceTracingTest, IntervalsOfTwoProcessesAgreeWithTheirOwnClock) { EXPECT_EQ(tracedRun(), ""); }

/// What outcomes begin with where there is no such user.
constexpr std::string_view kCannot = "cannot ";

/// What `run` answers in a process of an ordinary user.
std::string outcomeAsOrdinaryUser(std::string (*run)()) {
    const passwd* const other = getpwnam(kOtherUser); // NOLINT(concurrency-mt-unsafe): one thread
    if (geteuid() != 0 || other == nullptr) {
        return "cannot become " + std::string(kOtherUser);
    }
    const ForkedClient user([other, run](const ForkedClient::Report& report) {
        if (setgroups(0, nullptr) != 0 || setresgid(other->pw_gid, other->pw_gid, other->pw_gid) != 0 ||
            setresuid(other->pw_uid, other->pw_uid, other->pw_uid) != 0) {
            report("no user is taken");
        } else if (access(VELA_REPORTINGD, X_OK) != 0) {
            report(std::string(kCannot) + "run " + VELA_REPORTINGD);
        } else {
            const std::string problem = run();
            report(problem.empty() ? "well" : problem);
        }
        ForkedClient::stay();
    });
    const std::string outcome = user.report();
    return outcome == "well" ? "" : outcome.empty() ? "it ended without an outcome" : outcome;
}

TEST(ServiceTracingTest, IntervalsAgreeForAnOrdinaryUserToo) {
    const std::string outcome = outcomeAsOrdinaryUser(&tracedRun);
    if (outcome.starts_with(kCannot)) {
        GTEST_SKIP() << outcome << "; an ordinary user runs the other test like this";
    }
    EXPECT_EQ(outcome, "");
}

/// A process that loses three events on purpose; its report says "lost", or "no ring" where it needs none.
ForkedClient loser(const RunningService& service) {
    return ForkedClient([&service](const ForkedClient::Report& report) {
        setenv("VELA_RUNTIME", service.folder("runtime").c_str(), 1); // NOLINT(concurrency-mt-unsafe): one thread
        const std::string rings = service.folder("runtime/trace/rings");
        vela_trace_emit(kFirstBegin);
        if (std::filesystem::is_empty(rings)) {
            report("no ring");
            ForkedClient::stay();
        }
        std::filesystem::rename(rings, rings + "-away"); // where no thread can make a ring
        std::thread([] {
            for (int i = 0; i < 3; ++i) {
                vela_trace_emit(kFirstBegin + kToEnd);
            }
        }).join();
        std::filesystem::rename(rings + "-away", rings);
        report("lost");
        ForkedClient::stay();
    });
}

/// Runs a trace that loses events, and answers what is wrong with what it tells, or "".
std::string losingRun() {
    const RunningService service({R"(features."AudioAnalytics/Tracing"=true)"});
    ServiceClient client = service.client();
    startTracing(service, client);
    const ForkedClient emitter = loser(service);
    std::string outcome = emitter.report();
    if (outcome != "lost" || client.call("stopReportingSessionForID", "[42]") != "true") {
        return outcome;
    }
    auto results = resultsOf(service.root() + kResults);
    const std::vector<std::int64_t> lost = results["lost events"];
    if (results.size() != 1 || lost != std::vector<std::int64_t>{3}) {
        return "the results do not tell of three lost events; the service said:\n" + service.log();
    }
    return service.linesWith("3 trace events were lost") == 1 ? "" : "the log does not tell:\n" + service.log();
}

// An ordinary user's events go through rings.
TEST(ServiceTracingTest, LostEventsAreToldInTheLogAndInTheResults) {
    const std::string outcome = geteuid() == 0 ? outcomeAsOrdinaryUser(&losingRun) : losingRun();
    if (outcome.starts_with(kCannot)) {
        GTEST_SKIP() << outcome;
    }
    EXPECT_EQ(outcome, "");
}

// What was committed is still there, and nothing runs into what another thread destroys.
TEST(ServiceTracingTest, AServiceThatCannotLeaveItsResultsEndsWithOneAndKeepsWhatItDelivered) {
    RunningService service({R"(features."AudioAnalytics/Tracing"=true)", "device.InternalBuild=true",
                            "store.commit_ms=20", "drivers.Tarn=[]", "drivers.Rx=[]", "drivers.Tx=[]",
                            "drivers.Haptics=[]"});
    const std::filesystem::path folder = std::filesystem::path(service.root() + kResults).parent_path();
    std::filesystem::create_directories(folder.parent_path());
    std::ofstream(folder) << "no folder";
    const std::string parameters = service.folder("points.plist");
    std::ofstream(parameters) << kParameters;
    ServiceClient client = service.client();
    for (const char* const id : {"1", "2"}) {
        client.call("createReportingSession", "[" + std::string(id) + "]");
        client.call("setServiceType", std::string("[") + (*id == '1' ? "\"haptics\"" : "11") + "," + id + "]");
    }
    client.call("startReportingSessionForID", "[1]");
    for (int message = 0; message < 100; ++message) {
        client.call("sendMessage",
                    R"([{"EngineOnTime":)" + std::to_string(message) + R"(},"Performance","Joule",[1]])");
    }
    ASSERT_TRUE(testing::waitUntil([&] { return storedJoules(service) == 100; }));

    client.call("setConfiguration", R"([{"VelaReportingKilnPlistFilePath":")" + parameters + R"("},2])");
    EXPECT_EQ(client.call("startReportingSessionForID", "[2]"), "true");
    client.send("stopReportingSessionForID", "[2]");
    EXPECT_EQ(service.program().waitForEnd(), 1);
    EXPECT_EQ(service.linesWith("Failed to open metricsheet writer"), 1U) << service.log();
    EXPECT_EQ(service.linesWith("can't create logging directory at " + folder.string() + ": create folder " +
                                folder.string() + ": Not a directory"),
              1U);
    EXPECT_EQ(storedJoules(service), 100U);
    service.start();
    EXPECT_EQ(storedJoules(service), 100U);
}

} // namespace

} // namespace vela
