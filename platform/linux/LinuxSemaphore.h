// A counting semaphore for threads and for suspended serial queues. Thread-safe; its state is guarded by the pool's
// lock.
#pragma once

#include "platform/WorkQueue.h"
#include "platform/linux/WorkerPool.h"

#include <cstdint>
#include <list>
#include <optional>

namespace vela::platform {

class LinuxSemaphore final : public Semaphore {
public:
    LinuxSemaphore(WorkerPool& pool, std::uint32_t initial) : pool_(pool), count_(initial) {}
    /// Threads that wait answer false; queues that wait are resumed.
    ~LinuxSemaphore() override;

    void signal() override;
    bool wait(std::optional<Nanoseconds> timeout) override;
    void waitSuspending(SerialQueue& queue, Nanoseconds timeout, UniqueFunction<void(bool taken)> then) override;

private:
    class Waiter;
    class BlockedThread;
    class SuspendedQueue;
    using Waiters = std::list<Waiter*>;

    WorkerPool& pool_; // outlives the semaphore
    std::uint32_t count_;
    Waiters waiters_; // longest wait first; not empty only while count_ is 0
};

} // namespace vela::platform
