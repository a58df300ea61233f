#include "common/VelaReportingLogCategories.h"
#include "platform/sqlite/FailingVfs_test.h"
#include "platform/sqlite/StoreHarness_test.h"
#include "platform/sqlite/StoreWriter.h"
#include "testing/CapturingLog.h"

#include <gmock/gmock.h>

namespace vela::platform {

namespace {

using ::testing::ElementsAre;
using ::testing::IsEmpty;
using vela::testing::CapturedLine;

// The writer without its thread: every time is the test's.
class StoreWriterTest : public StoreHarness {
protected:
    void open() {
        const Result<Done> opened = writer_.open(at(0));
        ASSERT_TRUE(opened) << opened.failure().description;
    }
    static MonotonicTime at(int milliseconds) { return MonotonicTime(std::chrono::milliseconds(milliseconds)); }
    std::optional<MonotonicTime> run(int time) { return writer_.run(at(time)); }

    void push(int count = 1, StoreUrgency urgency = StoreUrgency::Usual) {
        for (; count > 0; --count) {
            StoreRecord record;
            record.urgency = urgency;
            record.entry = entry_;
            entry_->received(DeliveryBackend::Beacon);
            ASSERT_EQ(queue_.push(record), std::nullopt);
        }
    }
    std::uint64_t delivered() const { return entry_->counts(DeliveryBackend::Beacon).delivered; }
    std::uint64_t lost() const { return dropped(entry_, DeliveryBackend::Beacon, DropReason::StoreFailed); }
    std::vector<std::string> rows() const { return query("SELECT count(*) FROM beacon"); }
    std::vector<std::string> keptLedger() const {
        return query("SELECT received, delivered, store_failed FROM ledger");
    }

    FailingVfs disk_;
    StoreQueue queue_{{.records = 100, .bytes = 1024 * 1024, .group = 3}};
    StoreWriter writer_{options(), queue_, ledger_};
    std::shared_ptr<LedgerEntry> entry_ = ledger_.open(7, 42);

private:
    const StoreWriter::Options& options() {
        options_.commitMessages = 3;
        options_.commitDelay = std::chrono::milliseconds(250);
        options_.file.vfs = FailingVfs::kName;
        return options_;
    }
};

TEST_F(StoreWriterTest, AtRestNothingIsDue) {
    open();
    EXPECT_EQ(run(0), std::nullopt);
    EXPECT_EQ(run(1'000'000), std::nullopt);
}

TEST_F(StoreWriterTest, TheFirstRecordStartsTheTimeToTheCommit) {
    open();
    push();
    EXPECT_EQ(run(1'000), at(1'250));
    push();
    EXPECT_EQ(run(1'249), at(1'250));
    EXPECT_EQ(delivered(), 0U);
    run(1'250);
    EXPECT_EQ(delivered(), 2U);
    EXPECT_THAT(rows(), ElementsAre("2"));
}

TEST_F(StoreWriterTest, AFullGroupIsCommittedAtOnce) {
    open();
    push(3);
    run(0);
    EXPECT_EQ(delivered(), 3U);
}

TEST_F(StoreWriterTest, ABacklogSharesOneCommit) {
    open();
    push(3);
    int before = FailingVfs::syncsSoFar();
    run(0);
    const int syncsOfACommit = FailingVfs::syncsSoFar() - before;
    push(80);
    before = FailingVfs::syncsSoFar();
    run(1);
    EXPECT_EQ(delivered(), 83U);
    EXPECT_EQ(queue_.held(), 0U);
    EXPECT_LE(FailingVfs::syncsSoFar() - before, syncsOfACommit);
}

TEST_F(StoreWriterTest, AnUrgentRecordIsCommittedAtOnceWithThoseBeforeIt) {
    open();
    push();
    push(1, StoreUrgency::Now);
    run(0);
    EXPECT_EQ(delivered(), 2U);
}

TEST_F(StoreWriterTest, AFlushedSessionIsCommittedWithinMilliseconds) {
    open();
    push();
    EXPECT_EQ(run(0), at(250));
    push(1, StoreUrgency::Soon);
    EXPECT_EQ(run(1), at(6));
    run(6);
    EXPECT_EQ(delivered(), 2U);
}

TEST_F(StoreWriterTest, AFlushCommitsAtOnce) {
    open();
    push();
    const std::uint64_t flush = queue_.requestFlush();
    run(0);
    queue_.waitFlushed(flush);
    EXPECT_EQ(delivered(), 1U);
}

TEST_F(StoreWriterTest, AChangeOfTheLedgerAloneIsWrittenAfterFourTimesTheDelay) {
    open();
    entry_->received(DeliveryBackend::Beacon);
    entry_->dropped(DeliveryBackend::Beacon, DropReason::StoreFailed);
    queue_.noteLedgerChange();
    EXPECT_EQ(run(100), at(1'100));
    EXPECT_THAT(keptLedger(), IsEmpty());
    run(1'100);
    EXPECT_THAT(keptLedger(), ElementsAre("1|0|1"));
}

TEST_F(StoreWriterTest, BehindACommitTheLedgerIsLookedAtOnceMore) {
    open();
    push(3);
    EXPECT_EQ(run(0), at(1'000));
    entry_->received(DeliveryBackend::Beacon);
    entry_->dropped(DeliveryBackend::Beacon, DropReason::NotReported);
    EXPECT_EQ(run(1'000), std::nullopt);
    EXPECT_THAT(keptLedger(), ElementsAre("4|3|0"));
}

TEST_F(StoreWriterTest, AGroupThatCannotBeWrittenIsDropped) {
    open();
    disk_.fail(SQLITE_FULL);
    push(3);
    EXPECT_EQ(run(0), at(250));
    EXPECT_EQ(delivered(), 0U);
    EXPECT_EQ(lost(), 3U);
    const StoreStatus status = writer_.status();
    EXPECT_TRUE(status.degraded);
    EXPECT_EQ(status.failures, 1U);
    EXPECT_EQ(status.lastError, "cannot store deliveries: database or disk is full");
    EXPECT_EQ(queue_.held(), 0U);
}

TEST_F(StoreWriterTest, AFailingDiskIsTriedAgainAfterLongerAndLongerTimes) {
    open();
    disk_.fail(SQLITE_IOERR_WRITE);
    push(3);
    int time = 0;
    for (const int wait : {250, 500, 1'000, 2'000, 4'000, 8'000, 16'000, 30'000, 30'000}) {
        EXPECT_EQ(run(time), at(time + wait));
        EXPECT_EQ(run(time + wait - 1), at(time + wait));
        time += wait;
    }
    EXPECT_EQ(writer_.status().failures, 9U);
    EXPECT_EQ(lost(), 3U);
}

TEST_F(StoreWriterTest, WhatComesWhileTheDiskFailsWaitsAndIsStoredAfterwards) {
    open();
    disk_.fail(SQLITE_FULL);
    push(3);
    run(0);
    push(5);
    EXPECT_EQ(run(1), at(250));
    run(250);
    EXPECT_EQ(lost(), 3U);
    EXPECT_EQ(queue_.held(), 5U);
    disk_.fail(SQLITE_OK);
    run(750);
    EXPECT_EQ(delivered(), 5U);
    EXPECT_FALSE(writer_.status().degraded);
    EXPECT_THAT(rows(), ElementsAre("5"));
    EXPECT_THAT(keptLedger(), ElementsAre("8|5|3"));
}

TEST_F(StoreWriterTest, OfSeveralGroupsOnlyTheOneThatFailedIsDropped) {
    open();
    disk_.fail(SQLITE_FULL);
    push(8);
    run(0);
    EXPECT_EQ(lost(), 3U);
    EXPECT_EQ(queue_.held(), 5U);
    disk_.fail(SQLITE_OK);
    run(250);
    EXPECT_EQ(delivered(), 5U);
}

// Their room in the queue is free for others.
TEST_F(StoreWriterTest, RecordsThatWereDroppedAreNotHeldWhileOthersWaitForTheDisk) {
    open();
    const long others = entry_.use_count();
    disk_.fail(SQLITE_FULL);
    push(8);
    EXPECT_EQ(entry_.use_count(), others + 8);
    run(0);
    EXPECT_EQ(queue_.held(), 5U);
    EXPECT_EQ(entry_.use_count(), others + 5);
}

TEST_F(StoreWriterTest, NothingIsHeldWhenAllThatWaitedWasDropped) {
    open();
    const long others = entry_.use_count();
    disk_.fail(SQLITE_FULL);
    push(3);
    run(0);
    EXPECT_EQ(queue_.held(), 0U);
    EXPECT_EQ(entry_.use_count(), others);
}

// JSON says a control character with six, so that the file takes fewer in one transaction than the writer gives it.
TEST_F(StoreWriterTest, ABacklogOfRecordsThatBecomeLongIsStoredWhole) {
    options_.file.maxBytes = 4 * 1024 * 1024;
    StoreQueue queue({});
    StoreWriter writer(options_, queue, ledger_);
    ASSERT_TRUE(writer.open(at(0)));
    std::vector<bool> outcomes;
    for (int number = 0; number < 20; ++number) {
        StoreRecord record;
        record.payload = {{"text", std::string_view(std::string(10'000, '\x01'))}};
        record.entry = entry_;
        record.done =
            std::make_unique<UniqueFunction<void(bool)>>([&outcomes](bool stored) { outcomes.push_back(stored); });
        entry_->received(DeliveryBackend::Beacon);
        ASSERT_EQ(queue.push(record), std::nullopt);
    }
    writer.run(at(0));
    EXPECT_EQ(outcomes, std::vector<bool>(20, true));
    EXPECT_EQ(delivered(), 20U);
    EXPECT_EQ(queue.held(), 0U);
    EXPECT_THAT(query("SELECT count(*), sum(length(vals)) FROM beacon"), ElementsAre("20|1200080"));
    EXPECT_THAT(keptLedger(), ElementsAre("20|20|0"));
}

TEST_F(StoreWriterTest, TheQueueIsBoundedWhileTheDiskFails) {
    open();
    disk_.fail(SQLITE_FULL);
    push(3);
    run(0);
    push(100);
    StoreRecord tooMany;
    EXPECT_EQ(queue_.push(tooMany), DropReason::QueueFull);
    run(250);
    EXPECT_EQ(queue_.push(tooMany), DropReason::QueueFull);
}

TEST_F(StoreWriterTest, FailureAndRecoveryAreOneLineEach) {
    const vela::testing::CapturingLog log(LogLevel::Default);
    open();
    disk_.fail(SQLITE_FULL);
    push(3);
    run(0);
    run(250);
    disk_.fail(SQLITE_OK);
    run(750);
    run(2'000);
    const std::string category(VelaReportingServiceDelegateCategory().name());
    EXPECT_THAT(
        log.lines(),
        ElementsAre(
            CapturedLine{LogLevel::Error, category, "StoreWriter",
                         "deliveries are not stored: cannot store deliveries: database or disk is full"},
            CapturedLine{LogLevel::Default, category, "StoreWriter", "deliveries are stored again; 3 were lost"}));
}

TEST_F(StoreWriterTest, ADiskThatIsFullAtTheStartIsTriedAgain) {
    ledger_.open(8, 43);
    disk_.fail(SQLITE_FULL);
    open();
    EXPECT_TRUE(writer_.status().degraded);
    push();
    EXPECT_EQ(run(100), at(250));
    disk_.fail(SQLITE_OK);
    run(250);
    EXPECT_EQ(delivered(), 1U);
    EXPECT_FALSE(writer_.status().degraded);
}

TEST_F(StoreWriterTest, TheEndStoresWhatIsLeft) {
    open();
    push(2);
    queue_.close();
    writer_.finish(at(0));
    EXPECT_EQ(delivered(), 2U);
    EXPECT_THAT(keptLedger(), ElementsAre("2|2|0"));
}

TEST_F(StoreWriterTest, TheEndOnAFailingDiskDropsWhatIsLeft) {
    open();
    disk_.fail(SQLITE_FULL);
    push(10);
    queue_.close();
    writer_.finish(at(0));
    EXPECT_EQ(lost(), 10U);
    EXPECT_EQ(queue_.held(), 0U);
}

TEST_F(StoreWriterTest, BuildersOfADroppedGroupAreCalledAtMostOnce) {
    open();
    disk_.fail(SQLITE_FULL);
    int built = 0;
    std::vector<bool> outcomes;
    StoreRecord record;
    record.urgency = StoreUrgency::Now;
    record.builder = [&built] {
        ++built;
        return Dictionary();
    };
    record.done =
        std::make_unique<UniqueFunction<void(bool)>>([&outcomes](bool stored) { outcomes.push_back(stored); });
    ASSERT_EQ(queue_.push(record), std::nullopt);
    run(0);
    disk_.fail(SQLITE_OK);
    run(250);
    EXPECT_EQ(built, 1);
    EXPECT_THAT(outcomes, ElementsAre(false));
}

TEST_F(StoreWriterTest, ARecordThatIsTooLargeForTheFileIsDroppedAlone) {
    options_.file.maxBytes = 1024 * 1024;
    StoreQueue queue({});
    StoreWriter writer(options_, queue, ledger_);
    ASSERT_TRUE(writer.open(at(0)));
    for (const std::size_t size : {10U, 300'000U, 10U}) {
        StoreRecord record;
        record.payload = {{"text", std::string_view(std::string(size, 'x'))}};
        record.entry = entry_;
        entry_->received(DeliveryBackend::Beacon);
        ASSERT_EQ(queue.push(record), std::nullopt);
    }
    writer.finish(at(0));
    EXPECT_EQ(delivered(), 2U);
    EXPECT_EQ(dropped(entry_, DeliveryBackend::Beacon, DropReason::Limit), 1U);
    EXPECT_THAT(rows(), ElementsAre("2"));
}

} // namespace

} // namespace vela::platform
