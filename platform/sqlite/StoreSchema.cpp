#include "platform/sqlite/StoreSchema.h"

#include "platform/sqlite/StoreRecord.h"

#include <algorithm>
#include <array>
#include <cerrno>
#include <cstddef>
#include <string_view>

namespace vela::platform {

namespace {

// `bytes` of a back end is a sum of estimates; `evicted` counts deliveries, `evicted_marks` the other records.
constexpr std::string_view kCommonTables = R"(
CREATE TABLE backend(
  backend INTEGER PRIMARY KEY, name TEXT NOT NULL UNIQUE, rows INTEGER NOT NULL DEFAULT 0,
  bytes INTEGER NOT NULL DEFAULT 0, evicted INTEGER NOT NULL DEFAULT 0, evicted_marks INTEGER NOT NULL DEFAULT 0,
  last_evicted INTEGER NOT NULL DEFAULT 0);
CREATE TABLE shape(
  shape INTEGER PRIMARY KEY, backend INTEGER NOT NULL, name TEXT NOT NULL, keys TEXT NOT NULL,
  UNIQUE(backend, name, keys));
CREATE TABLE ledger(
  client INTEGER NOT NULL, session INTEGER NOT NULL, backend INTEGER NOT NULL, received INTEGER NOT NULL,
  delivered INTEGER NOT NULL, redundant INTEGER NOT NULL, no_consumer INTEGER NOT NULL, no_backends INTEGER NOT NULL,
  not_reported INTEGER NOT NULL, "limit" INTEGER NOT NULL, failed INTEGER NOT NULL, queue_full INTEGER NOT NULL,
  store_failed INTEGER NOT NULL, abandoned INTEGER NOT NULL, restart INTEGER NOT NULL,
  PRIMARY KEY(client, session, backend)) WITHOUT ROWID;
)";

constexpr std::string_view kBackendTable = R"(
CREATE TABLE @(
  seq INTEGER PRIMARY KEY, ts INTEGER NOT NULL, session INTEGER, operation INTEGER NOT NULL, category INTEGER,
  type INTEGER, shape INTEGER, name TEXT, number INTEGER, vals TEXT NOT NULL, record BLOB);
CREATE INDEX @_session ON @(session) WHERE session IS NOT NULL;
)";

// The arrow gives a value's own text, so that "1.0" and long digits come back as they were written.
constexpr std::string_view kPayload =
    "CASE WHEN d.shape IS NULL THEN d.vals ELSE "
    "(SELECT '{' || coalesce(group_concat((s.keys -> k.key) || ':' || (d.vals -> k.key), ','), '') || '}' "
    "FROM shape s, json_each(s.keys) k WHERE s.shape = d.shape) END";

std::string replaced(std::string_view text, std::string_view what, std::string_view by) {
    std::string result;
    for (std::size_t place = text.find(what); place != std::string_view::npos; place = text.find(what)) {
        result.append(text.substr(0, place)).append(by);
        text.remove_prefix(place + what.size());
    }
    return result.append(text);
}

std::string operationText() {
    std::string text = "CASE d.operation";
    for (std::size_t number = 0; number < kStoreOperationNames.size(); ++number) {
        text += " WHEN " + std::to_string(number) + " THEN '" + std::string(kStoreOperationNames[number]) + "'";
    }
    return text + " END";
}

// Columns of one name have one affinity in all arms: only then does SQLite take the view apart, and use the tables' own
// order and indexes.
std::string viewArm(DeliveryBackend backend) {
    const std::string name(nameOf(backend));
    const bool telem = backend == DeliveryBackend::Telem;
    std::string payload(kPayload);
    if (backend == DeliveryBackend::Joule) {
        payload = R"('{"client_id":' || d.number || ',"event":' || )" + payload + " || '}'";
    }
    return "SELECT d.seq AS seq, d.ts / 1000000.0 AS time, '" + name + "' AS backend, " + operationText() +
           " AS operation, coalesce(d.name, (SELECT nullif(s.name, '') FROM shape s WHERE s.shape = d.shape)) AS name, "
           "d.session AS session_id, d.category AS category, d.type AS type, " +
           payload + " AS payload, " + (telem ? "d.number" : "CAST(NULL AS INTEGER)") + " AS metric_id, " +
           (telem ? "d.record" : "CAST(NULL AS BLOB)") + " AS record FROM " + name + " d";
}

std::string allTables() {
    static_assert(kDropReasons == 9, "the ledger's table has a column for each reason");
    std::string sql(kCommonTables);
    std::string view;
    for (std::size_t number = 0; number < kDeliveryBackends; ++number) {
        const auto backend = static_cast<DeliveryBackend>(number);
        const std::string name(nameOf(backend));
        sql += replaced(kBackendTable, "@", name);
        sql += "INSERT INTO backend(backend, name) VALUES(" + std::to_string(number) + ", '" + name + "');\n";
        view += (view.empty() ? "" : "\nUNION ALL ") + viewArm(backend);
    }
    return sql + "CREATE VIEW deliveries AS " + view + ";\n";
}

struct SchemaIdentity {
    std::int64_t version = 0;
    std::int64_t application = 0;
    std::int64_t objects = 0;

    bool empty() const { return version == 0 && application == 0 && objects == 0; }
};

Result<SchemaIdentity> identify(SqliteDatabase& database, const std::string& path) {
    const auto version = database.integer("PRAGMA user_version");
    if (!version) {
        return database.failure(path + " is left as it is");
    }
    const auto application = database.integer("PRAGMA application_id");
    const auto objects = database.integer("SELECT count(*) FROM sqlite_schema");
    if (!application || !objects) {
        return database.failure(path + " is left as it is");
    }
    const SchemaIdentity identity{*version, *application, *objects};
    if (!identity.empty() && identity.application != kStoreApplication) {
        return Failure{EINVAL, path + " is a database of something else; it is left as it is"};
    }
    if (identity.version > kStoreVersion) {
        return Failure{EINVAL, path + " has schema version " + std::to_string(identity.version) + ", newer than " +
                                   std::to_string(kStoreVersion) + ", the newest that this program knows"};
    }
    return identity;
}

Result<Done> runInTransaction(SqliteDatabase& database, const std::string& sql, const std::string& what) {
    if (database.execute("BEGIN IMMEDIATE") && database.execute(sql) && database.execute("COMMIT")) {
        return Done();
    }
    Failure failure = database.failure(what);
    if (!database.execute("ROLLBACK")) {
        failure.description += "; taking it back failed too";
    }
    return failure;
}

Result<Done> create(SqliteDatabase& database, const std::string& path) {
    // All before the first table: they decide the form of the file.
    if (!database.execute("PRAGMA page_size = 4096; PRAGMA auto_vacuum = INCREMENTAL; PRAGMA journal_mode = WAL")) {
        return database.failure(path);
    }
    return runInTransaction(database,
                            allTables() + "PRAGMA application_id = " + std::to_string(kStoreApplication) +
                                "; PRAGMA user_version = " + std::to_string(kStoreVersion),
                            "cannot make the tables of " + path);
}

Result<Done> migrate(SqliteDatabase& database, const std::string& path, std::int64_t from,
                     std::span<const StoreMigration> migrations) {
    for (std::int64_t version = from; version < kStoreVersion; ++version) {
        const auto step =
            std::ranges::find_if(migrations, [&](const StoreMigration& each) { return each.from == version; });
        if (step == migrations.end()) {
            return Failure{EINVAL, path + " has schema version " + std::to_string(version) +
                                       ", from which there is no way to version " + std::to_string(kStoreVersion)};
        }
        Result<Done> done = runInTransaction(
            database, std::string(step->sql) + "; PRAGMA user_version = " + std::to_string(version + 1),
            path + " cannot be brought to schema version " + std::to_string(version + 1));
        if (!done) {
            return done;
        }
    }
    return Done();
}

} // namespace

std::span<const StoreMigration> storeMigrations() { return {}; }

Result<Done> prepareSchema(SqliteDatabase& database, const std::string& path,
                           std::span<const StoreMigration> migrations) {
    const Result<SchemaIdentity> identity = identify(database, path);
    if (!identity) {
        return identity.failure();
    }
    return identity->empty() ? create(database, path) : migrate(database, path, identity->version, migrations);
}

Result<Done> checkSchema(SqliteDatabase& database, const std::string& path) {
    const Result<SchemaIdentity> identity = identify(database, path);
    if (!identity) {
        return identity.failure();
    }
    if (identity->empty()) {
        return Failure{ENOENT, path + " holds no deliveries yet"};
    }
    if (identity->version < kStoreVersion) {
        return Failure{EINVAL, path + " has schema version " + std::to_string(identity->version) +
                                   "; the service brings it to version " + std::to_string(kStoreVersion) +
                                   " at its next start"};
    }
    return Done();
}

} // namespace vela::platform
