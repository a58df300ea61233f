#include "platform/sqlite/StoreTable.h"

#include <algorithm>
#include <chrono>
#include <string>

namespace vela::platform {

namespace {

std::int64_t microseconds(WallTime time) {
    return std::chrono::floor<std::chrono::microseconds>(time.time_since_epoch()).count();
}

} // namespace

bool StoreTable::load() {
    const std::string name(nameOf(backend_));
    insert_ = database_->prepare("INSERT INTO " + name +
                                 "(seq, ts, session, operation, category, type, shape, name, number, vals, record) "
                                 "VALUES(?1, ?2, ?3, ?4, ?5, ?6, ?7, ?8, ?9, ?10, ?11)");
    oldest_ = database_->prepare("SELECT seq, operation, vals, name, record FROM " + name + " ORDER BY seq");
    delete_ = database_->prepare("DELETE FROM " + name + " WHERE seq <= ?1");
    account_ = database_->prepare("UPDATE backend SET rows = ?1, bytes = ?2, evicted = ?3, evicted_marks = ?4, "
                                  "last_evicted = ?5 WHERE backend = ?6");
    SqliteStatement read = database_->prepare(
        "SELECT rows, bytes, evicted, evicted_marks, last_evicted, (SELECT coalesce(max(seq), 0) FROM " + name +
        ") FROM backend WHERE backend = ?1");
    if (!insert_ || !oldest_ || !delete_ || !account_ || !read) {
        return false;
    }
    read.bind(1, static_cast<std::int64_t>(backend_));
    if (read.step() != SqliteStatement::Step::Row) {
        return false;
    }
    usage_ = {read.integer(0), read.integer(1), read.integer(2), read.integer(3), read.integer(4)};
    kept_ = usage_;
    newest_ = std::max(read.integer(5), usage_.lastEvicted);
    return true;
}

std::int64_t StoreTable::oldest() {
    const bool found = oldest_.step() == SqliteStatement::Step::Row;
    const std::int64_t seq = found ? oldest_.integer(0) : usage_.lastEvicted + 1;
    oldest_.reset();
    return seq;
}

std::int64_t StoreTable::rowBytes(std::size_t values, std::size_t name, std::size_t bytes) {
    constexpr std::size_t kRest = 48; // the other columns, the index's entry and what pages leave empty
    return static_cast<std::int64_t>(values + name + bytes + kRest);
}

bool StoreTable::insert(const StoreRecord& record, const StoreRow& row) {
    const bool named = row.shape == 0 && !record.name.view().empty();
    insert_.bind(1, row.seq);
    insert_.bind(2, microseconds(record.time));
    insert_.bind(3, record.session);
    insert_.bind(4, static_cast<std::int64_t>(record.operation));
    insert_.bind(5, record.category);
    insert_.bind(6, record.type);
    insert_.bind(7, row.shape == 0 ? std::nullopt : std::optional(row.shape));
    if (named) {
        insert_.bindText(8, record.name.view());
    } else {
        insert_.bindNull(8);
    }
    insert_.bind(9, record.number);
    insert_.bindText(10, row.values);
    if (record.operation == StoreOperation::Post) {
        insert_.bindBytes(11, record.bytes);
    } else {
        insert_.bindNull(11);
    }
    if (!insert_.run()) {
        return false;
    }
    ++usage_.rows;
    usage_.bytes += rowBytes(row.values.size(), named ? record.name.view().size() : 0, record.bytes.size());
    return true;
}

bool StoreTable::evict(std::int64_t bytes) {
    StoreUsage after = usage_;
    SqliteStatement::Step step = oldest_.step();
    for (; step == SqliteStatement::Step::Row && usage_.bytes - after.bytes < bytes; step = oldest_.step()) {
        after.lastEvicted = oldest_.integer(0);
        --after.rows;
        // Lengths of columns that are NULL are 0.
        after.bytes -=
            rowBytes(static_cast<std::size_t>(oldest_.length(2)), static_cast<std::size_t>(oldest_.length(3)),
                     static_cast<std::size_t>(oldest_.length(4)));
        ++(isDelivery(static_cast<StoreOperation>(oldest_.integer(1))) ? after.evicted : after.evictedMarks);
    }
    oldest_.reset();
    if (step == SqliteStatement::Step::Failed) {
        return false;
    }
    delete_.bind(1, after.lastEvicted);
    if (after.rows != usage_.rows && !delete_.run()) {
        return false;
    }
    usage_ = after;
    return true;
}

bool StoreTable::writeUsage() {
    if (usage_ == kept_) {
        return true;
    }
    account_.bind(1, usage_.rows);
    account_.bind(2, usage_.bytes);
    account_.bind(3, usage_.evicted);
    account_.bind(4, usage_.evictedMarks);
    account_.bind(5, usage_.lastEvicted);
    account_.bind(6, static_cast<std::int64_t>(backend_));
    return account_.run();
}

} // namespace vela::platform
