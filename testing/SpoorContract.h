// What every Spoor does, as a test suite that runs on the fake and on the real ones.
//
// A harness has: `platform::Spoor& spoor()`; `platform::SerialQueue& queue()`, which the sessions of a test deliver on;
// `bool waitFor(const std::function<bool()>& condition)`, which lets things happen until `condition` holds, or answers
// false when it does not within some seconds; `void settle()`, which returns when all that is under way has happened;
// and `bool makeStartsFail()`: every later start fails, or the answer is false where that cannot be arranged. What a
// test asks of the conditions runs on the test's thread. Codes are 0x21040000 and above, outside of everybody's use.
#pragma once

#include "platform/Mutex.h"
#include "platform/Spoor.h"
#include "platform/WorkQueue.h"

#include <array>
#include <atomic>
#include <chrono>
#include <cstddef>
#include <cstdint>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <map>
#include <memory>
#include <set>
#include <thread>
#include <vector>

namespace vela::testing {

/// What one session delivered. Thread-safe.
class CollectedEvents {
public:
    void add(const platform::SpoorEvent& event) {
        const MutexLock lock(mutex_);
        events_.push_back(event);
    }
    std::vector<platform::SpoorEvent> events() const {
        const MutexLock lock(mutex_);
        return events_;
    }
    std::vector<std::uint32_t> codes() const {
        std::vector<std::uint32_t> codes;
        for (const platform::SpoorEvent& event : events()) {
            codes.push_back(event.eventCode);
        }
        return codes;
    }
    std::size_t size() const {
        const MutexLock lock(mutex_);
        return events_.size();
    }
    void complete() { ++completions_; }
    int completions() const { return completions_; }

private:
    mutable Mutex mutex_;
    std::vector<platform::SpoorEvent> events_ VELA_GUARDED_BY(mutex_);
    std::atomic<int> completions_ = 0;
};

template <class Harness>
class SpoorContract : public ::testing::Test {
protected:
    static constexpr std::uint32_t kFirst = 0x21040100;
    static constexpr std::uint32_t kLast = 0x2104010F;

    platform::Spoor& spoor() { return harness_.spoor(); }

    /// A session with a completion handler and a range, not started.
    std::unique_ptr<platform::SpoorSession> make(CollectedEvents& collected, std::uint32_t first = kFirst,
                                                 std::uint32_t last = kLast) {
        auto session = spoor().createSession();
        session->setCompletionHandler([&collected] { collected.complete(); });
        EXPECT_EQ(session->eventsRange(first, last, [&collected](const auto& event) { collected.add(event); }), 0);
        return session;
    }
    std::unique_ptr<platform::SpoorSession> makeStarted(CollectedEvents& collected, std::uint32_t first = kFirst,
                                                        std::uint32_t last = kLast) {
        auto session = make(collected, first, last);
        EXPECT_EQ(session->start(harness_.queue()), 0);
        return session;
    }
    /// Ends the session and waits for its completion.
    void endAndWait(platform::SpoorSession& session, CollectedEvents& collected) {
        const int before = collected.completions();
        EXPECT_EQ(session.end(), 0);
        EXPECT_TRUE(harness_.waitFor([&] { return collected.completions() > before; })) << "no completion came";
    }

    Harness harness_;
};

TYPED_TEST_SUITE_P(SpoorContract);

TYPED_TEST_P(SpoorContract, AnEventIsDeliveredWithItsCodeAndArguments) {
    CollectedEvents collected;
    const auto session = this->makeStarted(collected);
    this->spoor().emit(0x21040101, {1, 0xFFFFFFFFFFFFFFFF, 3, 0x8000000000000000});
    this->spoor().emit(0x21040102);
    this->endAndWait(*session, collected);
    const auto events = collected.events();
    ASSERT_EQ(events.size(), 2U);
    EXPECT_EQ(events[0].eventCode, 0x21040101U);
    EXPECT_THAT(events[0].arguments, ::testing::ElementsAre(1, 0xFFFFFFFFFFFFFFFF, 3, 0x8000000000000000));
    EXPECT_EQ(events[1].eventCode, 0x21040102U);
    EXPECT_THAT(events[1].arguments, ::testing::ElementsAre(0, 0, 0, 0));
    EXPECT_EQ(events[0].threadID, events[1].threadID);
}

TYPED_TEST_P(SpoorContract, BothEndsOfARangeBelongToItAndTheirNeighboursDoNot) {
    CollectedEvents collected;
    const auto session = this->makeStarted(collected, 0x21040000, 0x2104408A);
    for (const std::uint32_t code : {0x2103FFFFU, 0x21040000U, 0x2104408AU, 0x2104408BU}) {
        this->spoor().emit(code);
    }
    this->endAndWait(*session, collected);
    EXPECT_THAT(collected.codes(), ::testing::ElementsAre(0x21040000, 0x2104408A));
}

TYPED_TEST_P(SpoorContract, EveryRangeHasItsOwnHandler) {
    CollectedEvents low;
    CollectedEvents high;
    const auto session = this->make(low, 0x21040100, 0x21040101);
    EXPECT_EQ(session->eventsRange(0x21040104, 0x21040104, [&](const auto& event) { high.add(event); }), 0);
    EXPECT_EQ(session->start(this->harness_.queue()), 0);
    for (std::uint32_t code = 0x21040100; code <= 0x21040105; ++code) {
        this->spoor().emit(code);
    }
    this->endAndWait(*session, low);
    EXPECT_THAT(low.codes(), ::testing::ElementsAre(0x21040100, 0x21040101));
    EXPECT_THAT(high.codes(), ::testing::ElementsAre(0x21040104));
}

TYPED_TEST_P(SpoorContract, EventsOfOneThreadComeInTheirOrder) {
    constexpr std::uint64_t kThreads = 3;
    constexpr std::uint64_t kEvents = 2'000;
    CollectedEvents collected;
    const auto session = this->makeStarted(collected);
    std::vector<std::thread> threads;
    threads.reserve(kThreads);
    for (std::uint64_t thread = 0; thread < kThreads; ++thread) {
        threads.emplace_back([this, thread] {
            for (std::uint64_t number = 0; number < kEvents; ++number) {
                this->spoor().emit(0x21040100, {thread, number, 0, 0});
            }
        });
    }
    for (std::thread& thread : threads) {
        thread.join();
    }
    this->endAndWait(*session, collected);
    EXPECT_EQ(session->lostEvents(), 0U);
    EXPECT_EQ(collected.size(), kThreads * kEvents);
    struct Thread {
        std::uint64_t next = 0;
        std::uint64_t time = 0;
        std::set<std::uint64_t> identities;
    };
    std::map<std::uint64_t, Thread> seen;
    std::set<std::uint64_t> identities;
    for (const platform::SpoorEvent& event : collected.events()) {
        Thread& thread = seen[event.arguments[0]];
        ASSERT_EQ(event.arguments[1], thread.next++);
        ASSERT_GE(event.timestamp, thread.time);
        thread.time = event.timestamp;
        thread.identities.insert(event.threadID);
        identities.insert(event.threadID);
    }
    for (const auto& [number, thread] : seen) {
        EXPECT_EQ(thread.identities.size(), 1U) << "thread " << number;
    }
    EXPECT_EQ(identities.size(), kThreads);
}

TYPED_TEST_P(SpoorContract, AllThatWasEmittedBeforeTheEndComesBeforeTheCompletion) {
    constexpr std::size_t kEvents = 5'000;
    CollectedEvents collected;
    std::atomic<std::size_t> atCompletion = 0;
    const auto session = this->make(collected);
    session->setCompletionHandler([&] {
        atCompletion = collected.size();
        collected.complete();
    });
    EXPECT_EQ(session->start(this->harness_.queue()), 0);
    for (std::size_t i = 0; i < kEvents; ++i) {
        this->spoor().emit(0x21040100, {i, 0, 0, 0});
    }
    this->endAndWait(*session, collected);
    this->harness_.settle();
    EXPECT_EQ(atCompletion, kEvents);
    EXPECT_EQ(collected.size(), kEvents);
    EXPECT_EQ(session->lostEvents(), 0U);
}

TYPED_TEST_P(SpoorContract, EventsAndCompletionComeOnTheQueue) {
    std::atomic<int> onTheQueue = 0;
    CollectedEvents collected;
    const auto session = this->spoor().createSession();
    const auto& queue = this->harness_.queue();
    EXPECT_EQ(
        session->eventsRange(0x21040100, 0x21040100, [&](const auto&) { onTheQueue += queue.isCurrent() ? 1 : 0; }), 0);
    session->setCompletionHandler([&] {
        onTheQueue += queue.isCurrent() ? 10 : 0;
        collected.complete();
    });
    EXPECT_EQ(session->start(this->harness_.queue()), 0);
    this->spoor().emit(0x21040100);
    this->endAndWait(*session, collected);
    EXPECT_EQ(onTheQueue, 11);
}

TYPED_TEST_P(SpoorContract, OnlyWhatIsEmittedBetweenStartAndEndIsDelivered) {
    CollectedEvents collected;
    this->spoor().emit(0x21040101);
    const auto session = this->make(collected);
    this->spoor().emit(0x21040102);
    EXPECT_EQ(session->start(this->harness_.queue()), 0);
    this->spoor().emit(0x21040103);
    this->endAndWait(*session, collected);
    this->spoor().emit(0x21040104);
    this->harness_.settle();
    EXPECT_THAT(collected.codes(), ::testing::ElementsAre(0x21040103));
}

TYPED_TEST_P(SpoorContract, EventsAreDeliveredWhileTheSessionRuns) {
    CollectedEvents collected;
    const auto session = this->makeStarted(collected);
    this->spoor().emit(0x21040100);
    EXPECT_TRUE(this->harness_.waitFor([&] { return collected.size() == 1; }));
    EXPECT_EQ(collected.completions(), 0);
    this->endAndWait(*session, collected);
    EXPECT_EQ(collected.size(), 1U);
}

TYPED_TEST_P(SpoorContract, ASessionThatIsEndedTwiceCompletesOnce) {
    CollectedEvents collected;
    const auto session = this->makeStarted(collected);
    this->endAndWait(*session, collected);
    session->end();
    this->harness_.settle();
    EXPECT_EQ(collected.completions(), 1);
}

TYPED_TEST_P(SpoorContract, ASessionWithoutEventsCompletes) {
    CollectedEvents collected;
    const auto session = this->makeStarted(collected);
    this->endAndWait(*session, collected);
    EXPECT_EQ(collected.size(), 0U);
    EXPECT_EQ(session->lostEvents(), 0U);
}

TYPED_TEST_P(SpoorContract, ASessionWhoseStartFailedCompletesOnceAtItsEnd) {
    if (!this->harness_.makeStartsFail()) {
        GTEST_SKIP() << "starts cannot be made to fail here";
    }
    CollectedEvents collected;
    const auto session = this->make(collected);
    EXPECT_NE(session->start(this->harness_.queue()), 0);
    this->spoor().emit(0x21040100);
    this->harness_.settle();
    EXPECT_EQ(collected.completions(), 0);
    this->endAndWait(*session, collected);
    session->end();
    this->harness_.settle();
    EXPECT_EQ(collected.completions(), 1);
    EXPECT_EQ(collected.size(), 0U);
}

TYPED_TEST_P(SpoorContract, ASessionThatNobodyStartedAnswersAnErrorAndDoesNotComplete) {
    CollectedEvents collected;
    const auto session = this->make(collected);
    EXPECT_NE(session->end(), 0);
    this->harness_.settle();
    EXPECT_EQ(collected.completions(), 0);
}

TYPED_TEST_P(SpoorContract, ASessionMayBeDestroyedInsideItsOwnCompletionHandler) {
    CollectedEvents collected;
    auto session = this->make(collected);
    session->setCompletionHandler([&] {
        session.reset();
        collected.complete();
    });
    EXPECT_EQ(session->start(this->harness_.queue()), 0);
    this->spoor().emit(0x21040100);
    EXPECT_EQ(session->end(), 0);
    EXPECT_TRUE(this->harness_.waitFor([&] { return collected.completions() == 1; }));
    this->harness_.settle();
    EXPECT_EQ(collected.completions(), 1);
    EXPECT_EQ(collected.size(), 1U);
    EXPECT_EQ(session, nullptr);
}

TYPED_TEST_P(SpoorContract, ASessionThatIsDestroyedBeforeItsEndDeliversNothingMore) {
    CollectedEvents collected;
    auto session = this->makeStarted(collected);
    this->spoor().emit(0x21040100);
    std::atomic<bool> destroyed = false;
    std::size_t atDestruction = 0;
    this->harness_.queue().post([&] {
        session.reset();
        atDestruction = collected.size();
        destroyed = true;
    });
    EXPECT_TRUE(this->harness_.waitFor([&] { return destroyed.load(); }));
    this->spoor().emit(0x21040101);
    this->harness_.settle();
    EXPECT_EQ(collected.completions(), 0);
    EXPECT_EQ(collected.size(), atDestruction);
}

TYPED_TEST_P(SpoorContract, ASessionThatIsDestroyedBetweenItsEndAndItsCompletionDoesNotComplete) {
    CollectedEvents collected;
    auto session = this->makeStarted(collected);
    std::atomic<bool> destroyed = false;
    this->harness_.queue().post([&] {
        EXPECT_EQ(session->end(), 0);
        session.reset();
        destroyed = true;
    });
    EXPECT_TRUE(this->harness_.waitFor([&] { return destroyed.load(); }));
    this->harness_.settle();
    EXPECT_EQ(collected.completions(), 0);
}

TYPED_TEST_P(SpoorContract, AnEventThatNobodyCollectsGoesNowhere) {
    this->spoor().emit(0x21040100);
    CollectedEvents collected;
    const auto session = this->makeStarted(collected);
    this->endAndWait(*session, collected);
    this->spoor().emit(0x21040100);
    this->harness_.settle();
    EXPECT_EQ(collected.size(), 0U);
}

TYPED_TEST_P(SpoorContract, SessionsAtTheSameTimeEachGetTheirRange) {
    CollectedEvents low;
    CollectedEvents high;
    const auto lowSession = this->makeStarted(low, 0x21040100, 0x21040102);
    const auto highSession = this->makeStarted(high, 0x21040102, 0x21040103);
    for (std::uint32_t code = 0x21040100; code <= 0x21040103; ++code) {
        this->spoor().emit(code);
    }
    this->endAndWait(*lowSession, low);
    this->spoor().emit(0x21040102);
    this->endAndWait(*highSession, high);
    EXPECT_THAT(low.codes(), ::testing::ElementsAre(0x21040100, 0x21040101, 0x21040102));
    EXPECT_THAT(high.codes(), ::testing::ElementsAre(0x21040102, 0x21040103, 0x21040102));
}

TYPED_TEST_P(SpoorContract, OneSessionAfterTheOther) {
    for (std::uint64_t round = 0; round < 5; ++round) {
        CollectedEvents collected;
        const auto session = this->makeStarted(collected);
        this->spoor().emit(0x21040100, {round, 0, 0, 0});
        this->endAndWait(*session, collected);
        const auto events = collected.events();
        ASSERT_EQ(events.size(), 1U);
        EXPECT_EQ(events[0].arguments[0], round);
    }
}

TYPED_TEST_P(SpoorContract, LaterTimestampsAreLaterInNanoseconds) {
    CollectedEvents collected;
    const auto session = this->makeStarted(collected);
    for (int i = 0; i < 100; ++i) {
        this->spoor().emit(0x21040100);
    }
    this->endAndWait(*session, collected);
    std::uint64_t last = 0;
    for (const platform::SpoorEvent& event : collected.events()) {
        const std::uint64_t time = session->nanoseconds(event.timestamp);
        EXPECT_GE(time, last);
        EXPECT_GT(time, 0U);
        last = time;
    }
    EXPECT_EQ(collected.size(), 100U);
}

TYPED_TEST_P(SpoorContract, WallTimesAreThereWhenTheyWereAskedFor) {
    using std::chrono::seconds;
    using std::chrono::system_clock;
    CollectedEvents with;
    CollectedEvents without;
    const auto sessionWith = this->make(with);
    sessionWith->setWallTimesEnabled(true);
    EXPECT_EQ(sessionWith->start(this->harness_.queue()), 0);
    const auto sessionWithout = this->makeStarted(without);
    const auto before = std::chrono::duration_cast<seconds>(system_clock::now().time_since_epoch()).count();
    this->spoor().emit(0x21040100);
    const auto after = std::chrono::duration_cast<seconds>(system_clock::now().time_since_epoch()).count();
    this->endAndWait(*sessionWith, with);
    this->endAndWait(*sessionWithout, without);
    ASSERT_EQ(with.size(), 1U);
    EXPECT_GE(with.events()[0].wallTimeSeconds, before - 1);
    EXPECT_LE(with.events()[0].wallTimeSeconds, after + 1);
    EXPECT_GE(with.events()[0].wallTimeMicroseconds, 0);
    EXPECT_LT(with.events()[0].wallTimeMicroseconds, 1'000'000);
    ASSERT_EQ(without.size(), 1U);
    EXPECT_EQ(without.events()[0].wallTimeSeconds, 0);
    EXPECT_EQ(without.events()[0].wallTimeMicroseconds, 0);
}

REGISTER_TYPED_TEST_SUITE_P(SpoorContract, AnEventIsDeliveredWithItsCodeAndArguments,
                            BothEndsOfARangeBelongToItAndTheirNeighboursDoNot, EveryRangeHasItsOwnHandler,
                            EventsOfOneThreadComeInTheirOrder, AllThatWasEmittedBeforeTheEndComesBeforeTheCompletion,
                            EventsAndCompletionComeOnTheQueue, OnlyWhatIsEmittedBetweenStartAndEndIsDelivered,
                            EventsAreDeliveredWhileTheSessionRuns, ASessionThatIsEndedTwiceCompletesOnce,
                            ASessionWithoutEventsCompletes, ASessionWhoseStartFailedCompletesOnceAtItsEnd,
                            ASessionThatNobodyStartedAnswersAnErrorAndDoesNotComplete,
                            ASessionMayBeDestroyedInsideItsOwnCompletionHandler,
                            ASessionThatIsDestroyedBeforeItsEndDeliversNothingMore,
                            ASessionThatIsDestroyedBetweenItsEndAndItsCompletionDoesNotComplete,
                            AnEventThatNobodyCollectsGoesNowhere, SessionsAtTheSameTimeEachGetTheirRange,
                            OneSessionAfterTheOther, LaterTimestampsAreLaterInNanoseconds,
                            WallTimesAreThereWhenTheyWereAskedFor);

} // namespace vela::testing
