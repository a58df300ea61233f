#include "platform/spoor/LinuxSpoor.h"
#include "platform/spoor/SpoorHarness_test.h"
#include "testing/SpoorContract.h"

#include <cerrno>
#include <gmock/gmock.h>
#include <gtest/gtest.h>

namespace vela::testing {

using LinuxSpoorHarnesses = ::testing::Types<platform::RingHarness, platform::FtraceHarness>;
INSTANTIATE_TYPED_TEST_SUITE_P(LinuxSpoor, SpoorContract, LinuxSpoorHarnesses);

} // namespace vela::testing

namespace vela::platform {
namespace {

template <class Harness>
class LinuxSpoorTest : public ::testing::Test {
protected:
    std::unique_ptr<SpoorSession> start(testing::CollectedEvents& collected, std::uint32_t first, std::uint32_t last) {
        auto session = harness_.spoor().createSession();
        session->setCompletionHandler([&collected] { collected.complete(); });
        EXPECT_EQ(session->eventsRange(first, last, [&collected](const auto& event) { collected.add(event); }), 0);
        EXPECT_EQ(session->start(harness_.queue()), 0);
        return session;
    }
    void finish(SpoorSession& session, const testing::CollectedEvents& collected) {
        EXPECT_EQ(session.end(), 0);
        EXPECT_TRUE(harness_.waitFor([&] { return collected.completions() == 1; }));
    }

    Harness harness_;
};
TYPED_TEST_SUITE(LinuxSpoorTest, BothWays);

TYPED_TEST(LinuxSpoorTest, TheWayIsTheOneAskedFor) {
    testing::CollectedEvents collected;
    const auto session = this->start(collected, 1, 2);
    EXPECT_EQ(this->harness_.spoor().usesFtrace(), (std::is_same_v<TypeParam, FtraceHarness>));
    this->finish(*session, collected);
}

TYPED_TEST(LinuxSpoorTest, AnEventKnowsItsThreadProcessorAndTime) {
    testing::CollectedEvents collected;
    const auto session = this->start(collected, 1, 2);
    const std::uint64_t before = spoor::traceNow();
    this->harness_.spoor().emit(1);
    const std::uint64_t after = spoor::traceNow();
    this->finish(*session, collected);
    const auto events = collected.events();
    ASSERT_EQ(events.size(), 1U);
    EXPECT_EQ(events[0].threadID, static_cast<std::uint64_t>(gettid()));
    EXPECT_LT(events[0].cpu, 4096U);
    EXPECT_GE(events[0].timestamp, before);
    EXPECT_LE(events[0].timestamp, after);
    EXPECT_EQ(session->nanoseconds(events[0].timestamp), events[0].timestamp);
}

TYPED_TEST(LinuxSpoorTest, MoreSessionsThanSlotsEachGetTheirRange) {
    constexpr std::uint32_t kSessions = 40;
    std::vector<testing::CollectedEvents> collected(kSessions);
    std::vector<std::unique_ptr<SpoorSession>> sessions;
    for (std::uint32_t i = 0; i < kSessions; ++i) {
        sessions.push_back(this->start(collected[i], 10 * i, 10 * i + 5));
    }
    for (std::uint32_t code = 0; code < 10 * kSessions; ++code) {
        this->harness_.spoor().emit(code);
    }
    for (std::uint32_t i = 0; i < kSessions; ++i) {
        this->finish(*sessions[i], collected[i]);
        EXPECT_THAT(collected[i].codes(),
                    ::testing::ElementsAre(10 * i, 10 * i + 1, 10 * i + 2, 10 * i + 3, 10 * i + 4, 10 * i + 5));
    }
}

TYPED_TEST(LinuxSpoorTest, OverlappingRangesOfASessionEachGetTheEvent) {
    testing::CollectedEvents first;
    testing::CollectedEvents second;
    const auto session = this->harness_.spoor().createSession();
    session->setCompletionHandler([&] { first.complete(); });
    EXPECT_EQ(session->eventsRange(1, 5, [&](const auto& event) { first.add(event); }), 0);
    EXPECT_EQ(session->eventsRange(5, 9, [&](const auto& event) { second.add(event); }), 0);
    EXPECT_EQ(session->start(this->harness_.queue()), 0);
    this->harness_.spoor().emit(5);
    this->finish(*session, first);
    EXPECT_THAT(first.codes(), ::testing::ElementsAre(5));
    EXPECT_THAT(second.codes(), ::testing::ElementsAre(5));
}

TYPED_TEST(LinuxSpoorTest, ASessionWithoutARangeCompletes) {
    testing::CollectedEvents collected;
    const auto session = this->harness_.spoor().createSession();
    session->setCompletionHandler([&] { collected.complete(); });
    EXPECT_EQ(session->start(this->harness_.queue()), 0);
    this->harness_.spoor().emit(1);
    this->finish(*session, collected);
}

TYPED_TEST(LinuxSpoorTest, WhatCannotBeIsAnErrorNumber) {
    testing::CollectedEvents collected;
    const auto session = this->start(collected, 1, 2);
    EXPECT_EQ(session->start(this->harness_.queue()), EALREADY);
    EXPECT_EQ(session->eventsRange(1, 2, {}), EBUSY);
    this->finish(*session, collected);
    EXPECT_EQ(session->end(), EALREADY);
    EXPECT_EQ(this->harness_.spoor().createSession()->end(), EINVAL);
    EXPECT_EQ(this->harness_.spoor().createSession()->eventsRange(2, 1, {}), EINVAL);
}

TYPED_TEST(LinuxSpoorTest, AStartWhereAnotherServiceLivesFails) {
    LinuxSpoor second(spoorOptions(this->harness_.runtimeFolder(), SpoorWay::Rings), this->harness_.clock());
    const auto session = second.createSession();
    EXPECT_EQ(session->start(this->harness_.queue()), EBUSY);
    testing::CollectedEvents collected;
    const auto first = this->start(collected, 1, 2);
    this->harness_.spoor().emit(1);
    this->finish(*first, collected);
    EXPECT_EQ(collected.size(), 1U);
}

TYPED_TEST(LinuxSpoorTest, ASessionMayEndInsideAnEventsHandlerAndBeDestroyedThere) {
    testing::CollectedEvents collected;
    auto session = this->harness_.spoor().createSession();
    std::atomic<int> seen = 0;
    EXPECT_EQ(session->eventsRange(1, 1,
                                   [&](const auto&) {
                                       ++seen;
                                       session.reset();
                                   }),
              0);
    session->setCompletionHandler([&] { collected.complete(); });
    EXPECT_EQ(session->start(this->harness_.queue()), 0);
    this->harness_.spoor().emit(1);
    this->harness_.spoor().emit(1);
    EXPECT_TRUE(this->harness_.waitFor([&] { return seen > 0; }));
    this->harness_.settle();
    EXPECT_EQ(seen, 1);
    EXPECT_EQ(collected.completions(), 0);
}

TYPED_TEST(LinuxSpoorTest, AQueueThatIsHeldUpLosesWhatIsBeyondItsBound) {
    testing::CollectedEvents collected;
    std::atomic<std::uint64_t> seen = 0;
    const auto session = this->harness_.spoor().createSession();
    EXPECT_EQ(session->eventsRange(1, 1, [&](const auto&) { ++seen; }), 0);
    session->setCompletionHandler([&] { collected.complete(); });
    EXPECT_EQ(session->start(this->harness_.queue()), 0);
    this->harness_.queue().suspend();
    constexpr std::uint64_t kEvents = spoor::TraceCollection::kMostWaiting + 5'000;
    for (std::uint64_t i = 0; i < kEvents; ++i) {
        this->harness_.spoor().emit(1);
        if (i % 4'000 == 0) {
            std::this_thread::sleep_for(std::chrono::milliseconds(5)); // leaves the reader its time
        }
    }
    EXPECT_TRUE(this->harness_.waitFor([&] { return session->lostEvents() >= 5'000; }));
    EXPECT_EQ(session->end(), 0);
    this->harness_.queue().resume();
    EXPECT_TRUE(this->harness_.waitFor([&] { return collected.completions() == 1; }));
    EXPECT_EQ(seen + session->lostEvents(), kEvents);
    EXPECT_LE(seen, spoor::TraceCollection::kMostWaiting);
}

TYPED_TEST(LinuxSpoorTest, ASessionOutlivesItsFacility) {
    testing::CollectedEvents collected;
    std::unique_ptr<SpoorSession> session;
    const testing::TemporaryFolder folder;
    {
        LinuxSpoor spoor(spoorOptions(folder.path(), SpoorWay::Rings), this->harness_.clock());
        session = spoor.createSession();
        session->setCompletionHandler([&] { collected.complete(); });
        EXPECT_EQ(session->start(this->harness_.queue()), 0);
    }
    this->finish(*session, collected);
}

TYPED_TEST(LinuxSpoorTest, ManyShortSessionsLoseNothing) {
    constexpr std::uint64_t kEvents = 2'000;
    for (int round = 0; round < 20; ++round) {
        testing::CollectedEvents collected;
        const auto session = this->start(collected, 1, 1);
        for (std::uint64_t i = 0; i < kEvents; ++i) {
            this->harness_.spoor().emit(1, {i, 0, 0, 0});
        }
        this->finish(*session, collected);
        ASSERT_EQ(collected.size(), kEvents);
        ASSERT_EQ(session->lostEvents(), 0U);
    }
}

TEST(LinuxSpoorFallbackTest, WithoutATraceFileSystemThereAreRings) {
    const testing::TemporaryFolder folder;
    const LinuxClock clock;
    LinuxWorkQueues queues;
    const auto queue = queues.makeSerialQueue("spoor.test", QualityOfService::Default);
    LinuxSpoorOptions options = spoorOptions(folder.path(), SpoorWay::Ftrace);
    options.traceFolders = {folder / "none", folder.path()};
    LinuxSpoor spoor(options, clock);
    testing::CollectedEvents collected;
    const auto session = spoor.createSession();
    session->setCompletionHandler([&] { collected.complete(); });
    EXPECT_EQ(session->eventsRange(1, 1, [&](const auto& event) { collected.add(event); }), 0);
    EXPECT_EQ(session->start(*queue), 0);
    EXPECT_FALSE(spoor.usesFtrace());
    spoor.emit(1);
    EXPECT_EQ(session->end(), 0);
    EXPECT_TRUE(testing::waitUntil([&] { return collected.completions() == 1; }));
    EXPECT_EQ(collected.size(), 1U);
}

TEST(LinuxSpoorFallbackTest, AnInstanceOfAnotherServiceIsLeftToIt) {
    if (const std::string reason = reasonAgainstFtrace(); !reason.empty()) {
        GTEST_SKIP() << reason;
    }
    const FtraceHarness harness;
    const spoor::FtraceOptions options{{kTraceFolder}, testInstanceName() + "-own", 64};
    auto first = spoor::FtraceInstance::open(options);
    ASSERT_TRUE(first);
    auto second = spoor::FtraceInstance::open(options);
    ASSERT_TRUE(second);
    EXPECT_NE((*first)->markerPath(), (*second)->markerPath());
    const std::string path = (*first)->markerPath();
    { const auto gone = *std::move(first); }
    auto third = spoor::FtraceInstance::open(options);
    ASSERT_TRUE(third);
    EXPECT_EQ((*third)->markerPath(), path);
}

} // namespace
} // namespace vela::platform
