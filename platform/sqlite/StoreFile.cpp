#include "platform/sqlite/StoreFile.h"

#include "common/values/Json.h"
#include "platform/sqlite/StoreSchema.h"

#include <algorithm>
#include <cerrno>
#include <fcntl.h>
#include <filesystem>
#include <sqlite3.h>
#include <sys/stat.h>
#include <system_error>
#include <unistd.h>
#include <utility>

namespace vela::platform {

namespace {

constexpr std::int64_t kCheckpointPages = 1000;
constexpr std::int64_t kSmallestGroup = 64 * 1024;
constexpr std::int64_t kLargestGroup = 4 * 1024 * 1024;

std::int64_t pagesOf(std::uint64_t bytes, std::int64_t pageBytes) {
    return static_cast<std::int64_t>(bytes) / pageBytes;
}

// Must not touch a file that this process has open: closing it would give up SQLite's locks on it.
Result<Done> createIfMissing(const std::string& path) {
    std::error_code ignored;
    std::filesystem::create_directories(std::filesystem::path(path).parent_path(), ignored);
    const int descriptor = ::open(path.c_str(), O_RDWR | O_CREAT | O_EXCL | O_CLOEXEC, 0644);
    if (descriptor < 0) {
        const int error = errno;
        return error == EEXIST ? Result<Done>(Done())
                               : Failure{error, path + ": " + std::generic_category().message(error)};
    }
    // Whatever the umask; SQLite gives the log and its index the same permissions.
    fchmod(descriptor, 0644);
    close(descriptor);
    return Done();
}

int countLogPages(void* counter, sqlite3*, const char*, int pages) {
    *static_cast<std::int64_t*>(counter) = pages;
    return SQLITE_OK;
}

ShapeTable::Bounds shapeBounds(std::uint64_t maxBytes) {
    ShapeTable::Bounds bounds;
    bounds.bytes = std::min(bounds.bytes, static_cast<std::int64_t>(maxBytes / 64));
    return bounds;
}

} // namespace

StoreFile::StoreFile(SqliteDatabase database, const Options& options)
    : database_(std::move(database)),
      maxPages_(pagesOf(options.maxBytes, kPageBytes)),
      groupBytes_(std::clamp(static_cast<std::int64_t>(options.maxBytes / 16), kSmallestGroup, kLargestGroup)),
      largestRow_(static_cast<std::int64_t>(options.maxBytes / 4)),
      shapes_(database_, shapeBounds(options.maxBytes)),
      ledger_(database_) {}

StoreFile::~StoreFile() = default;

Result<std::unique_ptr<StoreFile>> StoreFile::open(const Options& options) {
    if (const Result<Done> created = createIfMissing(options.path); !created) {
        return created.failure();
    }
    Result<SqliteDatabase> database =
        SqliteDatabase::open(options.path, SqliteDatabase::Access::ReadWrite, options.vfs);
    if (!database) {
        return database.failure();
    }
    std::unique_ptr<StoreFile> file(new StoreFile(*std::move(database), options));
    if (const Result<Done> prepared = file->prepare(options.path); !prepared) {
        return prepared.failure();
    }
    return file;
}

Result<Done> StoreFile::prepare(const std::string& path) {
    constexpr int kPatience = 2000; // milliseconds, for what a person does to the file with other tools
    database_.setPatience(kPatience);
    if (Result<Done> prepared = prepareSchema(database_, path); !prepared) {
        return prepared;
    }
    database_.keepLog();
    if (database_.text("PRAGMA journal_mode = WAL") != "wal") {
        return Failure{EINVAL, path + " cannot have a write-ahead log where it is"};
    }
    if (!database_.execute("PRAGMA synchronous = FULL; PRAGMA wal_autocheckpoint = 0; "
                           "PRAGMA journal_size_limit = 8388608")) {
        return database_.failure(path);
    }
    sqlite3_wal_hook(database_.handle(), countLogPages, &logPages_);
    if (!loadTables() || !shrink()) {
        return database_.failure(path);
    }
    return Done();
}

bool StoreFile::loadTables() {
    begin_ = database_.prepare("BEGIN IMMEDIATE");
    commit_ = database_.prepare("COMMIT");
    rollBack_ = database_.prepare("ROLLBACK");
    pageCount_ = database_.prepare("PRAGMA page_count");
    freePages_ = database_.prepare("PRAGMA freelist_count");
    if (!begin_ || !commit_ || !rollBack_ || !pageCount_ || !freePages_ || !ledger_.load()) {
        return false;
    }
    for (std::size_t number = 0; number < kDeliveryBackends; ++number) {
        StoreTable& table = tables_.emplace_back(database_, static_cast<DeliveryBackend>(number));
        if (!table.load()) {
            return false;
        }
        lastSeq_ = std::max(lastSeq_, table.newest());
        shapes_.setOldest(table.backend(), table.oldest());
    }
    keptSeq_ = lastSeq_;
    return shapes_.load(lastSeq_) && measure();
}

Result<std::vector<LedgerRow>> StoreFile::ledgerRows() {
    std::optional<std::vector<LedgerRow>> rows = ledger_.rows();
    if (!rows) {
        return database_.failure("cannot read the ledger");
    }
    return *std::move(rows);
}

Result<std::size_t> StoreFile::store(std::span<StoreRecord> records, DeliveryLedger& ledger) {
    if (const Result<Done> bounded = boundLog(); !bounded) {
        return bounded.failure();
    }
    Group group;
    if (!begin_.run() || !insertAll(records, group) || !makeRoom(groupBytes_) ||
        !ledger_.write(ledger, group.deliveries) || !finish()) {
        return rollBack();
    }
    keptSeq_ = lastSeq_;
    ledger_.committed();
    for (StoreTable& table : tables_) {
        table.committed();
    }
    trim();
    if (logPages_ >= kCheckpointPages) {
        // A failure here leaves the log longer; when it grows too long, that is a failure of its own.
        database_.checkpoint(SqliteDatabase::Checkpoint::WhatIsFree);
    }
    return group.records;
}

bool StoreFile::finish() {
    return std::ranges::all_of(tables_, [](StoreTable& table) { return table.writeUsage(); }) && commit_.run();
}

// The connection stays: after a commit whose flush failed, a new one would take the group up from the log.
Failure StoreFile::rollBack() {
    Failure failure = database_.failure("cannot store deliveries");
    // SQLite may have ended the transaction by itself; then this fails and does no harm.
    if (sqlite3_get_autocommit(database_.handle()) == 0 && !rollBack_.run()) {
        failure.description += "; taking them back failed too";
    }
    lastSeq_ = keptSeq_;
    ledger_.rolledBack();
    for (StoreTable& table : tables_) {
        table.rolledBack();
        shapes_.setOldest(table.backend(), table.usage().lastEvicted + 1);
    }
    if (!shapes_.rolledBack(lastSeq_)) {
        failure.description += "; the key lists cannot be read";
    }
    return failure;
}

bool StoreFile::insertAll(std::span<StoreRecord> records, Group& group) {
    Insertion last = Insertion::Done;
    for (StoreRecord& record : records) {
        last = insert(record, group);
        if (last != Insertion::Done) {
            break;
        }
        ++group.records;
    }
    encoded_ = Dictionary();
    return last != Insertion::Failed &&
           std::ranges::all_of(tables_, [](StoreTable& table) { return table.writeRows(); });
}

// A payload's text may be many times as long as what the queue counted it for, so its bytes are known only here.
StoreFile::Insertion StoreFile::insert(StoreRecord& record, Group& group) {
    record.refused.reset(); // by an attempt that failed, in which its keys stood in its row
    const std::int64_t seq = lastSeq_ + 1;
    const std::optional<std::int64_t> shape = shapes_.shapeOf(record.backend, record.name, record.payload, seq);
    if (!shape) {
        return Insertion::Failed;
    }
    const std::string_view values = encode(record.payload, *shape == ShapeTable::kNoShape);
    const std::int64_t bytes =
        StoreTable::rowBytes(values.size(), record.name.view().size(), record.bytes.view().size());
    if (bytes > largestRow_) {
        record.refused = DropReason::Limit;
        return Insertion::Done;
    }
    if (group.bytes > 0 && group.bytes + bytes > groupBytes_) {
        return Insertion::TooMuch;
    }
    // More than every transaction leaves free for the next; nothing waits to be written yet.
    if (bytes > groupBytes_ && !makeRoom(bytes)) {
        return Insertion::Failed;
    }
    if (!tables_[static_cast<std::size_t>(record.backend)].insert(record, {seq, *shape, values})) {
        return Insertion::Failed;
    }
    lastSeq_ = seq;
    group.bytes += bytes;
    if (record.entry != nullptr) {
        group.deliveries.add(*record.entry, record.backend);
    }
    return Insertion::Done;
}

// The two analytics events of a message say the same and come one behind the other.
std::string_view StoreFile::encode(const Dictionary& payload, bool withKeys) {
    if (payload.hasSameEntries(encoded_) && withKeys == encodedWithKeys_ && !payload.empty()) {
        return values_;
    }
    encoded_ = payload;
    encodedWithKeys_ = withKeys;
    values_.clear();
    if (withKeys) {
        appendJson(values_, Value(payload));
    } else {
        appendJsonValues(values_, payload);
    }
    return values_;
}

std::array<StoreUsage, kDeliveryBackends> StoreFile::usage() const {
    std::array<StoreUsage, kDeliveryBackends> usage;
    for (std::size_t number = 0; number < kDeliveryBackends; ++number) {
        usage[number] = tables_[number].usage();
    }
    return usage;
}

} // namespace vela::platform
