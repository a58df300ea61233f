#include "platform/spoor/RingFolder.h"
#include "platform/spoor/SlowPath.h"
#include "platform/spoor/TraceControl.h"
#include "platform/spoor/TraceEmitter.h"
#include "testing/TemporaryFolder.h"

#include <cerrno>
#include <csignal>
#include <filesystem>
#include <fstream>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <optional>
#include <set>
#include <sys/stat.h>
#include <sys/time.h>
#include <sys/wait.h>
#include <thread>
#include <unistd.h>

namespace vela::platform::spoor {
namespace {

using ::testing::ElementsAre;

class TraceEmitterTest : public ::testing::Test {
protected:
    void openControl() {
        auto control = TraceControl::open(folder_.path(), {});
        ASSERT_TRUE(control);
        control_ = *std::move(control);
    }
    /// A service that collects everything.
    void collect() {
        openControl();
        ASSERT_TRUE(rings_.begin());
        control_->activate(0, ~std::uint32_t{0});
    }
    std::vector<TraceRecord> drain() {
        std::vector<TraceRecord> records;
        rings_.drain(true, records, lost_);
        return records;
    }
    std::size_t ringFiles() const {
        const std::filesystem::directory_iterator entries(ringFolder(folder_.path()));
        return static_cast<std::size_t>(std::distance(begin(entries), end(entries)));
    }

    testing::TemporaryFolder folder_;
    std::unique_ptr<TraceControl> control_;
    RingFolder rings_{ringFolder(folder_.path())};
    std::uint64_t lost_ = 0;
    TraceEmitter emitter_{{{folder_.path(), true}}};
};

TEST_F(TraceEmitterTest, WithoutAServiceAnEventGoesNowhere) {
    errno = 1234;
    EXPECT_EQ(emitter_.emitNow(1, {}), Emission::NoService);
    EXPECT_EQ(emitter_.emitNow(1, {}), Emission::NoService);
    EXPECT_EQ(errno, 1234);
    EXPECT_FALSE(emitter_.hasLivingService());
}

TEST_F(TraceEmitterTest, WhileNobodyCollectsTheWordIsZero) {
    openControl();
    EXPECT_NE(*emitter_.activeWord(), 0U) << "not known yet";
    EXPECT_EQ(emitter_.emitNow(1, {}), Emission::NobodyCollects);
    EXPECT_EQ(*emitter_.activeWord(), 0U);
    EXPECT_TRUE(emitter_.hasLivingService());
    EXPECT_EQ(ringFiles(), 0U);
    control_->activate(1, 1);
    EXPECT_NE(*emitter_.activeWord(), 0U);
}

TEST_F(TraceEmitterTest, AnEventStandsInARingOfItsThread) {
    collect();
    const std::uint64_t before = traceNow();
    errno = 1234;
    EXPECT_EQ(emitter_.emitNow(0x21040001, {1, 2, 3, 4}), Emission::Emitted);
    EXPECT_EQ(errno, 1234);
    const auto records = drain();
    ASSERT_EQ(records.size(), 1U);
    EXPECT_EQ(records[0].code, 0x21040001U);
    EXPECT_EQ(records[0].thread, static_cast<std::uint64_t>(gettid()));
    EXPECT_THAT(records[0].arguments, ElementsAre(1, 2, 3, 4));
    EXPECT_GE(records[0].time, before);
    EXPECT_LE(records[0].time, traceNow());
}

TEST_F(TraceEmitterTest, CodesThatNobodyAskedForAreNotWritten) {
    openControl();
    ASSERT_TRUE(rings_.begin());
    control_->activate(10, 20);
    control_->activate(40, 50);
    for (const std::uint32_t code : {9U, 21U, 39U, 51U}) {
        EXPECT_EQ(emitter_.emitNow(code, {}), Emission::OutOfRange);
    }
    for (const std::uint32_t code : {10U, 20U, 40U, 50U}) {
        EXPECT_EQ(emitter_.emitNow(code, {}), Emission::Emitted);
    }
    EXPECT_EQ(drain().size(), 4U);
}

TEST_F(TraceEmitterTest, AServiceThatIsSilentForLongCollectsNothing) {
    collect();
    control_->beat(traceNow() - 11'000'000'000);
    EXPECT_EQ(emitter_.emitNow(1, {}), Emission::NobodyCollects);
    control_->beat(traceNow());
    EXPECT_EQ(emitter_.emitNow(1, {}), Emission::Emitted);
}

TEST_F(TraceEmitterTest, EveryThreadHasItsOwnRing) {
    constexpr std::size_t kThreads = 5;
    collect();
    std::atomic<std::size_t> emitted = 0;
    std::vector<std::thread> threads;
    for (std::size_t i = 0; i < kThreads; ++i) {
        threads.emplace_back([&] {
            EXPECT_EQ(emitter_.emitNow(1, {}), Emission::Emitted);
            ++emitted;
            while (emitted < kThreads) {
                std::this_thread::yield();
            }
        });
    }
    for (std::thread& thread : threads) {
        thread.join();
    }
    EXPECT_EQ(ringFiles(), kThreads);
    EXPECT_EQ(drain().size(), kThreads);
}

TEST_F(TraceEmitterTest, ARingOfAThreadThatEndedIsTheNextThreads) {
    collect();
    std::set<std::uint64_t> identities;
    for (std::uint32_t i = 0; i < 10; ++i) {
        std::thread([&] {
            EXPECT_EQ(emitter_.emitNow(i, {}), Emission::Emitted);
            identities.insert(static_cast<std::uint64_t>(gettid()));
        }).join();
    }
    EXPECT_EQ(ringFiles(), 1U);
    std::set<std::uint64_t> seen;
    for (const TraceRecord& record : drain()) {
        seen.insert(record.thread);
    }
    EXPECT_EQ(seen, identities);
}

TEST_F(TraceEmitterTest, APreparedThreadHasItsRingBeforeItsFirstEvent) {
    openControl();
    emitter_.prepareThread();
    EXPECT_EQ(ringFiles(), 1U);
    EXPECT_EQ(*emitter_.activeWord(), 0U);
    ASSERT_TRUE(rings_.begin());
    control_->activate(1, 1);
    EXPECT_EQ(emitter_.emitNow(1, {}), Emission::Emitted);
    EXPECT_EQ(ringFiles(), 1U);
    EXPECT_EQ(drain().size(), 1U);
}

TEST_F(TraceEmitterTest, AServiceThatComesLaterIsFound) {
    EXPECT_EQ(emitter_.emitNow(1, {}), Emission::NoService);
    collect();
    emitter_.prepareThread(); // looks at once, not only after a second
    EXPECT_EQ(emitter_.emitNow(1, {}), Emission::Emitted);
}

TEST_F(TraceEmitterTest, TheFolderOfALivingServiceIsPreferred) {
    const testing::TemporaryFolder other;
    {
        auto dead = TraceControl::open(other.path(), {});
        ASSERT_TRUE(dead);
    }
    collect();
    TraceEmitter emitter({{other.path(), true}, {folder_.path(), true}});
    EXPECT_EQ(emitter.emitNow(1, {}), Emission::Emitted);
    EXPECT_EQ(drain().size(), 1U);
}

TEST_F(TraceEmitterTest, APageOfAnotherUserIsUsedOnlyWhereAnyOwnerMayBe) {
    if (geteuid() != 0) {
        GTEST_SKIP() << "only root may give a file away";
    }
    collect();
    ASSERT_EQ(chown(controlFile(folder_.path()).c_str(), 4242, 4242), 0);
    TraceEmitter careful({{folder_.path(), false}});
    EXPECT_EQ(careful.emitNow(1, {}), Emission::NoService);
    EXPECT_EQ(emitter_.emitNow(1, {}), Emission::Emitted);
}

TEST_F(TraceEmitterTest, AFileThatIsNoPageIsNoService) {
    ASSERT_EQ(mkdir((folder_ / "trace").c_str(), 0755), 0);
    std::ofstream(controlFile(folder_.path())) << "short";
    EXPECT_EQ(emitter_.emitNow(1, {}), Emission::NoService);
    std::ofstream(controlFile(folder_.path())) << std::string(4096, 'x');
    TraceEmitter other({{folder_.path(), true}});
    EXPECT_EQ(other.emitNow(1, {}), Emission::NoService);
}

TEST_F(TraceEmitterTest, AMarkerThatIsNoneOfTheKernelsIsNotWrittenTo) {
    collect();
    const std::string path = folder_ / "trace_marker_raw";
    std::ofstream(path) << "precious";
    control_->setMarker(path);
    EXPECT_EQ(emitter_.emitNow(1, {}), Emission::Emitted);
    EXPECT_EQ(std::filesystem::file_size(path), 8U);
    EXPECT_EQ(drain().size(), 1U);
}

TEST_F(TraceEmitterTest, WithoutAFolderForRingsEventsAreLost) {
    collect();
    std::filesystem::remove_all(ringFolder(folder_.path()));
    EXPECT_EQ(emitter_.emitNow(1, {}), Emission::Lost);
    EXPECT_EQ(emitter_.emitNow(1, {}), Emission::Lost);
}

TEST_F(TraceEmitterTest, RingsGoWithTheirProcessWhileNobodyCollects) {
    openControl();
    {
        TraceEmitter emitter({{folder_.path(), true}});
        emitter.prepareThread();
        EXPECT_EQ(ringFiles(), 1U);
    }
    EXPECT_EQ(ringFiles(), 0U);
}

TEST_F(TraceEmitterTest, RingsStayForTheReaderWhileItCollects) {
    collect();
    {
        TraceEmitter emitter({{folder_.path(), true}});
        EXPECT_EQ(emitter.emitNow(1, {}), Emission::Emitted);
    }
    EXPECT_EQ(ringFiles(), 1U);
    EXPECT_EQ(drain().size(), 1U);
    EXPECT_EQ(ringFiles(), 0U);
}

TEST_F(TraceEmitterTest, TheChildOfAForkHasRingsOfItsOwn) {
    collect();
    EXPECT_EQ(emitter_.emitNow(1, {}), Emission::Emitted);
    EXPECT_EQ(ringFiles(), 1U);
    const pid_t child = fork();
    if (child == 0) {
        const bool emitted = emitter_.emitNow(2, {7, 0, 0, 0}) == Emission::Emitted;
        _exit(emitted ? 0 : 1);
    }
    int status = 0;
    ASSERT_EQ(waitpid(child, &status, 0), child);
    EXPECT_EQ(status, 0);
    EXPECT_EQ(ringFiles(), 2U);
    EXPECT_EQ(emitter_.emitNow(3, {}), Emission::Emitted);
    std::vector<std::pair<std::uint32_t, std::uint64_t>> seen;
    for (const TraceRecord& record : drain()) {
        seen.emplace_back(record.code, record.thread);
    }
    const auto own = static_cast<std::uint64_t>(gettid());
    EXPECT_THAT(seen, ::testing::UnorderedElementsAre(std::pair(1U, own), std::pair(2U, std::uint64_t(child)),
                                                      std::pair(3U, own)));
    EXPECT_EQ(ringFiles(), 1U) << "the child's ring was read and removed; the parent's lives";
    EXPECT_EQ(lost_, 0U);
}

TEST_F(TraceEmitterTest, AForkWhileOthersMakeRingsLeavesTheChildAble) {
    collect();
    std::atomic<bool> stop = false;
    std::thread busy([&] {
        while (!stop) {
            std::thread([&] { static_cast<void>(emitter_.emitNow(1, {})); }).join();
        }
    });
    for (int i = 0; i < 10; ++i) {
        const pid_t child = fork();
        if (child == 0) {
            _exit(emitter_.emitNow(2, {}) == Emission::Emitted ? 0 : 1);
        }
        int status = 0;
        ASSERT_EQ(waitpid(child, &status, 0), child);
        EXPECT_EQ(status, 0);
    }
    stop = true;
    busy.join();
}

TraceEmitter* interruptedEmitter = nullptr;
volatile std::sig_atomic_t interruptions = 0;

void emitInHandler(int) {
    interruptions = interruptions + 1;
    static_cast<void>(interruptedEmitter->emitNow(2, {}));
}

TEST_F(TraceEmitterTest, EventsOfASignalsHandlerAreWrittenOrCounted) {
    collect();
    EXPECT_EQ(emitter_.emitNow(1, {}), Emission::Emitted);
    interruptedEmitter = &emitter_;
    interruptions = 0;
    struct sigaction action {};
    struct sigaction before {};
    action.sa_handler = emitInHandler;
    ASSERT_EQ(sigaction(SIGALRM, &action, &before), 0);
    const itimerval often{{0, 100}, {0, 100}};
    const itimerval never{};
    setitimer(ITIMER_REAL, &often, nullptr);
    std::size_t own = 1;
    std::size_t seen = 0;
    while (interruptions < 200 && own < 10'000'000) {
        ++own;
        EXPECT_EQ(emitter_.emitNow(1, {}), Emission::Emitted);
        if (own % 5'000 == 0) {
            seen += drain().size();
        }
    }
    setitimer(ITIMER_REAL, &never, nullptr);
    sigaction(SIGALRM, &before, nullptr);
    seen += drain().size();
    EXPECT_EQ(seen + lost_, own + static_cast<std::size_t>(interruptions));
}

// Each round has an emitter that knows nothing yet: the handler comes in the midst of its finding the service and of
// its making a ring, where locks are held.
TEST_F(TraceEmitterTest, ASignalsHandlerMayEmitInTheMidstOfTheFirstEvent) {
#if defined(__has_feature)
#if __has_feature(thread_sanitizer)
    GTEST_SKIP() << "the sanitizer refuses a handler that comes before the first event, and makes the ring itself";
#endif
#endif
    constexpr std::size_t kRounds = 30;
    collect();
    interruptions = 0;
    struct sigaction action {};
    struct sigaction before {};
    action.sa_handler = emitInHandler;
    ASSERT_EQ(sigaction(SIGALRM, &action, &before), 0);
    const itimerval often{{0, 100}, {0, 50}};
    const itimerval never{};
    std::size_t seen = 0;
    for (std::size_t round = 0; round < kRounds; ++round) {
        {
            TraceEmitter fresh({{folder_.path(), true}});
            interruptedEmitter = &fresh;
            setitimer(ITIMER_REAL, &often, nullptr);
            const Emission emission = fresh.emitNow(1, {});
            setitimer(ITIMER_REAL, &never, nullptr);
            EXPECT_EQ(emission, Emission::Emitted);
        }
        seen += drain().size();
    }
    sigaction(SIGALRM, &before, nullptr);
    EXPECT_EQ(seen + lost_, kRounds + static_cast<std::size_t>(interruptions));
}

TEST_F(TraceEmitterTest, WhatInterruptsTheSlowPathOfItsThreadIsLostAndCounted) {
    collect();
    {
        const SlowPath slow;
        EXPECT_EQ(emitter_.emitNow(1, {}), Emission::Lost) << "nothing is known yet";
    }
    EXPECT_EQ(ringFiles(), 0U);
    EXPECT_EQ(emitter_.emitNow(2, {}), Emission::Emitted);
    {
        const SlowPath slow;
        EXPECT_EQ(emitter_.emitNow(3, {}), Emission::Emitted) << "the thread has its ring";
        std::thread([&] { EXPECT_EQ(emitter_.emitNow(4, {}), Emission::Emitted); }).join();
    }
    std::thread([&] {
        const SlowPath slow;
        EXPECT_EQ(emitter_.emitNow(5, {}), Emission::Lost) << "the thread has none";
    }).join();
    EXPECT_EQ(drain().size(), 3U);
    EXPECT_EQ(lost_, 2U);
}

TEST_F(TraceEmitterTest, EventsOfThreadsWithoutARingAreCountedInTheFirstRing) {
    collect();
    EXPECT_EQ(emitter_.emitNow(1, {}), Emission::Emitted);
    EXPECT_EQ(drain().size(), 1U);
    std::filesystem::rename(ringFolder(folder_.path()), folder_ / "away");
    std::thread([&] {
        for (int i = 0; i < 3; ++i) {
            EXPECT_EQ(emitter_.emitNow(2, {}), Emission::Lost);
        }
    }).join();
    EXPECT_EQ(drain().size(), 0U);
    EXPECT_EQ(lost_, 3U);
}

TEST_F(TraceEmitterTest, EventsLostBeforeTheFirstRingAreCountedInIt) {
    collect();
    emitter_.countLost(2);
    EXPECT_EQ(emitter_.emitNow(1, {}), Emission::Emitted);
    EXPECT_EQ(drain().size(), 1U);
    EXPECT_EQ(lost_, 2U);
    emitter_.countLost(1);
    EXPECT_EQ(drain().size(), 0U);
    EXPECT_EQ(lost_, 3U);
}

} // namespace
} // namespace vela::platform::spoor
