// A mutex with a condition variable on the monotonic clock. Thread-safe. Not to be destroyed while a thread waits.
#pragma once

#include "platform/WorkQueue.h"
#include "platform/linux/WorkerPool.h"

#include <condition_variable>
#include <mutex>

namespace vela::platform {

class LinuxCondition final : public Condition {
public:
    explicit LinuxCondition(WorkerPool& pool) : pool_(pool) {}

    void lock() override { mutex_.lock(); }
    void unlock() override { mutex_.unlock(); }
    MonotonicTime monotonicNow() const override { return std::chrono::steady_clock::now(); }
    /// On a pool thread the pool makes room meanwhile.
    bool waitUntil(MonotonicTime deadline) override;
    void signal() override { condition_.notify_one(); }

private:
    WorkerPool& pool_; // outlives the condition
    std::mutex mutex_;
    std::condition_variable condition_;
};

} // namespace vela::platform
