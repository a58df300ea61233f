// Tables of the store's file, how a file is recognised, and how one of an older version becomes a new one.
// docs/store.md describes the format. Free functions, for the thread that owns the connection.
#pragma once

#include "common/DeliveryLedger.h"
#include "platform/Result.h"
#include "platform/sqlite/SqliteDatabase.h"

#include <cstdint>
#include <span>
#include <string>

namespace vela::platform {

/// "VeLa": application_id in the header of every file of the store.
inline constexpr std::int64_t kStoreApplication = 0x56654C61;
/// user_version of the files that this program writes.
inline constexpr std::int64_t kStoreVersion = 1;

/// Statements that make a file of version `from` one of version `from + 1`.
struct StoreMigration {
    std::int64_t from;
    const char* sql;
};

/// Every step from the first version on; version 1 is the first.
std::span<const StoreMigration> storeMigrations();

/// Makes the tables in an empty file, or brings those of an older version up to date, a step a transaction. Refuses a
/// newer version, a version without a step, and any file that is not the store's; such a file is left as it is. `path`
/// is for the failure's text.
Result<Done> prepareSchema(SqliteDatabase& database, const std::string& path,
                           std::span<const StoreMigration> migrations = storeMigrations());

/// Whether this program can read the file.
Result<Done> checkSchema(SqliteDatabase& database, const std::string& path);

} // namespace vela::platform
