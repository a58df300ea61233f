#include "platform/linux/WorkerPool.h"

#include "platform/linux/QueueCore.h"
#include "platform/linux/Worker.h"

#include <algorithm>
#include <cassert>
#include <system_error>
#include <utility>

namespace vela::platform {

namespace {

using namespace std::chrono_literals;

/// How long a thread that stood in for a blocked one is kept for the next time.
constexpr Nanoseconds kKeepSurplus = 2s;

/// How many items of its own queue a thread runs before it wakes another one for what they made ready: some ten
/// microseconds' worth, so that many small steps share one wake-up.
constexpr unsigned kItemsUnshared = 32;

/// How many items of a less urgent queue run before the thread takes on its priority: to change it and change it back
/// would cost as much as a few small items.
constexpr unsigned kItemsAtOldPriority = 64;

constinit thread_local Worker* currentWorker = nullptr;

} // namespace

MonotonicTime deadlineAfter(Nanoseconds timeout) {
    const MonotonicTime now = std::chrono::steady_clock::now();
    return timeout < MonotonicTime::max() - now ? now + timeout : MonotonicTime::max();
}

WorkerPool::WorkerPool(unsigned limit)
    : limit_(limit),
      appliesPriorities_(niceCanBeTakenBack()),
      baseNice_(threadNice()) {
    assert(limit > 0);
    PoolLock lock(*this);
    if (!addThread(lock)) {
        std::terminate();
    }
}

WorkerPool::~WorkerPool() { stop(); }

void WorkerPool::stop() {
    assert(currentWorker == nullptr || currentWorker->pool != this);
    PoolLock lock(*this);
    stopping_ = true;
    for (const auto& worker : workers_) {
        worker->sleeper.wake();
    }
    while (total_ > 0) {
        lock.wait(turnEnded_, std::nullopt);
    }
    for (Worker* const worker : std::exchange(ended_, {})) {
        if (worker->thread.joinable()) {
            worker->thread.join();
        }
    }
}

void WorkerPool::makeReady(PoolLock& lock, std::shared_ptr<QueueCore> queue) {
    const QualityOfService quality = queue->quality();
    const bool next = servesNext(*queue);
    ready_.push(quality, std::move(queue));
    noteReady();
    if (next) {
        currentWorker->itemsSince = currentWorker->owesWake ? currentWorker->itemsSince : 0;
        currentWorker->owesWake = true;
    } else {
        wakeForWork(lock);
    }
}

/// Whether the calling thread may serve `queue` itself after the item that it runs.
bool WorkerPool::servesNext(const QueueCore& queue) const {
    const Worker* const self = currentWorker;
    return self != nullptr && self->pool == this && self->inItem && self->blockingDepth == 0 &&
           queue.quality() >= self->queue->quality();
}

void WorkerPool::beginItem() {
    Worker& self = *currentWorker;
    self.inItem = true;
    if (++self.itemsInTurn == kItemsAtOldPriority) {
        adoptPriority(self);
    }
    if (self.owesWake && ++self.itemsSince == kItemsUnshared) {
        self.owesWake = false;
        PoolLock lock(*this);
        if (!ready_.empty()) {
            wakeForWork(lock);
        }
    }
}

void WorkerPool::endItem() { currentWorker->inItem = false; }

TimerKey WorkerPool::addTimer(PoolLock& lock, MonotonicTime deadline, TimerClient& client) {
    const TimerKey key{deadline, nextTimer_++};
    const auto position = timers_.emplace(key, &client).first;
    if (watcher_ == nullptr) {
        wakeForTimers(lock);
    } else if (position == timers_.begin()) {
        wake(lock, *std::exchange(watcher_, nullptr)); // it would sleep too long
    }
    return key;
}

void WorkerPool::removeTimer(PoolLock&, TimerKey key) { timers_.erase(key); }

void WorkerPool::beginBlocking(PoolLock& lock) {
    Worker* const self = currentWorker;
    if (self == nullptr || self->pool != this || self->blockingDepth++ > 0) {
        return;
    }
    if (self->queue != nullptr) {
        self->appearance.adopt(self->queue->threadName());
        adoptPriority(*self);
    }
    --active_;
    ++blocked_;
    if (!hasSurplus()) {
        surplusSince_.reset();
    }
    if (!ready_.empty()) {
        wakeForWork(lock);
    }
    wakeForTimers(lock);
}

void WorkerPool::endBlocking(PoolLock&) {
    Worker* const self = currentWorker;
    if (self == nullptr || self->pool != this) {
        return;
    }
    assert(self->blockingDepth > 0);
    if (--self->blockingDepth > 0) {
        return;
    }
    --blocked_;
    ++active_;
    if (hasSurplus() && !surplusSince_) {
        surplusSince_ = std::chrono::steady_clock::now();
    }
}

void WorkerPool::turnEnded(PoolLock&) { turnEnded_.notify_all(); }

bool WorkerPool::isRunning(const QueueCore& queue) const {
    return currentWorker != nullptr && currentWorker->queue == &queue;
}

std::size_t WorkerPool::threadCount() {
    const PoolLock lock(*this);
    return total_;
}

void WorkerPool::run(Worker& self) {
    currentWorker = &self;
    self.pool = this;
    self.appearance = ThreadAppearance(threadNameFor("vela.worker"), baseNice_);
    PoolLock lock(*this);
    for (;;) {
        fireDueTimers(lock);
        if (serveNext(lock, self)) {
            continue;
        }
        if (stopping_) {
            break;
        }
        if (takeOffBackgroundPriority(lock, self)) {
            continue;
        }
        if (!rest(lock, self)) {
            break;
        }
    }
    --active_;
    --total_;
    ended_.push_back(&self);
    if (!hasSurplus()) {
        surplusSince_.reset();
    }
    turnEnded(lock);
    wakeForTimers(lock);
}

/// Serves one queue for one turn. False when there is none, or more than enough threads are active.
bool WorkerPool::serveNext(PoolLock& lock, Worker& self) {
    if (active_ > limit_ || ready_.empty()) {
        return false;
    }
    std::shared_ptr<QueueCore> queue = ready_.take();
    noteReady();
    if (!ready_.empty()) {
        wakeForWork(lock);
    }
    wakeForTimers(lock);
    lock.unlock();
    prepare(self, *queue);
    self.queue = queue.get();
    self.itemsInTurn = 0;
    const bool again = queue->runTurn();
    assert(self.blockingDepth == 0);
    self.queue = nullptr;
    self.owesWake = false; // what is ready is looked at next
    if (again) {
        self.appearance.adopt(queue->threadName());
    } else {
        queue.reset();
    }
    lock.relock();
    if (again) {
        const QualityOfService quality = queue->quality();
        ready_.push(quality, std::move(queue)); // this thread looks at it next, nobody needs waking
        noteReady();
    }
    return true;
}

/// Rests until there is something to do. False when the thread is one too many and shall end.
bool WorkerPool::rest(PoolLock& lock, Worker& self) {
    std::optional<MonotonicTime> until;
    if (hasSurplus() && surplusSince_) {
        until = *surplusSince_ + kKeepSurplus;
        if (*until <= std::chrono::steady_clock::now()) {
            return false;
        }
    }
    self.woken = false;
    if (watcher_ == nullptr && !timers_.empty()) {
        watcher_ = &self;
        const MonotonicTime first = timers_.begin()->first.deadline;
        until = until ? std::min(*until, first) : first;
    } else {
        resting_.push_back(&self);
    }
    --active_;
    while (!self.woken && !stopping_) {
        if (!lock.sleep(self.sleeper, until)) {
            break;
        }
    }
    if (!self.woken) { // who wakes a thread takes it off the lists and counts it
        if (watcher_ == &self) {
            watcher_ = nullptr;
        } else {
            std::erase(resting_, &self);
        }
        ++active_;
    }
    return true;
}

/// A resting thread waits at the process's own priority, or urgent work that wakes it would begin late on a busy
/// device.
bool WorkerPool::takeOffBackgroundPriority(PoolLock& lock, Worker& self) {
    if (self.appearance.nice() == baseNice_) {
        return false;
    }
    lock.unlock();
    self.appearance.adopt(baseNice_);
    lock.relock();
    return true;
}

/// An urgent queue's priority is taken on at once, and so is the background's, whose items may be long.
void WorkerPool::prepare(Worker& self, const QueueCore& queue) const {
    if (queue.quality() == QualityOfService::Background || niceOf(queue) < self.appearance.nice()) {
        self.appearance.adopt(niceOf(queue));
    }
}

/// That of the queue that the thread serves.
void WorkerPool::adoptPriority(Worker& self) const { self.appearance.adopt(niceOf(*self.queue)); }

int WorkerPool::niceOf(const QueueCore& queue) const {
    return appliesPriorities_ ? niceFor(queue.quality(), baseNice_) : baseNice_;
}

void WorkerPool::fireDueTimers(PoolLock& lock) {
    if (timers_.empty()) {
        return;
    }
    const MonotonicTime now = std::chrono::steady_clock::now();
    ++looking_; // this thread serves the first queue that becomes ready by it
    while (!timers_.empty() && timers_.begin()->first.deadline <= now) {
        const auto fired = timers_.extract(timers_.begin());
        fired.mapped()->timerFired(lock, fired.key());
    }
    --looking_;
}

/// Sees to it that a thread will look at what is ready. An active one does so by itself when its turn ends.
void WorkerPool::wakeForWork(PoolLock& lock) {
    if (looking_ > 0 || active_ >= limit_) {
        return;
    }
    if (!resting_.empty()) {
        Worker* const worker = resting_.back();
        resting_.pop_back();
        wake(lock, *worker);
    } else if (watcher_ != nullptr) {
        wake(lock, *std::exchange(watcher_, nullptr));
    } else {
        addThread(lock);
    }
}

/// Sees to it that a thread watches the timers, if one can be spared.
void WorkerPool::wakeForTimers(PoolLock& lock) {
    if (!timers_.empty() && watcher_ == nullptr) {
        wakeForWork(lock);
    }
}

void WorkerPool::wake(PoolLock& lock, Worker& worker) {
    worker.woken = true;
    ++active_;
    lock.wakeOnUnlock(worker);
}

/// False when the system has no thread to give; the threads that exist then serve everything.
bool WorkerPool::addThread(PoolLock&) {
    if (stopping_) {
        return false;
    }
    Worker* worker = nullptr;
    if (!ended_.empty()) {
        worker = ended_.back();
        ended_.pop_back();
        if (worker->thread.joinable()) {
            worker->thread.join();
        }
    } else {
        worker = workers_.emplace_back(std::make_unique<Worker>()).get();
    }
    try {
        const SignalsBlocked blocked;
        worker->thread = std::thread([this, worker] { run(*worker); });
    } catch (const std::system_error&) {
        ended_.push_back(worker);
        return false;
    }
    ++total_;
    ++active_;
    return true;
}

} // namespace vela::platform
