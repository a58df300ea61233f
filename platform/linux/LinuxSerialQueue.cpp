#include "platform/linux/LinuxSerialQueue.h"

#include <algorithm>
#include <cassert>
#include <utility>

namespace vela::platform {

namespace {

/// Items that one queue runs before the other ready ones, and the timers, have their turn.
constexpr unsigned kItemsPerTurn = 64;

} // namespace

void SerialQueueCore::suspend() {
    const MutexLock lock(mutex_);
    ++suspensions_;
    noteAttention();
}

void SerialQueueCore::resumeWith(WorkItem first) {
    if (takeBack(first)) {
        PoolLock lock(pool());
        pool().makeReady(lock, shared_from_this());
    }
}

void SerialQueueCore::resumeWith(PoolLock& lock, WorkItem& first) {
    if (takeBack(first)) {
        pool().makeReady(lock, shared_from_this());
    }
}

void SerialQueueCore::close() {
    ItemFifo batch;
    ItemFifo pending;
    std::vector<WorkItem> fronts;
    DelayedItems delayed;
    std::vector<std::unique_ptr<QueueWait>> waits;
    PoolLock poolLock(pool());
    {
        const MutexLock lock(mutex_);
        closed_ = true;
        noteAttention();
        fronts.swap(fronts_);
        pending.swap(pending_);
        if (state_ != State::Running || isCurrent()) {
            batch.swap(batch_);
        }
    }
    delayed = takeDelayed(poolLock);
    waits.swap(waits_);
    for (const auto& wait : waits) {
        wait->abandon(poolLock);
    }
    if (!isCurrent()) {
        pool().waitForTurn(poolLock, [this] {
            const MutexLock lock(mutex_);
            return state_ != State::Running;
        });
    }
    poolLock.unlock();
    // In the order in which they would have run, now that nothing runs beside them.
    while (!fronts.empty()) {
        fronts.pop_back();
    }
    batch.clear();
    pending.clear();
}

bool SerialQueueCore::addWait(PoolLock&, std::unique_ptr<QueueWait>& wait) {
    if (isClosed()) {
        return false;
    }
    waits_.push_back(std::move(wait));
    return true;
}

std::unique_ptr<QueueWait> SerialQueueCore::takeWait(PoolLock&, const QueueWait& wait) {
    const auto position =
        std::find_if(waits_.begin(), waits_.end(), [&wait](const auto& candidate) { return candidate.get() == &wait; });
    assert(position != waits_.end());
    std::unique_ptr<QueueWait> taken = std::move(*position);
    waits_.erase(position);
    return taken;
}

bool SerialQueueCore::runTurn() {
    if (!beginTurn()) {
        return false;
    }
    for (unsigned ran = 0; ran < kItemsPerTurn; ++ran) {
        if (ran > 0 && pool().moreUrgentReady(quality())) {
            break;
        }
        WorkItem item;
        switch (takeNext(item)) {
        case Next::Item:
            pool().beginItem();
            item(); // and its captures go at the end of this round, before the next item begins
            pool().endItem();
            break;
        case Next::TurnOver:
            return false;
        case Next::Closed:
            endLastTurn();
            return false;
        }
    }
    return endTurn();
}

QueueCore::Accepted SerialQueueCore::accept(WorkItem& item) {
    const MutexLock lock(mutex_);
    if (closed_) {
        return Accepted::Dropped;
    }
    pending_.push(std::move(item));
    return becomesReady() ? Accepted::MakeReady : Accepted::Waits;
}

bool SerialQueueCore::isClosed() const {
    const MutexLock lock(mutex_);
    return closed_;
}

bool SerialQueueCore::beginTurn() {
    const MutexLock lock(mutex_);
    assert(state_ == State::Ready);
    state_ = closed_ ? State::Idle : State::Running;
    return state_ == State::Running;
}

SerialQueueCore::Next SerialQueueCore::takeNext(WorkItem& item) {
    if (attention_.load(std::memory_order_acquire) || batch_.empty()) {
        return takeWithLock(item);
    }
    item = batch_.take();
    return Next::Item;
}

SerialQueueCore::Next SerialQueueCore::takeWithLock(WorkItem& item) {
    const MutexLock lock(mutex_);
    if (closed_) {
        return Next::Closed;
    }
    if (suspensions_ > 0 || !hasWork()) {
        state_ = State::Idle;
        return Next::TurnOver;
    }
    if (!fronts_.empty()) {
        item = std::move(fronts_.back());
        fronts_.pop_back();
        noteAttention();
        return Next::Item;
    }
    if (batch_.empty()) {
        batch_.swap(pending_);
    }
    item = batch_.take();
    return Next::Item;
}

/// Answers whether the queue is ready again.
bool SerialQueueCore::endTurn() {
    {
        const MutexLock lock(mutex_);
        if (!closed_) {
            state_ = State::Idle;
            return becomesReady();
        }
    }
    endLastTurn();
    return false;
}

/// The queue was closed while this thread ran an item of it: what is left goes before the closing thread may go on.
void SerialQueueCore::endLastTurn() {
    batch_.clear();
    {
        const MutexLock lock(mutex_);
        state_ = State::Idle;
    }
    PoolLock lock(pool());
    pool().turnEnded(lock);
}

/// Takes back one suspension and puts `first`, if there is one, in front. Answers whether the queue is to be made
/// ready.
bool SerialQueueCore::takeBack(WorkItem& first) {
    const MutexLock lock(mutex_);
    if (closed_) {
        return false;
    }
    assert(suspensions_ > 0);
    --suspensions_;
    if (first) {
        fronts_.push_back(std::move(first));
    }
    noteAttention();
    return becomesReady();
}

bool SerialQueueCore::hasWork() const { return !fronts_.empty() || !batch_.empty() || !pending_.empty(); }

bool SerialQueueCore::becomesReady() {
    if (state_ != State::Idle || suspensions_ > 0 || !hasWork()) {
        return false;
    }
    state_ = State::Ready;
    return true;
}

void SerialQueueCore::noteAttention() {
    attention_.store(closed_ || suspensions_ > 0 || !fronts_.empty(), std::memory_order_release);
}

} // namespace vela::platform
