// Decides when the store commits, and what happens when it cannot. The thread around it only waits.
//
//     at rest ── a record ──> collecting ── group full, time over, urgent, flush, end ──> a commit ──> at rest
//                                                                                            │ failed
//     at rest <── a commit that works ── failing: an attempt after 1, 2, 4 ... times the delay, at most 30 s <┘
//
// A group whose commit failed is dropped and counted; what comes later waits in the queue until an attempt works. The
// ledger's changes are written with every commit, on their own within kLedgerDelays times the delay after they were
// noted, and once more after that. Confined to one thread, the store's; `status` is thread-safe.
#pragma once

#include "common/DeliveryLedger.h"
#include "platform/Clock.h"
#include "platform/Mutex.h"
#include "platform/sqlite/StoreFile.h"
#include "platform/sqlite/StoreQueue.h"

#include <array>
#include <chrono>
#include <cstddef>
#include <cstdint>
#include <memory>
#include <optional>
#include <span>
#include <string>
#include <vector>

namespace vela::platform {

struct StoreStatus {
    std::int64_t rows = 0;
    std::uint64_t bytes = 0; ///< of the file, without its log
    std::int64_t evicted = 0;
    std::uint64_t failures = 0; ///< commits that failed since the start
    std::string lastError;      ///< of the last failure; stays after it is over
    bool degraded = false;      ///< the last commit failed
    std::array<StoreUsage, kDeliveryBackends> backends{};
};

class StoreWriter {
public:
    struct Options {
        StoreFile::Options file;
        std::size_t commitMessages = 64;
        std::chrono::milliseconds commitDelay{250};
    };
    static constexpr int kLedgerDelays = 4;

    /// `queue` and `ledger` outlive the writer.
    StoreWriter(Options options, StoreQueue& queue, DeliveryLedger& ledger);

    /// Opens the file and gives the ledger what an earlier run left. A full or failing disk is no failure here: it is
    /// tried again later.
    Result<Done> open(MonotonicTime now);

    /// Does what is due at `now`, and answers when it wants to be called again without anything new.
    std::optional<MonotonicTime> run(MonotonicTime now);
    /// Stores or drops everything that is left.
    void finish(MonotonicTime now);

    StoreStatus status() const;

private:
    bool isDue(const StoreQueue::State& state, MonotonicTime now);
    void startTimes(const StoreQueue::State& state, MonotonicTime now);
    std::optional<MonotonicTime> nextTime() const;
    void commit(MonotonicTime now);
    bool commitWaiting(MonotonicTime now);
    bool probe(MonotonicTime now);
    bool takeMore();
    std::span<StoreRecord> nextGroup();
    bool store(std::span<StoreRecord> group, MonotonicTime now);
    Result<Done> openFile();
    Result<std::size_t> attempt(std::span<StoreRecord> group);
    void settle(std::span<StoreRecord> group, bool stored);
    void noteFailure(const Failure& failure, MonotonicTime now);
    void noteSuccess();

    const Options options_;
    StoreQueue& queue_;
    DeliveryLedger& ledger_;

    std::unique_ptr<StoreFile> file_; ///< null until a full disk let it open
    std::vector<StoreRecord> taken_;
    std::size_t settled_ = 0;               ///< of those taken
    std::optional<MonotonicTime> commitAt_; ///< for the oldest record that waits
    std::optional<MonotonicTime> ledgerAt_; ///< for the ledger alone
    std::optional<MonotonicTime> retryAt_;  ///< while commits fail: not before
    std::chrono::milliseconds retryDelay_{0};
    std::uint64_t flush_ = 0;     ///< newest that was answered
    std::uint64_t lostSince_ = 0; ///< deliveries dropped since commits fail

    mutable Mutex mutex_;
    StoreStatus status_ VELA_GUARDED_BY(mutex_);
};

} // namespace vela::platform
