#include "platform/linux/BackgroundQueue.h"

#include <utility>

namespace vela::platform {

void BackgroundQueueCore::close() {
    ItemFifo pending;
    DelayedItems delayed;
    PoolLock poolLock(pool());
    {
        const MutexLock lock(mutex_);
        closed_ = true;
        pending.swap(pending_);
    }
    delayed = takeDelayed(poolLock);
    poolLock.unlock();
    pending.clear();
}

bool BackgroundQueueCore::runTurn() {
    WorkItem item;
    bool more = false;
    {
        const MutexLock lock(mutex_);
        if (!pending_.empty()) {
            item = pending_.take();
        }
        more = !pending_.empty();
        ready_ = more;
    }
    if (more) {
        PoolLock lock(pool());
        pool().makeReady(lock, shared_from_this());
    }
    if (item) {
        item();
    }
    return false;
}

QueueCore::Accepted BackgroundQueueCore::accept(WorkItem& item) {
    const MutexLock lock(mutex_);
    if (closed_) {
        return Accepted::Dropped;
    }
    pending_.push(std::move(item));
    if (std::exchange(ready_, true)) {
        return Accepted::Waits;
    }
    return Accepted::MakeReady;
}

bool BackgroundQueueCore::isClosed() const {
    const MutexLock lock(mutex_);
    return closed_;
}

BackgroundQueue::BackgroundQueue(WorkerPool& pool)
    : core_(std::make_shared<BackgroundQueueCore>(pool, "com.orvex.vela.background", QualityOfService::Background)) {}

} // namespace vela::platform
