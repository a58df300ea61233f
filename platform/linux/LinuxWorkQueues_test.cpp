#include "platform/linux/LinuxWorkQueues.h"
#include "platform/linux/WorkQueueTestTools.h"
#include "testing/WorkQueueContract.h"

#include <atomic>
#include <chrono>
#include <functional>
#include <future>
#include <gtest/gtest.h>
#include <memory>
#include <thread>
#include <vector>

namespace vela::platform {

namespace {

using namespace std::chrono_literals;
using vela::testing::Record;
using vela::testing::Trace;

class LinuxBackend final : public vela::testing::WorkQueueBackend {
public:
    explicit LinuxBackend(unsigned threads) : queues_(threads) {}

    WorkQueues& queues() override { return queues_; }
    MonotonicTime monotonicNow() override { return std::chrono::steady_clock::now(); }
    bool runUntil(const std::function<bool()>& done) override { return waitFor(done); }

    void settle() override { pass(0ns); }

    void pass(Nanoseconds duration) override {
        const auto probe = queues_.makeSerialQueue("probe", QualityOfService::Background);
        std::promise<void> ran;
        probe->postAfter(duration, [&ran] { ran.set_value(); });
        ran.get_future().wait();
    }

private:
    LinuxWorkQueues queues_;
};

vela::testing::MakeWorkQueueBackend withThreads(unsigned threads) {
    return [threads] { return std::make_unique<LinuxBackend>(threads); };
}

} // namespace

} // namespace vela::platform

namespace vela::testing {

INSTANTIATE_TEST_SUITE_P(OneThread, WorkQueueContract, ::testing::Values(platform::withThreads(1)));
INSTANTIATE_TEST_SUITE_P(TwoThreads, WorkQueueContract, ::testing::Values(platform::withThreads(2)));
INSTANTIATE_TEST_SUITE_P(EightThreads, WorkQueueContract, ::testing::Values(platform::withThreads(8)));

} // namespace vela::testing

namespace vela::platform {

namespace {

TEST(LinuxWorkQueuesTest, BackgroundItemsRunBesideEachOther) {
    Gate gate;
    LinuxWorkQueues queues(4);
    for (int i = 0; i < 4; ++i) {
        queues.background().post(gate.item());
    }
    EXPECT_TRUE(gate.isReachedBy(4));
    EXPECT_EQ(queues.threadCount(), 4U);
    gate.open();
}

TEST(LinuxWorkQueuesTest, SerialQueuesRunBesideEachOther) {
    Gate gate;
    LinuxWorkQueues queues(2);
    const auto one = queues.makeSerialQueue("one", QualityOfService::Default);
    const auto two = queues.makeSerialQueue("two", QualityOfService::Default);
    one->post(gate.item());
    two->post(gate.item());
    EXPECT_TRUE(gate.isReachedBy(2));
    gate.open();
}

TEST(LinuxWorkQueuesTest, NoMoreItemsRunAtATimeThanThreadsWereAskedFor) {
    std::atomic<int> inside = 0;
    std::atomic<bool> tooMany = false;
    std::atomic<int> ran = 0;
    LinuxWorkQueues queues(3);
    for (int i = 0; i < 200; ++i) {
        queues.background().post([&] {
            if (++inside > 3) {
                tooMany = true;
            }
            std::this_thread::yield();
            --inside;
            ++ran;
        });
    }
    EXPECT_TRUE(waitFor([&ran] { return ran == 200; }));
    EXPECT_FALSE(tooMany);
    EXPECT_LE(queues.threadCount(), 3U);
}

TEST(LinuxWorkQueuesTest, AnEarlierTimerDoesNotWaitForALaterOne) {
    std::promise<void> ran;
    LinuxWorkQueues queues(1);
    const auto queue = queues.makeSerialQueue("queue", QualityOfService::Default);
    queue->postAfter(1h, [] {});
    queue->postAfter(5ms, [&ran] { ran.set_value(); });
    ran.get_future().wait();
}

TEST(LinuxWorkQueuesTest, DestroyingAQueueWaitsForItsRunningItemAndItsCaptures) {
    Record record;
    Gate gate;
    LinuxWorkQueues queues(2);
    auto queue = queues.makeSerialQueue("queue", QualityOfService::Default);
    SerialQueue& borrowed = *queue;
    queue->post([&, wait = gate.item(), trace = Trace([&record] { record.add(2); })]() mutable {
        borrowed
            .suspend(); // whether the gate opens before or after the destruction begins, the other item must not run
        wait();
        record.add(1);
    });
    queue->post([&record, trace = Trace([&record] { record.add(3); })] { record.add(0); });
    ASSERT_TRUE(gate.isReachedBy(1));
    std::thread opening([&gate] { gate.open(); });
    queue.reset();
    EXPECT_EQ(record.numbers(), (std::vector{1, 2, 3}));
    opening.join();
}

TEST(LinuxWorkQueuesTest, AnItemThatDestroysAnotherQueueWaitsForItsRunningItem) {
    Record record;
    LinuxWorkQueues queues(1);
    const auto semaphore = queues.makeSemaphore(0);
    auto blocked = queues.makeSerialQueue("blocked", QualityOfService::Default);
    const auto destroying = queues.makeSerialQueue("destroying", QualityOfService::Default);
    const auto signalling = queues.makeSerialQueue("signalling", QualityOfService::Default);
    blocked->post([&] {
        semaphore->wait(std::nullopt);
        record.add(1);
    });
    destroying->post([&] {
        signalling->post([&semaphore] { semaphore->signal(); });
        blocked.reset();
        record.add(2);
    });
    EXPECT_TRUE(waitFor([&record] { return record.size() == 2; }));
    EXPECT_EQ(record.numbers(), (std::vector{1, 2}));
}

TEST(LinuxWorkQueuesTest, DestroyingEverythingDropsBackgroundItemsThatHaveNotBegun) {
    Record record;
    Gate gate;
    {
        LinuxWorkQueues queues(1);
        queues.background().post(gate.item());
        ASSERT_TRUE(gate.isReachedBy(1));
        for (int i = 0; i < 100; ++i) {
            queues.background().post([&record, trace = Trace([&record] { record.add(1); })] { record.add(0); });
        }
        queues.background().postAfter(1h, [&record, trace = Trace([&record] { record.add(1); })] { record.add(0); });
        // Ends the running item when the waiting ones are gone.
        queues.background().post([trace = Trace([&gate] { gate.open(); })] {});
    }
    EXPECT_EQ(record.numbers(), std::vector<int>(101, 1));
}

TEST(LinuxWorkQueuesTest, ABackgroundItemThatRunsDuringTheEndMayPost) {
    Record record;
    Gate gate;
    {
        LinuxWorkQueues queues(1);
        queues.background().post([&, wait = gate.item()]() mutable {
            wait();
            queues.background().post([&record, trace = Trace([&record] { record.add(1); })] { record.add(0); });
            queues.background().postAfter(1h,
                                          [&record, trace = Trace([&record] { record.add(1); })] { record.add(0); });
        });
        ASSERT_TRUE(gate.isReachedBy(1));
        queues.background().post([trace = Trace([&gate] { gate.open(); })] {});
    }
    EXPECT_EQ(record.numbers(), (std::vector{1, 1}));
}

TEST(LinuxWorkQueuesTest, AQueueDestroyedByItsOwnItemMayOutliveNothingButThatItem) {
    Record record;
    {
        std::promise<void> destroyed;
        LinuxWorkQueues queues(2);
        auto queue = queues.makeSerialQueue("queue", QualityOfService::Default);
        queue->post([&] {
            queue.reset();
            destroyed.set_value();
            std::this_thread::yield();
            record.add(1);
        });
        destroyed.get_future().wait();
    }
    EXPECT_EQ(record.numbers(), (std::vector{1}));
}

} // namespace

} // namespace vela::platform
