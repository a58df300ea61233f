// What the session counts of its messages to real-time reporting.
#include "session/Session_test.h"

#include <cerrno>

namespace vela {

namespace {

class VelaReportingSessionLedgerTest : public SessionTest {
protected:
    VelaReportingSessionLedgerTest() { platform_.ledger = &ledger_; }

    LedgerCounts counts() { return ledger_.open(7, 42)->counts(DeliveryBackend::Beacon); }
    std::uint64_t dropped(DropReason reason) { return counts().dropped[static_cast<std::size_t>(reason)]; }

    DeliveryLedger ledger_{1};
};

TEST_F(VelaReportingSessionLedgerTest, AMessageIsQueuedUntilItsOutcome) {
    runningSession();
    send({{"a", 1}});
    EXPECT_EQ(counts(), (LedgerCounts{1, 0, 0, {}}));
    queues_.runUntilIdle();
    // Beacon has it, and counts its delivery.
    EXPECT_EQ(counts(), (LedgerCounts{1, 0, 0, {}}));
}

TEST_F(VelaReportingSessionLedgerTest, ARepeatedMessageIsRedundant) {
    runningSession();
    send({{"a", 1}});
    send({{"a", 1}});
    queues_.runUntilIdle();
    EXPECT_EQ(counts(), (LedgerCounts{2, 0, 1, {}}));
}

TEST_F(VelaReportingSessionLedgerTest, AMessageThatBeaconDoesNotTakeFailed) {
    runningSession();
    beacon_.failSends("no network");
    send({{"a", 1}});
    queues_.runUntilIdle();
    EXPECT_EQ(dropped(DropReason::Failed), 1U);
}

TEST_F(VelaReportingSessionLedgerTest, AMessageThatMeetsAFullQueueOfBeaconIsCountedAsThat) {
    runningSession();
    beacon_.failSends("the queue is full", ENOBUFS);
    send({{"a", 1}});
    queues_.runUntilIdle();
    EXPECT_EQ(dropped(DropReason::QueueFull), 1U);
    EXPECT_EQ(dropped(DropReason::Failed), 0U);
}

TEST_F(VelaReportingSessionLedgerTest, AMessageThatIsTooLargeForBeaconIsCountedAsThat) {
    runningSession();
    beacon_.failSends("larger than the queue", EMSGSIZE);
    send({{"a", 1}});
    queues_.runUntilIdle();
    EXPECT_EQ(dropped(DropReason::Limit), 1U);
    EXPECT_EQ(dropped(DropReason::Failed), 0U);
}

TEST_F(VelaReportingSessionLedgerTest, WithoutBackEndsMessagesAreDropped) {
    beacon_.setDiscovery(BeaconDiscovery::FindsNone);
    session().start();
    send({{"a", 1}});
    queues_.runUntilIdle();
    EXPECT_EQ(dropped(DropReason::NoBackends), 1U);
}

TEST_F(VelaReportingSessionLedgerTest, ASessionWithoutRealTimeReportingDropsThem) {
    runningSession();
    session().setBeaconReportingEnabled(false);
    send({{"a", 1}});
    EXPECT_EQ(dropped(DropReason::NotReported), 1U);
}

TEST_F(VelaReportingSessionLedgerTest, ATestSessionReportsNothing) {
    session().setServiceType(11);
    session().start();
    send({{"a", 1}});
    queues_.runUntilIdle();
    EXPECT_EQ(dropped(DropReason::NotReported), 1U);
}

TEST_F(VelaReportingSessionLedgerTest, ARefusedMessageIsDroppedByTheLimit) {
    VelaReportingSessionMemory memory({1, 1});
    platform_.memory = &memory;
    runningSession();
    send({{"a", 1}});
    EXPECT_EQ(dropped(DropReason::Limit), 1U);
    release();
    queues_.runUntilIdle();
}

TEST_F(VelaReportingSessionLedgerTest, ASingleMessageIsQueuedUntilItWasSent) {
    send({{"a", 1}});
    beacon_.failSends("no network");
    queues_.runUntilIdle();
    EXPECT_EQ(counts().queued(), 1U);
    queues_.advance(std::chrono::seconds(1));
    EXPECT_EQ(dropped(DropReason::Failed), 1U);
}

TEST_F(VelaReportingSessionLedgerTest, WhatIsSentBelongsToTheSessionsEntry) {
    std::vector<std::shared_ptr<LedgerEntry>> seen;
    beacon_.setObserver([&](BeaconOperation operation) {
        if (operation == BeaconOperation::Send || operation == BeaconOperation::SendOne) {
            seen.push_back(LedgerScope::current());
        }
    });
    send({{"a", 1}});
    queues_.advance(std::chrono::seconds(1));
    runningSession();
    send({{"a", 1}});
    queues_.runUntilIdle();
    EXPECT_THAT(seen, ::testing::ElementsAre(session().ledgerEntry(), session().ledgerEntry()));
    EXPECT_EQ(LedgerScope::current(), nullptr);
}

} // namespace

} // namespace vela
