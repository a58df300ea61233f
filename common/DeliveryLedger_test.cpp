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
    EXPECT_EQ(rows.front(), (LedgerRow{-1, 0, DeliveryBackend::Beacon, {512, 512, 0, {}}}));
    EXPECT_EQ(rows[1], (LedgerRow{7, 0, DeliveryBackend::Beacon, {1, 0, 0, {}}}));
    // The rows of those that were summed up are to be erased.
    EXPECT_EQ(rows.back().counts, LedgerCounts());
    const auto erased =
        std::count_if(rows.begin(), rows.end(), [](const LedgerRow& row) { return row.counts.received == 0; });
    EXPECT_EQ(erased, 512 * 5);
}

TEST_F(DeliveryLedgerTest, EntriesThatAreHeldAreAllFoundAgain) {
    std::vector<std::shared_ptr<LedgerEntry>> held;
    for (std::int64_t session = 0; session < 20'000; ++session) {
        held.push_back(ledger_.open(static_cast<std::int32_t>(session % 7 + 1), session));
        held.back()->received(DeliveryBackend::Beacon);
    }
    for (std::int64_t session = 0; session < 20'000; ++session) {
        ASSERT_EQ(ledger_.open(static_cast<std::int32_t>(session % 7 + 1), session),
                  held[static_cast<std::size_t>(session)]);
    }
    const std::vector<LedgerRow> rows = ledger_.takeChanged();
    ASSERT_EQ(rows.size(), 20'000U);
    EXPECT_EQ(rows.front(), (LedgerRow{1, 0, DeliveryBackend::Beacon, {1, 0, 0, {}}}));
    EXPECT_EQ(rows.back(), (LedgerRow{1, 19'999, DeliveryBackend::Beacon, {1, 0, 0, {}}}));
}

TEST_F(DeliveryLedgerTest, BesideManyThatAreHeldAQuarterAsManyAreKept) {
    std::vector<std::shared_ptr<LedgerEntry>> held;
    for (std::int64_t session = 0; session < 1'025; ++session) {
        held.push_back(ledger_.open(7, session));
    }
    for (std::int64_t session = 0; session < 255; ++session) {
        ledger_.open(8, session)->received(DeliveryBackend::Beacon);
    }
    EXPECT_EQ(ledger_.takeChanged().front(), (LedgerRow{8, 0, DeliveryBackend::Beacon, {1, 0, 0, {}}}));
    // The 1,281st.
    const auto last = ledger_.open(9, 0);
    EXPECT_EQ(ledger_.takeChanged().front(), (LedgerRow{-1, 0, DeliveryBackend::Beacon, {255, 0, 0, {}}}));
    EXPECT_EQ(ledger_.open(7, 1'024), held.back());
    EXPECT_EQ(ledger_.open(9, 0), last);
    EXPECT_EQ(ledger_.open(8, 0)->counts(DeliveryBackend::Beacon), LedgerCounts());
}

TEST_F(DeliveryLedgerTest, EntriesThatStayAreFoundAfterOthersWereSummedUp) {
    std::vector<std::shared_ptr<LedgerEntry>> held;
    for (std::int64_t session = 0; session < 1'024; ++session) {
        const auto entry = ledger_.open(7, session);
        if (session % 2 == 1) {
            held.push_back(entry);
        }
    }
    ledger_.open(7, 5'000);
    for (std::size_t number = 0; number < held.size(); ++number) {
        ASSERT_EQ(ledger_.open(7, static_cast<std::int64_t>(2 * number + 1)), held[number]);
    }
}

TEST_F(DeliveryLedgerTest, AClientWithoutAPidIsNotTakenForEarlierOnes) {
    ledger_.restore({{-1, 0, DeliveryBackend::Beacon, {5, 5, 0, {}}}});
    ledger_.open(0, 0)->received(DeliveryBackend::Beacon);
    EXPECT_THAT(ledger_.takeChanged(), ElementsAre(LedgerRow{-1, 0, DeliveryBackend::Beacon, {5, 5, 0, {}}},
                                                   LedgerRow{0, 0, DeliveryBackend::Beacon, {1, 0, 0, {}}}));
}

TEST_F(DeliveryLedgerTest, WhatAFileSaysOfPidZeroIsTakenUpWithEarlierClients) {
    ledger_.restore({{0, 0, DeliveryBackend::Beacon, {5, 5, 0, {}}}, {0, 42, DeliveryBackend::Beacon, {2, 2, 0, {}}}});
    EXPECT_THAT(ledger_.takeChanged(), ElementsAre(LedgerRow{-1, 0, DeliveryBackend::Beacon, {7, 7, 0, {}}}));
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
