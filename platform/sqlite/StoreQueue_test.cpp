#include "platform/sqlite/StoreQueue.h"

#include <gtest/gtest.h>
#include <string>
#include <utility>

namespace vela::platform {

namespace {

const std::optional<MonotonicTime> kPast = MonotonicTime();

StoreRecord record(std::int64_t session = 0) {
    StoreRecord record;
    record.session = session;
    return record;
}

class StoreQueueTest : public ::testing::Test {
protected:
    std::optional<DropReason> push(StoreQueue& queue, StoreRecord record) { return queue.push(record); }
    /// Whether the writer was called since this was last asked.
    bool woken(StoreQueue& queue) { return queue.wait(kPast); }

    StoreQueue queue_{{.records = 4, .bytes = 1024 * 1024, .group = 3}};
};

TEST_F(StoreQueueTest, RecordsComeOutInTheOrderPushed) {
    push(queue_, record(1));
    push(queue_, record(2));
    std::vector<StoreRecord> taken;
    queue_.take(taken);
    ASSERT_EQ(taken.size(), 2U);
    EXPECT_EQ(taken[0].session, 1);
    EXPECT_EQ(taken[1].session, 2);
    EXPECT_EQ(queue_.state().waiting, 0U);
}

TEST_F(StoreQueueTest, MoreRecordsThanItHoldsAreRefusedAndStayWhole) {
    for (int count = 0; count < 4; ++count) {
        EXPECT_EQ(push(queue_, record()), std::nullopt);
    }
    StoreRecord fifth = record(5);
    fifth.builder = [] { return Dictionary(); };
    EXPECT_EQ(queue_.push(fifth), DropReason::QueueFull);
    EXPECT_EQ(fifth.session, 5);
    EXPECT_TRUE(fifth.builder);
}

TEST_F(StoreQueueTest, RecordsThatAreBeingWrittenStillTakeRoom) {
    for (int count = 0; count < 4; ++count) {
        push(queue_, record());
    }
    std::vector<StoreRecord> taken;
    queue_.take(taken);
    EXPECT_EQ(push(queue_, record()), DropReason::QueueFull);
    queue_.release(1, taken[0].weight);
    EXPECT_EQ(push(queue_, record()), std::nullopt);
    EXPECT_EQ(queue_.held(), 4U);
}

TEST_F(StoreQueueTest, ItIsNearlyFullWhenAnEighthOfItsRecordsIsLeft) {
    StoreQueue queue({.records = 16, .bytes = 1024 * 1024, .group = 100});
    for (int count = 0; count < 13; ++count) {
        push(queue, record());
    }
    EXPECT_FALSE(queue.isNearlyFull());
    push(queue, record());
    EXPECT_TRUE(queue.isNearlyFull());
    std::vector<StoreRecord> taken;
    queue.take(taken);
    EXPECT_TRUE(queue.isNearlyFull());
    queue.release(1, taken[0].weight);
    EXPECT_FALSE(queue.isNearlyFull());
}

TEST_F(StoreQueueTest, ItIsNearlyFullWhenAnEighthOfItsBytesIsLeft) {
    StoreQueue queue({.records = 100, .bytes = 8'000, .group = 100});
    StoreRecord large = record();
    large.bytes = Data(std::string(7'000 - sizeof(StoreRecord) - 1, 'x'));
    push(queue, std::move(large));
    EXPECT_FALSE(queue.isNearlyFull());
    push(queue, record());
    EXPECT_TRUE(queue.isNearlyFull());
}

TEST_F(StoreQueueTest, MoreBytesThanItHoldsAreRefused) {
    StoreQueue queue({.records = 100, .bytes = 10'000, .group = 100});
    StoreRecord large = record();
    large.bytes = Data(std::string(6'000, 'x'));
    EXPECT_EQ(push(queue, std::move(large)), std::nullopt);
    StoreRecord second = record();
    second.payload = {{"text", std::string_view(std::string(6'000, 'y'))}};
    EXPECT_EQ(queue.push(second), DropReason::QueueFull);
    EXPECT_EQ(push(queue, record()), std::nullopt);
}

TEST_F(StoreQueueTest, ARecordLargerThanAllItsRoomIsRefusedForItsSize) {
    StoreQueue queue({.records = 100, .bytes = 1'000, .group = 100});
    StoreRecord large = record();
    large.bytes = Data(std::string(1'000, 'x'));
    EXPECT_EQ(queue.push(large), DropReason::Limit);
    EXPECT_EQ(large.bytes.view().size(), 1'000U);
    EXPECT_EQ(queue.held(), 0U);
}

TEST_F(StoreQueueTest, TheWriterIsWokenForTheFirstRecordAndForAFullGroup) {
    EXPECT_FALSE(woken(queue_));
    push(queue_, record());
    EXPECT_TRUE(woken(queue_));
    push(queue_, record());
    EXPECT_FALSE(woken(queue_));
    push(queue_, record());
    EXPECT_TRUE(woken(queue_));
    push(queue_, record());
    EXPECT_FALSE(woken(queue_));
}

TEST_F(StoreQueueTest, TheWriterIsWokenForEachGreaterUrgency) {
    push(queue_, record());
    EXPECT_TRUE(woken(queue_));
    StoreRecord soon = record();
    soon.urgency = StoreUrgency::Soon;
    push(queue_, std::move(soon));
    EXPECT_TRUE(woken(queue_));
    EXPECT_EQ(queue_.state().urgency, StoreUrgency::Soon);
    std::vector<StoreRecord> taken;
    queue_.take(taken);
    EXPECT_EQ(queue_.state().urgency, StoreUrgency::Usual);
}

TEST_F(StoreQueueTest, TheWriterIsWokenForTheFirstChangeOfTheLedgerOnly) {
    queue_.noteLedgerChange();
    EXPECT_TRUE(woken(queue_));
    queue_.noteLedgerChange();
    EXPECT_FALSE(woken(queue_));
    EXPECT_TRUE(queue_.state().ledgerChanged);
    queue_.clearLedgerChange();
    EXPECT_FALSE(queue_.state().ledgerChanged);
    queue_.noteLedgerChange();
    EXPECT_TRUE(woken(queue_));
}

TEST_F(StoreQueueTest, AClosedQueueRefuses) {
    push(queue_, record());
    queue_.close();
    EXPECT_EQ(push(queue_, record()), DropReason::Restart);
    EXPECT_TRUE(queue_.state().closed);
    EXPECT_EQ(queue_.state().waiting, 1U);
}

TEST_F(StoreQueueTest, AFlushThatWasAnsweredIsNotWaitedFor) {
    const std::uint64_t flush = queue_.requestFlush();
    EXPECT_TRUE(woken(queue_));
    EXPECT_EQ(queue_.state().flush, flush);
    queue_.flushed(flush);
    queue_.waitFlushed(flush);
}

TEST_F(StoreQueueTest, ABacklogComesOutInPiecesInTheOrderPushed) {
    StoreQueue queue({.records = 20'000, .bytes = 100 * 1024 * 1024, .group = 64});
    std::int64_t pushed = 0;
    std::int64_t expected = 0;
    std::vector<StoreRecord> taken;
    const auto pushMore = [&](int count) {
        for (; count > 0; --count) {
            ASSERT_EQ(push(queue, record(++pushed)), std::nullopt);
        }
    };
    const auto takePiece = [&](std::size_t size) {
        taken.clear();
        queue.take(taken);
        ASSERT_EQ(taken.size(), size);
        for (const StoreRecord& each : taken) {
            ASSERT_EQ(each.session, ++expected);
        }
        EXPECT_EQ(queue.state().waiting, static_cast<std::size_t>(pushed - expected));
    };
    pushMore(10'000);
    takePiece(4'096);
    pushMore(400);
    takePiece(4'096);
    pushMore(4'000);
    takePiece(4'096);
    takePiece(2'112);
    takePiece(0);
    pushMore(1);
    takePiece(1);
}

TEST_F(StoreQueueTest, AnUrgencyStandsUntilAllIsTaken) {
    StoreQueue queue({.records = 20'000, .bytes = 100 * 1024 * 1024, .group = 64});
    StoreRecord urgent = record();
    urgent.urgency = StoreUrgency::Now;
    for (int count = 0; count < 8'000; ++count) {
        push(queue, record());
    }
    push(queue, std::move(urgent));
    std::vector<StoreRecord> taken;
    queue.take(taken);
    EXPECT_EQ(queue.state().urgency, StoreUrgency::Now);
    taken.clear();
    queue.take(taken);
    EXPECT_EQ(queue.state().urgency, StoreUrgency::Usual);
}

TEST_F(StoreQueueTest, AGroupOfTheSettingsIsOnePiece) {
    StoreQueue queue({.records = 20'000, .bytes = 100 * 1024 * 1024, .group = 6'000});
    for (int count = 0; count < 8'000; ++count) {
        push(queue, record());
    }
    std::vector<StoreRecord> taken;
    queue.take(taken);
    EXPECT_EQ(taken.size(), 6'000U);
}

} // namespace

} // namespace vela::platform
