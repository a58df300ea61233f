// The store of deliveries: a file that one thread of its own writes in groups.
//
// Thread-safe. Adding never waits: it hands the record over, or counts why it could not. The composition root owns the
// store, makes it before the bindings that use it and destroys it behind them; what the ledger counted is in the file
// when it is gone.
#pragma once

#include "common/DeliveryLedger.h"
#include "platform/Clock.h"
#include "platform/Result.h"
#include "platform/sqlite/StoreLock.h"
#include "platform/sqlite/StoreQueue.h"
#include "platform/sqlite/StoreRecord.h"
#include "platform/sqlite/StoreWriter.h"

#include <cstddef>
#include <memory>
#include <optional>
#include <thread>

namespace vela::platform {

class DeliveryStore {
public:
    using Options = StoreWriter::Options;

    /// Opens the file and starts the thread. `ledger` and `clock` outlive the store. Fails when the file is no store or
    /// one of a newer version (it is left as it is then), when another service has it, or when it may not be written; a
    /// full or failing disk only degrades the store until it is over.
    static Result<std::unique_ptr<DeliveryStore>> open(const Options& options, DeliveryLedger& ledger,
                                                       const Clock& clock);
    ~DeliveryStore();
    DeliveryStore(const DeliveryStore&) = delete;
    DeliveryStore& operator=(const DeliveryStore&) = delete;

    /// A record for `add`, of the calling thread's account and its session, counted as received.
    StoreRecord newDelivery(DeliveryBackend backend, StoreOperation operation) const;
    /// Takes the record, stamped with the time; one that is refused is counted as dropped.
    void add(StoreRecord&& record);
    /// Takes the record, or answers why not, for the caller to count.
    std::optional<DropReason> tryAdd(StoreRecord& record);
    /// The ledger counted something that is not stored, so that it is written in time.
    void noteLedgerChange() { queue_.noteLedgerChange(); }

    /// Returns when everything added before is committed, or dropped; answers whether the store works. Not for the
    /// store's own thread, which calls builders and replies.
    bool commitAll();
    /// Commits everything and ends the thread; what comes later is refused. Once, and then by nobody else.
    void close();

    StoreStatus status() const { return writer_.status(); }
    /// Whether it would soon have no room for more, and will have it again: not while the disk fails.
    bool isBehind() const { return queue_.isNearlyFull() && !status().degraded; }

    /// The account of what the calling thread delivers: that of its LedgerScope, or the service's own.
    const std::shared_ptr<LedgerEntry>& account() const;
    const Clock& clock() const { return clock_; }

private:
    DeliveryStore(const Options& options, StoreLock lock, DeliveryLedger& ledger, const Clock& clock);
    void work();

    DeliveryLedger& ledger_;
    const Clock& clock_;
    const StoreLock lock_;
    StoreQueue queue_;
    StoreWriter writer_; ///< the thread's, from the moment it starts
    std::thread thread_;
};

} // namespace vela::platform
