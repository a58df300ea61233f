#include "common/DeliveryLedger.h"
#include "common/values/Json.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <thread>

namespace vela {

namespace {

using ::testing::ElementsAre;
using ::testing::IsEmpty;

std::string shown(const DeliveryLedger& ledger) { return jsonText(Value(ledger.asDictionary())); }

class DeliveryLedgerTest : public ::testing::Test {
protected:
    DeliveryLedger ledger_{100};
};

TEST_F(DeliveryLedgerTest, AnEmptyLedgerHasNoEntries) { EXPECT_EQ(shown(ledger_), R"({"totals":{},"entries":[]})"); }

TEST_F(DeliveryLedgerTest, WhatWasReceivedIsQueuedUntilItHasAnOutcome) {
    const auto entry = ledger_.open(7, 42);
    LedgerItem item(entry, DeliveryBackend::Beacon);
    EXPECT_EQ(entry->counts(DeliveryBackend::Beacon).queued(), 1U);
    item.deliver();
    const LedgerCounts counts = entry->counts(DeliveryBackend::Beacon);
    EXPECT_EQ(counts.queued(), 0U);
    EXPECT_EQ(counts.delivered, 1U);
}

TEST_F(DeliveryLedgerTest, EachOutcomeCountsOnce) {
    const auto entry = ledger_.open(7, 42);
    {
        LedgerItem item(entry, DeliveryBackend::Tally);
        item.drop(DropReason::NoConsumer);
        item.drop(DropReason::Failed);
        item.repeat();
    }
    EXPECT_EQ(
        shown(ledger_),
        R"({"totals":{"tally":{"received":1,"delivered":0,"queued":0,"redundant":0,"dropped":{"no_consumer":1}}},)"
        R"("entries":[{"client":7,"session":42,"tally":{"received":1,"delivered":0,"queued":0,"redundant":0,)"
        R"("dropped":{"no_consumer":1}}}]})");
}

TEST_F(DeliveryLedgerTest, AnItemThatIsDestroyedWithoutAnOutcomeWasAbandoned) {
    const auto entry = ledger_.open(7, 42);
    { const LedgerItem item(entry, DeliveryBackend::Beacon); }
    EXPECT_EQ(entry->counts(DeliveryBackend::Beacon).dropped[static_cast<std::size_t>(DropReason::Abandoned)], 1U);
}

TEST_F(DeliveryLedgerTest, AnItemThatWasHandedOverStaysQueued) {
    const auto entry = ledger_.open(7, 42);
    {
        LedgerItem item(entry, DeliveryBackend::Beacon);
        item.handOver();
    }
    EXPECT_EQ(entry->counts(DeliveryBackend::Beacon).queued(), 1U);
}

TEST_F(DeliveryLedgerTest, AMovedItemHasOneOutcome) {
    const auto entry = ledger_.open(7, 42);
    LedgerItem first(entry, DeliveryBackend::Beacon);
    {
        LedgerItem second(std::move(first));
        second.repeat();
    }
    first = LedgerItem();
    const LedgerCounts counts = entry->counts(DeliveryBackend::Beacon);
    EXPECT_EQ(counts.redundant, 1U);
    EXPECT_EQ(counts.allDropped(), 0U);
}

TEST_F(DeliveryLedgerTest, ASessionOfTheSameNumbersCountsOn) { EXPECT_EQ(ledger_.open(7, 42), ledger_.open(7, 42)); }

TEST_F(DeliveryLedgerTest, TheInnermostScopeHolds) {
    EXPECT_EQ(LedgerScope::current(), nullptr);
    const auto outer = ledger_.open(7, 1);
    const auto inner = ledger_.open(7, 2);
    {
        const LedgerScope outerScope(outer);
        {
            const LedgerScope innerScope(inner);
            EXPECT_EQ(LedgerScope::current(), inner);
        }
        EXPECT_EQ(LedgerScope::current(), outer);
    }
    EXPECT_EQ(LedgerScope::current(), nullptr);
}

TEST_F(DeliveryLedgerTest, OnlyChangedAccountsAreTaken) {
    const auto entry = ledger_.open(7, 42);
    ledger_.open(7, 43);
    entry->received(DeliveryBackend::Joule);
    const LedgerRow row{7, 42, DeliveryBackend::Joule, {1, 0, 0, {}}};
    EXPECT_THAT(ledger_.takeChanged(), ElementsAre(row));
    EXPECT_THAT(ledger_.takeChanged(), IsEmpty());
    EXPECT_THAT(ledger_.takeChanged(true), ElementsAre(row));
}

TEST_F(DeliveryLedgerTest, WhatWasQueuedAtTheEndOfARunIsDroppedAtTheNextStart) {
    const auto entry = ledger_.open(7, 42);
    entry->received(DeliveryBackend::Beacon);
    entry->received(DeliveryBackend::Beacon);
    entry->delivered(DeliveryBackend::Beacon);
    DeliveryLedger next(200);
    next.restore(ledger_.takeChanged(true));
    const LedgerCounts counts = next.open(7, 42)->counts(DeliveryBackend::Beacon);
    EXPECT_EQ(counts.received, 2U);
    EXPECT_EQ(counts.delivered, 1U);
    EXPECT_EQ(counts.queued(), 0U);
    EXPECT_EQ(counts.dropped[static_cast<std::size_t>(DropReason::Restart)], 1U);
}

TEST_F(DeliveryLedgerTest, OldEntriesThatNobodyHoldsAreSummedUp) {
    const auto held = ledger_.open(7, 0);
    held->received(DeliveryBackend::Beacon);
    for (std::size_t session = 1; session < DeliveryLedger::kMostEntries; ++session) {
        const auto entry = ledger_.open(7, static_cast<std::int64_t>(session));
        entry->received(DeliveryBackend::Beacon);
        entry->delivered(DeliveryBackend::Beacon);
    }
    ledger_.open(7, 5000);
    const std::vector<LedgerRow> rows = ledger_.takeChanged(true);
    EXPECT_EQ(rows.front(), (LedgerRow{0, 0, DeliveryBackend::Beacon, {512, 512, 0, {}}}));
    EXPECT_EQ(rows[1], (LedgerRow{7, 0, DeliveryBackend::Beacon, {1, 0, 0, {}}}));
    // The rows of those that were summed up are to be erased.
    EXPECT_EQ(rows.back().counts, LedgerCounts());
    const auto erased =
        std::count_if(rows.begin(), rows.end(), [](const LedgerRow& row) { return row.counts.received == 0; });
    EXPECT_EQ(erased, 512 * 5);
}

TEST_F(DeliveryLedgerTest, TotalsBalanceWhileOthersCount) {
    const auto entry = ledger_.open(7, 42);
    std::atomic<bool> ended = false;
    std::thread counting([&] {
        for (int round = 0; round < 20000; ++round) {
            LedgerItem item(entry, DeliveryBackend::Beacon);
            if (round % 2 == 0) {
                item.deliver();
            }
        }
        ended = true;
    });
    while (!ended) {
        const LedgerCounts counts = entry->counts(DeliveryBackend::Beacon);
        EXPECT_LE(counts.queued(), 20000U);
        EXPECT_GE(counts.received, counts.delivered + counts.allDropped());
    }
    counting.join();
    EXPECT_EQ(entry->counts(DeliveryBackend::Beacon), (LedgerCounts{20000, 10000, 0, {0, 0, 0, 0, 0, 0, 0, 10000, 0}}));
}

TEST(DeliveryNamesTest, NamesAreThoseOfTheStore) {
    EXPECT_EQ(nameOf(DeliveryBackend::Beacon), "beacon");
    EXPECT_EQ(backendNamed("malady"), DeliveryBackend::Malady);
    EXPECT_EQ(backendNamed("Malady"), std::nullopt);
    EXPECT_EQ(nameOf(DropReason::Restart), "restart");
}

} // namespace

} // namespace vela
