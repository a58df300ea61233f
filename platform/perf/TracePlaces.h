// How many performance traces of a probe may run at the same time: each is a process, a thread and a file. Thread-safe.
#pragma once

#include <atomic>
#include <cstddef>

namespace vela::platform::perf {

class TracePlaces {
public:
    explicit TracePlaces(std::size_t limit) : limit_(limit) {}

    /// False when all are taken.
    bool take() {
        std::size_t taken = taken_.load();
        while (taken < limit_) {
            if (taken_.compare_exchange_weak(taken, taken + 1)) {
                return true;
            }
        }
        return false;
    }
    void giveBack() { --taken_; }

    std::size_t limit() const { return limit_; }

private:
    const std::size_t limit_;
    std::atomic<std::size_t> taken_ = 0;
};

} // namespace vela::platform::perf
