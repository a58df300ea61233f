// The time of a call. Reads clocks that need no system call. Immutable, so thread-safe.
#pragma once

#include "client/ValueEncoder.h"

#include <chrono>
#include <optional>
#include <string_view>

namespace vela::client {

/// Since the system was started, time asleep included.
using SinceBoot = std::chrono::nanoseconds;

/// When the process was started, out of the text of its /proc stat file; none when the text has another form.
/// `ticksPerSecond` is the unit of that file.
std::optional<SinceBoot> startOfProcess(std::string_view stat, long ticksPerSecond);

/// Stamps of a moment.
Stamps stampsAt(std::chrono::nanoseconds sinceEpoch, SinceBoot sinceBoot, SinceBoot processStart);

class CallClock {
public:
    /// Looks up when this process was started. Where the system does not tell, it counts from now.
    CallClock();

    Stamps now() const;

private:
    SinceBoot processStart_;
};

} // namespace vela::client
