// How many events all traces of a service may keep together. Thread-safe.
#pragma once

#include <algorithm>
#include <atomic>
#include <cstddef>

namespace vela {

class TracePointBudget {
public:
    /// Of 72 bytes: 604 MB.
    static constexpr std::size_t kMostPoints = std::size_t{8} << 20U;

    explicit TracePointBudget(std::size_t points = kMostPoints) : left_(points) {}

    /// As many of `wanted` as there are left.
    std::size_t take(std::size_t wanted) {
        std::size_t left = left_.load(std::memory_order_relaxed);
        std::size_t taken = std::min(wanted, left);
        while (taken != 0 && !left_.compare_exchange_weak(left, left - taken, std::memory_order_relaxed)) {
            taken = std::min(wanted, left);
        }
        return taken;
    }
    void giveBack(std::size_t points) { left_.fetch_add(points, std::memory_order_relaxed); }

private:
    std::atomic<std::size_t> left_;
};

} // namespace vela
