#include "platform/sqlite/StoreHarness_test.h"
#include "platform/sqlite/StoreReader.h"
#include "platform/sqlite/StoreTally.h"
#include "platform/sqlite/StoreTelem.h"

#include <filesystem>
#include <fstream>
#include <gmock/gmock.h>

namespace vela::platform {

namespace {

using ::testing::ElementsAre;
using ::testing::HasSubstr;
using ::testing::IsEmpty;
using ::testing::Not;

class StoreReaderTest : public StoreHarness {
protected:
    StoreReader openReader() {
        Result<StoreReader> reader = StoreReader::open(options_.file.path);
        EXPECT_TRUE(reader) << (reader ? "" : reader.failure().description);
        return *std::move(reader);
    }
    std::string refusal() {
        const Result<StoreReader> reader = StoreReader::open(options_.file.path);
        return reader ? "opened" : reader.failure().description;
    }
    /// Events 1, 2, 3 ... a second apart, by turns of the sessions 42 and 43, every third a metric.
    void add(int count) {
        StoreTally tally(*store_, {"*"});
        StoreTelem telem(*store_);
        for (; count > 0; --count) {
            ++number_;
            const LedgerScope scope(ledger_.open(7, number_ % 2 == 0 ? 42 : 43));
            if (number_ % 3 == 0) {
                telem.telemPostMetric(5, "\x01", {{"n", number_}});
            } else {
                tally.tallySendEventLazy("event", [number = number_] { return Dictionary{{"n", number}}; });
            }
            clock_.advance(std::chrono::seconds(1));
        }
        ASSERT_TRUE(store_->commitAll());
    }
    static std::vector<std::int64_t> numbers(const Result<std::vector<StoredDelivery>>& rows) {
        std::vector<std::int64_t> numbers;
        for (const StoredDelivery& row : *rows) {
            numbers.push_back(row.seq);
        }
        return numbers;
    }

    std::unique_ptr<DeliveryStore> store_ = openStore();
    int number_ = 0;
};

TEST_F(StoreReaderTest, ARowHasEveryColumn) {
    add(3);
    const auto rows = openReader().read({});
    ASSERT_TRUE(rows);
    ASSERT_EQ(rows->size(), 3U);
    const StoredDelivery& event = (*rows)[0];
    EXPECT_EQ(event.seq, 1);
    EXPECT_EQ(event.time, 1'700'000'000.0);
    EXPECT_EQ(event.backend, "tally");
    EXPECT_EQ(event.operation, "send");
    EXPECT_EQ(event.name, "event");
    EXPECT_EQ(event.session, 43);
    EXPECT_EQ(event.category, std::nullopt);
    EXPECT_EQ(event.type, std::nullopt);
    EXPECT_EQ(event.payload, R"({"n":1})");
    EXPECT_EQ(event.metricID, std::nullopt);
    EXPECT_EQ(event.record, std::nullopt);
    const StoredDelivery& metric = (*rows)[2];
    EXPECT_EQ(metric.backend, "telem");
    EXPECT_EQ(metric.name, std::nullopt);
    EXPECT_EQ(metric.metricID, 5);
    EXPECT_EQ(metric.record, "\x01");
}

TEST_F(StoreReaderTest, FiltersNarrowWhatIsRead) {
    add(9);
    StoreReader reader = openReader();
    EXPECT_THAT(numbers(reader.read({.backend = DeliveryBackend::Telem})), ElementsAre(3, 6, 9));
    EXPECT_THAT(numbers(reader.read({.backend = DeliveryBackend::Joule})), IsEmpty());
    EXPECT_THAT(numbers(reader.read({.session = 42})), ElementsAre(2, 4, 6, 8));
    EXPECT_THAT(numbers(reader.read({.since = 1'700'000'006.0})), ElementsAre(7, 8, 9));
    EXPECT_THAT(numbers(reader.read({.after = 7})), ElementsAre(8, 9));
    EXPECT_THAT(numbers(reader.read({}, 2)), ElementsAre(1, 2));
    EXPECT_THAT(numbers(reader.read({.backend = DeliveryBackend::Tally, .session = 42, .after = 2})),
                ElementsAre(4, 8));
}

TEST_F(StoreReaderTest, PagesFollowEachOther) {
    add(600);
    StoreReader reader = openReader();
    StoreFilter filter;
    std::vector<std::size_t> sizes;
    for (auto page = reader.read(filter); !page->empty(); page = reader.read(filter)) {
        sizes.push_back(page->size());
        filter.after = page->back().seq;
    }
    EXPECT_THAT(sizes, ElementsAre(256, 256, 88));
}

TEST_F(StoreReaderTest, ASessionIsFoundByTheIndexOfEveryTable) {
    std::string plan;
    sqlite3* database = nullptr;
    ASSERT_EQ(sqlite3_open_v2(options_.file.path.c_str(), &database, SQLITE_OPEN_READONLY, nullptr), SQLITE_OK);
    sqlite3_stmt* statement = nullptr;
    ASSERT_EQ(sqlite3_prepare_v2(database,
                                 "EXPLAIN QUERY PLAN SELECT seq, payload FROM deliveries WHERE seq > ?1 AND "
                                 "session_id = ?3 ORDER BY seq LIMIT ?5",
                                 -1, &statement, nullptr),
              SQLITE_OK);
    while (sqlite3_step(statement) == SQLITE_ROW) {
        plan += std::string(reinterpret_cast<const char*>(sqlite3_column_text(statement, 3))) + "\n";
    }
    sqlite3_finalize(statement);
    sqlite3_close(database);
    for (const std::string table : {"beacon", "tally", "joule", "telem", "malady"}) {
        EXPECT_THAT(plan, HasSubstr("SEARCH d USING INDEX " + table + "_session (session=? AND rowid>?)"));
    }
    EXPECT_THAT(plan, Not(HasSubstr("SCAN d\n")));
    EXPECT_THAT(plan, Not(HasSubstr("TEMP B-TREE")));
}

TEST_F(StoreReaderTest, ChangesAreSeenOnce) {
    StoreReader reader = openReader();
    EXPECT_TRUE(*reader.changed());
    EXPECT_FALSE(*reader.changed());
    EXPECT_FALSE(*reader.waitForChange(std::chrono::milliseconds(0)));
    add(1);
    EXPECT_TRUE(*reader.waitForChange(std::chrono::seconds(60)));
    EXPECT_FALSE(*reader.changed());
}

TEST_F(StoreReaderTest, AStoppedServicesStoreCanStillBeRead) {
    add(2);
    store_.reset();
    EXPECT_THAT(numbers(openReader().read({})), ElementsAre(1, 2));
}

TEST_F(StoreReaderTest, WithoutAFileThereIsNothingToRead) {
    options_.file.path = folder_ / "missing.db";
    EXPECT_EQ(refusal(), folder_ / "missing.db: No such file or directory");
    EXPECT_FALSE(std::filesystem::exists(options_.file.path));
}

TEST_F(StoreReaderTest, AFileThatIsNoStoreIsRefused) {
    options_.file.path = folder_ / "text.db";
    std::ofstream(options_.file.path) << std::string(5'000, 'x');
    EXPECT_THAT(refusal(), HasSubstr("file is not a database"));
    options_.file.path = folder_ / "empty.db";
    std::ofstream(options_.file.path) << "";
    EXPECT_THAT(refusal(), HasSubstr("holds no deliveries yet"));
}

TEST_F(StoreReaderTest, ANewerVersionIsRefused) {
    store_.reset();
    changeFile(options_.file.path, "PRAGMA user_version = 2");
    EXPECT_EQ(refusal(),
              options_.file.path + " has schema version 2, newer than 1, the newest that this program knows");
}

TEST_F(StoreReaderTest, AnOlderVersionIsTheServicesToMigrate) {
    store_.reset();
    changeFile(options_.file.path, "PRAGMA user_version = 0");
    EXPECT_EQ(refusal(),
              options_.file.path + " has schema version 0; the service brings it to version 1 at its next start");
}

} // namespace

} // namespace vela::platform
