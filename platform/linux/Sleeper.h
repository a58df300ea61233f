// One thread's sleep, which any other may end. A futex of its own: who wakes from a condition variable takes the lock
// back as one that others wait for, and pays for a system call when it lets it go. Thread-safe, but for `sleepUntil`,
// which is the owner's.
#pragma once

#include "platform/Clock.h"

#include <atomic>
#include <cstdint>

namespace vela::platform {

class Sleeper {
public:
    /// Sleeps until it is woken (true) or until `deadline` (false), the end of time being never. At once when it was
    /// woken since the last sleep.
    bool sleepUntil(MonotonicTime deadline);

    /// Costs a system call only while the owner sleeps. The object must live on until this returns.
    void wake();

private:
    static constexpr std::uint32_t kAwake = 0;
    static constexpr std::uint32_t kWoken = 1; ///< and has not noticed yet
    static constexpr std::uint32_t kAsleep = 2;

    std::atomic<std::uint32_t> state_ = kAwake;
};

} // namespace vela::platform
