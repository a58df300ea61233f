#include "platform/linux/Sleeper.h"

#include <algorithm>
#include <cerrno>
#include <chrono>
#include <ctime>
#include <linux/futex.h>
#include <sys/syscall.h>
#include <unistd.h>

namespace vela::platform {

namespace {

static_assert(sizeof(std::atomic<std::uint32_t>) == sizeof(std::uint32_t), "what the kernel looks at is the number");

/// False when `deadline` has passed; may end without cause.
bool waitWhile(std::atomic<std::uint32_t>& word, std::uint32_t value, MonotonicTime deadline) {
    const auto since = std::max(deadline, MonotonicTime()).time_since_epoch();
    const auto seconds = std::chrono::floor<std::chrono::seconds>(since);
    const timespec time{seconds.count(), (since - seconds).count()};
    const long result = syscall(SYS_futex, &word, FUTEX_WAIT_BITSET | FUTEX_PRIVATE_FLAG, value,
                                deadline == MonotonicTime::max() ? nullptr : &time, nullptr, FUTEX_BITSET_MATCH_ANY);
    return result == 0 || errno != ETIMEDOUT;
}

} // namespace

bool Sleeper::sleepUntil(MonotonicTime deadline) {
    std::uint32_t before = kAwake;
    if (state_.compare_exchange_strong(before, kAsleep, std::memory_order_acquire)) {
        while (state_.load(std::memory_order_acquire) == kAsleep && waitWhile(state_, kAsleep, deadline)) {
        }
    }
    return state_.exchange(kAwake, std::memory_order_acquire) == kWoken;
}

void Sleeper::wake() {
    if (state_.exchange(kWoken, std::memory_order_release) == kAsleep) {
        syscall(SYS_futex, &state_, FUTEX_WAKE | FUTEX_PRIVATE_FLAG, 1, nullptr, nullptr, 0);
    }
}

} // namespace vela::platform
