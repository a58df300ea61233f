// One connection to a database file. Owned by one thread at a time; outlives its statements.
#pragma once

#include "platform/Result.h"
#include "platform/sqlite/SqliteStatement.h"

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

struct sqlite3;

namespace vela::platform {

class SqliteDatabase {
public:
    enum class Access : std::uint8_t { ReadOnly, ReadWrite };

    /// Opens the file, which is not made when it is missing. Nothing of it is read yet. `vfs`: name of the layer to the
    /// operating system's files; empty for the usual one.
    static Result<SqliteDatabase> open(const std::string& path, Access access, const std::string& vfs = {});
    SqliteDatabase(SqliteDatabase&& other) noexcept;
    SqliteDatabase& operator=(SqliteDatabase&& other) noexcept;
    SqliteDatabase(const SqliteDatabase&) = delete;
    SqliteDatabase& operator=(const SqliteDatabase&) = delete;
    ~SqliteDatabase();

    /// Runs statements without parameters whose rows nobody wants.
    [[nodiscard]] bool execute(const std::string& sql);
    /// None when `sql` is wrong for this file.
    SqliteStatement prepare(std::string_view sql);
    /// The first column of the first row.
    std::optional<std::int64_t> integer(std::string_view sql);
    std::optional<std::string> text(std::string_view sql);

    /// What the last call that failed said: `<what>: database or disk is full`. The code is an errno value.
    Failure failure(std::string_view what) const;

    /// The write-ahead log and its index stay after the last connection, so that a user who may only read can read.
    void keepLog();
    enum class Checkpoint : std::uint8_t {
        WhatIsFree, ///< moves what no reader holds back
        Everything, ///< waits for readers, so that the log begins anew
    };
    /// Moves pages from the log into the file. False when it failed or a reader stood in the way for too long.
    bool checkpoint(Checkpoint how);
    /// How long to wait for another connection's lock.
    void setPatience(int milliseconds);

    sqlite3* handle() const { return database_; }

private:
    explicit SqliteDatabase(sqlite3* database) : database_(database) {}

    sqlite3* database_ = nullptr;
};

} // namespace vela::platform
