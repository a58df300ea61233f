#include "platform/perf/PerfProbe_test.h"

#include "platform/perf/PerfProbe.h"
#include "testing/ProbeContract.h"

#include <atomic>
#include <cerrno>
#include <csignal>
#include <fcntl.h>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <memory>
#include <optional>
#include <thread>
#include <unistd.h>
#include <vector>

namespace vela::platform::perf {

namespace {

using ::testing::ElementsAre;
using ::testing::IsEmpty;
using ::testing::MatchesRegex;
using ::testing::StartsWith;

struct PerfHarness {
    PerfHarness() { writeFakePerf(folder_ / "perf", {}); }

    Probe& probe() { return probe_; }
    Probe& failingProbe() { return failingProbe_; }
    template <class Done>
    bool settle(const Done& done) {
        return testing::waitUntil(done);
    }

    testing::TemporaryFolder folder_;
    LinuxClock clock_;
    LinuxWorkQueues queues_;
    PerfProbe probe_{{.folder = folder_ / "traces", .program = folder_ / "perf"}, clock_, queues_.background()};
    PerfProbe failingProbe_{{.folder = folder_ / "traces", .program = folder_ / "none"}, clock_, queues_.background()};
};

class PerfProbeTest : public FakePerfTest {};

TEST_F(PerfProbeTest, TemplateOneIsTheOnlyOne) {
    PerfProbe probe(options_, clock_, queues_.background());
    EXPECT_NE(probe.makeProbeTraceConfig(1), nullptr);
    EXPECT_EQ(probe.makeProbeTraceConfig(0), nullptr);
    EXPECT_EQ(probe.makeProbeTraceConfig(2), nullptr);
    EXPECT_EQ(probe.makeProbeTraceConfig(-1), nullptr);
}

TEST_F(PerfProbeTest, MakingASessionStartsNothing) {
    makeSession(FakePerfScript());
    session_.reset();
    EXPECT_EQ(pid(), "");
    EXPECT_FALSE(std::filesystem::exists(results()));
}

TEST_F(PerfProbeTest, PerfProfilesTheWholeSystem) {
    trace(FakePerfScript());
    EXPECT_THAT(contentOf(program() + ".arguments"),
                MatchesRegex("record\n-a\n-e\ncpu-clock\n-F\n999\n-g\n-k\nCLOCK_MONOTONIC\n--delay=-1\n--no-bpf-event\n"
                             "--no-buildid-cache\n--max-size=67108864B\n--control=fd:3,4\n-o\n/proc/self/fd/5\n"));
}

TEST_F(PerfProbeTest, TheResultIsWhatPerfWroteAndOnlyTheServiceMayReadIt) {
    trace(FakePerfScript());
    ASSERT_EQ(namesIn(results()).size(), 1U);
    const std::string path = results() + "/" + namesIn(results())[0];
    EXPECT_THAT(path, MatchesRegex(".*/probe-000001-[0-9]*T[0-9]*Z\\.data"));
    EXPECT_THAT(delegate_->urls(), ElementsAre("file://" + path));
    EXPECT_EQ(contentOf(path), "profile");
    struct stat result {};
    ASSERT_EQ(stat(path.c_str(), &result), 0);
    EXPECT_EQ(result.st_mode & 0777, 0600U);
}

TEST_F(PerfProbeTest, TheUrlEscapesWhatAUrlDoesNotHold) {
    options_.folder = folder_ / "a b%\xC3\xBC";
    trace(FakePerfScript());
    EXPECT_THAT(delegate_->urls(), ElementsAre(StartsWith("file://" + (folder_ / "a%20b%25%C3%BC/probe-000001-"))));
}

TEST_F(PerfProbeTest, PerfRunsUntilTheStop) {
    makeSession(FakePerfScript());
    session_->startProbeTrace();
    ASSERT_TRUE(waitForCall("start"));
    EXPECT_FALSE(isGone(pid()));
    session_->stopProbeTrace();
    ASSERT_TRUE(waitForCompletions(1));
    EXPECT_TRUE(isGone(pid()));
    EXPECT_THAT(delegate_->calls(), ElementsAre("start", "stop", "complete"));
}

TEST_F(PerfProbeTest, AnAnswerMayBeLate) {
    trace({.enable = "sleep 0.2; answer",
           .disable = "sleep 0.2; answer",
           .stop = "printf p >\"$path\"; sleep 0.2; exit 0"});
    EXPECT_THAT(delegate_->calls(), ElementsAre("start", "stop", "complete"));
}

TEST_F(PerfProbeTest, AStopBeforeTheAnswerIsDoneAfterIt) {
    makeSession({.enable = "until [ -e \"$0.go\" ]; do sleep 0.01; done; answer"});
    session_->startProbeTrace();
    ASSERT_TRUE(testing::waitUntil([&] { return !pid().empty(); }));
    session_->stopProbeTrace();
    EXPECT_THAT(delegate_->calls(), IsEmpty());
    std::ofstream(program() + ".go").flush();
    ASSERT_TRUE(waitForCompletions(1));
    EXPECT_THAT(delegate_->calls(), ElementsAre("start", "stop", "complete"));
}

TEST_F(PerfProbeTest, AStartWhileATraceRunsDoesNothing) {
    makeSession(FakePerfScript());
    session_->startProbeTrace();
    session_->startProbeTrace();
    ASSERT_TRUE(waitForCall("start"));
    session_->startProbeTrace();
    session_->stopProbeTrace();
    ASSERT_TRUE(waitForCompletions(1));
    session_.reset(); // has told everything by then
    EXPECT_THAT(delegate_->calls(), ElementsAre("start", "stop", "complete"));
    EXPECT_EQ(namesIn(results()).size(), 1U);
}

TEST_F(PerfProbeTest, ASessionTracesAgainAfterTheCompletion) {
    trace(FakePerfScript());
    session_->startProbeTrace();
    session_->stopProbeTrace();
    ASSERT_TRUE(waitForCompletions(2));
    EXPECT_THAT(delegate_->calls(), ElementsAre("start", "stop", "complete", "start", "stop", "complete"));
    EXPECT_THAT(namesIn(results()), ElementsAre(StartsWith("probe-000001-"), StartsWith("probe-000002-")));
}

TEST_F(PerfProbeTest, ASessionMayTraceAgainWithinTheCompletion) {
    makeSession(FakePerfScript());
    std::atomic<bool> isFirst = true;
    delegate_->onComplete = [&] {
        if (isFirst.exchange(false)) {
            session_->startProbeTrace();
            session_->stopProbeTrace();
        }
    };
    session_->startProbeTrace();
    session_->stopProbeTrace();
    ASSERT_TRUE(waitForCompletions(2));
    EXPECT_THAT(delegate_->calls(), ElementsAre("start", "stop", "complete", "start", "stop", "complete"));
}

TEST_F(PerfProbeTest, SessionsTraceBesideEachOther) {
    makeSession(FakePerfScript());
    const auto first = session_;
    const std::string firstProgram = program();
    makeSession();
    first->startProbeTrace();
    session_->startProbeTrace();
    ASSERT_TRUE(testing::waitUntil([&] { return delegate_->calls().size() == 2; }));
    EXPECT_EQ(namesIn(results()).size(), 2U);
    first->stopProbeTrace();
    session_->stopProbeTrace();
    ASSERT_TRUE(waitForCompletions(2));
    EXPECT_THAT(namesIn(results()),
                ElementsAre(MatchesRegex("probe-000001-.*\\.data"), MatchesRegex("probe-000002-.*\\.data")));
}

TEST_F(PerfProbeTest, FourTracesRunAtTheSameTimeAndAFifthDoesNotStart) {
    writeFakePerf(program(), {});
    PerfProbe probe(options_, clock_, queues_.background());
    std::vector<std::shared_ptr<ProbeTraceSession>> sessions;
    for (int i = 0; i < 4; ++i) {
        sessions.push_back(probe.createProbeTraceSession(*probe.makeProbeTraceConfig(1)));
        sessions.back()->setDelegate(delegate_);
        sessions.back()->startProbeTrace();
    }
    ASSERT_TRUE(testing::waitUntil([&] { return delegate_->calls().size() == 4; }));
    EXPECT_THAT(delegate_->calls(), ElementsAre("start", "start", "start", "start"));

    const auto fifth = probe.createProbeTraceSession(*probe.makeProbeTraceConfig(1));
    const auto told = std::make_shared<testing::RecordingProbeDelegate>();
    fifth->setDelegate(told);
    fifth->startProbeTrace();
    ASSERT_TRUE(testing::waitUntil([&] { return told->completions() == 1; }));
    EXPECT_THAT(told->calls(), ElementsAre("start failed", "complete failed"));
    for (const Failure& failure : told->failures()) {
        EXPECT_EQ(failure.description, "4 performance traces run already, the limit is 4");
        EXPECT_EQ(failure.code, EBUSY);
    }
    EXPECT_EQ(namesIn(results()).size(), 4U);

    sessions.front()->stopProbeTrace();
    ASSERT_TRUE(waitForCompletions(1));
    fifth->startProbeTrace();
    fifth->stopProbeTrace();
    ASSERT_TRUE(testing::waitUntil([&] { return told->completions() == 2; }));
    EXPECT_THAT(told->calls(), ElementsAre("start failed", "complete failed", "start", "stop", "complete"));
    sessions.clear();
    ASSERT_TRUE(waitForCompletions(4));
}

TEST_F(PerfProbeTest, ATraceThatFailsGivesItsPlaceBack) {
    options_.mostTraces = 1;
    options_.program = folder_ / "none";
    makeSession();
    for (std::ptrdiff_t traces = 1; traces <= 3; ++traces) {
        session_->startProbeTrace();
        ASSERT_TRUE(waitForCompletions(traces));
    }
    for (const Failure& failure : delegate_->failures()) {
        EXPECT_EQ(failure.description, "cannot run " + (folder_ / "none") + ": No such file or directory");
    }
}

TEST_F(PerfProbeTest, TheNewestResultsAreKept) {
    options_.mostFiles = 2;
    makeSession(FakePerfScript());
    for (std::ptrdiff_t traces = 1; traces <= 4; ++traces) {
        session_->startProbeTrace();
        session_->stopProbeTrace();
        ASSERT_TRUE(waitForCompletions(traces));
    }
    EXPECT_THAT(namesIn(results()), ElementsAre(StartsWith("probe-000003-"), StartsWith("probe-000004-")));
}

TEST_F(PerfProbeTest, ATraceWhoseDelegateIsGoneEndsAllTheSame) {
    makeSession(FakePerfScript());
    auto delegate = std::make_shared<testing::RecordingProbeDelegate>();
    session_->setDelegate(delegate);
    session_->startProbeTrace();
    ASSERT_TRUE(testing::waitUntil([&] { return delegate->was("start"); }));
    delegate.reset();
    session_->stopProbeTrace();
    EXPECT_TRUE(
        testing::waitUntil([&] { return !namesIn(results()).empty() && namesIn(results())[0].ends_with(".data"); }));
    EXPECT_TRUE(isGone(pid()));
}

// What the service holds and how it handles signals is not perf's.
TEST_F(PerfProbeTest, PerfInheritsNoDescriptorAndNoEnvironment) {
    constexpr int kNumber = 77;
    ASSERT_EQ(dup2(STDERR_FILENO, kNumber), kNumber);
    trace({.stop = "{ ls /proc/self/fd | tr '\\n' ' '; echo $HOME; } >\"$path\"; exit 0"});
    close(kNumber);
    ASSERT_EQ(namesIn(results()).size(), 1U);
    // The sixth is the folder that ls lists.
    EXPECT_EQ(contentOf(results() + "/" + namesIn(results())[0]), "0 1 2 3 4 5 6 /\n");
}

TEST_F(PerfProbeTest, PerfHandlesItsSignalsAsIfTheServiceDidNot) {
    const auto handler = std::signal(SIGUSR1, SIG_IGN);
    // Read by the shell itself before it starts another program, for which it would change the mask.
    makeSession({.before = "while read -r line; do case $line in Sig[BI]*) echo \"$line\" >>\"$0.signals\" ;; esac; "
                           "done </proc/$$/status"});
    trace();
    static_cast<void>(std::signal(SIGUSR1, handler));
    EXPECT_EQ(contentOf(program() + ".signals"), "SigBlk:\t0000000000000000\nSigIgn:\t0000000000000000\n");
}

TEST(PerfProbeAfterKillTest, PerfEndsWithTheServiceAndTheNextTraceRemovesWhatItLeft) {
    const testing::TemporaryFolder folder;
    const PerfProbe::Options options{.folder = folder / "traces", .program = folder / "perf"};
    writeFakePerf(options.program, {.enable = "answer; exec sleep 1000"});
    ServiceProcess service(options);
    ASSERT_TRUE(service.waitForTrace());
    const std::string pid = pidOf(options.program);
    EXPECT_FALSE(isGone(pid));
    EXPECT_THAT(namesIn(options.folder), ElementsAre(MatchesRegex("probe-000001-.*\\.data\\.part")));
    service.killAndWait();
    EXPECT_TRUE(testing::waitUntil([&] { return isGone(pid); }));

    PerfHarness next;
    PerfProbe probe({.folder = options.folder, .program = next.folder_ / "perf"}, next.clock_,
                    next.queues_.background());
    const auto session = probe.createProbeTraceSession(*probe.makeProbeTraceConfig(1));
    const auto delegate = std::make_shared<testing::RecordingProbeDelegate>();
    session->setDelegate(delegate);
    session->startProbeTrace();
    session->stopProbeTrace();
    ASSERT_TRUE(testing::waitUntil([&] { return delegate->completions() == 1; }));
    EXPECT_THAT(namesIn(options.folder), ElementsAre(MatchesRegex("probe-000001-.*\\.data")));
}

} // namespace

} // namespace vela::platform::perf

namespace vela::testing {
INSTANTIATE_TYPED_TEST_SUITE_P(PerfProbe, ProbeContract, platform::perf::PerfHarness);
} // namespace vela::testing
