// The rows of one back end, and the account of them. Confined to the thread that owns the database.
#pragma once

#include "platform/sqlite/SqliteDatabase.h"
#include "platform/sqlite/StoreRecord.h"

#include <array>
#include <cstddef>
#include <cstdint>
#include <optional>
#include <span>
#include <string>
#include <string_view>
#include <vector>

namespace vela::platform {

/// The row of a back end in the table `backend`.
struct StoreUsage {
    std::int64_t rows = 0;
    std::int64_t bytes = 0; ///< a sum of estimates, see StoreTable::rowBytes
    std::int64_t evicted = 0;
    std::int64_t evictedMarks = 0; ///< records that are no deliveries
    std::int64_t lastEvicted = 0;  ///< number of the newest evicted record

    friend bool operator==(const StoreUsage&, const StoreUsage&) = default;
};

/// What of a record only the store knows.
struct StoreRow {
    std::int64_t seq = 0;
    std::int64_t shape = 0; ///< 0: `values` is the whole payload
    std::string_view values;
};

class StoreTable {
public:
    /// `database` outlives the table.
    StoreTable(SqliteDatabase& database, DeliveryBackend backend) : database_(&database), backend_(backend) {}
    [[nodiscard]] bool load();

    DeliveryBackend backend() const { return backend_; }
    const StoreUsage& usage() const { return usage_; }
    /// Number of the newest record that the table ever held; 0 when there was none.
    std::int64_t newest() const { return newest_; }
    std::int64_t oldest();

    /// What a row counts for: about what it takes in the file, its entry in the index included.
    static std::int64_t rowBytes(std::size_t values, std::size_t name, std::size_t bytes);

    /// Takes a row, which is written with others: by `writeRows`, or earlier when many wait. `record` lives until then.
    [[nodiscard]] bool insert(const StoreRecord& record, const StoreRow& row);
    [[nodiscard]] bool writeRows();
    /// Deletes the oldest rows until `bytes` are freed or none is left.
    [[nodiscard]] bool evict(std::int64_t bytes);

    // The end of a transaction.
    /// Writes the account when it changed.
    [[nodiscard]] bool writeUsage();
    void committed() { kept_ = usage_; }
    void rolledBack();

private:
    /// Rows that one statement writes: a statement by itself costs as much as some rows.
    static constexpr std::array<std::size_t, 3> kRowsTogether{64, 16, 1};

    /// Values that wait for no more rows.
    static constexpr std::size_t kBytesTogether = 256 * 1024;

    struct WaitingRow {
        const StoreRecord* record = nullptr;
        std::int64_t seq = 0;
        std::int64_t shape = 0;
        std::size_t begin = 0; ///< of its values in waitingValues_
        std::size_t end = 0;
    };

    /// What a row's place in a statement is bound to. Rows of one session differ in little, and what stays the same
    /// need not be bound anew.
    struct BoundRow {
        std::optional<std::int64_t> session;
        std::optional<std::int64_t> operation;
        std::optional<std::int64_t> category;
        std::optional<std::int64_t> type;
        std::optional<std::int64_t> shape;
        std::optional<std::int64_t> number;
        bool hasName = false;
        bool hasRecord = false;
    };
    struct Insertion {
        SqliteStatement statement;
        std::vector<BoundRow> bound; ///< one for each of its rows
    };

    void forgetRows();
    [[nodiscard]] bool prepare(Insertion& insertion, std::size_t rows);
    [[nodiscard]] bool write(Insertion& insertion, std::span<const WaitingRow> rows);
    void bind(Insertion& insertion, std::size_t place, const WaitingRow& row);

    SqliteDatabase* database_;
    DeliveryBackend backend_;
    std::array<Insertion, kRowsTogether.size()> insertions_; ///< made when they are first needed
    SqliteStatement oldest_;
    SqliteStatement delete_;
    SqliteStatement account_;
    StoreUsage usage_;
    StoreUsage kept_; ///< as the last commit left it
    std::int64_t newest_ = 0;
    std::vector<WaitingRow> waiting_;
    std::string waitingValues_;
};

} // namespace vela::platform
