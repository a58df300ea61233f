#include "platform/perf/PerfProbe.h"
#include "platform/perf/PerfProbe_test.h"

#include <cerrno>
#include <gmock/gmock.h>
#include <gtest/gtest.h>

namespace vela::platform::perf {

namespace {

using ::testing::Each;
using ::testing::ElementsAre;
using ::testing::IsEmpty;
using ::testing::MatchesRegex;

class PerfProbeFailuresTest : public FakePerfTest {
protected:
    void expectNoStart(const std::string& text, int code) const {
        EXPECT_THAT(delegate_->calls(), ElementsAre("start failed", "complete failed"));
        EXPECT_THAT(errorTexts(), ElementsAre(text, text));
        for (const Failure& failure : delegate_->failures()) {
            EXPECT_EQ(failure.code, code);
        }
        expectNothingLeft();
    }
    void expectBreak(const std::string& text) const {
        EXPECT_THAT(delegate_->calls(), ElementsAre("start", "stop failed", "complete failed"));
        EXPECT_THAT(errorTexts(), ElementsAre(text, text));
        expectNothingLeft();
    }
    void expectNoResult(const std::string& text) const {
        EXPECT_THAT(delegate_->calls(), ElementsAre("start", "stop", "complete failed"));
        EXPECT_THAT(errorTexts(), ElementsAre(text));
        expectNothingLeft();
    }
    /// The file that a running trace has until its end.
    std::string startTraceAndAnswerItsFile() {
        makeSession(FakePerfScript());
        session_->startProbeTrace();
        EXPECT_TRUE(waitForCall("start"));
        const std::vector<std::string> names = namesIn(results());
        EXPECT_THAT(names, ElementsAre(MatchesRegex("probe-000001-.*\\.data\\.part")));
        return results() + "/" + (names.empty() ? "none" : names.front());
    }
    void expectNothingLeft() const {
        EXPECT_THAT(delegate_->urls(), ElementsAre(""));
        EXPECT_THAT(namesIn(results()), IsEmpty());
        EXPECT_TRUE(pid().empty() || isGone(pid()));
    }
};

TEST_F(PerfProbeFailuresTest, PerfIsAbsent) {
    makeSession();
    trace();
    expectNoStart("cannot run " + program() + ": No such file or directory", ENOENT);
}

TEST_F(PerfProbeFailuresTest, PerfIsNotExecutable) {
    writeFakePerf(program(), {}, 0644);
    makeSession();
    trace();
    expectNoStart("cannot run " + program() + ": Permission denied", EACCES);
}

TEST_F(PerfProbeFailuresTest, PerfIsNoProgram) {
    std::ofstream(program()) << "nothing that runs";
    chmod(program().c_str(), 0755);
    makeSession();
    trace();
    expectNoStart("cannot run " + program() + ": Exec format error", ENOEXEC);
}

TEST_F(PerfProbeFailuresTest, PerfIsAFolder) {
    options_.program = folder_.path();
    makeSession();
    trace();
    expectNoStart("cannot run " + folder_.path() + ": Permission denied", EACCES);
}

TEST_F(PerfProbeFailuresTest, TheFolderOfTheResultsCannotBeMade) {
    std::ofstream(folder_ / "file").flush();
    options_.folder = folder_ / "file/traces";
    makeSession(FakePerfScript());
    trace();
    EXPECT_THAT(delegate_->calls(), ElementsAre("start failed", "complete failed"));
    EXPECT_THAT(errorTexts(), Each(MatchesRegex(".*/file.*: Not a directory")));
    EXPECT_EQ(pid(), "");
}

TEST_F(PerfProbeFailuresTest, PerfEndsAtOnceAndSaysWhy) {
    trace({.before = "printf 'Error:\\nAccess is limited.\\n\\n  Ask somebody.\\n' >&2; exit 255"});
    expectNoStart(program() + " ended with status 255: Access is limited. Ask somebody.", 0);
}

TEST_F(PerfProbeFailuresTest, PerfEndsAtOnceAndSaysNothing) {
    trace({.before = "exit 3"});
    expectNoStart(program() + " ended with status 3", 0);
}

TEST_F(PerfProbeFailuresTest, PerfEndsAtOnceAsIfAllWereWell) {
    trace({.before = "echo '[ perf record: Woken up 1 times ]' >&2; exit 0"});
    expectNoStart(program() + " ended with status 0", 0);
}

TEST_F(PerfProbeFailuresTest, PerfNeverAnswersTheStart) {
    options_.startLimit = std::chrono::milliseconds(300);
    trace({.enable = "echo 'Busy.' >&2; exec sleep 1000"});
    EXPECT_THAT(errorTexts(), Each(MatchesRegex(".*/perf did not answer \"enable\" within 300 ms(: Busy.)?")));
    EXPECT_THAT(delegate_->failures().at(0).code, ETIMEDOUT);
    EXPECT_THAT(delegate_->calls(), ElementsAre("start failed", "complete failed"));
    expectNothingLeft();
}

TEST_F(PerfProbeFailuresTest, PerfPrintsWithoutEndAndNeverAnswers) {
    options_.startLimit = std::chrono::milliseconds(300);
    trace({.before = "exec yes noise >&2"});
    EXPECT_THAT(errorTexts(), Each(MatchesRegex(".*did not answer \"enable\" within 300 ms.*")));
    for (const std::string& text : errorTexts()) {
        EXPECT_LE(text.size(), 600U);
    }
    EXPECT_THAT(delegate_->calls(), ElementsAre("start failed", "complete failed"));
    expectNothingLeft();
}

TEST_F(PerfProbeFailuresTest, PerfClosesItsAnswersAndNeverEnds) {
    options_.startLimit = std::chrono::milliseconds(300);
    trace({.before = "exec 4>&- 2>&-; exec sleep 1000"});
    expectNoStart(program() + " did not answer \"enable\" within 300 ms", ETIMEDOUT);
}

TEST_F(PerfProbeFailuresTest, PerfDiesWhileItTraces) {
    makeSession({.enable = "answer; kill -9 $$"});
    session_->startProbeTrace();
    ASSERT_TRUE(waitForCompletions(1));
    expectBreak(program() + " was ended by signal 9 (SIGKILL)");
}

TEST_F(PerfProbeFailuresTest, PerfFailsWhileItTraces) {
    makeSession({.enable = "answer; echo 'failed to write perf data' >&2; exit 1"});
    session_->startProbeTrace();
    ASSERT_TRUE(waitForCompletions(1));
    expectBreak(program() + " ended with status 1: failed to write perf data");
}

TEST_F(PerfProbeFailuresTest, AStopAfterPerfDiedTellsNothingMore) {
    makeSession({.enable = "answer; kill -9 $$"});
    session_->startProbeTrace();
    ASSERT_TRUE(waitForCompletions(1));
    session_->stopProbeTrace();
    session_.reset();
    expectBreak(program() + " was ended by signal 9 (SIGKILL)");
}

TEST_F(PerfProbeFailuresTest, ATraceThatReachedItsLargestSizeEndsByItself) {
    makeSession({.enable = "answer; printf much >\"$path\"; exit 0"});
    session_->startProbeTrace();
    ASSERT_TRUE(waitForCompletions(1));
    EXPECT_THAT(delegate_->calls(), ElementsAre("start", "stop", "complete"));
    ASSERT_EQ(namesIn(results()).size(), 1U);
    EXPECT_EQ(contentOf(results() + "/" + namesIn(results())[0]), "much");
}

TEST_F(PerfProbeFailuresTest, ATraceThatReachesItsLargestSizeAtTheStopHasItsResult) {
    trace({.disable = "printf much >\"$path\"; exit 0"});
    EXPECT_THAT(delegate_->calls(), ElementsAre("start", "stop", "complete"));
    EXPECT_EQ(namesIn(results()).size(), 1U);
}

TEST_F(PerfProbeFailuresTest, PerfNeverAnswersTheStop) {
    options_.stopLimit = std::chrono::milliseconds(100);
    trace({.disable = "exec sleep 1000"});
    expectBreak(program() + " did not answer \"disable\" within 100 ms");
}

TEST_F(PerfProbeFailuresTest, PerfDiesAtTheStop) {
    trace({.disable = "kill -15 $$"});
    expectBreak(program() + " was ended by signal 15 (SIGTERM)");
}

TEST_F(PerfProbeFailuresTest, PerfNeverEnds) {
    options_.endLimit = std::chrono::milliseconds(100);
    trace({.stop = "answer; exec sleep 1000"});
    expectNoResult(program() + " did not end within 100 ms");
}

TEST_F(PerfProbeFailuresTest, PerfFailsAtTheEnd) {
    trace({.stop = "printf half >\"$path\"; exit 2"});
    expectNoResult(program() + " ended with status 2");
}

TEST_F(PerfProbeFailuresTest, PerfWritesNothing) {
    trace({.stop = "exit 0"});
    EXPECT_THAT(delegate_->calls(), ElementsAre("start", "stop", "complete failed"));
    EXPECT_THAT(errorTexts(), ElementsAre(MatchesRegex("result of the trace, .*\\.part: nothing was written")));
    expectNothingLeft();
}

TEST_F(PerfProbeFailuresTest, PerfRemovesItsResult) {
    trace({.stop = "rm \"$(readlink /proc/$$/fd/5)\"; exit 0"});
    EXPECT_THAT(delegate_->calls(), ElementsAre("start", "stop", "complete failed"));
    EXPECT_THAT(errorTexts(), ElementsAre(MatchesRegex("result of the trace, .*\\.part: No such file or directory")));
    expectNothingLeft();
}

// Others may write into the folder.
TEST_F(PerfProbeFailuresTest, AFilePutInTheResultsPlaceIsNeitherWrittenNorPublished) {
    const std::string part = startTraceAndAnswerItsFile();
    std::filesystem::remove(part);
    std::ofstream(part) << "theirs";
    session_->stopProbeTrace();
    ASSERT_TRUE(waitForCompletions(1));
    EXPECT_THAT(delegate_->calls(), ElementsAre("start", "stop", "complete failed"));
    EXPECT_THAT(errorTexts(), ElementsAre("result of the trace, " + part + ": something else has taken its place"));
    EXPECT_EQ(contentOf(part), "theirs");
    EXPECT_EQ(namesIn(results()).size(), 1U);
}

TEST_F(PerfProbeFailuresTest, ALinkPutInTheResultsPlaceIsNotFollowed) {
    const std::string part = startTraceAndAnswerItsFile();
    std::filesystem::remove(part);
    std::filesystem::create_symlink(folder_ / "target", part);
    session_->stopProbeTrace();
    ASSERT_TRUE(waitForCompletions(1));
    EXPECT_THAT(delegate_->calls(), ElementsAre("start", "stop", "complete failed"));
    EXPECT_THAT(errorTexts(), ElementsAre("result of the trace, " + part + ": something else has taken its place"));
    EXPECT_FALSE(std::filesystem::exists(folder_ / "target"));
    EXPECT_TRUE(std::filesystem::is_symlink(part));
    EXPECT_EQ(namesIn(results()).size(), 1U);
}

TEST_F(PerfProbeFailuresTest, WhatPerfStartedEndsWithIt) {
    trace({.before = "sleep 1000 & echo $! >\"$0.child\""});
    EXPECT_THAT(delegate_->calls(), ElementsAre("start", "stop", "complete"));
    std::string child = contentOf(program() + ".child");
    child.pop_back();
    EXPECT_TRUE(testing::waitUntil([&] { return isGone(child); }));
}

TEST_F(PerfProbeFailuresTest, ASessionDestroyedWhileItTracesEndsPerfAndCompletes) {
    makeSession({.enable = "answer; exec sleep 1000"});
    session_->startProbeTrace();
    ASSERT_TRUE(waitForCall("start"));
    session_.reset();
    EXPECT_TRUE(isGone(pid()));
    EXPECT_THAT(namesIn(results()), IsEmpty());
    ASSERT_TRUE(waitForCompletions(1));
    expectBreak("the session of the trace was destroyed");
    EXPECT_EQ(delegate_->failures().at(0).code, ECANCELED);
}

TEST_F(PerfProbeFailuresTest, ASessionDestroyedWhileItStartsEndsPerfAndCompletes) {
    makeSession({.before = "exec sleep 1000"});
    session_->startProbeTrace();
    ASSERT_TRUE(testing::waitUntil([&] { return !pid().empty(); }));
    session_.reset();
    EXPECT_TRUE(isGone(pid()));
    ASSERT_TRUE(waitForCompletions(1));
    expectNoStart("the session of the trace was destroyed", ECANCELED);
}

TEST_F(PerfProbeFailuresTest, ASessionDestroyedRightBehindItsStartCompletes) {
    makeSession(FakePerfScript());
    session_->startProbeTrace();
    session_.reset();
    ASSERT_TRUE(waitForCompletions(1));
    EXPECT_THAT(delegate_->calls().back(), "complete failed");
    expectNothingLeft();
}

TEST_F(PerfProbeFailuresTest, ASessionDestroyedWhileItStopsEndsPerfAndCompletes) {
    makeSession({.stop = "answer; exec sleep 1000"});
    session_->startProbeTrace();
    session_->stopProbeTrace();
    ASSERT_TRUE(waitForCall("stop"));
    session_.reset();
    EXPECT_TRUE(isGone(pid()));
    ASSERT_TRUE(waitForCompletions(1));
    expectNoResult("the session of the trace was destroyed");
}

TEST_F(PerfProbeFailuresTest, AFailedTraceIsFollowedByAGoodOne) {
    makeSession();
    trace();
    writeFakePerf(program(), {});
    session_->startProbeTrace();
    session_->stopProbeTrace();
    ASSERT_TRUE(waitForCompletions(2));
    EXPECT_THAT(delegate_->calls(), ElementsAre("start failed", "complete failed", "start", "stop", "complete"));
}

} // namespace

} // namespace vela::platform::perf
