#include "platform/sqlite/StoreFile.h"
#include "platform/sqlite/StoreHarness_test.h"

#include <filesystem>
#include <gmock/gmock.h>

namespace vela::platform {

namespace {

using ::testing::ElementsAre;

constexpr std::uint64_t kMiB = 1024 * 1024;

// The file without queue and thread.
class StoreFileTest : public StoreHarness {
protected:
    std::unique_ptr<StoreFile> openFile(std::uint64_t maxBytes) {
        options_.file.maxBytes = maxBytes;
        Result<std::unique_ptr<StoreFile>> file = StoreFile::open(options_.file);
        EXPECT_TRUE(file) << (file ? "" : file.failure().description);
        return file ? *std::move(file) : nullptr;
    }
    StoreRecord record(DeliveryBackend backend, const Dictionary& payload) {
        StoreRecord record;
        record.backend = backend;
        record.session = ++number_ % 100;
        record.payload = payload;
        record.entry = entry_;
        entry_->received(backend);
        return record;
    }
    /// Stores `count` records of about `bytes` bytes in groups of 50.
    void fill(StoreFile& file, DeliveryBackend backend, int count, std::size_t bytes = 400) {
        const std::string text(bytes, 'x');
        while (count > 0) {
            std::vector<StoreRecord> group;
            for (; count > 0 && group.size() < 50; --count) {
                group.push_back(record(backend, {{"text", std::string_view(text)}}));
            }
            store(file, group);
        }
    }
    void store(StoreFile& file, std::vector<StoreRecord>& group) {
        const Result<Done> stored = file.store(group, ledger_);
        ASSERT_TRUE(stored) << stored.failure().description;
        for (const StoreRecord& each : group) {
            if (!each.refused) {
                each.entry->delivered(each.backend);
            }
        }
    }
    std::uint64_t fileSize() const { return std::filesystem::file_size(options_.file.path); }

    std::shared_ptr<LedgerEntry> entry_ = ledger_.open(7, 42);
    std::int64_t number_ = 0;
};

TEST_F(StoreFileTest, TheFileStaysBelowItsBoundAndTheOldestGoFirst) {
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

TEST_F(StoreFileTest, AFloodOfOneKindLeavesTheOthersTheirShares) {
    const auto file = openFile(2 * kMiB);
    fill(*file, DeliveryBackend::Malady, 100);
    fill(*file, DeliveryBackend::Joule, 100);
    fill(*file, DeliveryBackend::Beacon, 10'000);
    EXPECT_EQ(file->usage()[static_cast<std::size_t>(DeliveryBackend::Malady)].evicted, 0);
    EXPECT_EQ(file->usage()[static_cast<std::size_t>(DeliveryBackend::Joule)].evicted, 0);
    EXPECT_GT(file->usage()[0].evicted, 5'000);
    expectAccountsToHold();
}

TEST_F(StoreFileTest, WhoComesLateTakesItsShareBack) {
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

TEST_F(StoreFileTest, MarksThatAreEvictedAreCountedApart) {
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

TEST_F(StoreFileTest, ALowerBoundShortensTheFile) {
    fill(*openFile(8 * kMiB), DeliveryBackend::Beacon, 12'000);
    EXPECT_GT(fileSize(), 5 * kMiB);
    const auto file = openFile(2 * kMiB);
    EXPECT_LE(fileSize(), 2 * kMiB);
    EXPECT_EQ(only("SELECT max(seq) FROM beacon"), "12000");
    fill(*file, DeliveryBackend::Beacon, 100);
    EXPECT_LE(fileSize(), 2 * kMiB);
    expectAccountsToHold();
}

TEST_F(StoreFileTest, NumbersGoOnAfterTheyWereAllEvicted) {
    { fill(*openFile(kMiB), DeliveryBackend::Beacon, 10); }
    changeFile(options_.file.path, "DELETE FROM beacon; UPDATE backend SET rows = 0, bytes = 0, evicted = 10, "
                                   "last_evicted = 10 WHERE backend = 0");
    fill(*openFile(kMiB), DeliveryBackend::Beacon, 1);
    EXPECT_EQ(only("SELECT seq FROM beacon"), "11");
}

TEST_F(StoreFileTest, MessagesWithTheSameKeysShareOneKeyList) {
    const auto file = openFile(kMiB);
    fill(*file, DeliveryBackend::Beacon, 100);
    EXPECT_EQ(only("SELECT group_concat(keys) FROM shape"), R"(["text"])");
    EXPECT_EQ(only("SELECT vals FROM beacon WHERE seq = 1"), R"([")" + std::string(400, 'x') + R"("])");
}

TEST_F(StoreFileTest, KeyListsAreFoundAgainAfterARestart) {
    { fill(*openFile(kMiB), DeliveryBackend::Beacon, 1); }
    fill(*openFile(kMiB), DeliveryBackend::Beacon, 1);
    EXPECT_EQ(only("SELECT count(*) FROM shape"), "1");
}

TEST_F(StoreFileTest, InventedKeysAreBoundedAndComeBackRight) {
    const auto file = openFile(4 * kMiB);
    std::vector<StoreRecord> group;
    for (int number = 0; number < 3'000; ++number) {
        group.push_back(record(DeliveryBackend::Tally, {{std::string_view("k" + std::to_string(number)), number}}));
        group.back().name = String("name");
    }
    store(*file, group);
    EXPECT_EQ(only("SELECT count(*) FROM shape"), "1024");
    EXPECT_THAT(
        query("SELECT name, payload FROM deliveries WHERE seq IN (1, 1024, 1025, 3000) ORDER BY seq"),
        ElementsAre(R"(name|{"k0":0})", R"(name|{"k1023":1023})", R"(name|{"k1024":1024})", R"(name|{"k2999":2999})"));
}

TEST_F(StoreFileTest, AKeyListTooLongToBeSharedStandsInItsRow) {
    const auto file = openFile(kMiB);
    DictionaryBuilder keys;
    for (int number = 0; number < 500; ++number) {
        keys.add("a key that takes some room " + std::to_string(number), number);
    }
    std::vector<StoreRecord> group;
    group.push_back(record(DeliveryBackend::Beacon, keys.build()));
    store(*file, group);
    EXPECT_EQ(only("SELECT count(*) FROM shape"), "0");
    EXPECT_EQ(only("SELECT json_extract(payload, '$.a key that takes some room 499') FROM deliveries"), "499");
}

TEST_F(StoreFileTest, KeyListsThatNoRowNeedsMakeRoomForNewOnes) {
    const auto file = openFile(kMiB);
    const std::string text(200, 'x');
    for (int round = 0; round < 60; ++round) {
        std::vector<StoreRecord> group;
        for (int number = 0; number < 100; ++number) {
            const std::string key = "k" + std::to_string(100 * round + number);
            group.push_back(record(DeliveryBackend::Beacon, {{std::string_view(key), std::string_view(text)}}));
        }
        store(*file, group);
    }
    EXPECT_LE(std::stoi(only("SELECT count(*) FROM shape")), 1'024);
    // Without their removal the first 1,024 lists would have been the last; every row that is left is whole.
    EXPECT_EQ(only("SELECT max(seq) > 3000 FROM beacon WHERE shape IS NOT NULL"), "1");
    EXPECT_EQ(only("SELECT count(*) FROM beacon WHERE shape NOT IN (SELECT shape FROM shape)"), "0");
    EXPECT_EQ(only("SELECT count(*) FROM deliveries WHERE payload <> '{\"k' || (seq - 1) || '\":\"" + text + "\"}'"),
              "0");
    expectAccountsToHold();
}

TEST_F(StoreFileTest, AHugeRecordIsRefusedAndTheOthersAreStored) {
    const auto file = openFile(kMiB);
    std::vector<StoreRecord> group(3);
    group[0] = record(DeliveryBackend::Beacon, {{"t", "short"}});
    group[1] = record(DeliveryBackend::Beacon, {{"t", std::string_view(std::string(300'000, 'x'))}});
    group[2] = record(DeliveryBackend::Beacon, {{"t", "short"}});
    ASSERT_TRUE(file->store(group, ledger_));
    EXPECT_EQ(group[1].refused, DropReason::Limit);
    EXPECT_THAT(query("SELECT seq FROM beacon"), ElementsAre("1", "2"));
}

TEST_F(StoreFileTest, AReaderThatStandsStillCannotMakeTheLogGrowForEver) {
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
        const Result<Done> stored = file->store(group, ledger_);
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

TEST_F(StoreFileTest, LargeRecordsStayBelowTheBoundToo) {
    const auto file = openFile(2 * kMiB);
    for (int round = 0; round < 40; ++round) {
        std::vector<StoreRecord> group;
        group.push_back(record(DeliveryBackend::Beacon, {{"t", std::string_view(std::string(400'000, 'x'))}}));
        store(*file, group);
        EXPECT_LE(fileSize(), 2 * kMiB);
    }
    expectAccountsToHold();
}

TEST_F(StoreFileTest, EveryRowOfAGroupIsStoredWhateverItsSize) {
    const auto file = openFile(64 * kMiB);
    std::int64_t stored = 0;
    for (const std::int64_t size : {1, 15, 16, 17, 31, 32, 33, 100}) {
        std::vector<StoreRecord> group;
        for (std::int64_t number = 0; number < size; ++number) {
            // Two back ends in turns, so that both collect rows at the same time.
            const auto backend = number % 3 == 0 ? DeliveryBackend::Beacon : DeliveryBackend::Tally;
            group.push_back(record(backend, {{"number", stored + number}}));
        }
        store(*file, group);
        stored += size;
    }
    const auto rows = queryRows(options_.file.path, "SELECT seq, payload FROM deliveries ORDER BY seq");
    ASSERT_EQ(rows.size(), 245U);
    for (std::size_t row = 0; row < rows.size(); ++row) {
        EXPECT_EQ(rows[row], std::to_string(row + 1) + "|{\"number\":" + std::to_string(row) + "}");
    }
}

TEST_F(StoreFileTest, RowsOfManyBytesAreStoredBesideSmallOnes) {
    const auto file = openFile(64 * kMiB);
    std::vector<StoreRecord> group;
    std::vector<std::string> expected;
    for (const std::size_t bytes : {10U, 300'000U, 10U, 100'000U, 100'000U, 100'000U, 10U}) {
        group.push_back(record(DeliveryBackend::Beacon, {{"text", std::string_view(std::string(bytes, 'x'))}}));
        expected.push_back(std::to_string(bytes + 11));
    }
    store(*file, group);
    EXPECT_EQ(queryRows(options_.file.path, "SELECT length(payload) FROM deliveries ORDER BY seq"), expected);
}

TEST_F(StoreFileTest, RowsThatSayTheSameAreStoredEachUnderItsName) {
    const auto file = openFile(64 * kMiB);
    const Dictionary payload{{"a", 1}, {"b", "text"}};
    std::vector<StoreRecord> group;
    for (const char* const name : {"one", "two"}) {
        group.push_back(record(DeliveryBackend::Tally, payload.setting(Key("c"), 2.5)));
        group.back().name = String(name);
    }
    group.push_back(record(DeliveryBackend::Tally, payload));
    store(*file, group);
    EXPECT_THAT(queryRows(options_.file.path, "SELECT name, payload FROM deliveries ORDER BY seq"),
                ElementsAre(R"(one|{"a":1,"b":"text","c":2.5})", R"(two|{"a":1,"b":"text","c":2.5})",
                            R"(NULL|{"a":1,"b":"text"})"));
}

} // namespace

} // namespace vela::platform
