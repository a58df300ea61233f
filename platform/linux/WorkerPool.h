// The threads that serve the work queues: which queue is served next, timers, and the further threads that stand in for
// blocked ones. Thread-safe. It outlives every queue and semaphore that uses it.
//
// A thread is active (serves a queue or looks for one), resting, or blocked. At most `limit` threads are active, save
// for those that just came back from blocking. Timers need no thread of their own: of the resting threads one, the
// watcher, sleeps no longer than until the first deadline; while nobody rests, the active threads look at the timers
// between two turns.
#pragma once

#include "platform/WorkQueue.h"
#include "platform/linux/PoolLock.h"
#include "platform/linux/ReadyQueues.h"

#include <atomic>
#include <compare>
#include <condition_variable>
#include <cstddef>
#include <cstdint>
#include <map>
#include <memory>
#include <mutex>
#include <optional>
#include <thread>
#include <vector>

namespace vela::platform {

class QueueCore;
struct Worker;

/// `timeout` from now; the end of time when that is beyond it.
MonotonicTime deadlineAfter(Nanoseconds timeout);

/// Names a timer. Equal deadlines fire in the order in which they were added.
struct TimerKey {
    MonotonicTime deadline;
    std::uint64_t order = 0;

    friend auto operator<=>(const TimerKey&, const TimerKey&) = default;
};

class TimerClient {
public:
    /// Called once for each timer whose deadline has passed, with the pool's lock held.
    virtual void timerFired(PoolLock& lock, TimerKey key) = 0;

protected:
    ~TimerClient() = default;
};

class WorkerPool {
public:
    /// Ends the process when not even one thread can be had.
    explicit WorkerPool(unsigned limit);
    /// As `stop`.
    ~WorkerPool();
    WorkerPool(const WorkerPool&) = delete;
    WorkerPool& operator=(const WorkerPool&) = delete;

    /// Ends the threads when what is ready has been served, and joins them. Not from one of them.
    void stop();

    /// Puts `queue`, which must not be ready already, behind the others of its urgency, and sees to it that a thread
    /// serves it. From inside an item (see `beginItem`) of a queue that is at least as urgent, that is the calling
    /// thread, when its queue has no more items: work that is handed from queue to queue in small steps wakes nobody.
    /// While its queue goes on, another thread is woken after some items.
    void makeReady(PoolLock& lock, std::shared_ptr<QueueCore> queue);

    /// `client` must live until its timer has fired or was removed.
    TimerKey addTimer(PoolLock& lock, MonotonicTime deadline, TimerClient& client);
    void removeTimer(PoolLock& lock, TimerKey key);

    /// The calling thread, when it is one of the pool's, stops being counted as active until the matching
    /// `endBlocking`.
    void beginBlocking(PoolLock& lock);
    void endBlocking(PoolLock& lock);

    /// Around an item of the serial queue that the calling thread serves; never around one that may run for long
    /// without saying that it blocks.
    void beginItem();
    void endItem();

    /// Waits until `ended` answers true, which is asked whenever `turnEnded` was called.
    template <class Predicate>
    void waitForTurn(PoolLock& lock, Predicate ended) {
        beginBlocking(lock);
        while (!ended()) {
            lock.wait(turnEnded_, std::nullopt);
        }
        endBlocking(lock);
    }

    /// Tells those who wait to destroy a queue that its turn is over.
    void turnEnded(PoolLock& lock);

    /// Whether the calling thread is serving `queue`.
    bool isRunning(const QueueCore& queue) const;

    /// Whether a queue that is more urgent than `quality` waits for a thread. A hint, without a lock.
    bool moreUrgentReady(QualityOfService quality) const {
        return (readyMask_.load(std::memory_order_relaxed) & ((1U << static_cast<unsigned>(quality)) - 1U)) != 0;
    }

    /// Threads that exist, blocked ones included.
    std::size_t threadCount();

    /// Whether threads take on the priority of the queue that they serve.
    bool appliesPriorities() const { return appliesPriorities_; }

private:
    friend PoolLock;
    using Timers = std::map<TimerKey, TimerClient*>;

    void run(Worker& self);
    bool serveNext(PoolLock& lock, Worker& self);
    bool servesNext(const QueueCore& queue) const;
    bool rest(PoolLock& lock, Worker& self);
    bool takeOffBackgroundPriority(PoolLock& lock, Worker& self);
    void prepare(Worker& self, const QueueCore& queue) const;
    void adoptPriority(Worker& self) const;
    int niceOf(const QueueCore& queue) const;
    void fireDueTimers(PoolLock& lock);
    void wakeForWork(PoolLock& lock);
    void wakeForTimers(PoolLock& lock);
    void wake(PoolLock& lock, Worker& worker);
    bool addThread(PoolLock& lock);
    bool hasSurplus() const { return total_ - blocked_ > limit_; }
    void noteReady() { readyMask_.store(ready_.mask(), std::memory_order_relaxed); }

    const unsigned limit_;
    const bool appliesPriorities_;
    const int baseNice_;

    std::mutex mutex_;
    // Guarded by mutex_:
    ReadyQueues<QueueCore> ready_;
    Timers timers_;
    std::uint64_t nextTimer_ = 0;
    std::vector<std::unique_ptr<Worker>> workers_; // kept until the end: a late wake-up may still touch one
    std::vector<Worker*> resting_;                 // last in, first out; without the watcher
    std::vector<Worker*> ended_;                   // their threads are to be joined
    Worker* watcher_ = nullptr;
    std::size_t total_ = 0;
    std::size_t blocked_ = 0;
    std::size_t active_ = 0;
    unsigned looking_ = 0; // active threads that look at the timers and serve what becomes ready by them
    bool stopping_ = false;
    std::optional<MonotonicTime> surplusSince_;
    std::condition_variable turnEnded_;

    std::atomic<unsigned> readyMask_ = 0; // ready_'s mask, for a look without the lock
};

} // namespace vela::platform
