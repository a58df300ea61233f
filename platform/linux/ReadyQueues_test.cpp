#include "platform/linux/ReadyQueues.h"

#include <gtest/gtest.h>
#include <memory>

namespace vela::platform {

namespace {

class ReadyQueuesTest : public ::testing::Test {
protected:
    void push(QualityOfService quality, int number) { ready_.push(quality, std::make_shared<int>(number)); }
    int take() { return *ready_.take(); }

    ReadyQueues<int> ready_;
};

TEST_F(ReadyQueuesTest, MoreUrgentQueuesComeFirst) {
    push(QualityOfService::Background, 4);
    push(QualityOfService::Utility, 3);
    push(QualityOfService::UserInteractive, 1);
    push(QualityOfService::Default, 2);
    EXPECT_EQ(ready_.mask(), 0b1111U);
    EXPECT_EQ(take(), 1);
    EXPECT_EQ(take(), 2);
    EXPECT_EQ(take(), 3);
    EXPECT_EQ(take(), 4);
    EXPECT_TRUE(ready_.empty());
}

TEST_F(ReadyQueuesTest, EquallyUrgentQueuesComeInTheOrderInWhichTheyBecameReady) {
    push(QualityOfService::Utility, 1);
    push(QualityOfService::Utility, 2);
    EXPECT_EQ(take(), 1);
    push(QualityOfService::Utility, 3);
    EXPECT_EQ(take(), 2);
    EXPECT_EQ(take(), 3);
}

TEST_F(ReadyQueuesTest, ALessUrgentQueueIsPassedOverSixteenTimes) {
    push(QualityOfService::Background, 100);
    for (int passed = 0; passed < 16; ++passed) {
        push(QualityOfService::UserInteractive, passed);
        EXPECT_EQ(take(), passed);
    }
    push(QualityOfService::UserInteractive, 16);
    EXPECT_EQ(take(), 100);
    EXPECT_EQ(take(), 16);
}

TEST_F(ReadyQueuesTest, EveryUrgencyComesUpWhileMoreUrgentOnesNeverEnd) {
    push(QualityOfService::Default, 1);
    push(QualityOfService::Utility, 2);
    push(QualityOfService::Background, 3);
    int sum = 0;
    for (int round = 0; round < 20; ++round) {
        push(QualityOfService::UserInteractive, 0);
        sum += take();
    }
    EXPECT_EQ(sum, 6);
}

} // namespace

} // namespace vela::platform
