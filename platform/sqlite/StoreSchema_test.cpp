#include "platform/sqlite/StoreHarness_test.h"
#include "platform/sqlite/StoreSchema.h"

#include <fstream>
#include <gmock/gmock.h>
#include <iterator>

namespace vela::platform {

namespace {

using ::testing::ElementsAre;
using ::testing::HasSubstr;

class StoreSchemaTest : public StoreHarness {
protected:
    std::string path() const { return options_.file.path; }

    std::string refusal() {
        const Result<std::unique_ptr<DeliveryStore>> store = DeliveryStore::open(options_, ledger_, clock_);
        return store ? "opened" : store.failure().description;
    }
    std::string content() const {
        std::ifstream file(path(), std::ios::binary);
        return {std::istreambuf_iterator<char>(file), std::istreambuf_iterator<char>()};
    }
    void write(const std::string& content) const { std::ofstream(path(), std::ios::binary) << content; }

    /// As an earlier version might have been: the table "beacon" without the column "number", rows of one's own.
    void makeVersion0() {
        { const auto store = openStore(); }
        changeFile(path(), "DROP VIEW deliveries; CREATE TABLE old(seq INTEGER PRIMARY KEY, text TEXT);"
                           "INSERT INTO old VALUES(5, '{\"a\":1}'); PRAGMA user_version = 0");
    }
    Result<Done> prepare(std::span<const StoreMigration> migrations) {
        Result<SqliteDatabase> opened = SqliteDatabase::open(path(), SqliteDatabase::Access::ReadWrite);
        SqliteDatabase database = *std::move(opened);
        return prepareSchema(database, path(), migrations);
    }
};

TEST_F(StoreSchemaTest, ANewFileSaysWhatItIs) {
    const auto store = openStore();
    EXPECT_THAT(query("PRAGMA application_id"), ElementsAre("1449479265"));
    EXPECT_THAT(query("PRAGMA user_version"), ElementsAre("1"));
    EXPECT_THAT(query("PRAGMA journal_mode"), ElementsAre("wal"));
    EXPECT_THAT(query("SELECT backend, name, rows FROM backend"),
                ElementsAre("0|beacon|0", "1|tally|0", "2|joule|0", "3|telem|0", "4|malady|0"));
    EXPECT_THAT(query("SELECT name FROM pragma_table_info('deliveries')"),
                ElementsAre("seq", "time", "backend", "operation", "name", "session_id", "category", "type", "payload",
                            "metric_id", "record"));
}

TEST_F(StoreSchemaTest, TheLedgersColumnsAreNamedAsItsReasons) {
    const auto store = openStore();
    std::vector<std::string> reasons;
    for (std::size_t reason = 0; reason < kDropReasons; ++reason) {
        reasons.emplace_back(nameOf(static_cast<DropReason>(reason)));
    }
    EXPECT_EQ(query("SELECT name FROM pragma_table_info('ledger') WHERE cid >= 6 ORDER BY cid"), reasons);
}

TEST_F(StoreSchemaTest, AnEmptyFileBecomesAStore) {
    write("");
    EXPECT_EQ(refusal(), "opened");
}

TEST_F(StoreSchemaTest, AFileThatIsNoDatabaseIsRefusedAndLeftAsItIs) {
    const std::string text(5'000, 'x');
    write(text);
    EXPECT_EQ(refusal(), path() + " is left as it is: file is not a database");
    EXPECT_EQ(content(), text);
}

TEST_F(StoreSchemaTest, ADatabaseOfSomethingElseIsRefusedAndLeftAsItIs) {
    changeFile(path(), "CREATE TABLE theirs(a); INSERT INTO theirs VALUES(1)");
    const std::string before = content();
    EXPECT_EQ(refusal(), path() + " is a database of something else; it is left as it is");
    EXPECT_EQ(content(), before);
}

TEST_F(StoreSchemaTest, ANewerVersionIsRefused) {
    { const auto store = openStore(); }
    changeFile(path(), "PRAGMA user_version = 7");
    EXPECT_EQ(refusal(), path() + " has schema version 7, newer than 1, the newest that this program knows");
}

TEST_F(StoreSchemaTest, AnOlderVersionIsMigratedStepByStep) {
    makeVersion0();
    const StoreMigration steps[] = {
        {0, "INSERT INTO beacon(seq, ts, operation, vals) SELECT seq, 0, 0, text FROM old; DROP TABLE old"}};
    const Result<Done> migrated = prepare(steps);
    ASSERT_TRUE(migrated) << migrated.failure().description;
    EXPECT_THAT(query("PRAGMA user_version"), ElementsAre("1"));
    EXPECT_THAT(query("SELECT seq, vals FROM beacon"), ElementsAre(R"(5|{"a":1})"));
}

TEST_F(StoreSchemaTest, AMigrationThatFailsLeavesTheOldVersion) {
    makeVersion0();
    const StoreMigration steps[] = {{0, "DROP TABLE old; DROP TABLE not_there"}};
    const Result<Done> migrated = prepare(steps);
    ASSERT_FALSE(migrated);
    EXPECT_EQ(migrated.failure().description,
              path() + " cannot be brought to schema version 1: no such table: not_there");
    EXPECT_THAT(query("PRAGMA user_version"), ElementsAre("0"));
    EXPECT_THAT(query("SELECT seq FROM old"), ElementsAre("5"));
}

TEST_F(StoreSchemaTest, AnOlderVersionWithoutAStepIsRefused) {
    makeVersion0();
    EXPECT_EQ(refusal(), path() + " has schema version 0, from which there is no way to version 1");
}

TEST_F(StoreSchemaTest, ADamagedFileIsRefused) {
    { const auto store = openStore(); }
    std::fstream file(path(), std::ios::binary | std::ios::in | std::ios::out);
    file.seekp(100);
    file << std::string(3'996, '\xAA');
    file.close();
    std::filesystem::remove(path() + "-wal");
    EXPECT_THAT(refusal(), HasSubstr("database disk image is malformed"));
}

TEST_F(StoreSchemaTest, AFolderThatCannotBeMadeIsAFailure) {
    options_.file.path = "/proc/nowhere/deliveries.db";
    EXPECT_EQ(refusal(), "/proc/nowhere/deliveries.db.lock: No such file or directory");
}

} // namespace

} // namespace vela::platform
