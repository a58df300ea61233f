// Groups that cannot be stored leave the file and what is known of it as they were.
#include "platform/sqlite/FailingVfs_test.h"
#include "platform/sqlite/StoreFile.h"
#include "platform/sqlite/StoreFileHarness_test.h"

#include <gmock/gmock.h>

namespace vela::platform {

namespace {

using ::testing::ElementsAre;

// On a disk that can be made to fail.
class StoreFileFailureTest : public StoreFileHarness {
protected:
    StoreFileFailureTest() { options_.file.vfs = FailingVfs::kName; }
    std::string failureOf(StoreFile& file, std::vector<StoreRecord>& group) {
        const Result<std::size_t> stored = file.store(group, ledger_);
        return stored ? "" : stored.failure().description;
    }

    FailingVfs disk_;
};

// The insertion writes sixteen rows with one statement, and those before the one that fails stay until it is taken
// back.
TEST_F(StoreFileFailureTest, AGroupWhoseInsertionFailsHalfWayLeavesNothing) {
    const auto file = openFile(4 * kMiB);
    fill(*file, DeliveryBackend::Beacon, 5);
    changeFile(options_.file.path, "INSERT INTO beacon(seq, ts, operation, vals) VALUES(25, 0, 0, '{}')");
    std::vector<StoreRecord> group;
    for (int number = 0; number < 32; ++number) {
        group.push_back(record(DeliveryBackend::Beacon, {{"number", number}}));
    }
    const Result<std::size_t> stored = file->store(group, ledger_);
    ASSERT_FALSE(stored);
    EXPECT_EQ(stored.failure().description, "cannot store deliveries: UNIQUE constraint failed: beacon.seq");
    EXPECT_THAT(query("SELECT seq FROM beacon"), ElementsAre("1", "2", "3", "4", "5", "25"));
    EXPECT_EQ(only("SELECT rows FROM backend WHERE backend = 0"), "5");
    changeFile(options_.file.path, "DELETE FROM beacon WHERE seq = 25");
    store(*file, group);
    EXPECT_EQ(only("SELECT count(*), max(seq) FROM beacon"), "37|37");
    EXPECT_EQ(only("SELECT payload FROM deliveries WHERE seq = 37"), R"({"number":31})");
    expectAccountsToHold();
}

// A group that does not fit into SQLite's memory is written while it is inserted; SQLite then ends the transaction.
TEST_F(StoreFileFailureTest, AGroupThatFillsTheDiskHalfWayLeavesNothing) {
    const auto file = openFile(64 * kMiB);
    fill(*file, DeliveryBackend::Beacon, 5);
    std::vector<StoreRecord> group;
    const std::string text(200'000, 'x');
    for (int number = 0; number < 19; ++number) {
        group.push_back(record(DeliveryBackend::Beacon, {{"t", std::string_view(text)}}));
    }
    // Tells that the insertion never came so far: this one would be refused.
    group.push_back(record(DeliveryBackend::Beacon, {{"t", std::string_view(std::string(17 * kMiB, 'x'))}}));
    disk_.fail(SQLITE_FULL);
    EXPECT_EQ(failureOf(*file, group), "cannot store deliveries: database or disk is full");
    EXPECT_EQ(group.back().refused, std::nullopt);
    EXPECT_EQ(only("SELECT count(*), max(seq) FROM beacon"), "5|5");
    disk_.fail(SQLITE_OK);
    store(*file, group);
    EXPECT_EQ(group.back().refused, DropReason::Limit);
    EXPECT_EQ(only("SELECT count(*), max(seq) FROM beacon"), "24|24");
    EXPECT_EQ(only("SELECT length(payload) FROM deliveries WHERE seq = 24"), "200008");
    expectAccountsToHold();
}

// What else stands in the file takes the room, so that the transaction empties the table before it fails.
TEST_F(StoreFileFailureTest, AnEvictionThatWasTakenBackCostsNoKeyList) {
    const auto file = openFile(kMiB);
    inventAll(*file);
    changeFile(options_.file.path, "CREATE TABLE other(a); INSERT INTO other VALUES(zeroblob(850000))");
    std::vector<StoreRecord> failing;
    failing.push_back(unshared());
    disk_.fail(SQLITE_FULL);
    EXPECT_EQ(failureOf(*file, failing), "cannot store deliveries: database or disk is full");
    disk_.fail(SQLITE_OK);
    changeFile(options_.file.path, "DROP TABLE other");
    ASSERT_EQ(only("SELECT count(*) FROM beacon"), "1024");
    std::vector<StoreRecord> group;
    group.push_back(invention());
    store(*file, group);
    EXPECT_EQ(only("SELECT count(*) FROM beacon WHERE shape NOT IN (SELECT shape FROM shape)"), "0");
    EXPECT_EQ(only("SELECT payload FROM deliveries WHERE seq = 1"), R"({"k1":1})");
    EXPECT_EQ(only("SELECT payload FROM deliveries WHERE seq = 1025"), R"({"k1025":1})");
    expectAccountsToHold();
}

TEST_F(StoreFileFailureTest, ARefusalIsOfOneAttemptOnly) {
    std::vector<StoreRecord> group;
    group.push_back(record(DeliveryBackend::Beacon, {{"t", std::string_view(std::string(300'000, 'x'))}}));
    {
        const auto small = openFile(kMiB);
        disk_.fail(SQLITE_FULL);
        EXPECT_EQ(failureOf(*small, group), "cannot store deliveries: database or disk is full");
        EXPECT_EQ(group[0].refused, DropReason::Limit);
        disk_.fail(SQLITE_OK);
    }
    store(*openFile(4 * kMiB), group);
    EXPECT_EQ(group[0].refused, std::nullopt);
    EXPECT_THAT(query("SELECT seq FROM beacon"), ElementsAre("1"));
    expectAccountsToHold();
}

} // namespace

} // namespace vela::platform
