#include "platform/sqlite/DeliveryStore.h"
#include "platform/sqlite/FailingVfs_test.h"
#include "platform/sqlite/StoreBeacon.h"
#include "platform/sqlite/StoreHarness_test.h"
#include "platform/sqlite/StoreReader.h"
#include "platform/sqlite/StoreTally.h"

#include <atomic>
#include <filesystem>
#include <gmock/gmock.h>
#include <sys/stat.h>
#include <thread>

namespace vela::platform {

namespace {

using ::testing::ElementsAre;

class DeliveryStoreTest : public StoreHarness {
protected:
    void send(DeliveryStore& store, const std::shared_ptr<LedgerEntry>& entry, int count = 1) {
        StoreTally tally(store, {"*"});
        const LedgerScope scope(entry);
        for (; count > 0; --count) {
            tally.tallySendEventLazy("event", [] { return Dictionary{{"a", 1}}; });
        }
    }
    static unsigned permissionsOf(const std::string& path) {
        struct stat status {};
        stat(path.c_str(), &status);
        return status.st_mode & 0777U;
    }
};

TEST_F(DeliveryStoreTest, TheEndCommitsEverything) {
    {
        const auto store = openStore();
        send(*store, ledger_.open(7, 42), 10);
    }
    EXPECT_THAT(query("SELECT count(*) FROM deliveries"), ElementsAre("10"));
    EXPECT_THAT(query("SELECT client, session, backend, received, delivered FROM ledger"), ElementsAre("7|42|1|10|10"));
}

TEST_F(DeliveryStoreTest, CommitsComeBySetting) {
    options_.commitDelay = std::chrono::milliseconds(1);
    const auto store = openStore();
    StoreReader reader = *StoreReader::open(options_.file.path);
    ASSERT_TRUE(reader.changed());
    send(*store, ledger_.own());
    while (reader.read({})->empty()) {
        ASSERT_TRUE(reader.waitForChange(std::chrono::seconds(60)));
    }
    EXPECT_EQ(reader.read({})->size(), 1U);
}

TEST_F(DeliveryStoreTest, AFullGroupIsCommittedWithoutWaiting) {
    options_.commitMessages = 5;
    const auto store = openStore();
    StoreReader reader = *StoreReader::open(options_.file.path);
    ASSERT_TRUE(reader.changed());
    send(*store, ledger_.own(), 5);
    while (reader.read({})->size() < 5) {
        ASSERT_TRUE(reader.waitForChange(std::chrono::seconds(60)));
    }
    EXPECT_EQ(ledger_.own()->counts(DeliveryBackend::Tally).received, 5U);
}

TEST_F(DeliveryStoreTest, EverybodyMayReadItsFiles) {
    const mode_t before = umask(077);
    const auto store = openStore();
    send(*store, ledger_.own());
    store->commitAll();
    umask(before);
    for (const std::string end : {"", "-wal", "-shm"}) {
        EXPECT_EQ(permissionsOf(options_.file.path + end), 0644U) << end;
    }
    store->close();
    for (const std::string end : {"", "-wal", "-shm"}) {
        EXPECT_TRUE(std::filesystem::exists(options_.file.path + end)) << end;
    }
}

TEST_F(DeliveryStoreTest, ASecondServiceIsRefused) {
    auto store = openStore();
    const Result<std::unique_ptr<DeliveryStore>> second = DeliveryStore::open(options_, ledger_, clock_);
    ASSERT_FALSE(second);
    EXPECT_EQ(second.failure().description, options_.file.path + " is in use by another service");
    store.reset();
    EXPECT_NE(openStore(), nullptr);
}

TEST_F(DeliveryStoreTest, TheLedgerGoesOnAfterARestart) {
    {
        const auto store = openStore();
        const auto entry = ledger_.open(7, 42);
        send(*store, entry, 3);
        store->commitAll();
        entry->received(DeliveryBackend::Beacon); // and never had an outcome
    }
    DeliveryLedger later(101);
    {
        Result<std::unique_ptr<DeliveryStore>> store = DeliveryStore::open(options_, later, clock_);
        ASSERT_TRUE(store);
        send(**store, later.open(7, 42), 2);
    }
    const auto entry = later.open(7, 42);
    EXPECT_EQ(entry->counts(DeliveryBackend::Tally), (LedgerCounts{.received = 5, .delivered = 5}));
    EXPECT_EQ(dropped(entry, DeliveryBackend::Beacon, DropReason::Restart), 1U);
    EXPECT_THAT(query("SELECT client, session, backend, received, delivered, restart FROM ledger ORDER BY backend"),
                ElementsAre("7|42|0|1|0|1", "7|42|1|5|5|0"));
}

TEST_F(DeliveryStoreTest, AServiceWithTheSamePidCountsOn) {
    {
        const auto store = openStore();
        send(*store, ledger_.own(), 3);
    }
    DeliveryLedger later(100);
    {
        Result<std::unique_ptr<DeliveryStore>> store = DeliveryStore::open(options_, later, clock_);
        ASSERT_TRUE(store);
        send(**store, later.own(), 2);
    }
    EXPECT_THAT(query("SELECT client, session, received, delivered FROM ledger"), ElementsAre("100|0|5|5"));
}

TEST_F(DeliveryStoreTest, AccountsThatWereSummedUpLeaveTheFile) {
    {
        const auto store = openStore();
        for (int session = 1; session <= 1'500; ++session) {
            send(*store, ledger_.open(7, session));
            if (session % 100 == 0) {
                store->commitAll();
            }
        }
    }
    EXPECT_THAT(query("SELECT count(*) <= 1025, sum(received), sum(delivered) FROM ledger"),
                ElementsAre("1|1500|1500"));
}

TEST_F(DeliveryStoreTest, TheStatusTellsWhatIsStored) {
    const auto store = openStore();
    send(*store, ledger_.own(), 3);
    EXPECT_TRUE(store->commitAll());
    const StoreStatus status = store->status();
    EXPECT_EQ(status.rows, 3);
    EXPECT_EQ(status.backends[static_cast<std::size_t>(DeliveryBackend::Tally)].rows, 3);
    EXPECT_EQ(status.evicted, 0);
    EXPECT_FALSE(status.degraded);
    EXPECT_EQ(status.lastError, "");
    // The end moves the log into the file.
    store->close();
    EXPECT_EQ(status.bytes, std::filesystem::file_size(options_.file.path));
}

TEST_F(DeliveryStoreTest, AFailingDiskDoesNotStopTheService) {
    FailingVfs disk;
    options_.file.vfs = FailingVfs::kName;
    options_.commitDelay = std::chrono::milliseconds(1);
    const auto store = openStore();
    disk.fail(SQLITE_FULL);
    send(*store, ledger_.own(), 10);
    EXPECT_FALSE(store->commitAll());
    EXPECT_TRUE(store->status().degraded);
    disk.fail(SQLITE_OK);
    EXPECT_TRUE(store->commitAll());
    send(*store, ledger_.own(), 10);
    EXPECT_TRUE(store->commitAll());
    const LedgerCounts counts = ledger_.own()->counts(DeliveryBackend::Tally);
    EXPECT_EQ(counts.received, 20U);
    EXPECT_EQ(counts.queued(), 0U);
    EXPECT_EQ(query("SELECT count(*) FROM tally"), std::vector{std::to_string(counts.delivered)});
}

TEST_F(DeliveryStoreTest, WhatIsAddedBehindTheEndIsCountedAsLost) {
    const auto store = openStore();
    store->close();
    send(*store, ledger_.own(), 2);
    EXPECT_EQ(dropped(ledger_.own(), DeliveryBackend::Tally, DropReason::Restart), 2U);
    store->close();
    EXPECT_TRUE(store->commitAll());
}

// Threads add, flush, ask for the status and read, while the disk fails now and then; in the end every delivery has one
// outcome, and the file agrees with the ledger.
TEST_F(DeliveryStoreTest, ManyThreadsAtOnce) {
    FailingVfs disk;
    options_.file.vfs = FailingVfs::kName;
    options_.file.maxBytes = 1024 * 1024;
    options_.commitMessages = 16;
    options_.commitDelay = std::chrono::milliseconds(1);
    auto store = openStore();
    StoreBeacon beacon(*store, {"store"});
    std::atomic<bool> ends = false;
    std::vector<std::thread> senders;
    for (int number = 1; number <= 3; ++number) {
        senders.emplace_back([&, number] {
            const auto entry = ledger_.open(number, number);
            const LedgerScope scope(entry);
            const auto session = beacon.createBeaconSession({{"session_id", number}}, {});
            for (int message = 0; message < 1'000; ++message) {
                entry->received(DeliveryBackend::Beacon);
                if (!session->sendBeaconMessage(1, 2, {{"number", message}, {"text", "some text of a usual length"}})) {
                    entry->dropped(DeliveryBackend::Beacon, DropReason::Failed);
                }
                send(*store, entry);
            }
            session->flushBeaconMessages();
        });
    }
    std::thread observer([&] {
        StoreReader reader = *StoreReader::open(options_.file.path);
        for (int round = 0; !ends; ++round) {
            disk.fail(round % 8 == 7 ? SQLITE_FULL : SQLITE_OK);
            store->status();
            store->commitAll();
            EXPECT_TRUE(reader.read({.session = 2}, 16));
        }
        disk.fail(SQLITE_OK);
    });
    for (std::thread& sender : senders) {
        sender.join();
    }
    ends = true;
    observer.join();
    EXPECT_TRUE(store->commitAll());
    store.reset();
    for (int number = 1; number <= 3; ++number) {
        EXPECT_EQ(ledger_.open(number, number)->counts(DeliveryBackend::Beacon).queued(), 0U);
        EXPECT_EQ(ledger_.open(number, number)->counts(DeliveryBackend::Tally).queued(), 0U);
    }
    expectAccountsToHold();
}

} // namespace

} // namespace vela::platform
