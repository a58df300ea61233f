// The concurrent background queue: each of its items may run on another pool thread. Thread-safe. Closed before the
// pool stops.
#pragma once

#include "platform/Mutex.h"
#include "platform/linux/ItemFifo.h"
#include "platform/linux/QueueCore.h"

#include <memory>

namespace vela::platform {

class BackgroundQueueCore final : public QueueCore {
public:
    using QueueCore::QueueCore;

    /// Destroys what waits, in the calling thread; later items are destroyed when they are posted. Waits for nothing.
    void close();

    /// Runs one item. When more wait the queue is made ready before it, so that another thread can run the next one
    /// meanwhile.
    bool runTurn() override;

private:
    Accepted accept(WorkItem& item) override;
    bool isClosed() const override;

    mutable Mutex mutex_;
    ItemFifo pending_ VELA_GUARDED_BY(mutex_);
    bool ready_ VELA_GUARDED_BY(mutex_) = false; // in the pool's list of ready queues
    bool closed_ VELA_GUARDED_BY(mutex_) = false;
};

class BackgroundQueue final : public WorkQueue {
public:
    explicit BackgroundQueue(WorkerPool& pool);
    ~BackgroundQueue() override { core_->close(); }

    void post(WorkItem item) override { core_->post(std::move(item)); }
    void postAfter(Nanoseconds delay, WorkItem item) override { core_->postAfter(delay, std::move(item)); }
    bool isCurrent() const override { return core_->isCurrent(); }
    std::string_view name() const override { return core_->name(); }

    BackgroundQueueCore& core() const { return *core_; }

private:
    const std::shared_ptr<BackgroundQueueCore> core_;
};

} // namespace vela::platform
