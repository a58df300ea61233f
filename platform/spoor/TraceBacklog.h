// Events that wait on the queues of all sessions of a reader: a queue that is held up must not keep the memory that
// others need. Thread-safe.
#pragma once

#include <algorithm>
#include <atomic>
#include <cstdint>

namespace vela::platform::spoor {

class TraceBacklog {
public:
    /// Of 64 bytes: 128 MiB.
    static constexpr std::uint64_t kMostWaiting = std::uint64_t{2} << 20U;

    explicit TraceBacklog(std::uint64_t most = kMostWaiting) : most_(most) {}

    /// Takes room for as many of `wanted` as there is. One thread at a time.
    std::uint64_t take(std::uint64_t wanted) {
        const std::uint64_t taken = std::min(wanted, most_ - std::min<std::uint64_t>(most_, waiting_));
        waiting_ += taken;
        return taken;
    }
    void giveBack(std::uint64_t events) { waiting_ -= events; }

private:
    const std::uint64_t most_;
    std::atomic<std::uint64_t> waiting_ = 0;
};

} // namespace vela::platform::spoor
