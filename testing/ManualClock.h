// A clock that stands still until a test moves it. Not thread-safe.
#pragma once

#include "platform/Clock.h"

#include <cassert>

namespace vela::testing {

class ManualClock final : public platform::Clock {
public:
    /// 2023-11-14 22:13:20 UTC, an hour after the system started; local time is UTC.
    ManualClock() = default;

    /// Time passes: every time of the clock moves on.
    void advance(platform::Nanoseconds duration) {
        assert(duration >= platform::Nanoseconds::zero());
        now_ += duration;
        monotonic_ += duration;
        uptime_ += duration;
    }

    /// The device's clock is set: only the time of day jumps.
    void setNow(platform::WallTime time) { now_ = time; }

    void setLocalOffset(std::chrono::seconds offset) { localOffset_ = offset; }

    platform::WallTime now() const override { return now_; }
    platform::MonotonicTime monotonicNow() const override { return monotonic_; }
    platform::Nanoseconds systemUptime() const override { return uptime_; }
    std::chrono::seconds localOffset(platform::WallTime) const override { return localOffset_; }

private:
    platform::WallTime now_{std::chrono::seconds(1'700'000'000)};
    platform::MonotonicTime monotonic_{std::chrono::seconds(3'600)};
    platform::Nanoseconds uptime_{std::chrono::seconds(3'600)};
    std::chrono::seconds localOffset_{0};
};

} // namespace vela::testing
