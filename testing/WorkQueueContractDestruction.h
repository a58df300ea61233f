// The part of testing/WorkQueueContract.h about queues that are destroyed with work pending. Included by it only.
#pragma once

#include "testing/WorkQueueContract.h"

namespace vela::testing {

TEST_P(WorkQueueContract, DestroyingAQueueDestroysItsItemsWithoutRunningThem) {
    Record record;
    std::atomic<int> destroyed = 0;
    auto queue = makeQueue();
    queue->suspend();
    for (int i = 0; i < 100; ++i) {
        queue->post([&record, trace = Trace([&destroyed] { ++destroyed; })] { record.add(1); });
    }
    queue.reset();
    EXPECT_EQ(destroyed, 100);
    EXPECT_EQ(record.size(), 0U);
}

TEST_P(WorkQueueContract, DestroyingAQueueDestroysItsDelayedItems) {
    Record record;
    std::atomic<int> destroyed = 0;
    auto queue = makeQueue();
    queue->postAfter(1s, [&record, trace = Trace([&destroyed] { ++destroyed; })] { record.add(1); });
    queue->postAfter(2s, [&record, trace = Trace([&destroyed] { ++destroyed; })] { record.add(1); });
    queue.reset();
    EXPECT_EQ(destroyed, 2);
    EXPECT_EQ(record.size(), 0U);
}

TEST_P(WorkQueueContract, AnItemMayDestroyItsOwnQueue) {
    Record record;
    auto queue = makeQueue();
    queue->suspend();
    queue->post([&] {
        record.add(1);
        queue.reset();
        record.add(3);
    });
    for (int i = 0; i < 10; ++i) {
        queue->post([&record, trace = Trace([&record] { record.add(2); })] { record.add(0); });
    }
    queue->resume();
    EXPECT_TRUE(runUntilSize(record, 12));
    EXPECT_EQ(record.numbers(), (std::vector{1, 2, 2, 2, 2, 2, 2, 2, 2, 2, 2, 3}));
}

TEST_P(WorkQueueContract, AnItemMayHoldItsOwnQueue) {
    Record record;
    auto queue = makeQueue();
    SerialQueue& borrowed = *queue;
    borrowed.suspend();
    borrowed.post([&record, trace = Trace([&record] { record.add(2); }), held = std::move(queue)] { record.add(1); });
    borrowed.post([&record, trace = Trace([&record] { record.add(3); })] { record.add(0); });
    borrowed.resume();
    EXPECT_TRUE(runUntilSize(record, 3));
    settle();
    auto numbers = record.numbers();
    EXPECT_EQ(numbers.front(), 1);
    std::sort(numbers.begin(), numbers.end());
    EXPECT_EQ(numbers, (std::vector{1, 2, 3}));
}

TEST_P(WorkQueueContract, AnItemMayDestroyAnotherQueue) {
    Record record;
    auto other = makeQueue();
    const auto queue = makeQueue();
    other->suspend();
    other->post([&record, trace = Trace([&record] { record.add(1); })] { record.add(0); });
    queue->post([&] {
        other.reset();
        record.add(2);
    });
    EXPECT_TRUE(runUntilSize(record, 2));
    EXPECT_EQ(record.numbers(), (std::vector{1, 2}));
}

TEST_P(WorkQueueContract, AnItemDestroyedUnrunMayPostToItsQueue) {
    std::atomic<int> destroyed = 0;
    auto queue = makeQueue();
    SerialQueue& borrowed = *queue;
    borrowed.suspend();
    borrowed.post([trace = Trace([&] {
                       borrowed.post([second = Trace([&destroyed] { ++destroyed; })] {});
                       borrowed.postAfter(1s, [second = Trace([&destroyed] { ++destroyed; })] {});
                       ++destroyed;
                   })] {});
    queue.reset();
    EXPECT_EQ(destroyed, 3);
}

TEST_P(WorkQueueContract, AnItemDestroyedUnrunMayDestroyAnotherQueue) {
    Record record;
    auto queue = makeQueue();
    auto other = makeQueue();
    queue->suspend();
    other->suspend();
    other->post([&record, trace = Trace([&record] { record.add(1); })] { record.add(0); });
    queue->post([held = std::move(other)] {});
    queue.reset();
    EXPECT_EQ(record.numbers(), (std::vector{1}));
}

TEST_P(WorkQueueContract, CapturesOfAnItemGoBeforeTheNextItemBegins) {
    Record record;
    const auto queue = makeQueue();
    queue->suspend();
    queue->post([&record, trace = Trace([&record] { record.add(2); })] { record.add(1); });
    queue->post([&record] { record.add(3); });
    queue->resume();
    EXPECT_TRUE(runUntilSize(record, 3));
    EXPECT_EQ(record.numbers(), (std::vector{1, 2, 3}));
}

} // namespace vela::testing
