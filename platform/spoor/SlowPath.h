// Marks what an emitter does under a lock or with the allocator, so that a handler of a signal that interrupts it on
// its thread finds out, and neither waits for its own thread nor allocates. Marks of one thread may lie within each
// other.
#pragma once

#include <atomic>

namespace vela::platform::spoor {

class SlowPath {
public:
    SlowPath() : before_(isUnderWay_) { begin(); }
    ~SlowPath() { end(before_); }
    SlowPath(const SlowPath&) = delete;
    SlowPath& operator=(const SlowPath&) = delete;

    /// For the calling thread.
    static bool isUnderWay() { return isUnderWay_; }

    // For what begins and ends in different calls.
    static void begin() {
        isUnderWay_ = true;
        std::atomic_signal_fence(std::memory_order_seq_cst);
    }
    static void end(bool before = false) {
        std::atomic_signal_fence(std::memory_order_seq_cst);
        isUnderWay_ = before;
    }

private:
    // Any other model may allocate at a thread's first access.
    // NOLINTNEXTLINE(readability-identifier-naming): a member
    [[gnu::tls_model("initial-exec")]] inline static constinit thread_local volatile bool isUnderWay_ = false;

    const bool before_;
};

} // namespace vela::platform::spoor
