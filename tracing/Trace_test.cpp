// A trace: all of its intervals in one walk, their lines and their results.
#include "tracing/Trace_test.h"

#include "tracing/Trace.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

namespace vela {

namespace {

using ::testing::ElementsAre;
using ::testing::IsEmpty;
using ::testing::Pair;

class TraceTest : public ::testing::Test {
protected:
    void add(const std::string& name, std::uint32_t begin, std::uint32_t end, bool matchedByThread = true) {
        trace_.addTraceDataToCollect(std::make_unique<TraceInterval>(name, begin, end, matchedByThread));
    }
    void process(const std::vector<trace_point>& points) { trace_.processTracepoints(*clock_.session, points); }

    testing::CapturingLog log_;
    TraceClock clock_;
    Trace trace_{"start", true};
};

TEST_F(TraceTest, ItKnowsItsNameAndWhetherItIsCritical) {
    EXPECT_EQ(trace_.name(), "start");
    EXPECT_TRUE(trace_.isCritical());
    EXPECT_FALSE(Trace("", false).isCritical());
}

TEST_F(TraceTest, ResultsStandByNameInByteOrder) {
    add("b", 1, 2);
    add("a", 3, 4);
    add("B", 5, 6);
    add("\xC3\xA4", 7, 8);
    process({eventAt(1, 1), eventAt(2, 2), eventAt(3, 3), eventAt(5, 4), eventAt(5, 5), eventAt(8, 6), eventAt(8, 7),
             eventAt(12, 8)});
    EXPECT_THAT(trace_.getResults(), ElementsAre(Pair("B", ElementsAre(3)), Pair("a", ElementsAre(2)),
                                                 Pair("b", ElementsAre(1)), Pair("\xC3\xA4", ElementsAre(4))));
}

TEST_F(TraceTest, ItemsWithoutResultsDoNotShow) {
    add("a", 1, 2);
    add("never", 3, 4);
    process({eventAt(1, 1), eventAt(2, 2)});
    EXPECT_THAT(trace_.getResults(), ElementsAre(Pair("a", ElementsAre(1))));
}

TEST_F(TraceTest, ItemsOfOneNameShareIt) {
    add("same", 1, 2);
    add("same", 3, 4);
    process({eventAt(1, 3), eventAt(11, 4), eventAt(20, 1), eventAt(21, 2), eventAt(30, 1), eventAt(32, 2)});
    EXPECT_THAT(trace_.getResults(), ElementsAre(Pair("same", ElementsAre(1, 2, 10))));
}

TEST_F(TraceTest, AskedTwiceResultsDouble) {
    add("a", 1, 2);
    add("b", 1, 3);
    process({eventAt(1, 1), eventAt(5, 2), eventAt(6, 3), eventAt(7, 1), eventAt(8, 2)});
    EXPECT_THAT(trace_.getResults(), ElementsAre(Pair("a", ElementsAre(4, 1)), Pair("b", ElementsAre(5))));
    EXPECT_THAT(trace_.getResults(), ElementsAre(Pair("a", ElementsAre(4, 1, 4, 1)), Pair("b", ElementsAre(5, 5))));
}

TEST_F(TraceTest, WithoutItemsThereAreNoResults) {
    process({eventAt(1, 1)});
    EXPECT_THAT(trace_.getResults(), IsEmpty());
}

TEST_F(TraceTest, OneEventMayBeginOneIntervalAndEndAnother) {
    add("first", 1, 2);
    add("second", 2, 3);
    add("third", 3, 1, false);
    process({eventAt(1, 1), eventAt(3, 2), eventAt(7, 3), eventAt(8, 1)});
    EXPECT_THAT(trace_.getResults(), ElementsAre(Pair("first", ElementsAre(2)), Pair("second", ElementsAre(4)),
                                                 Pair("third", ElementsAre(1))));
    EXPECT_THAT(log_.lines(), ElementsAre(intervalLine(LogLevel::Default,
                                                       "DISCARDED 0 trace Stop points for interval third because no "
                                                       "start points found")));
}

TEST_F(TraceTest, IntervalsThatShareACodeAreMatchedApart) {
    add("short", 1, 2);
    add("long", 1, 3);
    add("wide", 1, 3, false);
    process({eventAt(1, 1, 5), eventAt(3, 2, 5), eventAt(7, 3, 5), eventAt(9, 3, 6)});
    EXPECT_THAT(trace_.getResults(),
                ElementsAre(Pair("long", ElementsAre(6)), Pair("short", ElementsAre(2)), Pair("wide", ElementsAre(6))));
}

TEST_F(TraceTest, LinesComeItemByItemInTheirOrder) {
    add("one", 1, 2, false);
    add("two", 3, 4);
    add("three", 1, 4);
    // What "two" drops comes first in time, what "one" drops last.
    process({eventAt(1, 4), eventAt(2, 3), eventAt(3, 3), eventAt(4, 2), eventAt(5, 1), eventAt(6, 1)});
    EXPECT_THAT(
        log_.lines(),
        ElementsAre(intervalLine(LogLevel::Default,
                                 "DISCARDED 1 trace Start points for interval one because no stop points found"),
                    intervalLine(LogLevel::Default,
                                 "DISCARDED 1 trace Stop points for interval one because no start points found"),
                    intervalLine(LogLevel::Debug,
                                 "DISCARDED 1 trace Start points for interval two because no stop points found"),
                    intervalLine(LogLevel::Debug,
                                 "DISCARDED 1 trace Stop points for interval two because no start points found"),
                    intervalLine(LogLevel::Debug,
                                 "DISCARDED 1 trace Start points for interval three because no stop points found"),
                    intervalLine(LogLevel::Debug,
                                 "DISCARDED 1 trace Stop points for interval three because no start points found")));
}

// Where pairs lie in time.

TEST_F(TraceTest, PairsAreKeptWithTheirTimesAndThreads) {
    add("thread", 1, 2);
    add("wide", 3, 4, false);
    clock_.spoor.setTimeUnit(10, 1);
    trace_point begin = eventAt(1, 3, 7);
    begin.processID = 70;
    trace_point end = eventAt(5, 4, 8);
    end.processID = 80;
    trace_point other = eventAt(3, 2, 9);
    other.processID = 90;
    process({begin, eventAt(2, 1, 9), other, end});
    const auto& spans = trace_.timeline().spans();
    ASSERT_EQ(spans.size(), 2U);
    EXPECT_EQ(spans[0].interval, 0U);
    EXPECT_EQ(spans[0].begin, 20U);
    EXPECT_EQ(spans[0].end, 30U);
    EXPECT_EQ(spans[0].beginThread, 9U);
    EXPECT_EQ(spans[0].endThread, 9U);
    EXPECT_EQ(spans[0].process, 90);
    EXPECT_EQ(spans[1].interval, 1U);
    EXPECT_EQ(spans[1].begin, 10U);
    EXPECT_EQ(spans[1].end, 50U);
    EXPECT_EQ(spans[1].beginThread, 7U);
    EXPECT_EQ(spans[1].endThread, 8U);
    EXPECT_EQ(spans[1].process, 70);
    EXPECT_EQ(trace_.timeline().leftOut(), 0U);
}

TEST_F(TraceTest, AnEndBeforeItsBeginIsAResultAndNotInTheTimeline) {
    add("a", 1, 2);
    process({eventAt(9, 1), eventAt(8, 2)});
    EXPECT_THAT(trace_.getResults(), ElementsAre(Pair("a", ElementsAre(18446744073709551615U))));
    EXPECT_THAT(trace_.timeline().spans(), IsEmpty());
    EXPECT_EQ(trace_.timeline().leftOut(), 1U);
}

TEST(TraceTimelineTest, WhatHasNoRoomIsCounted) {
    TraceTimeline timeline(2);
    for (std::uint64_t i = 0; i < 5; ++i) {
        timeline.add({i, i + 1, 1, 1, 0, 0});
    }
    ASSERT_EQ(timeline.spans().size(), 2U);
    EXPECT_EQ(timeline.spans()[1].begin, 1U);
    EXPECT_EQ(timeline.leftOut(), 3U);
}

} // namespace

} // namespace vela
