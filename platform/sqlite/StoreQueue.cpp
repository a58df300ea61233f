#include "platform/sqlite/StoreQueue.h"

#include <algorithm>
#include <cassert>
#include <utility>

namespace vela::platform {

StoreQueue::StoreQueue(const Limits& limits) : limits_(limits) {}

std::optional<DropReason> StoreQueue::push(StoreRecord& record) {
    record.weight = weightOf(record);
    bool wakes = false;
    {
        const std::lock_guard lock(mutex_);
        if (closed_) {
            return DropReason::Restart;
        }
        if (record.weight > limits_.bytes) {
            return DropReason::Limit; // it would find no room in an empty queue either
        }
        if (held_ >= limits_.records || record.weight > limits_.bytes - heldBytes_) {
            return DropReason::QueueFull;
        }
        ++held_;
        heldBytes_ += record.weight;
        ++waiting_;
        wakes = waiting_ == 1 || waiting_ == limits_.group || record.urgency > urgency_;
        urgency_ = std::max(urgency_, record.urgency);
        awake_ = awake_ || wakes;
        if (records_.size() == pieceSize()) {
            pieces_.push_back(std::exchange(records_, nextPiece()));
        }
        records_.push_back(std::move(record));
    }
    if (wakes) {
        writer_.notify_one();
    }
    return std::nullopt;
}

/// Memory for a whole piece, an emptied one's where there is one.
std::vector<StoreRecord> StoreQueue::nextPiece() {
    std::vector<StoreRecord> piece;
    if (!spare_.empty()) {
        piece = std::move(spare_.back());
        spare_.pop_back();
    }
    piece.reserve(pieceSize());
    return piece;
}

void StoreQueue::noteLedgerChange() {
    if (!ledgerChanged_.exchange(true)) {
        wake();
    }
}

std::uint64_t StoreQueue::requestFlush() {
    std::uint64_t flush = 0;
    {
        const std::lock_guard lock(mutex_);
        flush = ++flush_;
        awake_ = true;
    }
    writer_.notify_one();
    return flush;
}

void StoreQueue::waitFlushed(std::uint64_t flush) {
    std::unique_lock lock(mutex_);
    flushers_.wait(lock, [&] { return flushed_ >= flush; });
}

void StoreQueue::close() {
    {
        const std::lock_guard lock(mutex_);
        closed_ = true;
        awake_ = true;
    }
    writer_.notify_one();
}

std::size_t StoreQueue::held() const {
    const std::lock_guard lock(mutex_);
    return held_;
}

bool StoreQueue::isNearlyFull() const {
    const std::lock_guard lock(mutex_);
    return held_ >= limits_.records - limits_.records / 8 || heldBytes_ >= limits_.bytes - limits_.bytes / 8;
}

StoreQueue::State StoreQueue::state() const {
    const std::lock_guard lock(mutex_);
    return {waiting_, urgency_, ledgerChanged_.load(), closed_, flush_};
}

void StoreQueue::take(std::vector<StoreRecord>& records) {
    assert(records.empty());
    std::vector<std::vector<StoreRecord>> unused; // given back without the lock
    const std::lock_guard lock(mutex_);
    if (pieces_.empty()) {
        records.swap(records_);
        unused.swap(spare_);
    } else {
        records.swap(pieces_.front());
        spare_.push_back(std::move(pieces_.front()));
        pieces_.pop_front();
    }
    waiting_ -= records.size();
    if (waiting_ == 0) {
        urgency_ = StoreUrgency::Usual;
    }
}

void StoreQueue::release(std::size_t records, std::size_t bytes) {
    const std::lock_guard lock(mutex_);
    assert(records <= held_ && bytes <= heldBytes_);
    held_ -= records;
    heldBytes_ -= bytes;
}

void StoreQueue::flushed(std::uint64_t flush) {
    {
        const std::lock_guard lock(mutex_);
        flushed_ = std::max(flushed_, flush);
    }
    flushers_.notify_all();
}

bool StoreQueue::wait(std::optional<MonotonicTime> deadline) {
    std::unique_lock lock(mutex_);
    if (deadline) {
        writer_.wait_until(lock, *deadline, [&] { return awake_; });
    } else {
        writer_.wait(lock, [&] { return awake_; });
    }
    return std::exchange(awake_, false);
}

void StoreQueue::wake() {
    {
        const std::lock_guard lock(mutex_);
        awake_ = true;
    }
    writer_.notify_one();
}

} // namespace vela::platform
