// One walk for all intervals finds what a plain walk for each of them finds, whatever the events.
#include "tracing/IntervalMatching.h"
#include "tracing/Trace.h"
#include "tracing/Trace_test.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <map>
#include <random>

namespace vela {

namespace {

// What a plain walk finds for one interval: the definition, step by step.

IntervalMatches plainMatchesByThread(const platform::SpoorSession& session, const std::vector<trace_point>& points,
                                     const IntervalCodes& interval) {
    IntervalMatches matches;
    std::map<std::uint64_t, std::uint64_t> starts;
    for (const trace_point& point : points) {
        const auto pending = starts.find(point.threadID);
        const bool isPending = pending != starts.end();
        if (point.eventCode == interval.begin) {
            matches.droppedStarts += isPending ? 1U : 0U;
            starts[point.threadID] = point.timestamp;
        } else if (point.eventCode == interval.end && isPending) {
            matches.durations.push_back(session.nanoseconds(point.timestamp) - session.nanoseconds(pending->second));
            starts.erase(pending);
        } else if (point.eventCode == interval.end) {
            ++matches.droppedStops;
        }
    }
    return matches;
}

IntervalMatches plainMatchesProcessWide(const platform::SpoorSession& session, const std::vector<trace_point>& points,
                                        const IntervalCodes& interval) {
    IntervalMatches matches;
    std::uint64_t start = 0;
    for (const trace_point& point : points) {
        if (point.eventCode == interval.begin) {
            matches.droppedStarts += start != 0 ? 1U : 0U;
            start = point.timestamp;
        } else if (point.eventCode == interval.end && start != 0) {
            matches.durations.push_back(session.nanoseconds(point.timestamp) - session.nanoseconds(start));
            start = 0;
        } else if (point.eventCode == interval.end) {
            ++matches.droppedStops;
        }
    }
    return matches;
}

IntervalMatches plainMatches(const platform::SpoorSession& session, const std::vector<trace_point>& points,
                             const IntervalCodes& interval) {
    return interval.matchedByThread ? plainMatchesByThread(session, points, interval)
                                    : plainMatchesProcessWide(session, points, interval);
}

class Random {
public:
    explicit Random(std::uint32_t seed) : engine_(seed) {}
    /// 0 to `limit` - 1.
    std::uint32_t below(std::uint32_t limit) {
        return std::uniform_int_distribution<std::uint32_t>(0, limit - 1)(engine_);
    }

private:
    std::mt19937 engine_;
};

struct Input {
    std::vector<IntervalCodes> intervals;
    std::vector<trace_point> points;
};

/// Few codes and threads, so that everything meets everything; times that stand still, go back and are zero.
Input randomInput(std::uint32_t seed) {
    Random random(seed);
    Input input;
    const std::uint32_t codes = 1 + random.below(12);
    const std::uint32_t threads = 1 + random.below(seed % 4 == 0 ? 300 : 5);
    const std::uint32_t count = random.below(20);
    for (std::uint32_t i = 0; i < count; ++i) {
        input.intervals.push_back({random.below(codes), random.below(codes), random.below(2) == 0});
    }
    const std::uint32_t events = random.below(2'000);
    for (std::uint32_t i = 0; i < events; ++i) {
        const std::uint64_t time = random.below(10) == 0 ? random.below(3) : i + random.below(40);
        input.points.push_back(eventAt(time, random.below(codes + 1), random.below(threads)));
    }
    return input;
}

void expectSame(const IntervalMatches& found, const IntervalMatches& expected, const IntervalCodes& interval) {
    EXPECT_EQ(found.durations, expected.durations) << interval.begin << " " << interval.end;
    EXPECT_EQ(found.droppedStarts, expected.droppedStarts) << interval.begin << " " << interval.end;
    EXPECT_EQ(found.droppedStops, expected.droppedStops) << interval.begin << " " << interval.end;
}

TEST(IntervalMatchingTest, OneWalkFindsWhatPlainWalksFind) {
    TraceClock clock;
    clock.spoor.setTimeUnit(125, 3);
    std::size_t pairs = 0;
    for (std::uint32_t seed = 1; seed <= 400; ++seed) {
        const Input input = randomInput(seed);
        const auto together = matchIntervals(*clock.session, input.points, input.intervals, nullptr).intervals;
        ASSERT_EQ(together.size(), input.intervals.size());
        for (std::size_t i = 0; i < together.size(); ++i) {
            const IntervalMatches expected = plainMatches(*clock.session, input.points, input.intervals[i]);
            expectSame(together[i], expected, input.intervals[i]);
            expectSame(
                matchIntervals(*clock.session, input.points, {&input.intervals[i], 1}, nullptr).intervals.front(),
                expected, input.intervals[i]);
            pairs += expected.durations.size();
        }
        ASSERT_FALSE(::testing::Test::HasFailure()) << "seed " << seed;
    }
    EXPECT_GT(pairs, 100'000U) << "the inputs hold too little";
}

TEST(IntervalMatchingTest, ATraceFindsAndSaysWhatItsItemsAloneFindAndSay) {
    TraceClock clock;
    clock.spoor.setTimeUnit(125, 3);
    testing::CapturingLog log;
    for (std::uint32_t seed = 1; seed <= 100; ++seed) {
        const Input input = randomInput(seed);
        Trace together("together", true);
        Trace alone("alone", true);
        for (std::size_t i = 0; i < input.intervals.size(); ++i) {
            const auto& [begin, end, byThread] = input.intervals[i];
            const std::string name = "item " + std::to_string(i % 7);
            together.addTraceDataToCollect(std::make_unique<TraceInterval>(name, begin, end, byThread));
            alone.addTraceDataToCollect(std::make_unique<TraceInterval>(name, begin, end, byThread));
        }
        log.clear();
        together.processTracepoints(*clock.session, input.points);
        const auto linesTogether = log.lines();
        log.clear();
        for (const auto& interval : alone.intervals()) {
            interval->processTracepoints(*clock.session, input.points);
        }
        ASSERT_EQ(linesTogether, log.lines()) << "seed " << seed;
        ASSERT_EQ(together.getResults(), alone.getResults()) << "seed " << seed;
        for (std::size_t i = 0; i < input.intervals.size(); ++i) {
            ASSERT_EQ(together.intervals()[i]->getNumTimesTraced(), alone.intervals()[i]->getNumTimesTraced());
        }
    }
}

TEST(IntervalMatchingTest, ThousandsOfIntervalsAndThreadsAreMatchedApart) {
    constexpr std::uint32_t kIntervals = 1'000;
    constexpr std::uint64_t kThreads = 50;
    TraceClock clock;
    std::vector<IntervalCodes> intervals;
    std::vector<trace_point> points;
    for (std::uint32_t i = 0; i < kIntervals; ++i) {
        intervals.push_back({0x21040000 + 2 * i, 0x21040001 + 2 * i, i % 2 == 0});
    }
    for (std::uint64_t thread = 1; thread <= kThreads; ++thread) {
        for (std::uint32_t i = 0; i < kIntervals; ++i) {
            points.push_back(eventAt(100, intervals[i].begin, thread));
        }
    }
    for (std::uint64_t thread = kThreads; thread >= 1; --thread) {
        for (std::uint32_t i = 0; i < kIntervals; ++i) {
            points.push_back(eventAt(100 + thread, intervals[i].end, thread));
        }
    }
    const auto matches = matchIntervals(*clock.session, points, intervals, nullptr).intervals;
    for (std::uint32_t i = 0; i < kIntervals; ++i) {
        if (intervals[i].matchedByThread) {
            ASSERT_EQ(matches[i].durations.size(), kThreads);
            ASSERT_EQ(matches[i].durations.front(), kThreads);
            ASSERT_EQ(matches[i].durations.back(), 1U);
            ASSERT_EQ(matches[i].droppedStarts + matches[i].droppedStops, 0U);
        } else {
            ASSERT_EQ(matches[i].durations.size(), 1U);
            ASSERT_EQ(matches[i].droppedStarts, kThreads - 1);
            ASSERT_EQ(matches[i].droppedStops, kThreads - 1);
        }
    }
}

TEST(IntervalMatchingTest, EveryCodeAndThreadNumberIsAllowed) {
    TraceClock clock;
    const std::vector<IntervalCodes> intervals{{0, 0xFFFFFFFF, true}, {0xFFFFFFFF, 0, true}};
    const std::uint64_t thread = 0xFFFFFFFFFFFFFFFF;
    const std::vector points{eventAt(1, 0, thread), eventAt(2, 0xFFFFFFFF, thread), eventAt(4, 0, thread),
                             eventAt(5, 0xFFFFFFFF, 0), eventAt(0xFFFFFFFFFFFFFFFF, 0, 0)};
    const auto matches = matchIntervals(*clock.session, points, intervals, nullptr).intervals;
    EXPECT_THAT(matches[0].durations, ::testing::ElementsAre(1));
    EXPECT_THAT(matches[1].durations, ::testing::ElementsAre(2, 0xFFFFFFFFFFFFFFFA));
}

TEST(IntervalMatchingTest, WithoutIntervalsThereIsNothingToFind) {
    TraceClock clock;
    EXPECT_TRUE(matchIntervals(*clock.session, std::vector{eventAt(1, 0)}, {}, nullptr).intervals.empty());
}

TEST(IntervalMatchingTest, EventsBeyondTheLimitOfStepsAreCountedAndNotMatched) {
    TraceClock clock;
    // An event of code 1 takes two steps, one of code 2 takes two, code 3 is unknown.
    const std::vector<IntervalCodes> intervals{{1, 2, true}, {1, 2, false}};
    const std::vector points{eventAt(1, 1), eventAt(2, 2), eventAt(3, 1), eventAt(4, 2), eventAt(5, 3)};
    const auto all = matchIntervals(*clock.session, points, intervals, nullptr, {.steps = 8});
    EXPECT_EQ(all.unmatchedEvents, 0U);
    EXPECT_THAT(all.intervals[0].durations, ::testing::ElementsAre(1, 1));
    const auto some = matchIntervals(*clock.session, points, intervals, nullptr, {.steps = 7});
    EXPECT_EQ(some.unmatchedEvents, 1U);
    EXPECT_THAT(some.intervals[0].durations, ::testing::ElementsAre(1));
    EXPECT_THAT(some.intervals[1].durations, ::testing::ElementsAre(1));
    EXPECT_EQ(some.intervals[0].droppedStops, 0U);
}

TEST(IntervalMatchingTest, EventsBeyondTheLimitOfPendingStartsAreCountedAndNotMatched) {
    TraceClock clock;
    const std::vector<IntervalCodes> intervals{{1, 2, true}};
    std::vector<trace_point> points;
    for (std::uint64_t thread = 0; thread < 10; ++thread) {
        points.push_back(eventAt(thread, 1, thread));
    }
    const auto matched = matchIntervals(*clock.session, points, intervals, nullptr, {.pendingStarts = 6});
    EXPECT_EQ(matched.unmatchedEvents, 3U);
}

} // namespace

} // namespace vela
