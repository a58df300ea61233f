// With perf itself, where it is there and may trace the whole system.
#include "platform/linux/LinuxClock.h"
#include "platform/linux/LinuxWorkQueues.h"
#include "platform/perf/PerfProbe.h"
#include "platform/perf/PerfProbe_test.h"
#include "testing/ProbeContract.h"
#include "testing/RecordingProbeDelegate.h"
#include "testing/RunProgram.h"
#include "testing/RunningProgram.h"
#include "testing/TemporaryFolder.h"

#include <chrono>
#include <cstddef>
#include <cstdint>
#include <filesystem>
#include <fstream>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <memory>
#include <sstream>
#include <string>
#include <sys/prctl.h>
#include <sys/wait.h>
#include <system_error>
#include <unistd.h>

namespace vela::platform {

namespace {

using ::testing::ElementsAre;
using ::testing::StartsWith;

constexpr const char* kPerf = "/usr/bin/perf";

/// Why perf cannot trace the whole system here; empty where it can.
const std::string& obstacle() {
    static const std::string kObstacle = [] {
        const testing::TemporaryFolder folder;
        const auto run =
            testing::runProgram({kPerf, "record", "-a", "-e", "cpu-clock", "-o", folder / "probe.data", "/bin/true"},
                                {"PERF_CONFIG=/dev/null"});
        return run.status == 0 ? std::string() : "perf cannot trace the whole system: " + run.error;
    }();
    return kObstacle;
}

struct PerfItselfHarness {
    static std::string obstacle() { return platform::obstacle(); }
    Probe& probe() { return probe_; }
    Probe& failingProbe() { return failingProbe_; }
    template <class Done>
    bool settle(const Done& done) {
        return testing::waitUntil(done);
    }

    testing::TemporaryFolder folder_;
    LinuxClock clock_;
    LinuxWorkQueues queues_;
    PerfProbe probe_{{.folder = folder_ / "traces"}, clock_, queues_.background()};
    /// Perf runs, and fails: a result of that size is none to it.
    PerfProbe failingProbe_{{.folder = folder_ / "traces", .mostBytes = UINT64_MAX}, clock_, queues_.background()};
};

class PerfProbeIntegrationTest : public ::testing::Test {
protected:
    std::shared_ptr<ProbeTraceSession> makeSession() {
        PerfProbe probe({.folder = folder_ / "traces"}, clock_, queues_.background());
        auto session = probe.createProbeTraceSession(*probe.makeProbeTraceConfig(1));
        session->setDelegate(delegate_);
        return session;
    }
    bool waitForCall(const std::string& call) const {
        return testing::waitUntil([&] { return delegate_->was(call) || delegate_->completions() > 0; });
    }
    double monotonicSeconds() const {
        return std::chrono::duration<double>(clock_.monotonicNow().time_since_epoch()).count();
    }
    /// Keeps a processor busy for so many seconds.
    double work(double seconds) const {
        double sum = 0;
        for (const double end = monotonicSeconds() + seconds; monotonicSeconds() < end;) {
            sum += 1;
        }
        return sum;
    }

    testing::TemporaryFolder folder_;
    LinuxClock clock_;
    LinuxWorkQueues queues_;
    std::shared_ptr<testing::RecordingProbeDelegate> delegate_ = std::make_shared<testing::RecordingProbeDelegate>();
};

/// "name 12.345678" for each sample: the program's name and the time.
std::string samplesIn(const std::string& path) {
    const auto run =
        testing::runProgram({kPerf, "script", "-i", path, "-G", "-F", "comm,time"}, {"PERF_CONFIG=/dev/null"});
    EXPECT_EQ(run.status, 0) << run.error;
    return run.out;
}

TEST_F(PerfProbeIntegrationTest, TheProfileHasWhatRanBetweenStartAndStop) {
    if (!obstacle().empty()) {
        GTEST_SKIP() << obstacle();
    }
    prctl(PR_SET_NAME, "probe-subject");
    const auto session = makeSession();
    const double before = monotonicSeconds();
    session->startProbeTrace();
    ASSERT_TRUE(waitForCall("start"));
    ASSERT_THAT(delegate_->calls(), ElementsAre("start"));
    EXPECT_GT(work(0.5), 0);
    session->stopProbeTrace();
    ASSERT_TRUE(waitForCall("stop"));
    const double after = monotonicSeconds();
    ASSERT_TRUE(waitForCall("complete"));
    ASSERT_THAT(delegate_->calls(), ElementsAre("start", "stop", "complete"));

    const std::string url = delegate_->urls().at(0);
    ASSERT_THAT(url, StartsWith("file:///"));
    std::istringstream samples(samplesIn(url.substr(std::string("file://").size())));
    std::size_t ours = 0;
    std::string name;
    for (std::string word; samples >> word;) {
        if (word.find_first_not_of("0123456789.:") != std::string::npos) {
            name = word;
            continue;
        }
        const double time = std::stod(word);
        EXPECT_GE(time, before);
        EXPECT_LE(time, after);
        ours += name == "probe-subject" ? 1U : 0U;
    }
    EXPECT_GT(ours, 10U); // of 500; the machine may be busy otherwise
}

TEST(PerfProbeKillTest, PerfEndsWithTheService) {
    if (!obstacle().empty()) {
        GTEST_SKIP() << obstacle();
    }
    const testing::TemporaryFolder folder;
    const std::string program = folder / "perf";
    std::ofstream(program) << "#!/bin/sh\necho $$ >\"$0.pid\"\nexec " << kPerf << " \"$@\"\n";
    std::filesystem::permissions(program, std::filesystem::perms::owner_all);
    perf::ServiceProcess service({.folder = folder / "traces", .program = program});
    ASSERT_TRUE(service.waitForTrace());
    const std::string pid = perf::pidOf(program);
    EXPECT_EQ(perf::contentOf("/proc/" + pid + "/comm"), "perf\n");
    EXPECT_FALSE(perf::isGone(pid));
    service.killAndWait();
    EXPECT_TRUE(testing::waitUntil([&] { return perf::isGone(pid); }));
}

/// In a process of its own: what a trace without rights told, one a line, and why.
[[noreturn]] void traceAsNobody(const std::string& folder) {
    constexpr uid_t kNobody = 65534;
    const bool isNobody = setresgid(kNobody, kNobody, kNobody) == 0 && setresuid(kNobody, kNobody, kNobody) == 0;
    const LinuxClock clock;
    LinuxWorkQueues queues;
    PerfProbe probe({.folder = folder + "/traces"}, clock, queues.background());
    const auto session = probe.createProbeTraceSession(*probe.makeProbeTraceConfig(1));
    const auto delegate = std::make_shared<testing::RecordingProbeDelegate>();
    session->setDelegate(delegate);
    session->startProbeTrace();
    testing::waitUntil([&] { return !isNobody || delegate->completions() == 1; });
    std::ofstream told(folder + "/told");
    for (const std::string& call : delegate->calls()) {
        told << call << "\n";
    }
    for (const Failure& failure : delegate->failures()) {
        told << failure.description << "\n";
    }
    told.close();
    _exit(0);
}

TEST(PerfProbeRightsTest, WithoutRightsATraceDoesNotStart) {
    int paranoia = -1;
    std::ifstream("/proc/sys/kernel/perf_event_paranoid") >> paranoia;
    if (geteuid() != 0 || paranoia < 1 || !std::filesystem::exists(kPerf)) {
        GTEST_SKIP() << "needs perf, root, and a system that does not let everybody trace";
    }
    const testing::TemporaryFolder folder;
    std::filesystem::permissions(folder.path(), std::filesystem::perms::all);
    const pid_t child = fork();
    if (child == 0) {
        traceAsNobody(folder.path());
    }
    ASSERT_EQ(waitpid(child, nullptr, 0), child);
    EXPECT_THAT(perf::contentOf(folder / "told"),
                StartsWith("start failed\ncomplete failed\n/usr/bin/perf ended with status 255: Access to "
                           "performance monitoring and observability operations is limited."));
    std::error_code error;
    EXPECT_TRUE(std::filesystem::is_empty(folder / "traces", error)) << error.message();
}

} // namespace

} // namespace vela::platform

namespace vela::testing {
INSTANTIATE_TYPED_TEST_SUITE_P(PerfItself, ProbeContract, platform::PerfItselfHarness);
} // namespace vela::testing
