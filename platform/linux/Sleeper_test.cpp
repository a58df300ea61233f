#include "platform/linux/Sleeper.h"

#include <atomic>
#include <chrono>
#include <gtest/gtest.h>
#include <thread>

namespace vela::platform {

namespace {

using namespace std::chrono_literals;

constexpr MonotonicTime kNever = MonotonicTime::max();

MonotonicTime now() { return std::chrono::steady_clock::now(); }

TEST(SleeperTest, WhoWasWokenBeforeDoesNotSleep) {
    Sleeper sleeper;
    sleeper.wake();
    EXPECT_TRUE(sleeper.sleepUntil(kNever));
}

TEST(SleeperTest, WakingTwiceEndsOneSleep) {
    Sleeper sleeper;
    sleeper.wake();
    sleeper.wake();
    EXPECT_TRUE(sleeper.sleepUntil(kNever));
    EXPECT_FALSE(sleeper.sleepUntil(now() + 1ms));
}

TEST(SleeperTest, ItSleepsUntilTheDeadline) {
    Sleeper sleeper;
    const MonotonicTime deadline = now() + 5ms;
    EXPECT_FALSE(sleeper.sleepUntil(deadline));
    EXPECT_GE(now(), deadline);
}

TEST(SleeperTest, ADeadlineThatHasPassedEndsItAtOnce) {
    Sleeper sleeper;
    EXPECT_FALSE(sleeper.sleepUntil(now() - 1h));
    EXPECT_FALSE(sleeper.sleepUntil(MonotonicTime::min()));
}

TEST(SleeperTest, WhoWasWokenIsAwakeEvenBehindTheDeadline) {
    Sleeper sleeper;
    sleeper.wake();
    EXPECT_TRUE(sleeper.sleepUntil(now() - 1h));
}

TEST(SleeperTest, AnotherThreadWakesIt) {
    Sleeper sleeper;
    std::atomic<bool> woken = false;
    std::thread owner([&] { woken = sleeper.sleepUntil(kNever); });
    sleeper.wake();
    owner.join();
    EXPECT_TRUE(woken);
}

TEST(SleeperTest, NoWakingIsLostBetweenTwoThatWakeEachOther) {
    constexpr int kTurns = 20'000;
    Sleeper ping;
    Sleeper pong;
    int shared = 0; // each turn of the one is seen by the other
    std::thread other([&] {
        for (int turn = 0; turn < kTurns; ++turn) {
            pong.sleepUntil(kNever);
            ++shared;
            ping.wake();
        }
    });
    for (int turn = 0; turn < kTurns; ++turn) {
        ++shared;
        pong.wake();
        ping.sleepUntil(kNever);
        ASSERT_EQ(shared, 2 * (turn + 1));
    }
    other.join();
}

} // namespace

} // namespace vela::platform
