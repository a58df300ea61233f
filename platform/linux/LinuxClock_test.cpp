#include "platform/linux/LinuxClock.h"

#include <chrono>
#include <cstdlib>
#include <gtest/gtest.h>
#include <optional>
#include <string>

namespace vela::platform {

namespace {

using namespace std::chrono_literals;

// NOLINTBEGIN(concurrency-mt-unsafe): no other thread reads the environment during these tests
/// The zone of the process over a scope.
class Zone {
public:
    explicit Zone(const char* zone) {
        if (const char* before = std::getenv("TZ")) {
            before_ = before;
        }
        set(zone);
    }
    ~Zone() {
        if (before_) {
            set(before_->c_str());
        } else {
            unsetenv("TZ");
        }
    }
    Zone(const Zone&) = delete;
    Zone& operator=(const Zone&) = delete;

    void set(const char* zone) { setenv("TZ", zone, 1); }

private:
    std::optional<std::string> before_;
};
// NOLINTEND(concurrency-mt-unsafe)

TEST(LinuxClockTest, NowIsTheTimeOfDay) {
    const auto before = std::chrono::system_clock::now();
    const WallTime now = LinuxClock().now();
    const auto after = std::chrono::system_clock::now();
    EXPECT_GE(now, before);
    EXPECT_LE(now, after);
}

TEST(LinuxClockTest, MonotonicTimeIsTheOneThatDeadlinesAreMeasuredIn) {
    const MonotonicTime before = std::chrono::steady_clock::now();
    const MonotonicTime now = LinuxClock().monotonicNow();
    const MonotonicTime after = std::chrono::steady_clock::now();
    EXPECT_GE(now, before);
    EXPECT_LE(now, after);
}

TEST(LinuxClockTest, UptimeCountsSleepToo) {
    const LinuxClock clock;
    const Nanoseconds monotonic = clock.monotonicNow().time_since_epoch();
    EXPECT_GE(clock.systemUptime(), monotonic);
}

TEST(LinuxClockTest, LocalTimeLiesAheadOfUtcInTheEastAndBehindInTheWest) {
    const LinuxClock clock;
    Zone zone("EAST-2");
    EXPECT_EQ(clock.localOffset(WallTime(1'700'000'000s)), 7'200s);
    zone.set("WEST+5:30");
    EXPECT_EQ(clock.localOffset(WallTime(1'700'000'000s)), -19'800s);
    zone.set("UTC0");
    EXPECT_EQ(clock.localOffset(WallTime(1'700'000'000s)), 0s);
}

TEST(LinuxClockTest, LocalTimeKnowsSummer) {
    const LinuxClock clock;
    const Zone zone("CET-1CEST,M3.5.0,M10.5.0/3");
    EXPECT_EQ(clock.localOffset(WallTime(1'705'320'000s)), 3'600s);              // 2024-01-15
    EXPECT_EQ(clock.localOffset(WallTime(1'721'044'800s)), 7'200s);              // 2024-07-15
    EXPECT_EQ(clock.localOffset(WallTime(1'711'846'799'999'999'999ns)), 3'600s); // the last nanosecond of winter
    EXPECT_EQ(clock.localOffset(WallTime(1'711'846'800s)), 7'200s);
}

TEST(LinuxClockTest, LocalTimeIsKnownBefore1970) {
    const LinuxClock clock;
    const Zone zone("EAST-2");
    EXPECT_EQ(clock.localOffset(WallTime(-1ns)), 7'200s);
}

} // namespace

} // namespace vela::platform
