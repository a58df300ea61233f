#include "platform/sqlite/SqliteDatabase.h"

#include <cerrno>
#include <sqlite3.h>
#include <utility>

namespace vela::platform {

namespace {

int errorNumberOf(sqlite3* database) {
    const int system = sqlite3_system_errno(database);
    switch (sqlite3_errcode(database)) {
    case SQLITE_FULL:
        return ENOSPC;
    case SQLITE_IOERR:
        return system != 0 ? system : EIO;
    case SQLITE_CANTOPEN:
        return system != 0 ? system : ENOENT;
    case SQLITE_NOMEM:
        return ENOMEM;
    case SQLITE_BUSY:
    case SQLITE_LOCKED:
        return EBUSY;
    case SQLITE_READONLY:
    case SQLITE_PERM:
        return EACCES;
    default:
        return 0;
    }
}

// SQLite counts its memory, under a lock, for those who ask. Nobody does here.
void configureOnce() { [[maybe_unused]] static const int done = sqlite3_config(SQLITE_CONFIG_MEMSTATUS, 0); }

} // namespace

Result<SqliteDatabase> SqliteDatabase::open(const std::string& path, Access access, const std::string& vfs) {
    configureOnce();
    const int flags = (access == Access::ReadOnly ? SQLITE_OPEN_READONLY : SQLITE_OPEN_READWRITE) | SQLITE_OPEN_NOMUTEX;
    sqlite3* handle = nullptr;
    const int code = sqlite3_open_v2(path.c_str(), &handle, flags, vfs.empty() ? nullptr : vfs.c_str());
    SqliteDatabase database(handle);
    if (code != SQLITE_OK) {
        return handle == nullptr ? Failure{ENOMEM, path + ": out of memory"} : database.failure(path);
    }
    sqlite3_extended_result_codes(handle, 0);
    return database;
}

SqliteDatabase::SqliteDatabase(SqliteDatabase&& other) noexcept : database_(std::exchange(other.database_, nullptr)) {}

SqliteDatabase& SqliteDatabase::operator=(SqliteDatabase&& other) noexcept {
    std::swap(database_, other.database_);
    return *this;
}

SqliteDatabase::~SqliteDatabase() { sqlite3_close_v2(database_); }

bool SqliteDatabase::execute(const std::string& sql) {
    return sqlite3_exec(database_, sql.c_str(), nullptr, nullptr, nullptr) == SQLITE_OK;
}

SqliteStatement SqliteDatabase::prepare(std::string_view sql) {
    sqlite3_stmt* statement = nullptr;
    sqlite3_prepare_v3(database_, sql.data(), static_cast<int>(sql.size()), SQLITE_PREPARE_PERSISTENT, &statement,
                       nullptr);
    return SqliteStatement(statement);
}

std::optional<std::int64_t> SqliteDatabase::integer(std::string_view sql) {
    SqliteStatement statement = prepare(sql);
    if (!statement || statement.step() != SqliteStatement::Step::Row) {
        return std::nullopt;
    }
    return statement.integer(0);
}

std::optional<std::string> SqliteDatabase::text(std::string_view sql) {
    SqliteStatement statement = prepare(sql);
    if (!statement || statement.step() != SqliteStatement::Step::Row) {
        return std::nullopt;
    }
    return std::string(statement.text(0));
}

Failure SqliteDatabase::failure(std::string_view what) const {
    return {errorNumberOf(database_), std::string(what) + ": " + sqlite3_errmsg(database_)};
}

void SqliteDatabase::keepLog() {
    int keep = 1;
    sqlite3_file_control(database_, "main", SQLITE_FCNTL_PERSIST_WAL, &keep);
}

bool SqliteDatabase::checkpoint(Checkpoint how) {
    const int mode = how == Checkpoint::Everything ? SQLITE_CHECKPOINT_RESTART : SQLITE_CHECKPOINT_PASSIVE;
    return sqlite3_wal_checkpoint_v2(database_, "main", mode, nullptr, nullptr) == SQLITE_OK;
}

void SqliteDatabase::setPatience(int milliseconds) { sqlite3_busy_timeout(database_, milliseconds); }

} // namespace vela::platform
