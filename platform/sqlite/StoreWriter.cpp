#include "platform/sqlite/StoreWriter.h"

#include "common/VelaReportingLogCategories.h"

#include <algorithm>
#include <cerrno>
#include <utility>

namespace vela::platform {

namespace {

constexpr std::chrono::milliseconds kSoon{5};
constexpr std::chrono::seconds kLongestRetryDelay{30};
/// Of a backlog, so many share a commit at the most.
constexpr std::size_t kMostTogether = StoreQueue::kPiece;

/// Whether a file that could not be opened may be opened later without anybody's doing.
bool mayPass(int error) {
    return error == ENOSPC || error == EDQUOT || error == EIO || error == ENOMEM || error == EBUSY;
}

void keepEarlier(std::optional<MonotonicTime>& time, MonotonicTime other) {
    time = time ? std::min(*time, other) : other;
}

/// Counts deliveries of the same account together: meanwhile its session counts in the same place, on another
/// processor.
class DeliveredCounts {
public:
    DeliveredCounts() = default;
    DeliveredCounts(const DeliveredCounts&) = delete;
    DeliveredCounts& operator=(const DeliveredCounts&) = delete;
    ~DeliveredCounts() { tell(); }

    /// `entry` lives until `tell`.
    void add(LedgerEntry& entry, DeliveryBackend backend) {
        if (entry_ != &entry) {
            tell();
            entry_ = &entry;
        }
        ++counts_[static_cast<std::size_t>(backend)];
    }
    void tell() {
        for (std::size_t number = 0; number < counts_.size(); ++number) {
            if (const std::uint64_t count = std::exchange(counts_[number], 0); count > 0) {
                entry_->delivered(static_cast<DeliveryBackend>(number), count);
            }
        }
    }

private:
    LedgerEntry* entry_ = nullptr;
    std::array<std::uint64_t, kDeliveryBackends> counts_{};
};

} // namespace

StoreWriter::StoreWriter(Options options, StoreQueue& queue, DeliveryLedger& ledger)
    : options_(std::move(options)),
      queue_(queue),
      ledger_(ledger) {}

Result<Done> StoreWriter::open(MonotonicTime now) {
    Result<Done> opened = openFile();
    if (opened) {
        noteSuccess();
    } else if (mayPass(opened.failure().code)) {
        noteFailure(opened.failure(), now);
        return Done();
    }
    return opened;
}

Result<Done> StoreWriter::openFile() {
    Result<std::unique_ptr<StoreFile>> file = StoreFile::open(options_.file);
    if (!file) {
        return file.failure();
    }
    std::unique_ptr<StoreFile> opened = *std::move(file);
    const Result<std::vector<LedgerRow>> rows = opened->ledgerRows();
    if (!rows) {
        return rows.failure();
    }
    file_ = std::move(opened);
    if (!rows->empty()) {
        ledger_.restore(*rows);
        queue_.noteLedgerChange();
    }
    return Done();
}

std::optional<MonotonicTime> StoreWriter::run(MonotonicTime now) {
    const StoreQueue::State state = queue_.state();
    startTimes(state, now);
    if (isDue(state, now)) {
        commit(now);
    }
    if (state.flush != flush_) {
        flush_ = state.flush;
        queue_.flushed(flush_);
    }
    return nextTime();
}

void StoreWriter::startTimes(const StoreQueue::State& state, MonotonicTime now) {
    if (state.waiting > 0) {
        keepEarlier(commitAt_, now + (state.urgency == StoreUrgency::Soon ? std::min(kSoon, options_.commitDelay)
                                                                          : options_.commitDelay));
    }
    if (state.ledgerChanged) {
        keepEarlier(ledgerAt_, now + kLedgerDelays * options_.commitDelay);
    }
}

bool StoreWriter::isDue(const StoreQueue::State& state, MonotonicTime now) {
    if (state.flush != flush_ || state.urgency == StoreUrgency::Now) {
        return true;
    }
    if (retryAt_) {
        return now >= *retryAt_;
    }
    return state.waiting >= options_.commitMessages || (commitAt_ && now >= *commitAt_) ||
           (ledgerAt_ && now >= *ledgerAt_);
}

std::optional<MonotonicTime> StoreWriter::nextTime() const {
    if (retryAt_ || !ledgerAt_) {
        return retryAt_ ? retryAt_ : commitAt_;
    }
    return commitAt_ ? std::min(*commitAt_, *ledgerAt_) : *ledgerAt_;
}

void StoreWriter::commit(MonotonicTime now) {
    const bool ledgerNoted = queue_.state().ledgerChanged;
    queue_.clearLedgerChange();
    commitAt_.reset();
    ledgerAt_.reset();
    if (commitWaiting(now) || ledgerNoted) {
        // What is counted right behind a delivery, by whoever made it, is told by nobody.
        ledgerAt_ = now + kLedgerDelays * options_.commitDelay;
    }
}

// Stores what waits, group by group until one fails, or the ledger alone. Answers whether there was anything.
bool StoreWriter::commitWaiting(MonotonicTime now) {
    if (!takeMore()) {
        store({}, now);
        return false;
    }
    if (retryAt_ && !probe(now)) {
        return true;
    }
    bool stored = true;
    while (stored && takeMore()) {
        stored = store(nextGroup(), now);
    }
    return true;
}

// Tries the disk with the ledger alone, so that another failure costs no delivery.
bool StoreWriter::probe(MonotonicTime now) {
    const Result<std::size_t> stored = attempt({});
    if (!stored) {
        noteFailure(stored.failure(), now);
    }
    return static_cast<bool>(stored);
}

bool StoreWriter::takeMore() {
    if (settled_ < taken_.size()) {
        return true;
    }
    taken_.clear();
    settled_ = 0;
    queue_.take(taken_);
    return !taken_.empty();
}

std::span<StoreRecord> StoreWriter::nextGroup() {
    const std::span<StoreRecord> left = std::span(taken_).subspan(settled_);
    // What waits already shares the cost of one commit; in small steps while commits fail.
    const std::size_t most =
        std::min(left.size(), retryAt_ ? options_.commitMessages : std::max(options_.commitMessages, kMostTogether));
    const std::size_t mostBytes = file_ == nullptr ? 0 : file_->groupBytes();
    std::size_t count = 1;
    for (std::size_t bytes = left[0].weight; count < most && bytes + left[count].weight <= mostBytes; ++count) {
        bytes += left[count].weight;
    }
    return left.first(count);
}

bool StoreWriter::store(std::span<StoreRecord> group, MonotonicTime now) {
    for (StoreRecord& record : group) {
        if (record.builder) {
            record.payload = record.builder();
            record.builder.reset();
        }
    }
    const Result<std::size_t> stored = attempt(group);
    // Of a failed commit only the first are given up; the others wait for an attempt that works.
    settle(group.first(stored ? *stored : std::min(group.size(), options_.commitMessages)), static_cast<bool>(stored));
    if (stored) {
        noteSuccess();
    } else {
        noteFailure(stored.failure(), now);
    }
    return static_cast<bool>(stored);
}

Result<std::size_t> StoreWriter::attempt(std::span<StoreRecord> group) {
    if (file_ == nullptr) {
        if (const Result<Done> opened = openFile(); !opened) {
            return opened.failure();
        }
    }
    return file_->store(group, ledger_);
}

void StoreWriter::settle(std::span<StoreRecord> group, bool stored) {
    std::size_t bytes = 0;
    DeliveredCounts delivered;
    for (StoreRecord& each : group) {
        bytes += each.weight;
        const bool kept = stored && !each.refused;
        if (each.entry != nullptr && kept) {
            delivered.add(*each.entry, each.backend);
        } else if (each.entry != nullptr) {
            each.entry->dropped(each.backend, each.refused.value_or(DropReason::StoreFailed));
            lostSince_ += stored ? 0 : 1;
        }
        if (each.done != nullptr) {
            delivered.tell();
            (*each.done)(kept);
        }
    }
    delivered.tell();
    settled_ += group.size();
    // What the queue has room for again must not be held here any more, while commits fail say.
    if (settled_ == taken_.size()) {
        taken_.clear();
        settled_ = 0;
    } else {
        for (StoreRecord& each : group) {
            each = StoreRecord();
        }
    }
    queue_.release(group.size(), bytes);
}

void StoreWriter::noteFailure(const Failure& failure, MonotonicTime now) {
    retryDelay_ = std::clamp<std::chrono::milliseconds>(
        2 * retryDelay_, options_.commitDelay,
        std::max<std::chrono::milliseconds>(kLongestRetryDelay, options_.commitDelay));
    retryAt_ = now + retryDelay_;
    bool first = false;
    {
        const MutexLock lock(mutex_);
        first = !std::exchange(status_.degraded, true);
        ++status_.failures;
        status_.lastError = failure.description;
    }
    if (first) {
        VelaReportingServiceDelegateCategory().error("deliveries are not stored: %@", failure.description);
    }
}

void StoreWriter::noteSuccess() {
    retryAt_.reset();
    retryDelay_ = {};
    bool recovered = false;
    {
        const std::array<StoreUsage, kDeliveryBackends> usage = file_->usage();
        const MutexLock lock(mutex_);
        recovered = std::exchange(status_.degraded, false);
        status_.rows = 0;
        status_.evicted = 0;
        for (const StoreUsage& each : usage) {
            status_.rows += each.rows;
            status_.evicted += each.evicted;
        }
        status_.backends = usage;
        status_.bytes = file_->fileBytes();
    }
    if (recovered) {
        VelaReportingServiceDelegateCategory().standard("deliveries are stored again; %llu were lost",
                                                        std::exchange(lostSince_, 0));
    }
}

void StoreWriter::finish(MonotonicTime now) {
    bool stored = true;
    if (retryAt_ && !probe(now)) {
        stored = false;
    }
    while (takeMore()) {
        const std::span<StoreRecord> group = nextGroup();
        if (stored) {
            stored = store(group, now);
        } else {
            settle(group, false);
        }
    }
    if (stored) {
        store({}, now);
    }
    file_.reset();
}

StoreStatus StoreWriter::status() const {
    const MutexLock lock(mutex_);
    return status_;
}

} // namespace vela::platform
