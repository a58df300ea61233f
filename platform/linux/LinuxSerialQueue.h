// A serial queue on the pool. The handle closes the core when it is destroyed; the core lives on while a thread has it
// in hand. Thread-safe.
//
// Idle -> Ready (work has come and nothing suspends the queue) -> Running (a pool thread took it) -> Ready (its share
// of items has run and more wait) or Idle (no work, suspended or closed).
#pragma once

#include "platform/Mutex.h"
#include "platform/linux/ItemFifo.h"
#include "platform/linux/QueueCore.h"

#include <atomic>
#include <cstdint>
#include <memory>
#include <vector>

namespace vela::platform {

/// A wait for which a queue is suspended. The queue owns it until the wait is over.
class QueueWait {
public:
    virtual ~QueueWait() = default;

    /// The queue is being destroyed: leaves whatever would end the wait. With the pool's lock held.
    virtual void abandon(PoolLock& lock) = 0;
};

class SerialQueueCore final : public QueueCore {
public:
    using QueueCore::QueueCore;

    void suspend();
    void resumeWith(WorkItem first);

    /// No further item begins; everything that waits is destroyed, without a lock, in the calling thread. Returns when
    /// a running item has ended, unless the caller is that item.
    void close();

    // With the pool's lock held:

    /// False, and `wait` stays with the caller, when the queue is closed.
    bool addWait(PoolLock& lock, std::unique_ptr<QueueWait>& wait);
    std::unique_ptr<QueueWait> takeWait(PoolLock& lock, const QueueWait& wait);
    void resumeWith(PoolLock& lock, WorkItem& first);

    bool runTurn() override;

private:
    enum class State : std::uint8_t { Idle, Ready, Running };
    enum class Next : std::uint8_t { Item, TurnOver, Closed };

    Accepted accept(WorkItem& item) override;
    bool isClosed() const override;
    bool beginTurn();
    Next takeNext(WorkItem& item);
    Next takeWithLock(WorkItem& item);
    bool endTurn();
    void endLastTurn();
    bool takeBack(WorkItem& first);
    bool hasWork() const VELA_REQUIRES(mutex_);
    bool becomesReady() VELA_REQUIRES(mutex_);
    void noteAttention() VELA_REQUIRES(mutex_);

    mutable Mutex mutex_;
    ItemFifo pending_ VELA_GUARDED_BY(mutex_);
    std::vector<WorkItem> fronts_ VELA_GUARDED_BY(mutex_); // ahead of all others, the last one first
    std::uint32_t suspensions_ VELA_GUARDED_BY(mutex_) = 0;
    State state_ VELA_GUARDED_BY(mutex_) = State::Idle;
    bool closed_ VELA_GUARDED_BY(mutex_) = false;

    ItemFifo batch_; // ahead of pending_; the running thread's while Running, otherwise guarded by mutex_

    // Whether the running thread must take the lock before its next item: closed, suspended, or fronts_ is not empty.
    std::atomic<bool> attention_ = false;

    std::vector<std::unique_ptr<QueueWait>> waits_; // guarded by the pool's lock
};

class LinuxSerialQueue final : public SerialQueue {
public:
    explicit LinuxSerialQueue(std::shared_ptr<SerialQueueCore> core) : core_(std::move(core)) {}
    ~LinuxSerialQueue() override { core_->close(); }

    void post(WorkItem item) override { core_->post(std::move(item)); }
    void postAfter(Nanoseconds delay, WorkItem item) override { core_->postAfter(delay, std::move(item)); }
    bool isCurrent() const override { return core_->isCurrent(); }
    std::string_view name() const override { return core_->name(); }
    void suspend() override { core_->suspend(); }
    void resume() override { core_->resumeWith(nullptr); }
    void resumeWith(WorkItem first) override { core_->resumeWith(std::move(first)); }

    SerialQueueCore& core() const { return *core_; }

private:
    const std::shared_ptr<SerialQueueCore> core_;
};

} // namespace vela::platform
