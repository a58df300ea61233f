// The times that the service reads. Thread-safe.
#pragma once

#include <chrono>

namespace vela::platform {

using Nanoseconds = std::chrono::nanoseconds;
using WallTime = std::chrono::time_point<std::chrono::system_clock, Nanoseconds>;
using MonotonicTime = std::chrono::time_point<std::chrono::steady_clock, Nanoseconds>;

class Clock {
public:
    virtual ~Clock() = default;

    /// The time of day. It jumps when the device's clock is set.
    virtual WallTime now() const = 0;

    /// A time that never goes back; for deadlines and stretches.
    virtual MonotonicTime monotonicNow() const = 0;

    /// Time since the system started, sleep included.
    virtual Nanoseconds systemUptime() const = 0;

    /// How far local time lies ahead of UTC at `time`; negative west of Greenwich.
    virtual std::chrono::seconds localOffset(WallTime time) const = 0;
};

} // namespace vela::platform
