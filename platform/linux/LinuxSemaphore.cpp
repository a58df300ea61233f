#include "platform/linux/LinuxSemaphore.h"

#include "platform/linux/LinuxSerialQueue.h"

#include <cassert>
#include <condition_variable>
#include <memory>
#include <utility>
#include <vector>

namespace vela::platform {

/// Everything of a waiter happens with the pool's lock held.
class LinuxSemaphore::Waiter {
public:
    virtual ~Waiter() = default;

    /// It has taken one from the count and stands in no list any more.
    virtual void taken(PoolLock& lock) = 0;

    /// The semaphore is being destroyed. What is destroyed and resumed afterwards, without the lock, goes into `owed`.
    struct Owed {
        std::shared_ptr<SerialQueueCore> queue;
        std::unique_ptr<QueueWait> wait;
    };
    virtual void abandoned(PoolLock& lock, std::vector<Owed>& owed) = 0;
};

/// Lives on the stack of the thread that waits.
class LinuxSemaphore::BlockedThread final : public Waiter {
public:
    /// Answers whether the wait was ended by `taken`.
    bool block(PoolLock& lock, Waiters& waiters, Waiters::iterator self, const std::optional<MonotonicTime>& deadline) {
        while (!ended_) {
            if (!lock.wait(condition_, deadline) && !ended_) {
                waiters.erase(self);
                return false;
            }
        }
        return taken_;
    }

    void taken(PoolLock&) override {
        taken_ = true;
        end();
    }

    void abandoned(PoolLock&, std::vector<Owed>&) override { end(); }

private:
    void end() {
        ended_ = true;
        condition_.notify_one();
    }

    std::condition_variable condition_;
    bool ended_ = false;
    bool taken_ = false;
};

/// Owned by the queue while it waits, then by the item that runs `then`.
class LinuxSemaphore::SuspendedQueue final : public Waiter, public QueueWait, public TimerClient {
public:
    SuspendedQueue(SerialQueueCore& queue, UniqueFunction<void(bool)> then) : queue_(queue), then_(std::move(then)) {}

    void begin(PoolLock& lock, Waiters& waiters, MonotonicTime deadline) {
        waiters_ = &waiters;
        position_ = waiters.insert(waiters.end(), this);
        timer_ = queue_.pool().addTimer(lock, deadline, *this);
    }

    void taken(PoolLock& lock) override {
        queue_.pool().removeTimer(lock, timer_);
        finish(lock, true);
    }

    void finish(PoolLock& lock, bool taken) {
        WorkItem item = [self = queue_.takeWait(lock, *this), this, taken] { then_(taken); };
        queue_.resumeWith(lock, item);
    }

    void abandoned(PoolLock& lock, std::vector<Owed>& owed) override {
        queue_.pool().removeTimer(lock, timer_);
        owed.push_back(
            {std::static_pointer_cast<SerialQueueCore>(queue_.shared_from_this()), queue_.takeWait(lock, *this)});
    }

    void abandon(PoolLock& lock) override {
        waiters_->erase(position_);
        queue_.pool().removeTimer(lock, timer_);
    }

    void timerFired(PoolLock& lock, TimerKey) override {
        waiters_->erase(position_);
        finish(lock, false);
    }

private:
    SerialQueueCore& queue_; // abandons the wait when it is closed
    UniqueFunction<void(bool)> then_;
    Waiters* waiters_ = nullptr;
    Waiters::iterator position_;
    TimerKey timer_;
};

LinuxSemaphore::~LinuxSemaphore() {
    std::vector<Waiter::Owed> owed;
    {
        PoolLock lock(pool_);
        while (!waiters_.empty()) {
            Waiter* const waiter = waiters_.front();
            waiters_.pop_front();
            waiter->abandoned(lock, owed);
        }
    }
    for (Waiter::Owed& each : owed) {
        each.wait.reset();
        each.queue->resumeWith(nullptr);
    }
}

void LinuxSemaphore::signal() {
    PoolLock lock(pool_);
    if (waiters_.empty()) {
        ++count_;
        return;
    }
    Waiter* const waiter = waiters_.front();
    waiters_.pop_front();
    waiter->taken(lock);
}

bool LinuxSemaphore::wait(std::optional<Nanoseconds> timeout) {
    WorkerPool& pool = pool_; // the semaphore may be destroyed while this thread waits
    PoolLock lock(pool);
    if (count_ > 0) {
        --count_;
        return true;
    }
    if (timeout && *timeout <= Nanoseconds::zero()) {
        return false;
    }
    BlockedThread self;
    const auto position = waiters_.insert(waiters_.end(), &self);
    pool.beginBlocking(lock);
    const auto deadline = timeout ? std::optional(deadlineAfter(*timeout)) : std::nullopt;
    const bool taken = self.block(lock, waiters_, position, deadline);
    pool.endBlocking(lock);
    return taken;
}

void LinuxSemaphore::waitSuspending(SerialQueue& queue, Nanoseconds timeout, UniqueFunction<void(bool)> then) {
    assert(dynamic_cast<LinuxSerialQueue*>(&queue) != nullptr);
    SerialQueueCore& core = static_cast<LinuxSerialQueue&>(queue).core();
    auto created = std::make_unique<SuspendedQueue>(core, std::move(then));
    SuspendedQueue& wait = *created;
    std::unique_ptr<QueueWait> owned = std::move(created); // destroyed after the lock when the queue does not take it
    core.suspend();
    PoolLock lock(pool_);
    if (!core.addWait(lock, owned)) {
        return;
    }
    if (count_ > 0) {
        --count_;
        wait.finish(lock, true);
    } else if (timeout <= Nanoseconds::zero()) {
        wait.finish(lock, false);
    } else {
        wait.begin(lock, waiters_, deadlineAfter(timeout));
    }
}

} // namespace vela::platform
