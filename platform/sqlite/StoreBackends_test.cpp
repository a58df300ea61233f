// Tally, Joule and Telem on the store.
#include "platform/sqlite/StoreHarness_test.h"
#include "platform/sqlite/StoreJoule.h"
#include "platform/sqlite/StoreTally.h"
#include "platform/sqlite/StoreTelem.h"

#include <gmock/gmock.h>
#include <thread>

namespace vela::platform {

namespace {

using ::testing::ElementsAre;
using ::testing::IsEmpty;

class StoreBackendsTest : public StoreHarness {
protected:
    const std::unique_ptr<DeliveryStore> store_ = openStore();
    const std::shared_ptr<LedgerEntry> entry_ = ledger_.open(7, 42);
};

TEST_F(StoreBackendsTest, AnEventIsStoredUnderItsName) {
    StoreTally tally(*store_, {"*"});
    const LedgerScope scope(entry_);
    tally.tallySendEventLazy("com.orvex.vela.a.b", [] { return Dictionary{{"a", 1}}; });
    ASSERT_TRUE(store_->commitAll());
    EXPECT_THAT(
        query("SELECT seq, time, backend, operation, name, session_id, category, type, payload, metric_id, record "
              "FROM deliveries"),
        ElementsAre(R"(1|1700000000.0|tally|send|com.orvex.vela.a.b|42|NULL|NULL|{"a":1}|NULL|NULL)"));
    EXPECT_EQ(entry_->counts(DeliveryBackend::Tally), (LedgerCounts{.received = 1, .delivered = 1}));
}

TEST_F(StoreBackendsTest, WithoutAScopeAnEventIsTheServicesOwnAndOfNoSession) {
    StoreTally tally(*store_, {"*"});
    tally.tallySendEventLazy("a", [] { return Dictionary(); });
    ASSERT_TRUE(store_->commitAll());
    EXPECT_THAT(query("SELECT name, session_id, payload FROM deliveries"), ElementsAre("a|NULL|{}"));
    EXPECT_EQ(ledger_.own()->counts(DeliveryBackend::Tally).delivered, 1U);
}

TEST_F(StoreBackendsTest, PatternsTellWhichEventsAreUsed) {
    StoreTally tally(*store_, {"com.orvex.vela.*", "exact"});
    EXPECT_TRUE(tally.tallyIsEventUsed("com.orvex.vela.a.b"));
    EXPECT_TRUE(tally.tallyIsEventUsed("exact"));
    EXPECT_FALSE(tally.tallyIsEventUsed("com.orvex.other"));
    EXPECT_FALSE(StoreTally(*store_, {}).tallyIsEventUsed("exact"));
}

TEST_F(StoreBackendsTest, AnEventThatNobodyUsesIsCountedAsDropped) {
    StoreTally tally(*store_, {});
    const LedgerScope scope(entry_);
    EXPECT_FALSE(tally.tallyIsEventUsed("a"));
    EXPECT_FALSE(tally.tallyIsEventUsed("a"));
    EXPECT_EQ(entry_->counts(DeliveryBackend::Tally).received, 2U);
    EXPECT_EQ(dropped(entry_, DeliveryBackend::Tally, DropReason::NoConsumer), 2U);
}

TEST_F(StoreBackendsTest, MoreNamesThanAreRememberedAreStillJudgedRight) {
    StoreTally tally(*store_, {"*7"});
    int used = 0;
    for (int round = 0; round < 2; ++round) {
        for (std::size_t number = 0; number < 2 * StoreTally::kMostNames; ++number) {
            used += tally.tallyIsEventUsed(std::to_string(number)) ? 1 : 0;
        }
    }
    EXPECT_EQ(used, 2 * 205);
}

TEST_F(StoreBackendsTest, APayloadIsBuiltOnceOnTheStoresThreadAndThenDestroyed) {
    StoreTally tally(*store_, {"*"});
    const auto owned = std::make_shared<int>(1);
    std::vector<std::thread::id> threads;
    tally.tallySendEventLazy("a", [&threads, owned] {
        threads.push_back(std::this_thread::get_id());
        return Dictionary();
    });
    EXPECT_EQ(owned.use_count(), 2);
    ASSERT_TRUE(store_->commitAll());
    ASSERT_EQ(threads.size(), 1U);
    EXPECT_NE(threads[0], std::this_thread::get_id());
    EXPECT_EQ(owned.use_count(), 1);
}

TEST_F(StoreBackendsTest, ABuilderMayUseTheStore) {
    StoreTally tally(*store_, {"*"});
    tally.tallySendEventLazy("outer", [&] {
        tally.tallySendEventLazy("inner", [] { return Dictionary(); });
        return Dictionary();
    });
    store_->close();
    // The end of the store takes nothing more, so what was sent inside it is counted as lost.
    const LedgerCounts counts = ledger_.own()->counts(DeliveryBackend::Tally);
    EXPECT_EQ(counts.received, 2U);
    EXPECT_EQ(counts.queued(), 0U);
}

TEST_F(StoreBackendsTest, AnEventForAClosedStoreIsCountedAndNotBuilt) {
    StoreTally tally(*store_, {"*"});
    store_->close();
    const LedgerScope scope(entry_);
    tally.tallySendEventLazy("a", []() -> Dictionary { throw std::logic_error("built"); });
    EXPECT_EQ(dropped(entry_, DeliveryBackend::Tally, DropReason::Restart), 1U);
}

TEST_F(StoreBackendsTest, AnEnergyEventHasItsClientBesideIt) {
    StoreJoule joule(*store_);
    const LedgerScope scope(entry_);
    joule.jouleLogRegisteredEvent(17, "AudioHaptics", {{"client_id", "its own"}, {"seconds", 2.5}}, {});
    joule.jouleLogRegisteredEvent(18, "Empty", {}, {});
    ASSERT_TRUE(store_->commitAll());
    EXPECT_THAT(
        query("SELECT backend, operation, name, session_id, payload, metric_id FROM deliveries ORDER BY seq"),
        ElementsAre(R"(joule|send|AudioHaptics|42|{"client_id":17,"event":{"client_id":"its own","seconds":2.5}}|NULL)",
                    R"(joule|send|Empty|42|{"client_id":18,"event":{}}|NULL)"));
    EXPECT_EQ(entry_->counts(DeliveryBackend::Joule), (LedgerCounts{.received = 2, .delivered = 2}));
}

TEST_F(StoreBackendsTest, AMetricKeepsItsBytes) {
    StoreTelem telem(*store_);
    const LedgerScope scope(entry_);
    telem.telemPostMetric(0x5B0003, std::string_view("\x08\0\x96", 3), {{"issue_type", 1}});
    telem.telemPostMetric(1, "", {});
    ASSERT_TRUE(store_->commitAll());
    EXPECT_THAT(
        query("SELECT backend, operation, name, session_id, payload, metric_id, hex(record), typeof(record) "
              "FROM deliveries ORDER BY seq"),
        ElementsAre(R"(telem|post|NULL|42|{"issue_type":1}|5963779|080096|blob)", "telem|post|NULL|42|{}|1||blob"));
    EXPECT_EQ(entry_->counts(DeliveryBackend::Telem), (LedgerCounts{.received = 2, .delivered = 2}));
}

TEST_F(StoreBackendsTest, NumbersRiseOverAllBackEnds) {
    StoreTally tally(*store_, {"*"});
    StoreJoule joule(*store_);
    StoreTelem telem(*store_);
    tally.tallySendEventLazy("a", [] { return Dictionary(); });
    joule.jouleLogRegisteredEvent(1, "b", {}, {});
    telem.telemPostMetric(1, "", {});
    tally.tallySendEventLazy("c", [] { return Dictionary(); });
    ASSERT_TRUE(store_->commitAll());
    EXPECT_THAT(query("SELECT seq, backend FROM deliveries ORDER BY seq"),
                ElementsAre("1|tally", "2|joule", "3|telem", "4|tally"));
}

TEST_F(StoreBackendsTest, NothingIsThereBeforeTheCommit) {
    StoreTelem telem(*store_);
    telem.telemPostMetric(1, "", {});
    EXPECT_THAT(query("SELECT * FROM deliveries"), IsEmpty());
    store_->close();
    EXPECT_THAT(query("SELECT backend FROM deliveries"), ElementsAre("telem"));
}

TEST_F(StoreBackendsTest, WhatAPayloadHoldsCountsBeforeItIsBuilt) {
    StoreTally tally(*store_, {"*"});
    const LedgerScope scope(entry_);
    // Nothing of so many bytes has room in the queue.
    tally.tallySendEventLazy(
        "a", [] { return Dictionary(); }, 32 * 1024 * 1024);
    EXPECT_EQ(dropped(entry_, DeliveryBackend::Tally, DropReason::Limit), 1U);
    tally.tallySendEventLazy("a", [] { return Dictionary(); });
    ASSERT_TRUE(store_->commitAll());
    EXPECT_EQ(entry_->counts(DeliveryBackend::Tally).delivered, 1U);
}

} // namespace

} // namespace vela::platform
