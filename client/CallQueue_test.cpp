#include "client/CallQueue.h"

#include <atomic>
#include <cstring>
#include <gtest/gtest.h>
#include <set>
#include <thread>
#include <vector>

namespace vela::client {

namespace {

constexpr std::size_t kBytes = CallQueue::kLeastBytes;

/// Reserves, numbers and commits a record; false when there is no room.
bool put(CallQueue& queue, std::int64_t number, std::size_t bodyBytes = 0, std::size_t spare = 0) {
    CallRecord* const record = queue.reserve(bodyBytes, spare);
    if (record == nullptr) {
        return false;
    }
    record->reporterID = number;
    std::memset(record->body(), static_cast<int>(number & 0x7F) + 1, bodyBytes);
    CallQueue::commit(record);
    return true;
}

/// The next record's number, checked against its body and released; -1 for none.
std::int64_t take(CallQueue& queue) {
    const CallQueue::Read read = queue.next();
    if (read.record == nullptr) {
        return -1;
    }
    const std::int64_t number = read.record->reporterID;
    for (std::size_t index = 0; index < read.record->bodyBytes; ++index) {
        EXPECT_EQ(std::to_integer<int>(read.record->body()[index]), static_cast<int>(number & 0x7F) + 1);
    }
    queue.release(read.end);
    return number;
}

TEST(CallQueueTest, ANewQueueIsEmpty) {
    CallQueue queue(kBytes);
    EXPECT_TRUE(queue.empty());
    EXPECT_FALSE(queue.hasCommitted());
    EXPECT_EQ(queue.next().record, nullptr);
    EXPECT_EQ(queue.used(), 0U);
    EXPECT_EQ(queue.highestUsed(), 0U);
    EXPECT_EQ(queue.capacity(), 65536U);
    EXPECT_EQ(queue.mostBodyBytes(), 16384U);
}

TEST(CallQueueTest, RecordsComeInTheOrderReserved) {
    CallQueue queue(kBytes);
    put(queue, 1, 10);
    put(queue, 2, 0);
    put(queue, 3, 100);
    EXPECT_EQ(take(queue), 1);
    EXPECT_EQ(take(queue), 2);
    EXPECT_EQ(take(queue), 3);
    EXPECT_EQ(take(queue), -1);
    EXPECT_TRUE(queue.empty());
}

TEST(CallQueueTest, FieldsOfANewRecordAreAtTheirDefaults) {
    CallQueue queue(kBytes);
    for (int round = 0; round < 3000; ++round) {
        CallRecord* const record = queue.reserve(40, 0);
        ASSERT_NE(record, nullptr);
        ASSERT_EQ(record->operation, 0);
        ASSERT_EQ(record->serviceType, 0);
        ASSERT_EQ(record->reporterID, 0);
        ASSERT_EQ(record->ticket, 0U);
        ASSERT_EQ(record->bodyBytes, 40U);
        ASSERT_EQ(reinterpret_cast<std::uintptr_t>(record->body()) % 8, 0U);
        std::memset(static_cast<void*>(&record->operation), 0xFF, sizeof(CallRecord) - 8 + 40);
        CallQueue::commit(record);
        const CallQueue::Read read = queue.next();
        ASSERT_EQ(read.record, record);
        queue.release(read.end);
    }
}

TEST(CallQueueTest, WhatIsNotCommittedHidesWhatIsBehindIt) {
    CallQueue queue(kBytes);
    CallRecord* const first = queue.reserve(0, 0);
    put(queue, 2);
    EXPECT_FALSE(queue.hasCommitted());
    EXPECT_EQ(queue.next().record, nullptr);
    EXPECT_FALSE(queue.empty());
    first->reporterID = 1;
    CallQueue::commit(first);
    EXPECT_TRUE(queue.hasCommitted());
    EXPECT_EQ(take(queue), 1);
    EXPECT_EQ(take(queue), 2);
}

TEST(CallQueueTest, FullMeansFullToTheLastByte) {
    CallQueue queue(kBytes);
    for (int index = 0; index < 2048; ++index) { // 32 bytes each
        ASSERT_TRUE(put(queue, index));
    }
    EXPECT_EQ(queue.used(), 65536U);
    EXPECT_FALSE(put(queue, 9999));
    for (int index = 0; index < 2048; ++index) {
        ASSERT_EQ(take(queue), index);
    }
    EXPECT_EQ(take(queue), -1);
    EXPECT_EQ(queue.highestUsed(), 65536U);
}

TEST(CallQueueTest, AFullQueueThatWasReadButNotReleasedShowsNothingMore) {
    CallQueue queue(kBytes);
    for (int index = 0; index < 2048; ++index) {
        put(queue, index);
    }
    for (int index = 0; index < 2048; ++index) {
        ASSERT_NE(queue.next().record, nullptr);
    }
    EXPECT_FALSE(queue.hasCommitted());
    EXPECT_EQ(queue.next().record, nullptr);
    EXPECT_FALSE(put(queue, 1));
}

TEST(CallQueueTest, SpareBytesStayFree) {
    CallQueue queue(kBytes);
    int messages = 0;
    while (put(queue, messages, 0, 4096)) {
        ++messages;
    }
    EXPECT_EQ(messages, (65536 - 4096) / 32);
    for (int index = 0; index < 4096 / 32; ++index) {
        EXPECT_TRUE(put(queue, index));
    }
    EXPECT_FALSE(put(queue, 0));
}

TEST(CallQueueTest, ARecordOfExactlyTheRestNeedsNoPad) {
    CallQueue queue(kBytes);
    for (int index = 0; index < 3; ++index) {
        put(queue, index, 16384 - 32);
    }
    ASSERT_TRUE(put(queue, 3, 16384 - 32));
    EXPECT_EQ(queue.used(), 65536U);
    for (int index = 0; index < 4; ++index) {
        EXPECT_EQ(take(queue), index);
    }
    ASSERT_TRUE(put(queue, 4, 8));
    EXPECT_EQ(queue.used(), 40U);
    EXPECT_EQ(take(queue), 4);
}

TEST(CallQueueTest, ARecordThatDoesNotFitBeforeTheEndStandsAtTheBeginning) {
    CallQueue queue(kBytes);
    for (int index = 0; index < 4; ++index) {
        put(queue, index, 16384 - 32 - 8); // leaves 32 bytes at the end
    }
    EXPECT_FALSE(put(queue, 4, 8));
    EXPECT_EQ(take(queue), 0);
    ASSERT_TRUE(put(queue, 4, 8));
    EXPECT_EQ(queue.used(), 3U * 16376 + 32 + 40);
    for (int index = 1; index < 5; ++index) {
        EXPECT_EQ(take(queue), index);
    }
    EXPECT_EQ(queue.used(), 0U);
}

TEST(CallQueueTest, APadMayBeSmallerThanAHeader) {
    CallQueue queue(kBytes);
    for (int index = 0; index < 3; ++index) {
        put(queue, index, 16384 - 32);
    }
    put(queue, 3, 16384 - 32 - 8); // leaves 8 bytes
    EXPECT_EQ(take(queue), 0);
    ASSERT_TRUE(put(queue, 4));
    for (int index = 1; index < 5; ++index) {
        EXPECT_EQ(take(queue), index);
    }
    EXPECT_EQ(take(queue), -1);
}

TEST(CallQueueTest, TheLargestBodyFitsWhereverTheQueueStands) {
    CallQueue queue(kBytes);
    std::int64_t number = 0;
    for (std::size_t step = 0; step < 200; ++step) {
        ASSERT_TRUE(put(queue, ++number, step * 8));
        ASSERT_EQ(take(queue), number);
        ASSERT_TRUE(put(queue, ++number, queue.mostBodyBytes()));
        ASSERT_EQ(take(queue), number);
    }
}

TEST(CallQueueTest, WhatWasReadCanBeReadAgainUntilItIsReleased) {
    CallQueue queue(kBytes);
    for (int index = 0; index < 4; ++index) {
        put(queue, index);
    }
    const CallQueue::Read first = queue.next();
    queue.next();
    queue.next();
    queue.release(first.end);
    queue.rewind();
    for (int index = 1; index < 4; ++index) {
        EXPECT_EQ(take(queue), index);
    }
}

TEST(CallQueueTest, HalfFullIsMoreThanHalf) {
    CallQueue queue(kBytes);
    for (int index = 0; index < 1024; ++index) {
        put(queue, index);
    }
    EXPECT_FALSE(queue.isHalfFull());
    put(queue, 0);
    EXPECT_TRUE(queue.isHalfFull());
}

// Producers number their records; the consumer checks that each producer's come whole, in order and without a gap.
TEST(CallQueueTest, ManyProducersLoseAndMixUpNothing) {
    constexpr int kProducers = 4;
    constexpr std::int64_t kRecords = 20000;
    CallQueue queue(kBytes);
    std::vector<std::thread> producers;
    producers.reserve(kProducers);
    for (int producer = 0; producer < kProducers; ++producer) {
        producers.emplace_back([&queue, producer] {
            for (std::int64_t number = 0; number < kRecords;) {
                const auto bodyBytes = static_cast<std::size_t>((number * 37 + producer * 11) % 900);
                if (put(queue, number * kProducers + producer, bodyBytes)) {
                    ++number;
                } else {
                    std::this_thread::yield();
                }
            }
        });
    }
    std::vector<std::int64_t> next(kProducers, 0);
    for (std::int64_t taken = 0; taken < kProducers * kRecords;) {
        const std::int64_t number = take(queue);
        if (number < 0) {
            std::this_thread::yield();
            continue;
        }
        const auto producer = static_cast<std::size_t>(number % kProducers);
        ASSERT_EQ(number / kProducers, next[producer]);
        ++next[producer];
        ++taken;
    }
    for (std::thread& producer : producers) {
        producer.join();
    }
    EXPECT_TRUE(queue.empty());
    EXPECT_LE(queue.highestUsed(), kBytes);
}

} // namespace

} // namespace vela::client
