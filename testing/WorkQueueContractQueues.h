// The part of testing/WorkQueueContract.h about queues: order, delays, suspension. Included by it only.
#pragma once

#include "testing/WorkQueueContract.h"

namespace vela::testing {

TEST_P(WorkQueueContract, ItemsRunInTheOrderPosted) {
    Record record;
    const auto queue = makeQueue();
    std::vector<int> expected;
    for (int i = 0; i < 1'000; ++i) {
        queue->post([&record, i] { record.add(i); });
        expected.push_back(i);
    }
    EXPECT_TRUE(runUntilSize(record, 1'000));
    EXPECT_EQ(record.numbers(), expected);
}

TEST_P(WorkQueueContract, AnItemPostedByAnItemRunsAfterThoseThatWait) {
    Record record;
    const auto queue = makeQueue();
    queue->suspend();
    queue->post([&] {
        queue->post([&record] { record.add(3); });
        record.add(1);
    });
    queue->post([&record] { record.add(2); });
    queue->resume();
    EXPECT_TRUE(runUntilSize(record, 3));
    EXPECT_EQ(record.numbers(), (std::vector{1, 2, 3}));
}

TEST_P(WorkQueueContract, ItemsOfOneQueueNeverRunBesideEachOther) {
    std::atomic<int> inside = 0;
    std::atomic<int> most = 0;
    std::atomic<int> ran = 0;
    const auto queue = makeQueue();
    for (int i = 0; i < 300; ++i) {
        queue->post([&] {
            most = std::max(most.load(), ++inside);
            --inside;
            ++ran;
        });
    }
    EXPECT_TRUE(runUntil([&ran] { return ran == 300; }));
    EXPECT_EQ(most, 1);
}

TEST_P(WorkQueueContract, AQueueRunsItsItemsWhileAnotherIsSuspended) {
    Record record;
    const auto suspended = makeQueue();
    const auto queue = makeQueue();
    suspended->suspend();
    suspended->post([&record] { record.add(1); });
    queue->post([&record] { record.add(2); });
    EXPECT_TRUE(runUntilSize(record, 1));
    settle();
    EXPECT_EQ(record.numbers(), (std::vector{2}));
}

TEST_P(WorkQueueContract, DelayedItemsRunInTheOrderOfTheirDeadlines) {
    Record record;
    const auto queue = makeQueue();
    queue->postAfter(30ms, [&record] { record.add(3); });
    queue->postAfter(10ms, [&record] { record.add(1); });
    queue->postAfter(20ms, [&record] { record.add(2); });
    EXPECT_TRUE(runUntilSize(record, 3));
    EXPECT_EQ(record.numbers(), (std::vector{1, 2, 3}));
}

TEST_P(WorkQueueContract, EqualDelaysKeepTheirOrder) {
    Record record;
    const auto queue = makeQueue();
    std::vector<int> expected;
    for (int i = 0; i < 100; ++i) {
        queue->postAfter(5ms, [&record, i] { record.add(i); });
        expected.push_back(i);
    }
    EXPECT_TRUE(runUntilSize(record, 100));
    EXPECT_EQ(record.numbers(), expected);
}

TEST_P(WorkQueueContract, ADelayOfZeroOrLessPostsAtOnce) {
    Record record;
    const auto queue = makeQueue();
    queue->suspend();
    queue->post([&record] { record.add(1); });
    queue->postAfter(0ms, [&record] { record.add(2); });
    queue->postAfter(-1s, [&record] { record.add(3); });
    queue->postAfter(Nanoseconds::min(), [&record] { record.add(4); });
    queue->post([&record] { record.add(5); });
    queue->resume();
    EXPECT_TRUE(runUntilSize(record, 5));
    EXPECT_EQ(record.numbers(), (std::vector{1, 2, 3, 4, 5}));
}

TEST_P(WorkQueueContract, ADelayedItemNeverRunsBeforeItsDelayHasPassed) {
    std::optional<platform::MonotonicTime> ranAt; // read after `ran`
    std::atomic<bool> ran = false;
    const auto queue = makeQueue();
    const auto postedAt = monotonicNow();
    queue->postAfter(20ms, [&] {
        ranAt = monotonicNow();
        ran = true;
    });
    EXPECT_TRUE(runUntil([&ran] { return ran.load(); }));
    EXPECT_GE(*ranAt - postedAt, 20ms);
}

TEST_P(WorkQueueContract, ADelayBeyondTheEndOfTimeNeverEnds) {
    Record record;
    const auto queue = makeQueue();
    queue->postAfter(Nanoseconds::max(), [&record] { record.add(1); });
    queue->postAfter(1ms, [&record] { record.add(2); });
    EXPECT_TRUE(runUntilSize(record, 1));
    EXPECT_EQ(record.numbers(), (std::vector{2}));
}

TEST_P(WorkQueueContract, ADelayedItemOfASuspendedQueueWaitsForItsTurn) {
    Record record;
    const auto queue = makeQueue();
    queue->suspend();
    queue->postAfter(1ms, [&record] { record.add(1); });
    pass(5ms);
    queue->post([&record] { record.add(2); });
    EXPECT_EQ(record.size(), 0U);
    queue->resume();
    EXPECT_TRUE(runUntilSize(record, 2));
    EXPECT_EQ(record.numbers(), (std::vector{1, 2}));
}

TEST_P(WorkQueueContract, AQueueResumesWhenEverySuspendWasTakenBack) {
    Record record;
    const auto queue = makeQueue();
    queue->suspend();
    queue->suspend();
    queue->post([&record] { record.add(1); });
    queue->resume();
    settle();
    EXPECT_EQ(record.size(), 0U);
    queue->resume();
    EXPECT_TRUE(runUntilSize(record, 1));
}

TEST_P(WorkQueueContract, AnItemThatSuspendsItsQueueRunsToItsEndAndIsTheLast) {
    Record record;
    const auto queue = makeQueue();
    queue->post([&] {
        queue->suspend();
        record.add(1);
    });
    queue->post([&record] { record.add(2); });
    EXPECT_TRUE(runUntilSize(record, 1));
    settle();
    EXPECT_EQ(record.numbers(), (std::vector{1}));
    queue->resume();
    EXPECT_TRUE(runUntilSize(record, 2));
}

TEST_P(WorkQueueContract, AnItemThatSuspendsAndResumesItsQueueChangesNothing) {
    Record record;
    const auto queue = makeQueue();
    queue->post([&queue] {
        queue->suspend();
        queue->resume();
    });
    queue->post([&record] { record.add(1); });
    EXPECT_TRUE(runUntilSize(record, 1));
}

TEST_P(WorkQueueContract, ResumeWithRunsItsItemAheadOfThoseThatWait) {
    Record record;
    const auto queue = makeQueue();
    queue->suspend();
    queue->post([&record] { record.add(2); });
    queue->post([&record] { record.add(3); });
    queue->resumeWith([&record] { record.add(1); });
    EXPECT_TRUE(runUntilSize(record, 3));
    EXPECT_EQ(record.numbers(), (std::vector{1, 2, 3}));
}

TEST_P(WorkQueueContract, ResumeWithInsideAnItemRunsItsItemNext) {
    Record record;
    const auto queue = makeQueue();
    queue->suspend();
    queue->post([&] {
        queue->suspend();
        queue->resumeWith([&record] { record.add(2); });
        record.add(1);
    });
    queue->post([&record] { record.add(3); });
    queue->resume();
    EXPECT_TRUE(runUntilSize(record, 3));
    EXPECT_EQ(record.numbers(), (std::vector{1, 2, 3}));
}

TEST_P(WorkQueueContract, ResumeWithOnAQueueStillSuspendedKeepsItsItemInFront) {
    Record record;
    const auto queue = makeQueue();
    queue->suspend();
    queue->suspend();
    queue->post([&record] { record.add(3); });
    queue->resumeWith([&record] { record.add(2); });
    settle();
    EXPECT_EQ(record.size(), 0U);
    queue->resumeWith([&record] { record.add(1); });
    EXPECT_TRUE(runUntilSize(record, 3));
    EXPECT_EQ(record.numbers(), (std::vector{1, 2, 3}));
}

TEST_P(WorkQueueContract, AQueueIsCurrentInsideItsItemsOnly) {
    Record record;
    const auto queue = makeQueue();
    const auto other = makeQueue();
    queue->post([&] {
        record.add(queue->isCurrent() ? 1 : 0);
        record.add(other->isCurrent() ? 1 : 0);
        record.add(queues().background().isCurrent() ? 1 : 0);
    });
    EXPECT_TRUE(runUntilSize(record, 3));
    EXPECT_EQ(record.numbers(), (std::vector{1, 0, 0}));
    EXPECT_FALSE(queue->isCurrent());
}

TEST_P(WorkQueueContract, AQueueKeepsItsWholeName) {
    EXPECT_EQ(makeQueue("com.orvex.vela.session.beaconreporting")->name(), "com.orvex.vela.session.beaconreporting");
    EXPECT_EQ(makeQueue("")->name(), "");
}

TEST_P(WorkQueueContract, TheBackgroundQueueRunsEveryItemOnce) {
    Record record;
    std::atomic<int> current = 0;
    WorkQueue& background = queues().background();
    for (int i = 0; i < 100; ++i) {
        background.post([&, i] {
            current += background.isCurrent() ? 1 : 0;
            record.add(i);
        });
    }
    EXPECT_TRUE(runUntilSize(record, 100));
    settle();
    auto numbers = record.numbers();
    std::sort(numbers.begin(), numbers.end());
    std::vector<int> expected(100);
    std::iota(expected.begin(), expected.end(), 0);
    EXPECT_EQ(numbers, expected);
    EXPECT_EQ(current, 100);
}

TEST_P(WorkQueueContract, TheBackgroundQueueKeepsDelays) {
    Record record;
    const auto postedAt = monotonicNow();
    std::atomic<bool> early = false;
    queues().background().postAfter(10ms, [&] {
        early = monotonicNow() - postedAt < 10ms;
        record.add(1);
    });
    EXPECT_TRUE(runUntilSize(record, 1));
    EXPECT_FALSE(early);
}

TEST_P(WorkQueueContract, QueuesOfEveryQualityRunTheirItems) {
    Record record;
    std::vector<std::unique_ptr<SerialQueue>> all;
    for (const auto quality : {platform::QualityOfService::Background, platform::QualityOfService::Utility,
                               platform::QualityOfService::Default, platform::QualityOfService::UserInteractive}) {
        all.push_back(queues().makeSerialQueue("com.orvex.vela.test", quality));
        all.back()->post([&record] { record.add(1); });
    }
    EXPECT_TRUE(runUntilSize(record, 4));
}

TEST_P(WorkQueueContract, BlockingScopesNestAndDoNothingOutsideAnItem) {
    Record record;
    { const platform::BlockingScope outside(queues()); }
    const auto queue = makeQueue();
    queue->post([&] {
        const platform::BlockingScope outer(queues());
        const platform::BlockingScope inner(queues());
        record.add(1);
    });
    queue->post([&record] { record.add(2); });
    EXPECT_TRUE(runUntilSize(record, 2));
}

} // namespace vela::testing
