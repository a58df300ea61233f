// Emission of trace events through the library.
#include "client/Trace_integrationtest.h"

#include "client/include/vela/trace.h"
#include "testing/RunProgram.h"

#include <algorithm>
#include <cerrno>
#include <csignal>
#include <gmock/gmock.h>
#include <sys/time.h>
#include <sys/wait.h>
#include <thread>
#include <unistd.h>

namespace vela::client {

namespace {

using ::testing::ElementsAre;

TEST_F(TraceTest, AnEventHasUpToFourArguments) {
    start();
    vela_trace_emit(0x21040100);
    vela_trace_emit(0x21040101, 1);
    vela_trace_emit(0x21040102, 1, -1);
    vela_trace_emit(0x21040103, 1, 2, true);
    vela_trace_emit(0x21040104, 1, 2, 3, 0x8000000000000000U);
    const auto& events = finish();
    ASSERT_EQ(events.size(), 5U);
    EXPECT_THAT(events[0].arguments, ElementsAre(0, 0, 0, 0));
    EXPECT_THAT(events[1].arguments, ElementsAre(1, 0, 0, 0));
    EXPECT_THAT(events[2].arguments, ElementsAre(1, 0xFFFFFFFFFFFFFFFF, 0, 0));
    EXPECT_THAT(events[3].arguments, ElementsAre(1, 2, 1, 0));
    EXPECT_THAT(events[4].arguments, ElementsAre(1, 2, 3, 0x8000000000000000));
    EXPECT_EQ(events[4].eventCode, 0x21040104U);
}

TEST_F(TraceTest, WhileNobodyCollectsThereIsNothingToDo) {
    VelaReportingTracePrepareThread();
    EXPECT_FALSE(VelaReportingTraceIsActive());
    start();
    EXPECT_TRUE(VelaReportingTraceIsActive());
    EXPECT_TRUE(finish().empty());
    EXPECT_FALSE(VelaReportingTraceIsActive());
}

TEST_F(TraceTest, ErrnoStays) {
    start();
    errno = 1234;
    std::thread([] {
        errno = 4321;
        vela_trace_emit(0x21040100);
        EXPECT_EQ(errno, 4321);
    }).join();
    vela_trace_emit(0x21040100);
    EXPECT_EQ(errno, 1234);
    EXPECT_EQ(finish().size(), 2U);
}

volatile std::sig_atomic_t interruptions = 0;

void emitInHandler(int) {
    interruptions = interruptions + 1;
    vela_trace_emit(0x21040101);
}

// In a process that has emitted nothing yet: what is under way then holds locks and allocates.
TEST_F(TraceTest, ASignalsHandlerMayEmitInTheMidstOfTheFirstEvent) {
#if defined(__has_feature)
#if __has_feature(thread_sanitizer)
    GTEST_SKIP() << "the sanitizer refuses a handler that comes before the first event, and makes the emitter itself";
#endif
#endif
    start();
    const pid_t child = fork();
    if (child == 0) {
        struct sigaction action {};
        action.sa_handler = emitInHandler;
        sigaction(SIGALRM, &action, nullptr);
        const itimerval often{{0, 100}, {0, 50}};
        const itimerval never{};
        setitimer(ITIMER_REAL, &often, nullptr);
        vela_trace_emit(0x21040100);
        setitimer(ITIMER_REAL, &never, nullptr);
        const int counted = interruptions;
        _exit(std::min(counted, 255));
    }
    int status = 0;
    ASSERT_EQ(waitpid(child, &status, 0), child);
    ASSERT_TRUE(WIFEXITED(status)) << status;
    ASSERT_LT(WEXITSTATUS(status), 255);
    EXPECT_EQ(session_->end(), 0);
    ASSERT_TRUE(testing::waitUntil([this] { return completed_.load(); }));
    EXPECT_EQ(events_.size() + session_->lostEvents(), 1U + static_cast<std::size_t>(WEXITSTATUS(status)));
}

TEST_F(TraceTest, AProgramInCIsCollected) {
    start();
    const auto run = testing::runProgram({VELA_TRACE_EXAMPLE, "20"}, {"VELA_RUNTIME=" + runtimeFolder()});
    EXPECT_EQ(run.status, 0) << run.error;
    EXPECT_EQ(run.out, "20 intervals emitted\n");
    const auto& events = finish();
    ASSERT_EQ(events.size(), 40U);
    for (std::size_t i = 0; i < 20; ++i) {
        EXPECT_EQ(events[2 * i].eventCode, 0x21040100U);
        EXPECT_THAT(events[2 * i].arguments, ElementsAre(i, 0, 0, 0));
        EXPECT_EQ(events[2 * i + 1].eventCode, 0x21040101U);
        EXPECT_THAT(events[2 * i + 1].arguments, ElementsAre(i, 20, 0, 0));
        EXPECT_GE(events[2 * i + 1].timestamp - events[2 * i].timestamp, 1'000'000U) << "it slept that long";
    }
}

TEST_F(TraceTest, AProgramWithoutAServiceRunsAllTheSame) {
    const auto run = testing::runProgram({VELA_TRACE_EXAMPLE, "1"}, {"VELA_RUNTIME=/nonexistent"});
    EXPECT_EQ(run.status, 0);
    EXPECT_EQ(run.out, "1 intervals emitted\n");
}

} // namespace

} // namespace vela::client
