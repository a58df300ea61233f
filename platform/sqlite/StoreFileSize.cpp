// How the store's file and its log stay below their bounds.
#include "platform/sqlite/StoreFile.h"

#include <algorithm>
#include <cerrno>
#include <numeric>

namespace vela::platform {

namespace {

/// A reader that stands still keeps the log from being used anew; beyond this nothing more is written.
constexpr std::int64_t kMostLogPages = 16'384;

} // namespace

bool StoreFile::measure() {
    const bool measured =
        pageCount_.step() == SqliteStatement::Step::Row && freePages_.step() == SqliteStatement::Step::Row;
    if (measured) {
        pages_ = pageCount_.integer(0);
        usedPages_ = pages_ - freePages_.integer(0);
    }
    pageCount_.reset();
    freePages_.reset();
    return measured;
}

// What is in use stays so far below the bound that rows of so many bytes find room below it too.
bool StoreFile::makeRoom(std::int64_t bytes) {
    constexpr int kMostPieces = 256; // a table of bytes that are wrongly estimated must not keep us here
    const std::int64_t reserve = bytes / kPageBytes * 5 / 4 + 16;
    const std::int64_t limit = std::max<std::int64_t>(maxPages_ - reserve, maxPages_ / 2);
    if (!measure()) {
        return false;
    }
    // Some more than is needed, so that not every group has to evict.
    const std::int64_t target = usedPages_ <= limit ? usedPages_ : limit - limit / 64;
    for (int piece = 0; piece < kMostPieces && usedPages_ > target; ++piece) {
        if (!evictPiece((usedPages_ - target) * kPageBytes) || !measure()) {
            return false;
        }
    }
    return true;
}

// Takes up to `bytes` of the back end that is furthest above its share, at most down to that share.
bool StoreFile::evictPiece(std::int64_t bytes) {
    const auto perShare = [](const StoreTable& table) {
        return table.usage().bytes / kShares[static_cast<std::size_t>(table.backend())];
    };
    StoreTable& largest = *std::ranges::max_element(tables_, {}, perShare);
    const std::int64_t whole =
        std::accumulate(tables_.begin(), tables_.end(), std::int64_t{0},
                        [](std::int64_t sum, const StoreTable& table) { return sum + table.usage().bytes; });
    const std::int64_t shares = std::accumulate(kShares.begin(), kShares.end(), std::int64_t{0});
    const std::int64_t above =
        largest.usage().bytes - whole * kShares[static_cast<std::size_t>(largest.backend())] / shares;
    if (!largest.evict(std::min(bytes, std::max(above, bytes / 8)))) {
        return false;
    }
    shapes_.setOldest(largest.backend(), largest.usage().lastEvicted + 1);
    return true;
}

// What an earlier run with a higher bound left.
bool StoreFile::shrink() {
    if (pages_ <= maxPages_) {
        return true;
    }
    if (!begin_.run() || !makeRoom(groupBytes_) || !finish()) {
        return false;
    }
    for (StoreTable& table : tables_) {
        table.committed();
    }
    std::int64_t before = pages_ + 1;
    while (pages_ > maxPages_ && pages_ < before) {
        before = pages_;
        if (!trim() || !database_.checkpoint(SqliteDatabase::Checkpoint::WhatIsFree)) {
            return false;
        }
    }
    return true;
}

// Gives the end of a file that is too long back, a piece that the log has room for.
bool StoreFile::trim() {
    constexpr std::int64_t kPiece = 1000;
    const std::int64_t pages = std::min({pages_ - maxPages_, pages_ - usedPages_, kPiece});
    return pages <= 0 || (database_.execute("PRAGMA incremental_vacuum(" + std::to_string(pages) + ")") && measure());
}

Result<Done> StoreFile::boundLog() {
    if (logPages_ <= kMostLogPages) {
        return Done();
    }
    if (database_.checkpoint(SqliteDatabase::Checkpoint::Everything)) {
        logPages_ = 0;
        return Done();
    }
    return Failure{EBUSY, "a reader that stands still keeps " + std::to_string(logPages_ * kPageBytes / 1024 / 1024) +
                              " MiB in the log"};
}

} // namespace vela::platform
