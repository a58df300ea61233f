// Work queues, counting semaphores and conditions: everything by which work moves between threads or waits.
//
// All of it is thread-safe and made by one `WorkQueues`, which outlives what it made. Items never throw. An object may
// be destroyed at any time, from any thread, with work pending: what had not begun is destroyed without being run, and
// the destructor returns when a running item has ended (at once when it is called from that item).
#pragma once

#include "platform/Clock.h"
#include "platform/UniqueFunction.h"

#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <string_view>

namespace vela::platform {

/// How urgent a queue's work is, most urgent first. Bindings map it to thread priority where they may, for work that
/// goes on for some time.
enum class QualityOfService : std::uint8_t { UserInteractive, Default, Utility, Background };

using WorkItem = UniqueFunction<void()>;

class WorkQueue {
public:
    virtual ~WorkQueue() = default;

    /// Runs `item` later, on a thread of the queue's choosing. Never blocks and never runs it in place.
    virtual void post(WorkItem item) = 0;

    /// Posts `item` when `delay` has passed (at once when it is zero or negative). Equal deadlines keep their order.
    virtual void postAfter(Nanoseconds delay, WorkItem item) = 0;

    /// Whether the calling thread is running an item of this queue.
    virtual bool isCurrent() const = 0;

    virtual std::string_view name() const = 0;
};

/// Runs its items one at a time, in the order posted.
class SerialQueue : public WorkQueue {
public:
    /// No further item begins until `resume` has been called as often as `suspend`. Holds no thread. An item may
    /// suspend its own queue; it runs to its end.
    virtual void suspend() = 0;

    /// Takes back one `suspend`, which must have been called.
    virtual void resume() = 0;

    /// As `resume`, with `first` put ahead of every item that waits.
    virtual void resumeWith(WorkItem first) = 0;
};

/// A counting semaphore. Waiters are served in the order in which they began to wait.
class Semaphore {
public:
    virtual ~Semaphore() = default;

    /// Adds one to the count, or ends the longest wait.
    virtual void signal() = 0;

    /// Blocks the calling thread until it takes one from the count (true) or `timeout` has passed (false); without a
    /// timeout it waits for ever. On a pool thread the pool makes room meanwhile.
    virtual bool wait(std::optional<Nanoseconds> timeout) = 0;

    /// Suspends `queue` until one is taken from the count or `timeout` has passed, then runs `then(taken)` on it ahead
    /// of every waiting item. Holds no thread. When the queue or the semaphore is destroyed first, `then` is destroyed
    /// without being run and a queue that still lives is resumed.
    virtual void waitSuspending(SerialQueue& queue, Nanoseconds timeout, UniqueFunction<void(bool taken)> then) = 0;
};

/// A mutex with a condition variable. Usable with std::unique_lock.
class Condition {
public:
    virtual ~Condition() = default;

    virtual void lock() = 0;
    virtual void unlock() = 0;

    /// The time that deadlines are measured in.
    virtual MonotonicTime monotonicNow() const = 0;

    /// With the lock held: waits for a signal (true) or until `deadline` (false). May wake without cause (true).
    virtual bool waitUntil(MonotonicTime deadline) = 0;

    /// Wakes one waiter.
    virtual void signal() = 0;
};

class WorkQueues {
public:
    virtual ~WorkQueues() = default;

    /// A new serial queue. `name` shows in the thread's name while an item of it blocks, or many follow each other.
    virtual std::unique_ptr<SerialQueue> makeSerialQueue(std::string_view name, QualityOfService quality) = 0;

    /// The shared background queue: its items run in any order and beside each other.
    virtual WorkQueue& background() = 0;

    /// A new semaphore with a count of `initial`.
    virtual std::unique_ptr<Semaphore> makeSemaphore(std::uint32_t initial) = 0;

    virtual std::unique_ptr<Condition> makeCondition() = 0;

    /// Brackets a stretch in which the running item blocks or computes for long: the pool runs other work on a further
    /// thread meanwhile. Without it, what the item posted may wait for the item's end. Calls nest. Outside an item both
    /// do nothing.
    virtual void beginBlocking() = 0;
    virtual void endBlocking() = 0;
};

/// `WorkQueues::beginBlocking` and `endBlocking` as a scope.
class BlockingScope {
public:
    explicit BlockingScope(WorkQueues& queues) : queues_(queues) { queues_.beginBlocking(); }
    ~BlockingScope() { queues_.endBlocking(); }
    BlockingScope(const BlockingScope&) = delete;
    BlockingScope& operator=(const BlockingScope&) = delete;

private:
    WorkQueues& queues_;
};

} // namespace vela::platform
