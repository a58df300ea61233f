#include "platform/linux/QueueCore.h"

#include <utility>

namespace vela::platform {

QueueCore::QueueCore(WorkerPool& pool, std::string_view name, QualityOfService quality)
    : pool_(pool),
      name_(name),
      threadName_(threadNameFor(name)),
      quality_(quality) {}

void QueueCore::post(WorkItem item) {
    if (accept(item) == Accepted::MakeReady) {
        PoolLock lock(pool_);
        pool_.makeReady(lock, shared_from_this());
    }
}

void QueueCore::postAfter(Nanoseconds delay, WorkItem item) {
    if (delay <= Nanoseconds::zero()) {
        post(std::move(item));
        return;
    }
    PoolLock lock(pool_);
    if (!isClosed()) {
        // The deadline is read under the lock, so that of two equal delays the one posted first ends first.
        const TimerKey key = pool_.addTimer(lock, deadlineAfter(delay), *this);
        delayed_.emplace(key, std::move(item));
    }
}

QueueCore::DelayedItems QueueCore::takeDelayed(PoolLock& lock) {
    for (const auto& [key, item] : delayed_) {
        pool_.removeTimer(lock, key);
    }
    return std::exchange(delayed_, {});
}

void QueueCore::timerFired(PoolLock& lock, TimerKey key) {
    auto delayed = delayed_.extract(key);
    if (accept(delayed.mapped()) == Accepted::MakeReady) {
        pool_.makeReady(lock, shared_from_this());
    }
}

} // namespace vela::platform
