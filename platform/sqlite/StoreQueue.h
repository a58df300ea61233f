// The way from any thread to the store's writer: bounded in records and bytes, and its callers never wait.
//
// A record is held until the writer has finished with it, so the bounds cover what is being written as well. The writer
// is woken only when it must act: for the first record (it starts the time until the commit), for the one that fills a
// group, for an urgent one, for a first change of the ledger, for a flush and for the end. Thread-safe; `take`,
// `release`, `flushed` and `wait` are the writer's.
#pragma once

#include "platform/sqlite/StoreRecord.h"

#include <algorithm>
#include <atomic>
#include <condition_variable>
#include <cstddef>
#include <cstdint>
#include <deque>
#include <mutex>
#include <optional>
#include <vector>

namespace vela::platform {

class StoreQueue {
public:
    struct Limits {
        std::size_t records = 65'536;
        std::size_t bytes = 32 * 1024 * 1024;
        std::size_t group = 64; ///< records that are committed together
    };
    /// A backlog waits in pieces of so many, whose memory goes round until it is over.
    static constexpr std::size_t kPiece = 4096;

    /// What the writer decides by.
    struct State {
        std::size_t waiting = 0; ///< records not taken yet
        StoreUrgency urgency = StoreUrgency::Usual;
        bool ledgerChanged = false;
        bool closed = false;
        std::uint64_t flush = 0; ///< number of the newest flush asked for
    };

    explicit StoreQueue(const Limits& limits);

    /// Takes the record, or leaves it as it is and answers why.
    std::optional<DropReason> push(StoreRecord& record);
    /// The ledger has something to be written although nothing is stored. Cheap when it was said already.
    void noteLedgerChange();
    /// Asks for a commit of everything pushed so far, and answers the number to wait for.
    std::uint64_t requestFlush();
    void waitFlushed(std::uint64_t flush);
    /// Nothing more is taken; the writer finishes what is there.
    void close();

    /// Records that are held, those being written among them.
    std::size_t held() const;
    /// Whether an eighth or less of its room is free.
    bool isNearlyFull() const;

    State state() const;
    /// The oldest that wait, at most kPiece or one group, in the order pushed. `records` is empty before; its memory
    /// serves those that come.
    void take(std::vector<StoreRecord>& records);
    /// The writer looks at the ledger from here on.
    void clearLedgerChange() { ledgerChanged_.exchange(false); }
    /// So many taken records are finished with.
    void release(std::size_t records, std::size_t bytes);
    void flushed(std::uint64_t flush);
    /// Until the writer must act, or `deadline`; at once when something happened since the last wait. Answers whether
    /// something did.
    bool wait(std::optional<MonotonicTime> deadline);
    /// Ends a wait, whatever its reason.
    void wake();

private:
    std::size_t pieceSize() const { return std::max(kPiece, limits_.group); }
    std::vector<StoreRecord> nextPiece();

    const Limits limits_;

    mutable std::mutex mutex_;
    std::condition_variable writer_;
    std::condition_variable flushers_;
    // Guarded by mutex_.
    std::deque<std::vector<StoreRecord>> pieces_; ///< full ones, the oldest first
    std::vector<StoreRecord> records_;            ///< behind them
    std::vector<std::vector<StoreRecord>> spare_; ///< empty; their memory is used next
    std::size_t waiting_ = 0;
    std::size_t held_ = 0;
    std::size_t heldBytes_ = 0;
    StoreUrgency urgency_ = StoreUrgency::Usual; ///< the greatest of those that wait
    std::uint64_t flush_ = 0;
    std::uint64_t flushed_ = 0;
    bool awake_ = false; ///< something happened since the last wait
    bool closed_ = false;

    std::atomic<bool> ledgerChanged_{false};
};

} // namespace vela::platform
