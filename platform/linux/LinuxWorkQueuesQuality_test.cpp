#include "platform/linux/DeferredWakes.h"
#include "platform/linux/LinuxWorkQueues.h"
#include "platform/linux/WorkQueueTestTools.h"
#include "testing/Record.h"

#include <atomic>
#include <chrono>
#include <fstream>
#include <functional>
#include <future>
#include <gtest/gtest.h>
#include <string>
#include <vector>

namespace vela::platform {

namespace {

using namespace std::chrono_literals;
using vela::testing::Record;

std::string currentThreadName() {
    std::string name;
    std::getline(std::ifstream("/proc/thread-self/comm"), name);
    return name;
}

TEST(LinuxWorkQueuesQualityTest, AThreadThatBlocksBearsTheNameOfTheQueueThatItServes) {
    std::promise<std::string> inSession;
    std::promise<std::string> inTracing;
    std::promise<std::string> inBackground;
    LinuxWorkQueues queues(1);
    const auto session = queues.makeSerialQueue("com.orvex.vela.session.beaconreporting", QualityOfService::Utility);
    const auto tracing = queues.makeSerialQueue("Tracing Queue", QualityOfService::Default);
    const auto threadName = [&queues] {
        const BlockingScope blocking(queues);
        return currentThreadName();
    };
    session->post([&] { inSession.set_value(threadName()); });
    EXPECT_EQ(inSession.get_future().get(), "beaconreporting");
    tracing->post([&] { inTracing.set_value(threadName()); });
    EXPECT_EQ(inTracing.get_future().get(), "Tracing Queue");
    queues.background().post([&] { inBackground.set_value(threadName()); });
    EXPECT_EQ(inBackground.get_future().get(), "vela.background");
}

TEST(LinuxWorkQueuesQualityTest, AThreadThatRunsManyItemsInARowBearsTheNameOfTheirQueue) {
    std::promise<std::string> name;
    Gate gate;
    LinuxWorkQueues queues(1);
    const auto busy = queues.makeSerialQueue("com.orvex.vela.busy", QualityOfService::Utility);
    busy->post(gate.item());
    ASSERT_TRUE(gate.isReachedBy(1));
    for (int i = 0; i < 100; ++i) {
        busy->post([] {});
    }
    busy->post([&name] { name.set_value(currentThreadName()); });
    gate.open();
    EXPECT_EQ(name.get_future().get(), "orvex.vela.busy");
}

// With threads to spare, so that only the order of the wake-ups could let it run beside.
TEST(LinuxWorkQueuesQualityTest, WhatAnItemPostsElsewhereRunsWhenTheItemBlocks) {
    std::promise<void> ran;
    std::promise<bool> seen;
    LinuxWorkQueues queues(4);
    const auto one = queues.makeSerialQueue("one", QualityOfService::Default);
    const auto other = queues.makeSerialQueue("other", QualityOfService::Default);
    one->post([&] {
        other->post([&ran] { ran.set_value(); });
        const BlockingScope blocking(queues);
        seen.set_value(ran.get_future().wait_for(60s) == std::future_status::ready);
    });
    EXPECT_TRUE(seen.get_future().get());
}

TEST(LinuxWorkQueuesQualityTest, WhatABlockedItemPostsElsewhereRunsBesideIt) {
    std::promise<void> ran;
    std::promise<bool> seen;
    LinuxWorkQueues queues(4);
    const auto one = queues.makeSerialQueue("one", QualityOfService::Default);
    const auto other = queues.makeSerialQueue("other", QualityOfService::Default);
    one->post([&] {
        const BlockingScope blocking(queues);
        other->post([&ran] { ran.set_value(); });
        seen.set_value(ran.get_future().wait_for(60s) == std::future_status::ready);
    });
    EXPECT_TRUE(seen.get_future().get());
}

TEST(LinuxWorkQueuesQualityTest, WhatAnItemPostsToAMoreUrgentQueueRunsBesideIt) {
    std::promise<void> ran;
    std::promise<bool> seen;
    LinuxWorkQueues queues(4);
    const auto one = queues.makeSerialQueue("one", QualityOfService::Utility);
    const auto urgent = queues.makeSerialQueue("urgent", QualityOfService::Default);
    one->post([&] {
        urgent->post([&ran] { ran.set_value(); });
        seen.set_value(ran.get_future().wait_for(60s) == std::future_status::ready);
    });
    EXPECT_TRUE(seen.get_future().get());
}

// An item hands work to another queue; one of those behind it waits for it.
TEST(LinuxWorkQueuesQualityTest, WhatAnItemPostsElsewhereRunsBesideItsQueueThatGoesOn) {
    std::promise<void> ran;
    std::promise<bool> seen;
    Gate gate;
    LinuxWorkQueues queues(4);
    const auto one = queues.makeSerialQueue("one", QualityOfService::Default);
    const auto other = queues.makeSerialQueue("other", QualityOfService::Default);
    one->post(gate.item());
    one->post([&] { other->post([&ran] { ran.set_value(); }); });
    for (int i = 0; i < 31; ++i) {
        one->post([] {});
    }
    one->post([&] { seen.set_value(ran.get_future().wait_for(60s) == std::future_status::ready); });
    gate.open();
    EXPECT_TRUE(seen.get_future().get());
}

TEST(LinuxWorkQueuesQualityTest, ATimerIsServedBesideAQueueThatNeverEnds) {
    std::atomic<bool> ran = false;
    std::function<void()> again;
    LinuxWorkQueues queues(1);
    const auto busy = queues.makeSerialQueue("busy", QualityOfService::UserInteractive);
    const auto delayed = queues.makeSerialQueue("delayed", QualityOfService::Background);
    again = [&] { busy->post([&again] { again(); }); };
    busy->post([&again] { again(); });
    delayed->postAfter(5ms, [&ran] { ran = true; });
    EXPECT_TRUE(waitFor([&ran] { return ran.load(); }));
}

TEST(LinuxWorkQueuesQualityTest, MoreUrgentQueuesAreServedFirst) {
    Record record;
    Gate gate;
    LinuxWorkQueues queues(1);
    const auto holding = queues.makeSerialQueue("holding", QualityOfService::UserInteractive);
    const auto background = queues.makeSerialQueue("background", QualityOfService::Background);
    const auto utility = queues.makeSerialQueue("utility", QualityOfService::Utility);
    const auto standard = queues.makeSerialQueue("standard", QualityOfService::Default);
    const auto urgent = queues.makeSerialQueue("urgent", QualityOfService::UserInteractive);
    holding->post(gate.item());
    ASSERT_TRUE(gate.isReachedBy(1));
    background->post([&record] { record.add(4); });
    utility->post([&record] { record.add(3); });
    standard->post([&record] { record.add(2); });
    urgent->post([&record] { record.add(1); });
    gate.open();
    EXPECT_TRUE(waitFor([&record] { return record.size() == 4; }));
    EXPECT_EQ(record.numbers(), (std::vector{1, 2, 3, 4}));
}

TEST(LinuxWorkQueuesQualityTest, AQueueMakesWayForAMoreUrgentOneBetweenItsItems) {
    Record record;
    Gate gate;
    LinuxWorkQueues queues(1);
    const auto utility = queues.makeSerialQueue("utility", QualityOfService::Utility);
    const auto urgent = queues.makeSerialQueue("urgent", QualityOfService::UserInteractive);
    utility->post(gate.item());
    utility->post([&record] { record.add(2); });
    ASSERT_TRUE(gate.isReachedBy(1));
    urgent->post([&record] { record.add(1); });
    gate.open();
    EXPECT_TRUE(waitFor([&record] { return record.size() == 2; }));
    EXPECT_EQ(record.numbers(), (std::vector{1, 2}));
}

TEST(LinuxWorkQueuesQualityTest, BackgroundWorkIsServedBesideUrgentWorkThatNeverEnds) {
    std::atomic<int> ran = 0;
    std::function<void()> again;
    LinuxWorkQueues queues(1);
    const auto urgent = queues.makeSerialQueue("urgent", QualityOfService::UserInteractive);
    again = [&] { urgent->post([&again] { again(); }); };
    urgent->post([&again] { again(); });
    for (int i = 0; i < 10; ++i) {
        queues.background().post([&ran] { ++ran; });
    }
    EXPECT_TRUE(waitFor([&ran] { return ran == 10; }));
}

TEST(LinuxWorkQueuesQualityTest, ABusyQueueLetsItsEqualsHaveTheirTurn) {
    Record record;
    Gate gate;
    LinuxWorkQueues queues(1);
    const auto busy = queues.makeSerialQueue("busy", QualityOfService::Default);
    const auto other = queues.makeSerialQueue("other", QualityOfService::Default);
    busy->post(gate.item());
    ASSERT_TRUE(gate.isReachedBy(1));
    for (int i = 0; i < 1'000; ++i) {
        busy->post([&record] { record.add(1); });
    }
    other->post([&record] { record.add(2); });
    gate.open();
    EXPECT_TRUE(waitFor([&record] { return record.size() == 1'001; }));
    EXPECT_EQ(record.numbers()[63], 2); // the gate and 63 items were the busy queue's share
}

TEST(LinuxWorkQueuesQualityTest, AFewItemsOfALessUrgentQueueRunAtTheThreadsOwnNiceValue) {
    LinuxWorkQueues queues(1);
    const int base = threadNice();
    std::promise<int> nice;
    const auto queue = queues.makeSerialQueue("queue", QualityOfService::Utility);
    queue->post([&nice] { nice.set_value(threadNice()); });
    EXPECT_EQ(nice.get_future().get(), base);
}

TEST(LinuxWorkQueuesQualityTest, AnItemThatBlockedHasTheNiceValueOfItsQueue) {
    LinuxWorkQueues queues(1);
    std::promise<int> nice;
    const auto queue = queues.makeSerialQueue("queue", QualityOfService::Utility);
    queue->post([&] {
        { const BlockingScope blocking(queues); }
        nice.set_value(threadNice());
    });
    const int base = threadNice();
    EXPECT_EQ(nice.get_future().get(),
              queues.appliesThreadPriorities() ? niceFor(QualityOfService::Utility, base) : base);
}

TEST(LinuxWorkQueuesQualityTest, TheBackgroundsItemsHaveItsNiceValueFromTheFirstOn) {
    LinuxWorkQueues queues(1);
    std::promise<int> nice;
    queues.background().post([&nice] { nice.set_value(threadNice()); });
    const int base = threadNice();
    EXPECT_EQ(nice.get_future().get(),
              queues.appliesThreadPriorities() ? niceFor(QualityOfService::Background, base) : base);
}

TEST(LinuxWorkQueuesQualityTest, ThreadsTakeOnTheNiceValueOfTheirQueueWhereTheyMay) {
    LinuxWorkQueues queues(1);
    const int base = threadNice();
    const auto niceIn = [&queues](QualityOfService quality) {
        std::promise<int> nice;
        Gate gate;
        const auto queue = queues.makeSerialQueue("queue", quality);
        queue->post(gate.item());
        for (int i = 0; i < 63; ++i) {
            queue->post([] {});
        }
        queue->post([&nice] { nice.set_value(threadNice()); });
        gate.open();
        return nice.get_future().get();
    };
    const auto expected = [&](QualityOfService quality) {
        return queues.appliesThreadPriorities() ? niceFor(quality, base) : base;
    };
    for (const auto quality : {QualityOfService::Background, QualityOfService::UserInteractive,
                               QualityOfService::Utility, QualityOfService::Default}) {
        EXPECT_EQ(niceIn(quality), expected(quality));
    }
    EXPECT_EQ(threadNice(), base);
}

TEST(LinuxWorkQueuesQualityTest, WhatIsPostedWhileWakesAreDeferredRunsAfterwards) {
    std::atomic<int> ran = 0;
    LinuxWorkQueues queues(4);
    std::vector<std::unique_ptr<SerialQueue>> all;
    all.reserve(20);
    for (int i = 0; i < 20; ++i) {
        all.push_back(queues.makeSerialQueue("queue", QualityOfService::Default));
    }
    for (int round = 0; round < 200; ++round) {
        const DeferredWakes wakes;
        for (const auto& queue : all) {
            queue->post([&ran] { ++ran; });
        }
    }
    EXPECT_TRUE(waitFor([&ran] { return ran == 4'000; }));
}

TEST(LinuxWorkQueuesQualityTest, AThreadThatSleepsIsWokenWhenTheDeferringEnds) {
    std::promise<void> first;
    std::promise<void> second;
    LinuxWorkQueues queues(1);
    const auto queue = queues.makeSerialQueue("queue", QualityOfService::Default);
    queue->post([&first] { first.set_value(); });
    first.get_future().get();
    {
        const DeferredWakes outer;
        const DeferredWakes inner;
        queue->post([&second] { second.set_value(); });
    }
    EXPECT_EQ(second.get_future().wait_for(60s), std::future_status::ready);
}

} // namespace

} // namespace vela::platform
