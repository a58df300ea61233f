// What the store's tests share: a folder, a ledger and a clock for stores, and a second look at their files.
#pragma once

#include "common/DeliveryLedger.h"
#include "platform/sqlite/DeliveryStore.h"
#include "testing/ManualClock.h"
#include "testing/TemporaryFolder.h"

#include <cstdint>
#include <gtest/gtest.h>
#include <memory>
#include <sqlite3.h>
#include <string>
#include <utility>
#include <vector>

namespace vela::platform {

/// Rows of a query through a connection of its own, as "a|b|c", NULL for no value; an error is the only row.
inline std::vector<std::string> queryRows(const std::string& path, const std::string& sql) {
    std::vector<std::string> rows;
    sqlite3* database = nullptr;
    sqlite3_open_v2(path.c_str(), &database, SQLITE_OPEN_READONLY, nullptr);
    const auto collect = [](void* target, int columns, char** values, char**) {
        std::string& row = static_cast<std::vector<std::string>*>(target)->emplace_back();
        for (int column = 0; column < columns; ++column) {
            row += (column == 0 ? "" : "|") + std::string(values[column] == nullptr ? "NULL" : values[column]);
        }
        return 0;
    };
    if (sqlite3_exec(database, sql.c_str(), collect, &rows, nullptr) != SQLITE_OK) {
        rows = {std::string("error: ") + sqlite3_errmsg(database)};
    }
    sqlite3_close(database);
    return rows;
}

/// Writes to a file that no store has open.
inline void changeFile(const std::string& path, const std::string& sql) {
    sqlite3* database = nullptr;
    ASSERT_EQ(sqlite3_open(path.c_str(), &database), SQLITE_OK);
    ASSERT_EQ(sqlite3_exec(database, sql.c_str(), nullptr, nullptr, nullptr), SQLITE_OK) << sqlite3_errmsg(database);
    sqlite3_close(database);
}

class StoreHarness : public ::testing::Test {
protected:
    /// Commits only when it is asked to, unless a test says otherwise.
    StoreHarness() {
        options_.file.path = folder_ / "deliveries.db";
        options_.commitMessages = 1000;
        options_.commitDelay = std::chrono::hours(1);
    }

    std::unique_ptr<DeliveryStore> openStore() {
        Result<std::unique_ptr<DeliveryStore>> store = DeliveryStore::open(options_, ledger_, clock_);
        EXPECT_TRUE(store) << (store ? "" : store.failure().description);
        return store ? *std::move(store) : nullptr;
    }

    std::vector<std::string> query(const std::string& sql) const { return queryRows(options_.file.path, sql); }
    std::string only(const std::string& sql) const { return query(sql).at(0); }
    /// For each back end: delivered in the kept ledger = rows of deliveries + evicted ones, and the rows are counted.
    void expectAccountsToHold() const {
        for (const char* backend : {"beacon", "tally", "joule", "telem", "malady"}) {
            const std::string table(backend);
            std::string sql = "SELECT rows - (SELECT count(*) FROM ";
            sql.append(table).append("), evicted + (SELECT count(*) FROM ").append(table);
            sql += " WHERE operation <= 3) - (SELECT coalesce(sum(delivered), 0) FROM ledger l WHERE l.backend = "
                   "b.backend)"
                   " FROM backend b WHERE name = '";
            sql.append(table).append("'");
            EXPECT_EQ(only(sql), "0|0") << backend;
        }
        EXPECT_EQ(only("PRAGMA integrity_check"), "ok");
    }
    static std::uint64_t dropped(const std::shared_ptr<LedgerEntry>& entry, DeliveryBackend backend,
                                 DropReason reason) {
        return entry->counts(backend).dropped[static_cast<std::size_t>(reason)];
    }

    const vela::testing::TemporaryFolder folder_;
    vela::testing::ManualClock clock_;
    DeliveryLedger ledger_{100};
    DeliveryStore::Options options_;
};

} // namespace vela::platform
