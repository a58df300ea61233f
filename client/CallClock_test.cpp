#include "client/CallClock.h"

#include <gtest/gtest.h>

namespace vela::client {

namespace {

using namespace std::chrono_literals;

std::string statWith(const std::string& name, const std::string& startTime) {
    return "12 (" + name + ") S 1 2 3 4 5 6 7 8 9 10 11 12 13 14 15 16 17 18 " + startTime + " 20 21\n";
}

TEST(CallClockTest, TheStartOfAProcessIsIn22ndPlace) {
    EXPECT_EQ(startOfProcess(statWith("name", "250"), 100), 2500ms);
    EXPECT_EQ(startOfProcess(statWith("name", "0"), 100), 0ms);
}

TEST(CallClockTest, TheNameMayHoldAnything) { EXPECT_EQ(startOfProcess(statWith("a) S 9 (b", "250"), 100), 2500ms); }

TEST(CallClockTest, OtherTextsAreRefused) {
    EXPECT_EQ(startOfProcess("", 100), std::nullopt);
    EXPECT_EQ(startOfProcess("12 (x) S 1 2 3", 100), std::nullopt);
    EXPECT_EQ(startOfProcess(statWith("x", "-5"), 100), std::nullopt);
    EXPECT_EQ(startOfProcess(statWith("x", "x"), 100), std::nullopt);
    EXPECT_EQ(startOfProcess(statWith("x", "5"), 0), std::nullopt);
}

TEST(CallClockTest, TheSystemsUptimeIsRoundedToTheNearestSecond) {
    EXPECT_EQ(stampsAt(0ns, 10499ms, 0ns).systemUptimeSeconds, 10);
    EXPECT_EQ(stampsAt(0ns, 10500ms, 0ns).systemUptimeSeconds, 11);
}

TEST(CallClockTest, TheOtherStampsAreInTheirUnits) {
    const Stamps stamps = stampsAt(1500ms, 10s, 4s);
    EXPECT_EQ(stamps.epochSeconds, 1.5);
    EXPECT_EQ(stamps.processUptimeMilliseconds, 6000);
}

TEST(CallClockTest, ThisProcessStartedNotLongAgo) {
    const CallClock clock;
    const Stamps first = clock.now();
    const Stamps second = clock.now();
    EXPECT_GE(first.processUptimeMilliseconds, 0);
    EXPECT_LT(first.processUptimeMilliseconds, 3'600'000);
    EXPECT_GE(second.processUptimeMilliseconds, first.processUptimeMilliseconds);
    EXPECT_GT(first.epochSeconds, 1.6e9);
    EXPECT_GT(first.systemUptimeSeconds, 0);
}

} // namespace

} // namespace vela::client
