#include "platform/sqlite/SqliteStatement.h"

#include <cstddef>
#include <sqlite3.h>
#include <utility>

namespace vela::platform {

SqliteStatement::SqliteStatement(SqliteStatement&& other) noexcept
    : statement_(std::exchange(other.statement_, nullptr)) {}

SqliteStatement& SqliteStatement::operator=(SqliteStatement&& other) noexcept {
    std::swap(statement_, other.statement_);
    return *this;
}

SqliteStatement::~SqliteStatement() { sqlite3_finalize(statement_); }

void SqliteStatement::bind(int parameter, std::int64_t number) { sqlite3_bind_int64(statement_, parameter, number); }

void SqliteStatement::bindReal(int parameter, double number) { sqlite3_bind_double(statement_, parameter, number); }

void SqliteStatement::bindText(int parameter, std::string_view text) {
    // A null pointer would bind NULL.
    const char* start = text.data() == nullptr ? "" : text.data();
    sqlite3_bind_text64(statement_, parameter, start, text.size(), SQLITE_STATIC, SQLITE_UTF8);
}

void SqliteStatement::bindBytes(int parameter, std::string_view bytes) {
    const char* start = bytes.data() == nullptr ? "" : bytes.data();
    sqlite3_bind_blob64(statement_, parameter, start, bytes.size(), SQLITE_STATIC);
}

void SqliteStatement::bindNull(int parameter) { sqlite3_bind_null(statement_, parameter); }

SqliteStatement::Step SqliteStatement::step() {
    switch (sqlite3_step(statement_)) {
    case SQLITE_ROW:
        return Step::Row;
    case SQLITE_DONE:
        return Step::Done;
    default:
        return Step::Failed;
    }
}

void SqliteStatement::reset() { sqlite3_reset(statement_); }

bool SqliteStatement::run() {
    Step last = step();
    while (last == Step::Row) {
        last = step();
    }
    reset();
    return last == Step::Done;
}

bool SqliteStatement::isNull(int column) const { return sqlite3_column_type(statement_, column) == SQLITE_NULL; }

std::int64_t SqliteStatement::integer(int column) const { return sqlite3_column_int64(statement_, column); }

double SqliteStatement::real(int column) const { return sqlite3_column_double(statement_, column); }

std::string_view SqliteStatement::text(int column) const {
    const unsigned char* start = sqlite3_column_text(statement_, column);
    return {reinterpret_cast<const char*>(start), static_cast<std::size_t>(sqlite3_column_bytes(statement_, column))};
}

std::string_view SqliteStatement::bytes(int column) const {
    const void* start = sqlite3_column_blob(statement_, column);
    return {static_cast<const char*>(start), static_cast<std::size_t>(sqlite3_column_bytes(statement_, column))};
}

std::int64_t SqliteStatement::length(int column) const { return sqlite3_column_bytes(statement_, column); }

} // namespace vela::platform
