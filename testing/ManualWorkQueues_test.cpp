#include "testing/ManualWorkQueues.h"
#include "testing/WorkQueueContract.h"

#include <chrono>
#include <gtest/gtest.h>
#include <memory>
#include <mutex>
#include <vector>

namespace vela::testing {

namespace {

using platform::QualityOfService;

class ManualBackend final : public WorkQueueBackend {
public:
    platform::WorkQueues& queues() override { return queues_; }
    platform::MonotonicTime monotonicNow() override { return clock_.monotonicNow(); }
    void settle() override { queues_.runUntilIdle(); }
    void pass(Nanoseconds duration) override { queues_.advance(duration); }

    bool runUntil(const std::function<bool()>& done) override {
        queues_.runUntilIdle();
        for (int passed = 0; !done() && passed < 120'000; ++passed) {
            queues_.advance(1ms);
        }
        return done();
    }

private:
    ManualClock clock_;
    ManualWorkQueues queues_{clock_};
};

INSTANTIATE_TEST_SUITE_P(Manual, WorkQueueContract,
                         ::testing::Values(MakeWorkQueueBackend([] { return std::make_unique<ManualBackend>(); })));

class ManualWorkQueuesTest : public ::testing::Test {
protected:
    std::unique_ptr<SerialQueue> makeQueue() { return queues_.makeSerialQueue("queue", QualityOfService::Default); }
    platform::WorkItem note(int number) {
        return [this, number] { ran_.push_back(number); };
    }

    ManualClock clock_;
    ManualWorkQueues queues_{clock_};
    std::vector<int> ran_;
};

TEST_F(ManualWorkQueuesTest, NothingRunsByItself) {
    const auto queue = makeQueue();
    queue->post(note(1));
    EXPECT_TRUE(ran_.empty());
    EXPECT_EQ(queues_.pendingItems(), 1U);
}

TEST_F(ManualWorkQueuesTest, ItemsOfAllQueuesRunInTheOrderPosted) {
    const auto first = makeQueue();
    const auto second = makeQueue();
    second->post(note(1));
    first->post(note(2));
    queues_.background().post(note(3));
    second->post(note(4));
    queues_.runUntilIdle();
    EXPECT_EQ(ran_, (std::vector{1, 2, 3, 4}));
}

TEST_F(ManualWorkQueuesTest, RunNextRunsOneItem) {
    const auto queue = makeQueue();
    queue->post(note(1));
    queue->post(note(2));
    EXPECT_TRUE(queues_.runNext());
    EXPECT_EQ(ran_, (std::vector{1}));
    EXPECT_TRUE(queues_.runNext());
    EXPECT_FALSE(queues_.runNext());
}

TEST_F(ManualWorkQueuesTest, RunUntilIdleLeavesTheClockAlone) {
    const auto queue = makeQueue();
    queue->postAfter(1s, note(1));
    const auto before = clock_.monotonicNow();
    queues_.runUntilIdle();
    EXPECT_EQ(clock_.monotonicNow(), before);
    EXPECT_TRUE(ran_.empty());
    EXPECT_EQ(queues_.pendingTimers(), 1U);
}

TEST_F(ManualWorkQueuesTest, RunUntilIdleRunsWhatTheClockHasReached) {
    const auto queue = makeQueue();
    queue->postAfter(1s, note(1));
    clock_.advance(1s);
    queues_.runUntilIdle();
    EXPECT_EQ(ran_, (std::vector{1}));
}

TEST_F(ManualWorkQueuesTest, AdvanceStopsAtEachTimer) {
    const auto queue = makeQueue();
    const auto start = clock_.monotonicNow();
    std::vector<Nanoseconds> times;
    queue->postAfter(9s, [&] { times.push_back(clock_.monotonicNow() - start); });
    queue->postAfter(1s, [&] {
        times.push_back(clock_.monotonicNow() - start);
        queue->postAfter(500ms, [&] { times.push_back(clock_.monotonicNow() - start); });
    });
    queues_.advance(9s);
    EXPECT_EQ(times, (std::vector<Nanoseconds>{1s, 1'500ms, 9s}));
    EXPECT_EQ(clock_.monotonicNow() - start, 9s);
}

TEST_F(ManualWorkQueuesTest, AdvanceStopsShortOfLaterTimers) {
    const auto queue = makeQueue();
    queue->postAfter(1s, note(1));
    queues_.advance(999ms);
    EXPECT_TRUE(ran_.empty());
    queues_.advance(1ms);
    EXPECT_EQ(ran_, (std::vector{1}));
}

TEST_F(ManualWorkQueuesTest, ABlockedItemMovesTheClockToItsDeadline) {
    const auto semaphore = queues_.makeSemaphore(0);
    const auto before = clock_.monotonicNow();
    EXPECT_FALSE(semaphore->wait(9s));
    EXPECT_EQ(clock_.monotonicNow() - before, 9s);
}

TEST_F(ManualWorkQueuesTest, ABlockedItemDoesNotLetItsOwnQueueGoOn) {
    const auto semaphore = queues_.makeSemaphore(0);
    const auto queue = makeQueue();
    const auto other = makeQueue();
    queue->post([&] {
        EXPECT_TRUE(semaphore->wait(9s));
        ran_.push_back(2);
    });
    queue->post(note(3));
    other->post(note(1));
    other->post([&semaphore] { semaphore->signal(); });
    queues_.runUntilIdle();
    EXPECT_EQ(ran_, (std::vector{1, 2, 3}));
}

TEST_F(ManualWorkQueuesTest, ABlockedItemIsToldWhenItsSemaphoreIsDestroyed) {
    auto semaphore = queues_.makeSemaphore(0);
    const auto waiting = makeQueue();
    const auto destroying = makeQueue();
    waiting->post([&] { ran_.push_back(semaphore->wait(std::nullopt) ? 1 : 0); });
    destroying->post([&semaphore] { semaphore.reset(); });
    queues_.runUntilIdle();
    EXPECT_EQ(ran_, (std::vector{0}));
}

TEST_F(ManualWorkQueuesTest, AWaitThatNothingCanEndEndsTheTest) {
    const auto semaphore = queues_.makeSemaphore(0);
    EXPECT_DEATH(semaphore->wait(std::nullopt), "nothing can end");
}

TEST_F(ManualWorkQueuesTest, AConditionWithoutStepsWaitsUntilItsDeadline) {
    const auto condition = queues_.makeCondition();
    const auto deadline = condition->monotonicNow() + 5s;
    const std::unique_lock lock(*condition);
    EXPECT_FALSE(condition->waitUntil(deadline));
    EXPECT_EQ(clock_.monotonicNow(), deadline);
}

TEST_F(ManualWorkQueuesTest, AConditionRunsOneStepForEachWait) {
    const auto condition = queues_.makeCondition();
    queues_.addConditionStep([this](platform::Condition&) { ran_.push_back(1); });
    queues_.addConditionStep([this](platform::Condition& waited) {
        const std::scoped_lock free(waited);
        clock_.advance(9s);
        waited.signal();
        ran_.push_back(2);
    });
    queues_.addConditionStep([this](platform::Condition&) { clock_.advance(9s); });
    const std::unique_lock lock(*condition);
    EXPECT_TRUE(condition->waitUntil(condition->monotonicNow() + 9s));
    EXPECT_TRUE(condition->waitUntil(condition->monotonicNow() + 9s));
    EXPECT_FALSE(condition->waitUntil(condition->monotonicNow() + 9s));
    EXPECT_EQ(ran_, (std::vector{1, 2}));
}

TEST_F(ManualWorkQueuesTest, CountsTellWhatIsThere) {
    const auto semaphore = queues_.makeSemaphore(0);
    auto queue = makeQueue();
    auto waiting = makeQueue();
    semaphore->waitSuspending(*waiting, 9s, [](bool) {});
    queue->post(note(1));
    waiting->post(note(2));
    EXPECT_EQ(queues_.liveQueues(), 2U);
    EXPECT_EQ(queues_.suspendedQueues(), 1U);
    EXPECT_EQ(queues_.pendingItems(), 2U);
    EXPECT_EQ(queues_.pendingTimers(), 1U);
    waiting.reset();
    EXPECT_EQ(queues_.liveQueues(), 1U);
    EXPECT_EQ(queues_.suspendedQueues(), 0U);
    EXPECT_EQ(queues_.pendingItems(), 1U);
    EXPECT_EQ(queues_.pendingTimers(), 0U);
}

TEST_F(ManualWorkQueuesTest, BlockingDepthIsSeen) {
    const auto queue = makeQueue();
    queue->post([this] {
        const platform::BlockingScope outer(queues_);
        const platform::BlockingScope inner(queues_);
        ran_.push_back(static_cast<int>(queues_.blockingDepth()));
    });
    queues_.runUntilIdle();
    EXPECT_EQ(ran_, (std::vector{2}));
    EXPECT_EQ(queues_.blockingDepth(), 0U);
}

TEST(ManualClockTest, AdvanceMovesEveryTimeAndSetNowOnlyTheTimeOfDay) {
    ManualClock clock;
    const auto wall = clock.now();
    const auto monotonic = clock.monotonicNow();
    const auto uptime = clock.systemUptime();
    clock.advance(2s);
    EXPECT_EQ(clock.now() - wall, 2s);
    EXPECT_EQ(clock.monotonicNow() - monotonic, 2s);
    EXPECT_EQ(clock.systemUptime() - uptime, 2s);
    clock.setNow(platform::WallTime(5s));
    EXPECT_EQ(clock.now(), platform::WallTime(5s));
    EXPECT_EQ(clock.monotonicNow() - monotonic, 2s);
    clock.setLocalOffset(std::chrono::hours(-5));
    EXPECT_EQ(clock.localOffset(clock.now()), std::chrono::hours(-5));
}

} // namespace

} // namespace vela::testing
