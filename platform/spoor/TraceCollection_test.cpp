#include "platform/spoor/TraceCollection.h"
#include "testing/ManualClock.h"
#include "testing/ManualWorkQueues.h"

#include <cstddef>
#include <cstdint>
#include <gtest/gtest.h>
#include <memory>
#include <vector>

namespace vela::platform::spoor {
namespace {

class TraceCollectionTest : public ::testing::Test {
protected:
    /// One whose queue is held up until the test lets it run.
    std::shared_ptr<TraceCollection> collect(std::size_t& seen, SerialQueue& queue) {
        auto collection = std::make_shared<TraceCollection>(backlog_);
        collection->addRange({1, 1, [&seen](const SpoorEvent&) { ++seen; }});
        collection->setQueue(queue);
        return collection;
    }
    static void deliver(TraceCollection& collection, std::size_t count) {
        TraceRecord record{};
        record.code = 1;
        collection.deliver(std::vector<TraceRecord>(count, record), 0, ~std::uint64_t{0});
    }

    testing::ManualClock clock_;
    testing::ManualWorkQueues queues_{clock_};
    const std::shared_ptr<TraceBacklog> backlog_ = std::make_shared<TraceBacklog>(10);
    const std::unique_ptr<SerialQueue> first_ = queues_.makeSerialQueue("first", QualityOfService::Default);
    std::unique_ptr<SerialQueue> second_ = queues_.makeSerialQueue("second", QualityOfService::Default);
    std::size_t seenByFirst_ = 0;
    std::size_t seenBySecond_ = 0;
};

TEST_F(TraceCollectionTest, WhatWaitsForAllSessionsHasOneBound) {
    const auto one = collect(seenByFirst_, *first_);
    const auto other = collect(seenBySecond_, *second_);
    deliver(*one, 7);
    deliver(*other, 5);
    deliver(*one, 2);
    EXPECT_EQ(one->lost(), 2U);
    EXPECT_EQ(other->lost(), 2U);
    queues_.runUntilIdle();
    EXPECT_EQ(seenByFirst_, 7U);
    EXPECT_EQ(seenBySecond_, 3U);
    deliver(*other, 10);
    queues_.runUntilIdle();
    EXPECT_EQ(seenBySecond_, 13U);
    EXPECT_EQ(other->lost(), 2U);
}

TEST_F(TraceCollectionTest, EventsOfACancelledSessionWaitNoMore) {
    const auto one = collect(seenByFirst_, *first_);
    const auto other = collect(seenBySecond_, *second_);
    deliver(*one, 10);
    one->cancel();
    queues_.runUntilIdle();
    EXPECT_EQ(seenByFirst_, 0U);
    deliver(*other, 10);
    EXPECT_EQ(other->lost(), 0U);
}

TEST_F(TraceCollectionTest, EventsOfAQueueThatIsDestroyedWaitNoMore) {
    const auto one = collect(seenByFirst_, *first_);
    const auto other = collect(seenBySecond_, *second_);
    second_->suspend();
    deliver(*other, 10);
    deliver(*one, 1);
    EXPECT_EQ(one->lost(), 1U);
    second_.reset();
    deliver(*one, 10);
    EXPECT_EQ(one->lost(), 1U);
}

TEST_F(TraceCollectionTest, TwoMillionEventsWaitForAllSessionsAndHalfOfThemForOne) {
    EXPECT_EQ(TraceBacklog().take(10'000'000), 2'097'152U);
    EXPECT_EQ(TraceCollection::kMostWaiting, 1'048'576U);
}

} // namespace
} // namespace vela::platform::spoor
