// The ledger's accounts in the file, written in the transactions of the deliveries that they count. Confined to the
// thread that owns the database.
#pragma once

#include "common/DeliveryLedger.h"
#include "platform/sqlite/SqliteDatabase.h"

#include <array>
#include <cstdint>
#include <map>
#include <optional>
#include <utility>
#include <vector>

namespace vela::platform {

/// Deliveries of one group by account, which count as delivered when their transaction is committed.
class StoredDeliveries {
public:
    /// `entry` is held by whoever holds the group.
    void add(const LedgerEntry& entry, DeliveryBackend backend);

private:
    friend class LedgerTable;
    struct Account {
        const LedgerEntry* entry = nullptr;
        std::array<std::uint64_t, kDeliveryBackends> delivered{};
    };
    using Name = std::pair<std::int32_t, std::int64_t>; ///< client and session

    std::map<Name, Account> accounts_;
    Account* last_ = nullptr; ///< of the last call: neighbours are often of one session
};

class LedgerTable {
public:
    /// `database` outlives the table.
    explicit LedgerTable(SqliteDatabase& database) : database_(database) {}
    [[nodiscard]] bool load();

    /// What an earlier run left; none when the database failed.
    std::optional<std::vector<LedgerRow>> rows();

    /// Writes what changed since the last call as it will be when `deliveries` count.
    [[nodiscard]] bool write(DeliveryLedger& ledger, const StoredDeliveries& deliveries);
    void committed() { all_ = false; }
    /// What was written is lost, so everything is written next time.
    void rolledBack() { all_ = true; }

private:
    [[nodiscard]] bool put(std::int32_t client, std::int64_t session, DeliveryBackend backend,
                           const LedgerCounts& counts);
    [[nodiscard]] bool erase(const LedgerRow& row);

    SqliteDatabase& database_;
    SqliteStatement put_;
    SqliteStatement erase_;
    SqliteStatement clear_;
    bool all_ = true; ///< the first time too: what an earlier run left was summed up anew
};

} // namespace vela::platform
