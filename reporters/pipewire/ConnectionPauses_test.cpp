#include "reporters/pipewire/ConnectionPauses.h"

#include <gtest/gtest.h>

namespace vela::reporter {
namespace {

using namespace std::chrono_literals;

TEST(ConnectionPausesTest, DoubleFrom50MillisecondsTo5Seconds) {
    ConnectionPauses pauses;
    for (const auto pause : {50ms, 100ms, 200ms, 400ms, 800ms, 1600ms, 3200ms, 5000ms, 5000ms}) {
        EXPECT_EQ(pauses.attemptFailed(false), pause);
    }
}

TEST(ConnectionPausesTest, WhereTheSocketIsWatchedNothingIsTriedAfterTheLongest) {
    ConnectionPauses pauses;
    for (const auto pause : {50ms, 100ms, 200ms, 400ms, 800ms, 1600ms, 3200ms}) {
        EXPECT_EQ(pauses.attemptFailed(true), pause);
    }
    EXPECT_EQ(pauses.attemptFailed(true), std::nullopt);
    EXPECT_EQ(pauses.attemptFailed(true), std::nullopt);
    pauses.reset();
    EXPECT_EQ(pauses.attemptFailed(true), 50ms);
}

TEST(ConnectionPausesTest, AConnectionThatLastedBeginsThemAnew) {
    ConnectionPauses pauses;
    pauses.attemptFailed(true);
    pauses.attemptFailed(true);
    pauses.connected(10s);
    EXPECT_EQ(pauses.connectionLost(11s), 50ms);
    EXPECT_EQ(pauses.attemptFailed(true), 100ms);
}

TEST(ConnectionPausesTest, AConnectionThatDidNotLastGoesOnWithThem) {
    ConnectionPauses pauses;
    pauses.connected(10s);
    EXPECT_EQ(pauses.connectionLost(10s + 999ms), 50ms);
    pauses.connected(12s);
    EXPECT_EQ(pauses.connectionLost(12s), 100ms);
    pauses.connected(13s);
    EXPECT_EQ(pauses.connectionLost(13s), 200ms);
}

TEST(ConnectionPausesTest, AServerThatEndsEveryConnectionIsCalledForEver) {
    ConnectionPauses pauses;
    for (const auto pause : {50ms, 100ms, 200ms, 400ms, 800ms, 1600ms, 3200ms, 5000ms, 5000ms, 5000ms}) {
        pauses.connected(10s);
        EXPECT_EQ(pauses.connectionLost(10s), pause);
    }
}

} // namespace
} // namespace vela::reporter
