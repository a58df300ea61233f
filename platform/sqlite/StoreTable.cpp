#include "platform/sqlite/StoreTable.h"

#include <algorithm>
#include <chrono>
#include <string>

namespace vela::platform {

namespace {

constexpr std::size_t kColumns = 11; // of a row

std::int64_t microseconds(WallTime time) {
    return std::chrono::floor<std::chrono::microseconds>(time.time_since_epoch()).count();
}

/// Whether the row says its name itself; else its shape does.
bool isNamed(const StoreRecord& record, std::int64_t shape) { return shape == 0 && !record.name.view().empty(); }

} // namespace

// "OR FAIL": without it SQLite notes for each statement how to take it back, and a failure takes back the whole
// transaction anyway.
bool StoreTable::prepare(Insertion& insertion, std::size_t rows) {
    std::string sql = "INSERT OR FAIL INTO " + std::string(nameOf(backend_)) +
                      "(seq, ts, session, operation, category, type, shape, name, number, vals, record) VALUES";
    for (std::size_t row = 0; row < rows; ++row) {
        sql += row == 0 ? "(?" : ",(?";
        for (std::size_t column = 1; column < kColumns; ++column) {
            sql += ",?";
        }
        sql += ')';
    }
    insertion.statement = database_->prepare(sql);
    insertion.bound.assign(rows, {});
    return static_cast<bool>(insertion.statement);
}

bool StoreTable::load() {
    const std::string name(nameOf(backend_));
    oldest_ = database_->prepare("SELECT seq, operation, vals, name, record FROM " + name + " ORDER BY seq");
    delete_ = database_->prepare("DELETE FROM " + name + " WHERE seq <= ?1");
    account_ = database_->prepare("UPDATE backend SET rows = ?1, bytes = ?2, evicted = ?3, evicted_marks = ?4, "
                                  "last_evicted = ?5 WHERE backend = ?6");
    SqliteStatement read = database_->prepare(
        "SELECT rows, bytes, evicted, evicted_marks, last_evicted, (SELECT coalesce(max(seq), 0) FROM " + name +
        ") FROM backend WHERE backend = ?1");
    if (!oldest_ || !delete_ || !account_ || !read) {
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
    const std::size_t begin = waitingValues_.size();
    waitingValues_ += row.values;
    waiting_.push_back({&record, row.seq, row.shape, begin, waitingValues_.size()});
    ++usage_.rows;
    usage_.bytes += rowBytes(row.values.size(), isNamed(record, row.shape) ? record.name.view().size() : 0,
                             record.bytes.view().size());
    return (waiting_.size() < kRowsTogether.front() && waitingValues_.size() < kBytesTogether) || writeRows();
}

bool StoreTable::writeRows() {
    bool written = true;
    std::span<const WaitingRow> rest = waiting_;
    for (std::size_t size = 0; size < kRowsTogether.size(); ++size) {
        const std::size_t together = kRowsTogether[size];
        // Not one row more than up to a failure: binding it would clear the failure's text.
        for (; written && rest.size() >= together; rest = rest.subspan(together)) {
            written = write(insertions_[size], rest.first(together));
        }
    }
    forgetRows();
    return written;
}

bool StoreTable::write(Insertion& insertion, std::span<const WaitingRow> rows) {
    if (!insertion.statement && !prepare(insertion, rows.size())) {
        return false;
    }
    for (std::size_t place = 0; place < rows.size(); ++place) {
        bind(insertion, place, rows[place]);
    }
    return insertion.statement.run();
}

void StoreTable::rolledBack() {
    usage_ = kept_;
    forgetRows();
}

void StoreTable::forgetRows() {
    waiting_.clear();
    waitingValues_.clear();
    if (waitingValues_.capacity() > 2 * kBytesTogether) {
        waitingValues_.shrink_to_fit();
    }
}

void StoreTable::bind(Insertion& insertion, std::size_t place, const WaitingRow& row) {
    const StoreRecord& record = *row.record;
    SqliteStatement& statement = insertion.statement;
    BoundRow& bound = insertion.bound[place];
    int column = static_cast<int>(place * kColumns);
    const auto bindWhereOther = [&](std::optional<std::int64_t> number, std::optional<std::int64_t>& before) {
        ++column;
        if (number != before) {
            statement.bind(column, number);
            before = number;
        }
    };
    const auto bindIfAny = [&](bool has, bool& had, const auto& bindIt) {
        ++column;
        if (has) {
            bindIt();
        } else if (had) {
            statement.bindNull(column);
        }
        had = has;
    };
    statement.bind(++column, row.seq);
    statement.bind(++column, microseconds(record.time));
    bindWhereOther(record.session, bound.session);
    bindWhereOther(static_cast<std::int64_t>(record.operation), bound.operation);
    bindWhereOther(record.category, bound.category);
    bindWhereOther(record.type, bound.type);
    bindWhereOther(row.shape == 0 ? std::nullopt : std::optional(row.shape), bound.shape);
    bindIfAny(isNamed(record, row.shape), bound.hasName, [&] { statement.bindText(column, record.name.view()); });
    bindWhereOther(record.number, bound.number);
    statement.bindText(++column, std::string_view(waitingValues_).substr(row.begin, row.end - row.begin));
    bindIfAny(record.operation == StoreOperation::Post, bound.hasRecord,
              [&] { statement.bindBytes(column, record.bytes.view()); });
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
