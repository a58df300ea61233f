// The part of testing/WorkQueueContract.h about semaphores and conditions. Included by it only.
#pragma once

#include "testing/WorkQueueContract.h"

namespace vela::testing {

TEST_P(WorkQueueContract, ASemaphoreIsTakenAsOftenAsItsCount) {
    const auto semaphore = queues().makeSemaphore(2);
    EXPECT_TRUE(semaphore->wait(0ms));
    EXPECT_TRUE(semaphore->wait(0ms));
    EXPECT_FALSE(semaphore->wait(0ms));
    semaphore->signal();
    EXPECT_TRUE(semaphore->wait(std::nullopt));
}

TEST_P(WorkQueueContract, AWaitOfNegativeTimeTakesOrAnswersAtOnce) {
    const auto semaphore = queues().makeSemaphore(1);
    EXPECT_TRUE(semaphore->wait(-1s));
    EXPECT_FALSE(semaphore->wait(-1s));
}

TEST_P(WorkQueueContract, AWaitThatNothingEndsLastsUntilItsTimeLimit) {
    const auto semaphore = queues().makeSemaphore(0);
    const auto began = monotonicNow();
    EXPECT_FALSE(semaphore->wait(20ms));
    EXPECT_GE(monotonicNow() - began, 20ms);
}

TEST_P(WorkQueueContract, AWaitThatTimedOutTakesNothingLater) {
    const auto semaphore = queues().makeSemaphore(0);
    EXPECT_FALSE(semaphore->wait(1ms));
    semaphore->signal();
    EXPECT_TRUE(semaphore->wait(0ms));
}

TEST_P(WorkQueueContract, AnItemOfAnotherQueueEndsAWait) {
    const auto semaphore = queues().makeSemaphore(0);
    const auto queue = makeQueue();
    queue->post([&semaphore] { semaphore->signal(); });
    EXPECT_TRUE(semaphore->wait(std::nullopt));
    queue->postAfter(5ms, [&semaphore] { semaphore->signal(); });
    EXPECT_TRUE(semaphore->wait(Nanoseconds::max()));
}

TEST_P(WorkQueueContract, AnItemMayBlockUntilAnotherQueuesItemSignals) {
    Record record;
    const auto semaphore = queues().makeSemaphore(0);
    const auto waiting = makeQueue();
    const auto signalling = makeQueue();
    waiting->post([&] { record.add(semaphore->wait(60s) ? 1 : 0); });
    signalling->postAfter(5ms, [&semaphore] { semaphore->signal(); });
    EXPECT_TRUE(runUntilSize(record, 1));
    EXPECT_EQ(record.numbers(), (std::vector{1}));
}

TEST_P(WorkQueueContract, ASuspendingWaitTakesAtOnceWhatIsThere) {
    Record record;
    const auto semaphore = queues().makeSemaphore(1);
    const auto queue = makeQueue();
    semaphore->waitSuspending(*queue, 60s, [&record](bool taken) { record.add(taken ? 1 : 0); });
    EXPECT_TRUE(runUntilSize(record, 1));
    EXPECT_EQ(record.numbers(), (std::vector{1}));
    EXPECT_FALSE(semaphore->wait(0ms));
}

TEST_P(WorkQueueContract, ASuspendingWaitNeverRunsItsContinuationInPlace) {
    Record record;
    const auto semaphore = queues().makeSemaphore(1);
    const auto queue = makeQueue();
    queue->post([&] {
        semaphore->waitSuspending(*queue, 60s, [&record](bool) { record.add(2); });
        record.add(1);
    });
    EXPECT_TRUE(runUntilSize(record, 2));
    EXPECT_EQ(record.numbers(), (std::vector{1, 2}));
}

TEST_P(WorkQueueContract, ASuspendingWaitIsEndedByASignal) {
    Record record;
    const auto semaphore = queues().makeSemaphore(0);
    const auto queue = makeQueue();
    semaphore->waitSuspending(*queue, 60s, [&](bool taken) { record.add(taken && queue->isCurrent() ? 1 : 0); });
    settle();
    EXPECT_EQ(record.size(), 0U);
    semaphore->signal();
    EXPECT_TRUE(runUntilSize(record, 1));
    EXPECT_EQ(record.numbers(), (std::vector{1}));
    EXPECT_FALSE(semaphore->wait(0ms));
}

TEST_P(WorkQueueContract, ASuspendingWaitIsEndedByItsTimeLimit) {
    Record record;
    const auto semaphore = queues().makeSemaphore(0);
    const auto queue = makeQueue();
    const auto began = monotonicNow();
    std::atomic<bool> early = false;
    semaphore->waitSuspending(*queue, 10ms, [&](bool taken) {
        early = monotonicNow() - began < 10ms;
        record.add(taken ? 1 : 0);
    });
    EXPECT_TRUE(runUntilSize(record, 1));
    EXPECT_EQ(record.numbers(), (std::vector{0}));
    EXPECT_FALSE(early);
    semaphore->signal();
    EXPECT_TRUE(semaphore->wait(0ms));
}

TEST_P(WorkQueueContract, ASuspendingWaitWithoutTimeAnswersAtOnce) {
    Record record;
    const auto semaphore = queues().makeSemaphore(0);
    const auto queue = makeQueue();
    semaphore->waitSuspending(*queue, 0ms, [&record](bool taken) { record.add(taken ? 1 : 0); });
    semaphore->waitSuspending(*queue, -1s, [&record](bool taken) { record.add(taken ? 1 : 0); });
    EXPECT_TRUE(runUntilSize(record, 2));
    EXPECT_EQ(record.numbers(), (std::vector{0, 0}));
}

TEST_P(WorkQueueContract, WhatWaitsRunsAfterTheContinuationOfASuspendingWait) {
    Record record;
    const auto semaphore = queues().makeSemaphore(0);
    const auto queue = makeQueue();
    queue->suspend();
    queue->post([&] {
        record.add(1);
        semaphore->waitSuspending(*queue, 60s, [&record](bool taken) { record.add(taken ? 2 : 0); });
    });
    queue->post([&record] { record.add(3); });
    queue->resume();
    EXPECT_TRUE(runUntilSize(record, 1));
    queue->post([&record] { record.add(4); });
    settle();
    EXPECT_EQ(record.numbers(), (std::vector{1}));
    semaphore->signal();
    EXPECT_TRUE(runUntilSize(record, 4));
    EXPECT_EQ(record.numbers(), (std::vector{1, 2, 3, 4}));
}

TEST_P(WorkQueueContract, ASuspendingWaitLeavesOtherSuspensionsAlone) {
    Record record;
    const auto semaphore = queues().makeSemaphore(0);
    const auto queue = makeQueue();
    queue->suspend();
    semaphore->waitSuspending(*queue, 60s, [&record](bool) { record.add(1); });
    semaphore->signal();
    settle();
    EXPECT_EQ(record.size(), 0U);
    queue->resume();
    EXPECT_TRUE(runUntilSize(record, 1));
}

TEST_P(WorkQueueContract, WaitersAreServedInTheOrderInWhichTheyBegan) {
    Record record;
    const auto semaphore = queues().makeSemaphore(0);
    const auto first = makeQueue();
    const auto second = makeQueue();
    const auto third = makeQueue();
    semaphore->waitSuspending(*first, 60s, [&record](bool) { record.add(1); });
    semaphore->waitSuspending(*second, 60s, [&record](bool) { record.add(2); });
    semaphore->waitSuspending(*third, 60s, [&record](bool) { record.add(3); });
    for (std::size_t signals = 1; signals <= 3; ++signals) {
        semaphore->signal();
        EXPECT_TRUE(runUntilSize(record, signals));
    }
    EXPECT_EQ(record.numbers(), (std::vector{1, 2, 3}));
}

TEST_P(WorkQueueContract, AWaiterThatTimedOutIsNotServed) {
    Record record;
    const auto semaphore = queues().makeSemaphore(0);
    const auto impatient = makeQueue();
    const auto patient = makeQueue();
    semaphore->waitSuspending(*impatient, 5ms, [&record](bool taken) { record.add(taken ? 1 : 10); });
    semaphore->waitSuspending(*patient, 60s, [&record](bool taken) { record.add(taken ? 2 : 20); });
    EXPECT_TRUE(runUntilSize(record, 1));
    semaphore->signal();
    EXPECT_TRUE(runUntilSize(record, 2));
    EXPECT_EQ(record.numbers(), (std::vector{10, 2}));
}

TEST_P(WorkQueueContract, DestroyingASemaphoreDropsContinuationsAndResumesTheirQueues) {
    Record record;
    auto semaphore = queues().makeSemaphore(0);
    const auto queue = makeQueue();
    semaphore->waitSuspending(*queue, 60s,
                              [&record, trace = Trace([&record] { record.add(1); })](bool) { record.add(0); });
    queue->post([&record] { record.add(2); });
    settle();
    EXPECT_EQ(record.size(), 0U);
    semaphore.reset();
    EXPECT_TRUE(runUntilSize(record, 2));
    EXPECT_EQ(record.numbers(), (std::vector{1, 2}));
}

TEST_P(WorkQueueContract, DestroyingAWaitingQueueDropsItsContinuationAndTakesNothing) {
    Record record;
    const auto semaphore = queues().makeSemaphore(0);
    auto queue = makeQueue();
    const auto next = makeQueue();
    semaphore->waitSuspending(*queue, 60s,
                              [&record, trace = Trace([&record] { record.add(1); })](bool) { record.add(0); });
    semaphore->waitSuspending(*next, 60s, [&record](bool taken) { record.add(taken ? 2 : 0); });
    queue.reset();
    EXPECT_EQ(record.numbers(), (std::vector{1}));
    semaphore->signal();
    EXPECT_TRUE(runUntilSize(record, 2));
    EXPECT_EQ(record.numbers(), (std::vector{1, 2}));
}

TEST_P(WorkQueueContract, DestroyingAQueueDropsAContinuationThatHasNotBegun) {
    Record record;
    const auto semaphore = queues().makeSemaphore(1);
    auto queue = makeQueue();
    queue->suspend();
    semaphore->waitSuspending(*queue, 60s,
                              [&record, trace = Trace([&record] { record.add(1); })](bool) { record.add(0); });
    queue.reset();
    EXPECT_EQ(record.numbers(), (std::vector{1}));
}

TEST_P(WorkQueueContract, AQueueMayWaitOnTwoSemaphoresAtOnce) {
    Record record;
    const auto one = queues().makeSemaphore(0);
    const auto two = queues().makeSemaphore(0);
    const auto queue = makeQueue();
    one->waitSuspending(*queue, 60s, [&record](bool) { record.add(1); });
    two->waitSuspending(*queue, 60s, [&record](bool) { record.add(2); });
    two->signal();
    settle();
    EXPECT_EQ(record.size(), 0U);
    one->signal();
    EXPECT_TRUE(runUntilSize(record, 2));
    EXPECT_EQ(record.numbers(), (std::vector{1, 2}));
}

TEST_P(WorkQueueContract, AContinuationMayDestroyItsSemaphore) {
    Record record;
    auto semaphore = queues().makeSemaphore(0);
    const auto queue = makeQueue();
    semaphore->waitSuspending(*queue, 60s, [&](bool) {
        semaphore.reset();
        record.add(1);
    });
    semaphore->signal();
    EXPECT_TRUE(runUntilSize(record, 1));
}

TEST_P(WorkQueueContract, AConditionWithoutSignalWaitsUntilItsDeadline) {
    const auto condition = queues().makeCondition();
    std::unique_lock lock(*condition);
    const auto deadline = condition->monotonicNow() + 10ms;
    while (condition->waitUntil(deadline)) { // it may wake without cause
    }
    EXPECT_GE(condition->monotonicNow(), deadline);
}

} // namespace vela::testing
