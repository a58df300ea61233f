#include "client/Backoff.h"

#include <gtest/gtest.h>

namespace vela::client {

namespace {

using namespace std::chrono_literals;

const Moment kStart{1000s};

TEST(BackoffTest, TheFirstAttemptIsMadeAtOnce) { EXPECT_LE(Backoff().next(), kStart); }

TEST(BackoffTest, PausesDoubleFrom50MillisecondsTo5Seconds) {
    Backoff backoff;
    for (const auto pause : {50ms, 100ms, 200ms, 400ms, 800ms, 1600ms, 3200ms, 5000ms, 5000ms}) {
        backoff.attemptFailed(kStart);
        EXPECT_EQ(backoff.next() - kStart, pause);
    }
}

TEST(BackoffTest, ALostConnectionThatLastedIsRenewedAtOnce) {
    Backoff backoff;
    backoff.attemptFailed(kStart);
    backoff.attemptFailed(kStart);
    backoff.connected(kStart);
    backoff.connectionLost(kStart + 1s);
    EXPECT_EQ(backoff.next(), kStart + 1s);
    backoff.attemptFailed(kStart + 1s);
    EXPECT_EQ(backoff.next(), kStart + 1s + 50ms);
}

TEST(BackoffTest, AConnectionThatDidNotLastGoesOnWithThePauses) {
    Backoff backoff;
    backoff.connected(kStart);
    backoff.connectionLost(kStart + 999ms);
    EXPECT_EQ(backoff.next(), kStart + 999ms + 50ms);
    backoff.connected(kStart + 2s);
    backoff.connectionLost(kStart + 2s);
    EXPECT_EQ(backoff.next(), kStart + 2s + 100ms);
}

} // namespace

} // namespace vela::client
