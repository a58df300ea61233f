// How the store's file and its log stay below their bounds.
#include "platform/sqlite/StoreFile.h"
#include "platform/sqlite/StoreFileHarness_test.h"

#include <filesystem>
#include <gmock/gmock.h>

namespace vela::platform {

namespace {

using ::testing::ElementsAre;

class StoreFileSizeTest : public StoreFileHarness {};

TEST_F(StoreFileSizeTest, TheFileStaysBelowItsBoundAndTheOldestGoFirst) {
    const auto file = openFile(2 * kMiB);
    for (int round = 0; round < 20; ++round) {
        fill(*file, DeliveryBackend::Beacon, 1'000);
        EXPECT_LE(fileSize(), 2 * kMiB);
        EXPECT_LE(std::filesystem::file_size(options_.file.path + "-wal"), 8 * kMiB);
    }
    EXPECT_EQ(only("SELECT max(seq) FROM beacon"), "20000");
    const std::int64_t rows = file->usage()[0].rows;
    EXPECT_GT(rows, 2'500);
    EXPECT_EQ(only("SELECT min(seq) FROM beacon"), std::to_string(20'001 - rows));
    EXPECT_EQ(file->usage()[0].evicted, 20'000 - rows);
    expectAccountsToHold();
}

TEST_F(StoreFileSizeTest, AFloodOfOneKindLeavesTheOthersTheirShares) {
    const auto file = openFile(2 * kMiB);
    fill(*file, DeliveryBackend::Malady, 100);
    fill(*file, DeliveryBackend::Joule, 100);
    fill(*file, DeliveryBackend::Beacon, 10'000);
    EXPECT_EQ(file->usage()[static_cast<std::size_t>(DeliveryBackend::Malady)].evicted, 0);
    EXPECT_EQ(file->usage()[static_cast<std::size_t>(DeliveryBackend::Joule)].evicted, 0);
    EXPECT_GT(file->usage()[0].evicted, 5'000);
    expectAccountsToHold();
}

TEST_F(StoreFileSizeTest, WhoComesLateTakesItsShareBack) {
    const auto file = openFile(2 * kMiB);
    fill(*file, DeliveryBackend::Tally, 10'000);
    fill(*file, DeliveryBackend::Beacon, 10'000);
    // Beacon's share is twice Tally's, and the others' parts are divided between the two.
    const auto usage = file->usage();
    const double ratio = static_cast<double>(usage[0].bytes) / static_cast<double>(usage[1].bytes);
    EXPECT_GT(ratio, 1.8);
    EXPECT_LT(ratio, 2.2);
    expectAccountsToHold();
}

TEST_F(StoreFileSizeTest, MarksThatAreEvictedAreCountedApart) {
    const auto file = openFile(kMiB);
    std::vector<StoreRecord> marks(50);
    for (StoreRecord& mark : marks) {
        mark.operation = StoreOperation::Flush;
    }
    ASSERT_TRUE(file->store(marks, ledger_));
    fill(*file, DeliveryBackend::Beacon, 5'000);
    EXPECT_EQ(file->usage()[0].evictedMarks, 50);
    expectAccountsToHold();
}

TEST_F(StoreFileSizeTest, ALowerBoundShortensTheFile) {
    fill(*openFile(8 * kMiB), DeliveryBackend::Beacon, 12'000);
    EXPECT_GT(fileSize(), 5 * kMiB);
    const auto file = openFile(2 * kMiB);
    EXPECT_LE(fileSize(), 2 * kMiB);
    EXPECT_EQ(only("SELECT max(seq) FROM beacon"), "12000");
    fill(*file, DeliveryBackend::Beacon, 100);
    EXPECT_LE(fileSize(), 2 * kMiB);
    expectAccountsToHold();
}

TEST_F(StoreFileSizeTest, NumbersGoOnAfterTheyWereAllEvicted) {
    { fill(*openFile(kMiB), DeliveryBackend::Beacon, 10); }
    changeFile(options_.file.path, "DELETE FROM beacon; UPDATE backend SET rows = 0, bytes = 0, evicted = 10, "
                                   "last_evicted = 10 WHERE backend = 0");
    fill(*openFile(kMiB), DeliveryBackend::Beacon, 1);
    EXPECT_EQ(only("SELECT seq FROM beacon"), "11");
}

TEST_F(StoreFileSizeTest, AHugeRecordIsRefusedAndTheOthersAreStored) {
    const auto file = openFile(kMiB);
    std::vector<StoreRecord> group(3);
    group[0] = record(DeliveryBackend::Beacon, {{"t", "short"}});
    group[1] = record(DeliveryBackend::Beacon, {{"t", std::string_view(std::string(300'000, 'x'))}});
    group[2] = record(DeliveryBackend::Beacon, {{"t", "short"}});
    ASSERT_TRUE(file->store(group, ledger_));
    EXPECT_EQ(group[1].refused, DropReason::Limit);
    EXPECT_THAT(query("SELECT seq FROM beacon"), ElementsAre("1", "2"));
}

TEST_F(StoreFileSizeTest, AReaderThatStandsStillCannotMakeTheLogGrowForEver) {
    const auto file = openFile(16 * kMiB);
    fill(*file, DeliveryBackend::Beacon, 1);
    sqlite3* reader = nullptr;
    ASSERT_EQ(sqlite3_open_v2(options_.file.path.c_str(), &reader, SQLITE_OPEN_READONLY, nullptr), SQLITE_OK);
    ASSERT_EQ(sqlite3_exec(reader, "BEGIN; SELECT count(*) FROM beacon", nullptr, nullptr, nullptr), SQLITE_OK);
    const std::string text(20'000, 'x');
    std::string failure;
    for (int round = 0; round < 200 && failure.empty(); ++round) {
        std::vector<StoreRecord> group;
        group.reserve(50);
        for (int number = 0; number < 50; ++number) {
            group.push_back(record(DeliveryBackend::Beacon, {{"text", std::string_view(text)}}));
        }
        const Result<std::size_t> stored = file->store(group, ledger_);
        failure = stored ? "" : stored.failure().description;
    }
    EXPECT_THAT(failure, ::testing::MatchesRegex("a reader that stands still keeps 6[4-9] MiB in the log"));
    EXPECT_LE(std::filesystem::file_size(options_.file.path + "-wal"), 70 * kMiB);
    sqlite3_close(reader);
    for (int round = 0; round < 3; ++round) {
        fill(*file, DeliveryBackend::Beacon, 50);
    }
    EXPECT_LE(std::filesystem::file_size(options_.file.path + "-wal"), 8 * kMiB);
    EXPECT_EQ(only("PRAGMA integrity_check"), "ok");
}

TEST_F(StoreFileSizeTest, LargeRecordsStayBelowTheBoundToo) {
    const auto file = openFile(2 * kMiB);
    for (int round = 0; round < 40; ++round) {
        std::vector<StoreRecord> group;
        group.push_back(record(DeliveryBackend::Beacon, {{"t", std::string_view(std::string(400'000, 'x'))}}));
        store(*file, group);
        EXPECT_LE(fileSize(), 2 * kMiB);
    }
    expectAccountsToHold();
}

// JSON says a control character with six.
TEST_F(StoreFileSizeTest, RecordsThatBecomeSixTimesAsLongStayBelowTheBoundToo) {
    const auto file = openFile(16 * kMiB);
    fill(*file, DeliveryBackend::Beacon, 1'000, 20'000);
    EXPECT_GT(fileSize(), 14 * kMiB);
    const std::string text(100 * 1024, '\x01');
    for (int round = 0; round < 3; ++round) {
        std::vector<StoreRecord> group;
        for (int number = 0; number < 20; ++number) {
            group.push_back(record(DeliveryBackend::Beacon, {{"t", std::string_view(text)}}));
        }
        store(*file, group);
        EXPECT_LE(fileSize(), 16 * kMiB);
        EXPECT_LE(logSize(), 8 * kMiB);
    }
    EXPECT_EQ(only("SELECT max(seq) FROM beacon"), "1060");
    EXPECT_EQ(only("SELECT length(vals) FROM beacon WHERE seq = 1060"), "614404");
    expectAccountsToHold();
}

TEST_F(StoreFileSizeTest, RecordsThatAreTooMuchForOneTransactionAreLeftForTheNext) {
    const auto file = openFile(4 * kMiB);
    std::vector<StoreRecord> group;
    for (const std::size_t bytes : {100'000U, 100'000U, 100'000U, 600'000U, 10U}) {
        group.push_back(record(DeliveryBackend::Beacon, {{"t", std::string_view(std::string(bytes, 'x'))}}));
    }
    std::vector<std::size_t> stored;
    for (std::span<StoreRecord> left(group); !left.empty(); left = left.subspan(stored.back())) {
        const Result<std::size_t> taken = file->store(left, ledger_);
        ASSERT_TRUE(taken) << taken.failure().description;
        stored.push_back(*taken);
        EXPECT_EQ(only("SELECT count(*), max(seq) FROM beacon"),
                  std::to_string(group.size() - left.size() + *taken) + "|" +
                      std::to_string(group.size() - left.size() + *taken));
    }
    EXPECT_THAT(stored, ElementsAre(2U, 1U, 1U, 1U));
}

TEST_F(StoreFileSizeTest, ARecordLargerThanAGroupStaysBelowTheBoundToo) {
    const auto file = openFile(32 * kMiB);
    fill(*file, DeliveryBackend::Beacon, 1'600, 20'000);
    EXPECT_GT(fileSize(), 28 * kMiB);
    const std::string text(8'300'000, 'x');
    for (int round = 0; round < 5; ++round) {
        std::vector<StoreRecord> group;
        group.push_back(record(DeliveryBackend::Beacon, {{"t", std::string_view(text)}}));
        store(*file, group);
        EXPECT_EQ(group[0].refused, std::nullopt);
        EXPECT_LE(fileSize(), 32 * kMiB);
    }
    EXPECT_EQ(only("SELECT max(seq) FROM beacon"), "1605");
    EXPECT_EQ(only("SELECT length(payload) FROM deliveries WHERE seq = 1605"), "8300008");
    expectAccountsToHold();
}

} // namespace

} // namespace vela::platform
