// Wakes the client's thread, by a system call only when that thread has announced that it rests. Thread-safe; the
// functions below "The client's thread" belong to it.
//
// The thread announces its rest and then looks at the queue once more; a producer commits and then looks at the
// announcement. All four accesses are sequentially consistent, so at least one of the two sees the other.
#pragma once

#include "platform/linux/FileDescriptor.h"

#include <atomic>
#include <cstdint>

namespace vela::client {

/// How deeply the thread rests, which is what may wake it.
enum class Rest : std::uint8_t {
    Awake,   ///< it works, or waits for something that no call can bring about
    Waiting, ///< for its next attempt to connect: calls that somebody waits for
    Napping, ///< for a few milliseconds, while calls come in: these, and a queue that is half full
    Asleep,  ///< everything
};

class Doorbell {
public:
    /// The descriptor may be missing: `works` tells.
    Doorbell();
    bool works() const { return static_cast<bool>(descriptor_); }

    /// After a commit. At most one system call, and none while the thread is awake.
    template <class IsHalfFull>
    void afterCommit(bool somebodyWaits, const IsHalfFull& isHalfFull) {
        const Rest rest = rest_.load(std::memory_order_seq_cst);
        if (rest == Rest::Awake) [[likely]] {
            return;
        }
        if (rest == Rest::Asleep || somebodyWaits || (rest == Rest::Napping && isHalfFull())) {
            ring();
        }
    }
    /// Wakes the thread whatever it does; a second ring before it woke costs no system call.
    void ring();
    /// Wakes it though it announced nothing.
    void ringAlways() const;

    // The client's thread.
    void announce(Rest rest) { rest_.store(rest, std::memory_order_seq_cst); }
    /// To be waited for: readable once rung.
    int descriptor() const { return descriptor_.get(); }
    void silence() const;

private:
    platform::FileDescriptor descriptor_;
    alignas(64) std::atomic<Rest> rest_ = Rest::Awake;
};

} // namespace vela::client
