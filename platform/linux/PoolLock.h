// The lock of a worker pool, held over a scope: it guards everything that waits or is waited for. Threads that are to
// be woken are woken when it is let go. Confined to the thread that made it.
#pragma once

#include "platform/Clock.h"

#include <array>
#include <condition_variable>
#include <cstddef>
#include <mutex>
#include <optional>

namespace vela::platform {

class Sleeper;
class WorkerPool;
struct Worker;

class PoolLock {
public:
    explicit PoolLock(WorkerPool& pool);
    ~PoolLock() { unlock(); }
    PoolLock(const PoolLock&) = delete;
    PoolLock& operator=(const PoolLock&) = delete;

    void unlock();
    void relock() { lock_.lock(); }

    /// Waits, with the lock let go meanwhile; may end without cause. False when `deadline` has passed.
    bool wait(std::condition_variable& condition, const std::optional<MonotonicTime>& deadline);

    /// As `wait`, asleep.
    bool sleep(Sleeper& sleeper, const std::optional<MonotonicTime>& deadline);

    /// `worker` lives as long as its pool.
    void wakeOnUnlock(Worker& worker);

private:
    void wakeNow();

    std::unique_lock<std::mutex> lock_;
    std::array<Worker*, 4> wakes_{};
    std::size_t wakeCount_ = 0;
};

} // namespace vela::platform
