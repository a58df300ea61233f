#include "platform/linux/LinuxWorkQueues.h"
#include "platform/perf/DelegateCalls.h"
#include "testing/RecordingProbeDelegate.h"
#include "testing/RunningProgram.h"

#include <atomic>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <memory>
#include <optional>
#include <string>
#include <thread>
#include <vector>

namespace vela::platform::perf {

namespace {

using ::testing::ElementsAre;
using ::testing::IsEmpty;

class DelegateCallsTest : public ::testing::Test {
protected:
    void SetUp() override { calls_->setDelegate(delegate_); }
    void tellAll() {
        calls_->didStart(std::nullopt);
        calls_->didStop(std::nullopt);
        calls_->didComplete("file:///result", std::nullopt);
    }
    bool waitForCompletions(std::ptrdiff_t count) const {
        return testing::waitUntil([&] { return delegate_->completions() >= count; });
    }

    LinuxWorkQueues queues_{4};
    const std::shared_ptr<DelegateCalls> calls_ = std::make_shared<DelegateCalls>(queues_.background());
    const std::shared_ptr<testing::RecordingProbeDelegate> delegate_ =
        std::make_shared<testing::RecordingProbeDelegate>();
};

TEST_F(DelegateCallsTest, AQueueThatRunsItsItemsInAnyOrderKeepsTheirs) {
    std::vector<std::string> expected;
    constexpr int kTraces = 100;
    for (int trace = 0; trace < kTraces; ++trace) {
        tellAll();
        expected.insert(expected.end(), {"start", "stop", "complete"});
    }
    ASSERT_TRUE(waitForCompletions(kTraces));
    EXPECT_EQ(delegate_->calls(), expected);
}

TEST_F(DelegateCallsTest, TheUrlIsHandedOn) {
    tellAll();
    ASSERT_TRUE(waitForCompletions(1));
    EXPECT_THAT(delegate_->urls(), ElementsAre("file:///result"));
}

TEST_F(DelegateCallsTest, ErrorsAreHandedOn) {
    calls_->didStart(Failure{5, "one"});
    calls_->didStop(Failure{6, "two"});
    calls_->didComplete("", Failure{7, "three"});
    ASSERT_TRUE(waitForCompletions(1));
    EXPECT_THAT(delegate_->calls(), ElementsAre("start failed", "stop failed", "complete failed"));
    ASSERT_EQ(delegate_->failures().size(), 3U);
    EXPECT_EQ(delegate_->failures()[1].code, 6);
    EXPECT_EQ(delegate_->failures()[2].description, "three");
}

TEST_F(DelegateCallsTest, CallsThatAreDueOutliveWhoMadeThem) {
    auto calls = std::make_shared<DelegateCalls>(queues_.background());
    calls->setDelegate(delegate_);
    calls->didComplete("", std::nullopt);
    calls.reset();
    EXPECT_TRUE(waitForCompletions(1));
}

TEST_F(DelegateCallsTest, TakingTheDelegateOffWaitsForTheCallUnderWay) {
    std::atomic<bool> isIn = false;
    std::atomic<bool> isOut = false;
    delegate_->onStart = [&] {
        isIn = true;
        std::this_thread::sleep_for(
            std::chrono::milliseconds(50)); // for the other to come too early, if it did not wait
        isOut = true;
    };
    tellAll();
    ASSERT_TRUE(testing::waitUntil([&] { return isIn.load(); }));
    calls_->setDelegate({});
    EXPECT_TRUE(isOut);
}

TEST_F(DelegateCallsTest, ADelegateThatWasTakenOffGetsNoneOfTheCallsThatAreDue) {
    delegate_->onStart = [&] { calls_->setDelegate({}); };
    tellAll();
    ASSERT_TRUE(testing::waitUntil([&] { return delegate_->was("start"); }));
    const auto other = std::make_shared<testing::RecordingProbeDelegate>();
    ASSERT_TRUE(testing::waitUntil([&] { return calls_.use_count() == 1; })); // the item is gone
    calls_->setDelegate(other);
    calls_->didStart(std::nullopt);
    ASSERT_TRUE(testing::waitUntil([&] { return other->was("start"); }));
    EXPECT_THAT(delegate_->calls(), ElementsAre("start"));
}

TEST_F(DelegateCallsTest, ADelegateThatIsGoneIsNotMissed) {
    auto gone = std::make_shared<testing::RecordingProbeDelegate>();
    calls_->setDelegate(gone);
    gone.reset();
    tellAll();
    ASSERT_TRUE(testing::waitUntil([&] { return calls_.use_count() == 1; }));
    EXPECT_THAT(delegate_->calls(), IsEmpty());
}

} // namespace

} // namespace vela::platform::perf
