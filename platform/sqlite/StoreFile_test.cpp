#include "platform/sqlite/StoreFile.h"
#include "platform/sqlite/StoreFileHarness_test.h"

#include <gmock/gmock.h>

namespace vela::platform {

namespace {

using ::testing::ElementsAre;

class StoreFileTest : public StoreFileHarness {};

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

TEST_F(StoreFileTest, TheAccountsOfEarlierClientsAndOfOneWithoutAPidAreBothKept) {
    const auto file = openFile(kMiB);
    ledger_.restore({{kEarlierClient, 0, DeliveryBackend::Tally, {5, 5, 0, {}}}});
    ledger_.open(0, 0)->received(DeliveryBackend::Tally);
    ASSERT_TRUE(file->store({}, ledger_));
    EXPECT_THAT(query("SELECT client, session, received, delivered FROM ledger ORDER BY client"),
                ElementsAre("-1|0|5|5", "0|0|1|0"));
}

TEST_F(StoreFileTest, TheAccountOfEarlierClientsInAnOlderFileIsTakenUp) {
    { const auto file = openFile(kMiB); }
    changeFile(options_.file.path, "INSERT INTO ledger VALUES(0, 0, 0, 5, 5, 0, 0, 0, 0, 0, 0, 0, 0, 0, 0)");
    const auto file = openFile(kMiB);
    const auto rows = file->ledgerRows();
    ASSERT_TRUE(rows);
    ledger_.restore(*rows);
    ASSERT_TRUE(file->store({}, ledger_));
    EXPECT_THAT(query("SELECT client, session, received, delivered FROM ledger"), ElementsAre("-1|0|5|5"));
}

TEST_F(StoreFileTest, KeyListsMakeRoomAgainAfterAllOfThemWent) {
    const auto file = openFile(kMiB);
    for (int round = 0; round < 3; ++round) {
        inventAll(*file);
        EXPECT_EQ(only("SELECT count(*) FROM beacon WHERE shape IS NOT NULL"), "1024") << round;
        for (int number = 0; number < 200; ++number) {
            std::vector<StoreRecord> group;
            group.push_back(unshared());
            store(*file, group);
        }
        ASSERT_EQ(only("SELECT count(*) FROM beacon WHERE shape IS NOT NULL"), "0");
    }
    expectAccountsToHold();
}

} // namespace

} // namespace vela::platform
