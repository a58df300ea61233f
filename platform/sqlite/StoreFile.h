// The store's open file: one transaction after another of groups of records with the ledger's accounts.
//
// The size stays below a bound: when the pages in use come near it, the oldest records go, first those of the back end
// that is furthest above its share. What a back end leaves of its share others may use until it wants it. Confined to
// the thread that owns it.
#pragma once

#include "common/DeliveryLedger.h"
#include "platform/Result.h"
#include "platform/sqlite/LedgerTable.h"
#include "platform/sqlite/ShapeTable.h"
#include "platform/sqlite/SqliteDatabase.h"
#include "platform/sqlite/StoreTable.h"

#include <array>
#include <cstddef>
#include <cstdint>
#include <memory>
#include <span>
#include <string>
#include <vector>

namespace vela::platform {

class StoreFile {
public:
    struct Options {
        std::string path;
        std::uint64_t maxBytes = 256 * 1024 * 1024;
        std::string vfs; ///< name of SQLite's layer to the operating system's files; empty for the usual one
    };
    /// Parts of the whole that each back end is sure of, by number.
    static constexpr std::array<std::int64_t, kDeliveryBackends> kShares{8, 4, 1, 1, 2};

    /// Opens the file, or makes it, readable for everybody; recovers what a crash left.
    static Result<std::unique_ptr<StoreFile>> open(const Options& options);
    ~StoreFile();
    StoreFile(const StoreFile&) = delete;
    StoreFile& operator=(const StoreFile&) = delete;

    Result<std::vector<LedgerRow>> ledgerRows();

    /// Stores the first of the records, as many as one transaction takes, and the ledger's changes: all or nothing.
    /// Answers how many; 0 only of none. A record that is too large for this file is among them, marked as refused and
    /// left out.
    Result<std::size_t> store(std::span<StoreRecord> records, DeliveryLedger& ledger);

    /// By number of the back end, as of the last commit.
    std::array<StoreUsage, kDeliveryBackends> usage() const;
    /// Of the file, without its log.
    std::uint64_t fileBytes() const { return static_cast<std::uint64_t>(pages_) * kPageBytes; }
    /// Rows of more bytes together are stored in several transactions.
    std::size_t groupBytes() const { return static_cast<std::size_t>(groupBytes_); }

private:
    static constexpr std::int64_t kPageBytes = 4096;
    /// What one transaction takes up.
    struct Group {
        std::size_t records = 0; ///< the refused ones among them
        std::int64_t bytes = 0;  ///< of their rows
        StoredDeliveries deliveries;
    };
    enum class Insertion : std::uint8_t { Done, TooMuch, Failed };

    StoreFile(SqliteDatabase database, const Options& options);
    Result<Done> prepare(const std::string& path);
    bool loadTables();

    bool insertAll(std::span<StoreRecord> records, Group& group);
    Insertion insert(StoreRecord& record, Group& group);
    std::string_view encode(const Dictionary& payload, bool withKeys);

    bool makeRoom(std::int64_t bytes);
    bool evictPiece(std::int64_t bytes);
    bool measure();
    bool shrink();
    bool trim();
    Result<Done> boundLog();
    bool finish();
    Failure rollBack();

    SqliteDatabase database_;
    const std::int64_t maxPages_;
    const std::int64_t groupBytes_;
    const std::int64_t largestRow_;
    ShapeTable shapes_;
    LedgerTable ledger_;
    std::vector<StoreTable> tables_; ///< by number of the back end
    SqliteStatement begin_;
    SqliteStatement commit_;
    SqliteStatement rollBack_;
    SqliteStatement pageCount_;
    SqliteStatement freePages_;

    std::int64_t lastSeq_ = 0;
    std::int64_t keptSeq_ = 0; ///< as of the last commit
    std::int64_t pages_ = 0;
    std::int64_t usedPages_ = 0;
    std::int64_t logPages_ = 0; ///< that the log holds since it began anew
    std::string values_;        ///< kept for its memory
    Dictionary encoded_;        ///< whose text values_ is; while a group is inserted
    bool encodedWithKeys_ = false;
};

} // namespace vela::platform
