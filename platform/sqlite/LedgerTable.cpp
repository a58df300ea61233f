#include "platform/sqlite/LedgerTable.h"

#include <cstddef>

namespace vela::platform {

namespace {

std::int64_t stored(std::uint64_t number) { return static_cast<std::int64_t>(number); }
std::uint64_t counted(std::int64_t number) { return static_cast<std::uint64_t>(number); }

constexpr int kFirstReason = 6; // column, from 0

} // namespace

void StoredDeliveries::add(const LedgerEntry& entry, DeliveryBackend backend) {
    if (last_ == nullptr || last_->entry != &entry) {
        last_ = &accounts_[{entry.client, entry.reporterID}];
        last_->entry = &entry;
    }
    ++last_->delivered[static_cast<std::size_t>(backend)];
}

bool LedgerTable::load() {
    put_ = database_.prepare(
        "INSERT OR REPLACE INTO ledger VALUES(?1, ?2, ?3, ?4, ?5, ?6, ?7, ?8, ?9, ?10, ?11, ?12, ?13, ?14, ?15)");
    erase_ = database_.prepare("DELETE FROM ledger WHERE client = ?1 AND session = ?2 AND backend = ?3");
    clear_ = database_.prepare("DELETE FROM ledger");
    return put_ && erase_ && clear_;
}

std::optional<std::vector<LedgerRow>> LedgerTable::rows() {
    SqliteStatement read =
        database_.prepare("SELECT client, session, backend, received, delivered, redundant, no_consumer, no_backends, "
                          "not_reported, \"limit\", failed, queue_full, store_failed, abandoned, restart FROM ledger");
    if (!read) {
        return std::nullopt;
    }
    std::vector<LedgerRow> rows;
    SqliteStatement::Step step = read.step();
    for (; step == SqliteStatement::Step::Row; step = read.step()) {
        const std::int64_t backend = read.integer(2);
        if (backend < 0 || backend >= static_cast<std::int64_t>(kDeliveryBackends)) {
            continue;
        }
        LedgerRow& row = rows.emplace_back();
        row.client = static_cast<std::int32_t>(read.integer(0));
        row.reporterID = read.integer(1);
        row.backend = static_cast<DeliveryBackend>(backend);
        row.counts.received = counted(read.integer(3));
        row.counts.delivered = counted(read.integer(4));
        row.counts.redundant = counted(read.integer(5));
        for (std::size_t reason = 0; reason < kDropReasons; ++reason) {
            row.counts.dropped[reason] = counted(read.integer(kFirstReason + static_cast<int>(reason)));
        }
    }
    return step == SqliteStatement::Step::Done ? std::optional(std::move(rows)) : std::nullopt;
}

bool LedgerTable::write(DeliveryLedger& ledger, const StoredDeliveries& deliveries) {
    const std::vector<LedgerRow> rows = ledger.takeChanged(all_);
    if (all_ && !clear_.run()) {
        return false;
    }
    // Erasures first: an account that was summed up may have been opened again since.
    for (const LedgerRow& row : rows) {
        if (row.counts.received == 0 && !erase(row)) {
            return false;
        }
    }
    for (const LedgerRow& row : rows) {
        const bool below = deliveries.accounts_.contains({row.client, row.reporterID});
        if (row.counts.received != 0 && !below && !put(row.client, row.reporterID, row.backend, row.counts)) {
            return false;
        }
    }
    for (const auto& [name, account] : deliveries.accounts_) {
        for (std::size_t number = 0; number < kDeliveryBackends; ++number) {
            const auto backend = static_cast<DeliveryBackend>(number);
            LedgerCounts counts = account.entry->counts(backend);
            counts.delivered += account.delivered[number];
            if (counts.received != 0 && !put(name.first, name.second, backend, counts)) {
                return false;
            }
        }
    }
    return true;
}

bool LedgerTable::put(std::int32_t client, std::int64_t session, DeliveryBackend backend, const LedgerCounts& counts) {
    put_.bind(1, client);
    put_.bind(2, session);
    put_.bind(3, static_cast<std::int64_t>(backend));
    put_.bind(4, stored(counts.received));
    put_.bind(5, stored(counts.delivered));
    put_.bind(6, stored(counts.redundant));
    for (std::size_t reason = 0; reason < kDropReasons; ++reason) {
        put_.bind(kFirstReason + 1 + static_cast<int>(reason), stored(counts.dropped[reason]));
    }
    return put_.run();
}

bool LedgerTable::erase(const LedgerRow& row) {
    erase_.bind(1, row.client);
    erase_.bind(2, row.reporterID);
    erase_.bind(3, static_cast<std::int64_t>(row.backend));
    return erase_.run();
}

} // namespace vela::platform
