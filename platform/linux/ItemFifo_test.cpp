#include "platform/linux/ItemFifo.h"

#include <gtest/gtest.h>
#include <memory>
#include <numeric>
#include <vector>

namespace vela::platform {

namespace {

class ItemFifoTest : public ::testing::Test {
protected:
    void push(ItemFifo& fifo, int count) {
        for (int i = 0; i < count; ++i) {
            fifo.push([this, number = next_++] { ran_.push_back(number); });
        }
    }
    void run(ItemFifo& fifo, int count) {
        for (int i = 0; i < count; ++i) {
            fifo.take()();
        }
    }
    std::vector<int> firstNumbers(int count) const {
        std::vector<int> numbers(static_cast<std::size_t>(count));
        std::iota(numbers.begin(), numbers.end(), 0);
        return numbers;
    }

    std::vector<int> ran_;

private:
    int next_ = 0;
};

TEST_F(ItemFifoTest, ItemsComeOutInTheOrderPutInForEveryCount) {
    ItemFifo fifo;
    int total = 0;
    for (int count = 0; count < 70; ++count) {
        push(fifo, count);
        EXPECT_EQ(fifo.size(), static_cast<std::size_t>(count));
        run(fifo, count);
        EXPECT_TRUE(fifo.empty());
        total += count;
    }
    EXPECT_EQ(ran_, firstNumbers(total));
}

TEST_F(ItemFifoTest, PuttingInAndTakingOutMayAlternate) {
    ItemFifo fifo;
    for (int round = 0; round < 100; ++round) {
        push(fifo, 3);
        run(fifo, 2);
    }
    run(fifo, 100);
    EXPECT_TRUE(fifo.empty());
    EXPECT_EQ(ran_, firstNumbers(300));
}

TEST_F(ItemFifoTest, SwappingExchangesTheItems) {
    ItemFifo one;
    ItemFifo two;
    push(one, 20);
    one.swap(two);
    EXPECT_TRUE(one.empty());
    push(one, 1);
    run(two, 20);
    run(one, 1);
    EXPECT_EQ(ran_, firstNumbers(21));
}

TEST_F(ItemFifoTest, ItemsLeftAreDestroyedInOrderWithoutBeingRun) {
    const auto owner = std::make_shared<int>(0);
    {
        ItemFifo fifo;
        for (int i = 0; i < 40; ++i) {
            fifo.push([owner] { ++*owner; });
        }
        EXPECT_EQ(owner.use_count(), 41);
        run(fifo, 1);
        EXPECT_EQ(owner.use_count(), 40);
    }
    EXPECT_EQ(owner.use_count(), 1);
    EXPECT_EQ(*owner, 1);
}

} // namespace

} // namespace vela::platform
