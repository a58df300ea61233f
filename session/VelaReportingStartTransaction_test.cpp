#include "session/VelaReportingStartTransaction.h"

#include <atomic>
#include <barrier>
#include <gtest/gtest.h>
#include <memory>
#include <thread>
#include <vector>

namespace vela {

namespace {

/// Counts the calls of its blocks and checks that each is called with no error and true.
class Calls {
public:
    VelaReportingStartTransaction::Block block() {
        return [this](const std::optional<platform::IpcError>& error, bool done) {
            EXPECT_FALSE(error.has_value());
            EXPECT_TRUE(done);
            ++count_;
        };
    }
    int count() const { return count_; }

private:
    std::atomic<int> count_ = 0;
};

TEST(VelaReportingStartTransactionTest, ABlockStoredBeforeTheOutcomeIsCalledAtIt) {
    VelaReportingStartTransaction transaction;
    Calls calls;
    const std::uint64_t start = transaction.begin(true);
    transaction.setBlock(calls.block());
    EXPECT_EQ(calls.count(), 0);
    transaction.end(start);
    EXPECT_EQ(calls.count(), 1);
}

TEST(VelaReportingStartTransactionTest, ABlockStoredAfterTheOutcomeIsCalledAtOnce) {
    VelaReportingStartTransaction transaction;
    Calls calls;
    transaction.end(transaction.begin(true));
    transaction.setBlock(calls.block());
    EXPECT_EQ(calls.count(), 1);
}

TEST(VelaReportingStartTransactionTest, WithoutASetUpABlockIsCalledAtOnce) {
    VelaReportingStartTransaction transaction;
    Calls calls;
    transaction.begin(false);
    transaction.setBlock(calls.block());
    EXPECT_EQ(calls.count(), 1);
}

TEST(VelaReportingStartTransactionTest, BeforeTheFirstStartABlockIsCalledAtOnce) {
    VelaReportingStartTransaction transaction;
    Calls calls;
    transaction.setBlock(calls.block());
    EXPECT_EQ(calls.count(), 1);
}

TEST(VelaReportingStartTransactionTest, ASecondOutcomeCallsNothing) {
    VelaReportingStartTransaction transaction;
    Calls calls;
    const std::uint64_t start = transaction.begin(true);
    transaction.setBlock(calls.block());
    transaction.end(start);
    transaction.end(start);
    EXPECT_EQ(calls.count(), 1);
}

TEST(VelaReportingStartTransactionTest, TheOutcomeOfAnEarlierStartDoesNotAnswerALaterOne) {
    VelaReportingStartTransaction transaction;
    Calls calls;
    const std::uint64_t first = transaction.begin(true);
    const std::uint64_t second = transaction.begin(true);
    transaction.setBlock(calls.block());
    transaction.end(first);
    EXPECT_EQ(calls.count(), 0);
    transaction.end(second);
    EXPECT_EQ(calls.count(), 1);
}

TEST(VelaReportingStartTransactionTest, TheOutcomeOfAnEarlierStartLeavesALaterOneUnended) {
    VelaReportingStartTransaction transaction;
    Calls calls;
    const std::uint64_t first = transaction.begin(true);
    transaction.begin(true);
    transaction.end(first);
    transaction.setBlock(calls.block());
    EXPECT_EQ(calls.count(), 0);
}

TEST(VelaReportingStartTransactionTest, ABlockTakesThePlaceOfTheOneThatIsStored) {
    VelaReportingStartTransaction transaction;
    Calls old;
    Calls calls;
    const std::uint64_t start = transaction.begin(true);
    transaction.setBlock(old.block());
    transaction.setBlock(calls.block());
    transaction.end(start);
    EXPECT_EQ(old.count(), 0);
    EXPECT_EQ(calls.count(), 1);
}

TEST(VelaReportingStartTransactionTest, CallingTheBlockEarlyClearsIt) {
    VelaReportingStartTransaction transaction;
    Calls calls;
    const std::uint64_t start = transaction.begin(true);
    transaction.setBlock(calls.block());
    EXPECT_TRUE(transaction.callBlock());
    EXPECT_FALSE(transaction.callBlock());
    transaction.end(start);
    EXPECT_EQ(calls.count(), 1);
}

TEST(VelaReportingStartTransactionTest, ThereIsNothingToCallWithoutABlock) {
    VelaReportingStartTransaction transaction;
    EXPECT_FALSE(transaction.callBlock());
    transaction.end(transaction.begin(true));
    EXPECT_FALSE(transaction.callBlock());
}

TEST(VelaReportingStartTransactionTest, ABlockMayUseTheTransaction) {
    VelaReportingStartTransaction transaction;
    Calls inner;
    const std::uint64_t start = transaction.begin(true);
    transaction.setBlock([&](const std::optional<platform::IpcError>&, bool) { transaction.setBlock(inner.block()); });
    transaction.end(start);
    EXPECT_EQ(inner.count(), 1);
}

TEST(VelaReportingStartTransactionTest, ADestroyedTransactionDestroysItsBlockUncalled) {
    Calls calls;
    const auto held = std::make_shared<int>(1);
    {
        VelaReportingStartTransaction transaction;
        transaction.begin(true);
        transaction.setBlock([held, block = calls.block()](const std::optional<platform::IpcError>& error,
                                                           bool done) mutable { block(error, done); });
        EXPECT_EQ(held.use_count(), 2);
    }
    EXPECT_EQ(held.use_count(), 1);
    EXPECT_EQ(calls.count(), 0);
}

// Outcomes of one start and the beginning of the next at the same time, again and again; many of the former, so that
// the lock is fought for and the beginning falls between their steps.
TEST(VelaReportingStartTransactionTest, AnOutcomeNeverAnswersTheStartThatBeginsMeanwhile) {
    constexpr int kRounds = 30'000;
    constexpr int kOutcomes = 4;
    VelaReportingStartTransaction transaction;
    std::uint64_t first = 0;
    std::barrier round(kOutcomes + 1);
    std::vector<std::thread> outcomes;
    outcomes.reserve(kOutcomes);
    for (int number = 0; number < kOutcomes; ++number) {
        outcomes.emplace_back([&] {
            for (int i = 0; i < kRounds; ++i) {
                round.arrive_and_wait();
                for (int repeat = 0; repeat < 50; ++repeat) {
                    transaction.end(first);
                }
                round.arrive_and_wait();
            }
        });
    }
    int early = 0;
    int late = 0;
    for (int i = 0; i < kRounds; ++i) {
        Calls calls;
        first = transaction.begin(true);
        round.arrive_and_wait();
        const std::uint64_t second = transaction.begin(true);
        transaction.setBlock(calls.block());
        round.arrive_and_wait();
        early += calls.count();
        transaction.end(second);
        late += calls.count();
    }
    for (std::thread& thread : outcomes) {
        thread.join();
    }
    EXPECT_EQ(early, 0);
    EXPECT_EQ(late, kRounds);
}

TEST(VelaReportingStartTransactionTest, OfManyThreadsThatEndOneStartOneCallsTheBlock) {
    constexpr int kRounds = 200;
    for (int i = 0; i < kRounds; ++i) {
        VelaReportingStartTransaction transaction;
        Calls calls;
        const std::uint64_t start = transaction.begin(true);
        std::vector<std::thread> threads;
        threads.emplace_back([&] { transaction.setBlock(calls.block()); });
        threads.emplace_back([&] { transaction.end(start); });
        threads.emplace_back([&] { transaction.callBlock(); });
        for (std::thread& thread : threads) {
            thread.join();
        }
        ASSERT_EQ(calls.count(), 1);
    }
}

} // namespace

} // namespace vela
