#include "platform/sqlite/StoreReader.h"

#include "platform/sqlite/StoreSchema.h"

#include <algorithm>
#include <cerrno>
#include <system_error>
#include <thread>
#include <unistd.h>
#include <utility>

namespace vela::platform {

namespace {

// Only a parameter lets SQLite find a session by its index, through the view.
std::string queryFor(const StoreFilter& filter) {
    std::string sql =
        "SELECT seq, time, backend, operation, name, session_id, category, type, payload, metric_id, record "
        "FROM deliveries WHERE seq > ?1";
    if (filter.backend) {
        sql += " AND backend = ?2";
    }
    if (filter.session) {
        sql += " AND session_id = ?3";
    }
    if (filter.since) {
        sql += " AND time >= ?4";
    }
    return sql + " ORDER BY seq LIMIT ?5";
}

std::optional<std::int64_t> optionalInteger(const SqliteStatement& row, int column) {
    return row.isNull(column) ? std::nullopt : std::optional(row.integer(column));
}

StoredDelivery deliveryOf(const SqliteStatement& row) {
    StoredDelivery delivery;
    delivery.seq = row.integer(0);
    delivery.time = row.real(1);
    delivery.backend = row.text(2);
    delivery.operation = row.text(3);
    if (!row.isNull(4)) {
        delivery.name = row.text(4);
    }
    delivery.session = optionalInteger(row, 5);
    delivery.category = optionalInteger(row, 6);
    delivery.type = optionalInteger(row, 7);
    delivery.payload = row.text(8);
    delivery.metricID = optionalInteger(row, 9);
    if (!row.isNull(10)) {
        delivery.record = row.bytes(10);
    }
    return delivery;
}

} // namespace

Result<StoreReader> StoreReader::open(const std::string& path) {
    if (access(path.c_str(), R_OK) != 0) {
        const int error = errno;
        return Failure{error, path + ": " + std::generic_category().message(error)};
    }
    Result<SqliteDatabase> database = SqliteDatabase::open(path, SqliteDatabase::Access::ReadOnly);
    if (!database) {
        return database.failure();
    }
    StoreReader reader(*std::move(database));
    constexpr int kPatience = 1000; // milliseconds; while the service recovers the file after a crash
    reader.database_.setPatience(kPatience);
    if (const Result<Done> checked = checkSchema(reader.database_, path); !checked) {
        return checked.failure();
    }
    return reader;
}

Result<std::vector<StoredDelivery>> StoreReader::read(const StoreFilter& filter, std::size_t limit) {
    SqliteStatement rows = database_.prepare(queryFor(filter));
    if (!rows) {
        return database_.failure("cannot read deliveries");
    }
    rows.bind(1, filter.after);
    if (filter.backend) {
        rows.bindText(2, nameOf(*filter.backend));
    }
    if (filter.session) {
        rows.bind(3, *filter.session);
    }
    if (filter.since) {
        rows.bindReal(4, *filter.since);
    }
    rows.bind(5, static_cast<std::int64_t>(limit));
    std::vector<StoredDelivery> deliveries;
    SqliteStatement::Step step = rows.step();
    for (; step == SqliteStatement::Step::Row; step = rows.step()) {
        deliveries.push_back(deliveryOf(rows));
    }
    if (step == SqliteStatement::Step::Failed) {
        return database_.failure("cannot read deliveries");
    }
    return deliveries;
}

Result<bool> StoreReader::changed() {
    const std::optional<std::int64_t> version = database_.integer("PRAGMA data_version");
    if (!version) {
        return database_.failure("cannot read deliveries");
    }
    return std::exchange(version_, version) != version;
}

Result<bool> StoreReader::waitForChange(std::chrono::milliseconds timeout) {
    // Asking costs a few microseconds. A watch on the log would wake before the commit can be seen.
    constexpr std::chrono::milliseconds kStep{100};
    const auto end = std::chrono::steady_clock::now() + timeout;
    while (true) {
        Result<bool> result = changed();
        const auto left = end - std::chrono::steady_clock::now();
        if (!result || *result || left <= std::chrono::nanoseconds::zero()) {
            return result;
        }
        std::this_thread::sleep_for(std::min<std::chrono::nanoseconds>(kStep, left));
    }
}

} // namespace vela::platform
