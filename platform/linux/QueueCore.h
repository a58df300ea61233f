// The part of a work queue that the pool's threads know. It is shared: a queue may be destroyed while a thread has it
// in hand. Thread-safe. Locks are taken in this order: the pool's, then the queue's own.
#pragma once

#include "platform/WorkQueue.h"
#include "platform/linux/ThreadAttributes.h"
#include "platform/linux/WorkerPool.h"

#include <map>
#include <memory>
#include <string>
#include <string_view>

namespace vela::platform {

class QueueCore : public TimerClient, public std::enable_shared_from_this<QueueCore> {
public:
    QueueCore(WorkerPool& pool, std::string_view name, QualityOfService quality);
    virtual ~QueueCore() = default;
    QueueCore(const QueueCore&) = delete;
    QueueCore& operator=(const QueueCore&) = delete;

    void post(WorkItem item);
    void postAfter(Nanoseconds delay, WorkItem item);
    bool isCurrent() const { return pool_.isRunning(*this); }

    WorkerPool& pool() const { return pool_; }
    const std::string& name() const { return name_; }
    const ThreadName& threadName() const { return threadName_; }
    QualityOfService quality() const { return quality_; }

    /// Runs a bounded number of items on the calling pool thread, without a lock. Answers whether the queue is to be
    /// made ready again, behind the others.
    virtual bool runTurn() = 0;

protected:
    using DelayedItems = std::map<TimerKey, WorkItem>;

    enum class Accepted { Dropped, Waits, MakeReady };

    /// Appends `item`. Dropped leaves it with the caller, who destroys it without a lock.
    virtual Accepted accept(WorkItem& item) = 0;

    /// Takes the delayed items back from the pool's timers. None can be added once the queue accepts no more.
    DelayedItems takeDelayed(PoolLock& lock);

private:
    virtual bool isClosed() const = 0;
    void timerFired(PoolLock& lock, TimerKey key) final;

    WorkerPool& pool_; // outlives the queue
    const std::string name_;
    const ThreadName threadName_;
    const QualityOfService quality_;

    DelayedItems delayed_; // guarded by the pool's lock
};

} // namespace vela::platform
