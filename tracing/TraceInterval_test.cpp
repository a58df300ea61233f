// An interval alone: its durations, what it drops, and what it says about that.
#include "tracing/TraceInterval.h"
#include "tracing/TracePoint.h"
#include "tracing/Trace_test.h"

#include <cmath>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <limits>

namespace vela {

namespace {

using ::testing::ElementsAre;
using ::testing::IsEmpty;

class TraceIntervalTest : public ::testing::Test {
protected:
    std::vector<std::uint64_t> byThread(const std::vector<trace_point>& points) { return process(points, true); }
    std::vector<std::uint64_t> processWide(const std::vector<trace_point>& points) { return process(points, false); }
    std::vector<std::uint64_t> process(const std::vector<trace_point>& points, bool matchedByThread) {
        interval_ = std::make_unique<TraceInterval>("open", kBegin, kEnd, matchedByThread);
        interval_->processTracepoints(*clock_.session, points);
        return interval_->getResults();
    }
    void setUnit() { clock_.spoor.setTimeUnit(125, 3); }

    testing::CapturingLog log_;
    TraceClock clock_;
    std::unique_ptr<TraceInterval> interval_;
};

// By thread.

TEST_F(TraceIntervalTest, ThreadsAreMatchedApart) {
    EXPECT_THAT(byThread({eventAt(10, kBegin, 1), eventAt(20, kBegin, 2), eventAt(35, kEnd, 1), eventAt(60, kEnd, 2)}),
                ElementsAre(25, 40));
    EXPECT_EQ(interval_->getNumTimesTraced(), 2U);
    EXPECT_TRUE(interval_->hasResults());
    EXPECT_THAT(log_.lines(), IsEmpty());
}

TEST_F(TraceIntervalTest, DurationsStandInTheOrderOfTheirEnds) {
    EXPECT_THAT(byThread({eventAt(10, kBegin, 1), eventAt(20, kBegin, 2), eventAt(21, kEnd, 2), eventAt(60, kEnd, 1)}),
                ElementsAre(1, 50));
}

TEST_F(TraceIntervalTest, ByThreadALaterBeginReplacesTheEarlierOneWhichIsDropped) {
    EXPECT_THAT(byThread({eventAt(10, kBegin), eventAt(20, kBegin), eventAt(25, kEnd)}), ElementsAre(5));
    EXPECT_THAT(log_.lines(),
                ElementsAre(intervalLine(LogLevel::Debug, "DISCARDED 1 trace Start points for interval open because no "
                                                          "stop points found")));
}

TEST_F(TraceIntervalTest, ByThreadAnEndWithoutABeginIsDroppedAndTheLineGivesTheStartCount) {
    EXPECT_THAT(byThread({eventAt(10, kEnd), eventAt(20, kEnd)}), IsEmpty());
    EXPECT_FALSE(interval_->hasResults());
    EXPECT_THAT(log_.lines(),
                ElementsAre(intervalLine(LogLevel::Debug, "DISCARDED 0 trace Stop points for interval open because no "
                                                          "start points found")));
}

TEST_F(TraceIntervalTest, AnEndOnAnotherThreadFindsNothingByThread) {
    EXPECT_THAT(byThread({eventAt(10, kBegin, 1), eventAt(20, kEnd, 2)}), IsEmpty());
    EXPECT_THAT(log_.lines(),
                ElementsAre(intervalLine(LogLevel::Debug, "DISCARDED 0 trace Stop points for interval open because no "
                                                          "start points found")));
}

TEST_F(TraceIntervalTest, ByThreadTheLineAboutStartsStandsFirstAndBothGiveTheStartCount) {
    byThread({eventAt(1, kBegin), eventAt(2, kBegin), eventAt(3, kBegin), eventAt(4, kEnd), eventAt(5, kEnd)});
    EXPECT_THAT(log_.lines(),
                ElementsAre(intervalLine(LogLevel::Debug, "DISCARDED 2 trace Start points for interval open because no "
                                                          "stop points found"),
                            intervalLine(LogLevel::Debug, "DISCARDED 2 trace Stop points for interval open because no "
                                                          "start points found")));
}

TEST_F(TraceIntervalTest, ByThreadAStartAtTimeZeroIsAStart) {
    EXPECT_THAT(byThread({eventAt(0, kBegin), eventAt(7, kEnd)}), ElementsAre(7));
    EXPECT_THAT(byThread({eventAt(0, kBegin), eventAt(2, kBegin), eventAt(7, kEnd)}), ElementsAre(5));
    EXPECT_THAT(log_.lines(),
                ElementsAre(intervalLine(LogLevel::Debug, "DISCARDED 1 trace Start points for interval open because no "
                                                          "stop points found")));
}

TEST_F(TraceIntervalTest, ByThreadAnEndEndsOneStart) {
    EXPECT_THAT(byThread({eventAt(1, kBegin), eventAt(3, kEnd), eventAt(9, kEnd)}), ElementsAre(2));
    EXPECT_THAT(log_.lines(),
                ElementsAre(intervalLine(LogLevel::Debug, "DISCARDED 0 trace Stop points for interval open because no "
                                                          "start points found")));
}

// Process-wide.

TEST_F(TraceIntervalTest, ProcessWideAnEndOnAnotherThreadEndsTheStart) {
    EXPECT_THAT(processWide({eventAt(10, kBegin, 1), eventAt(25, kEnd, 2)}), ElementsAre(15));
    EXPECT_EQ(interval_->getNumTimesTraced(), 1U);
    EXPECT_THAT(log_.lines(), IsEmpty());
}

TEST_F(TraceIntervalTest, ProcessWideALaterBeginReplacesTheEarlierOneWhichIsDropped) {
    EXPECT_THAT(processWide({eventAt(10, kBegin, 1), eventAt(20, kBegin, 2), eventAt(25, kEnd, 1)}), ElementsAre(5));
    EXPECT_THAT(log_.lines(),
                ElementsAre(intervalLine(LogLevel::Default, "DISCARDED 1 trace Start points for interval open because "
                                                            "no stop points found")));
}

TEST_F(TraceIntervalTest, ProcessWideAnEndWithoutABeginIsDroppedAndTheLineGivesTheStartCount) {
    EXPECT_THAT(processWide({eventAt(10, kEnd), eventAt(11, kEnd)}), IsEmpty());
    EXPECT_THAT(log_.lines(),
                ElementsAre(intervalLine(LogLevel::Default, "DISCARDED 0 trace Stop points for interval open because "
                                                            "no start points found")));
}

TEST_F(TraceIntervalTest, ProcessWideTheLineAboutStartsStandsFirstAndBothGiveTheStartCount) {
    processWide({eventAt(1, kBegin), eventAt(2, kBegin), eventAt(4, kEnd), eventAt(5, kEnd), eventAt(6, kEnd)});
    EXPECT_THAT(log_.lines(),
                ElementsAre(intervalLine(LogLevel::Default, "DISCARDED 1 trace Start points for interval open because "
                                                            "no stop points found"),
                            intervalLine(LogLevel::Default, "DISCARDED 1 trace Stop points for interval open because "
                                                            "no start points found")));
}

TEST_F(TraceIntervalTest, ProcessWideAStartAtTimeZeroIsNoStart) {
    EXPECT_THAT(processWide({eventAt(0, kBegin), eventAt(7, kEnd), eventAt(8, kBegin), eventAt(10, kEnd)}),
                ElementsAre(2));
    EXPECT_THAT(log_.lines(),
                ElementsAre(intervalLine(LogLevel::Default, "DISCARDED 0 trace Stop points for interval open because "
                                                            "no start points found")));
}

TEST_F(TraceIntervalTest, ProcessWideAStartAtTimeZeroDropsTheOneBeforeAndIsNotDroppedByTheOneAfter) {
    EXPECT_THAT(processWide({eventAt(5, kBegin), eventAt(0, kBegin), eventAt(6, kBegin), eventAt(10, kEnd)}),
                ElementsAre(4));
    EXPECT_THAT(log_.lines(),
                ElementsAre(intervalLine(LogLevel::Default, "DISCARDED 1 trace Start points for interval open because "
                                                            "no stop points found")));
}

// Both.

TEST_F(TraceIntervalTest, EachTimeIsConvertedBeforeTheyAreSubtracted) {
    setUnit();
    EXPECT_THAT(byThread({eventAt(1, kBegin), eventAt(3, kEnd)}), ElementsAre(84));
    EXPECT_THAT(processWide({eventAt(1, kBegin), eventAt(3, kEnd)}), ElementsAre(84));
}

TEST_F(TraceIntervalTest, ATimeThatIsZeroOnlyInNanosecondsIsAStartProcessWide) {
    clock_.spoor.setTimeUnit(1, 10);
    EXPECT_THAT(processWide({eventAt(9, kBegin), eventAt(25, kEnd)}), ElementsAre(2));
}

TEST_F(TraceIntervalTest, AnEndBeforeItsBeginWrapsAndIsKept) {
    EXPECT_THAT(byThread({eventAt(200, kBegin), eventAt(100, kEnd)}), ElementsAre(18446744073709551516U));
    EXPECT_THAT(processWide({eventAt(200, kBegin), eventAt(100, kEnd)}), ElementsAre(18446744073709551516U));
    EXPECT_EQ(interval_->getNumTimesTraced(), 1U);
}

TEST_F(TraceIntervalTest, OtherCodesAreIgnored) {
    EXPECT_THAT(byThread({eventAt(1, kBegin), eventAt(2, kBegin + 1), eventAt(3, 0), eventAt(4, kEnd)}),
                ElementsAre(3));
    EXPECT_THAT(processWide({eventAt(1, kBegin), eventAt(2, kBegin + 1), eventAt(3, 0), eventAt(4, kEnd)}),
                ElementsAre(3));
    EXPECT_THAT(log_.lines(), IsEmpty());
}

TEST_F(TraceIntervalTest, StartsThatArePendingAtTheEndAreNotSpokenOf) {
    EXPECT_THAT(byThread({eventAt(1, kBegin, 1), eventAt(2, kBegin, 2)}), IsEmpty());
    EXPECT_THAT(processWide({eventAt(1, kBegin)}), IsEmpty());
    EXPECT_THAT(log_.lines(), IsEmpty());
    EXPECT_EQ(interval_->getNumTimesTraced(), 0U);
}

TEST_F(TraceIntervalTest, NoEventsNoResults) {
    EXPECT_THAT(byThread({}), IsEmpty());
    EXPECT_THAT(processWide({}), IsEmpty());
    EXPECT_THAT(log_.lines(), IsEmpty());
}

TEST_F(TraceIntervalTest, AnImpulseNeverHasADurationAndDropsAllButOneOfAThread) {
    TraceInterval impulse("tick", kBegin, kBegin, true);
    impulse.processTracepoints(*clock_.session, std::vector{eventAt(1, kBegin, 1), eventAt(2, kBegin, 1),
                                                            eventAt(3, kBegin, 2), eventAt(4, kBegin, 1)});
    EXPECT_THAT(impulse.getResults(), IsEmpty());
    EXPECT_THAT(log_.lines(),
                ElementsAre(intervalLine(LogLevel::Debug, "DISCARDED 2 trace Start points for interval tick because no "
                                                          "stop points found")));
}

TEST_F(TraceIntervalTest, AnImpulseNeverHasADurationProcessWide) {
    TraceInterval impulse("tick", kBegin, kBegin, false);
    impulse.processTracepoints(*clock_.session, std::vector{eventAt(1, kBegin, 1), eventAt(2, kBegin, 2)});
    EXPECT_THAT(impulse.getResults(), IsEmpty());
    EXPECT_EQ(log_.lines().size(), 1U);
}

TEST_F(TraceIntervalTest, ALevelEndsAtCodeZero) {
    TraceInterval level("level", kBegin, 0, true);
    level.processTracepoints(*clock_.session, std::vector{eventAt(1, kBegin), eventAt(5, 0)});
    EXPECT_THAT(level.getResults(), ElementsAre(4));
}

TEST_F(TraceIntervalTest, TheWayOfMatchingIsTheOneOfTheConstruction) {
    const std::vector points{eventAt(1, kBegin, 1), eventAt(4, kEnd, 2)};
    EXPECT_THAT(process(points, true), IsEmpty());
    EXPECT_THAT(process(points, false), ElementsAre(3));
}

TEST_F(TraceIntervalTest, EitherWayOfMatchingCanBeAskedFor) {
    const std::vector points{eventAt(1, kBegin, 1), eventAt(4, kEnd, 2)};
    TraceInterval interval("open", kBegin, kEnd, false);
    interval.processTracepointsSingleThread(*clock_.session, points);
    EXPECT_THAT(interval.getResults(), IsEmpty());
    EXPECT_THAT(log_.lines(),
                ElementsAre(intervalLine(LogLevel::Debug, "DISCARDED 0 trace Stop points for interval open because no "
                                                          "start points found")));
    TraceInterval other("open", kBegin, kEnd, true);
    other.processTracepointsAnyThread(*clock_.session, points);
    EXPECT_THAT(other.getResults(), ElementsAre(3));
}

TEST_F(TraceIntervalTest, AFurtherWalkAddsToTheResults) {
    const std::vector points{eventAt(1, kBegin), eventAt(4, kEnd)};
    byThread(points);
    interval_->processTracepoints(*clock_.session, points);
    EXPECT_THAT(interval_->getResults(), ElementsAre(3, 3));
    EXPECT_EQ(interval_->getNumTimesTraced(), 2U);
}

TEST_F(TraceIntervalTest, NamesFromOutsideCannotForgeALine) {
    TraceInterval interval("a\nb", kBegin, kEnd, false);
    interval.processTracepoints(*clock_.session, std::vector{eventAt(1, kEnd)});
    ASSERT_EQ(log_.lines().size(), 1U);
    EXPECT_EQ(log_.lines()[0].message.find('\n'), std::string::npos);
}

// Averages.

TEST_F(TraceIntervalTest, TheAverageIsTheSumOverTheNumberOfPairs) {
    byThread({eventAt(0, kBegin), eventAt(3, kEnd), eventAt(10, kBegin), eventAt(14, kEnd)});
    EXPECT_EQ(interval_->getAverageResult(), 3.5F);
}

TEST_F(TraceIntervalTest, TheAverageIsSummedAs32BitFloats) {
    // 2^24 + 1 is 2^24 in 32 bits.
    byThread({eventAt(0, kBegin), eventAt(16777216, kEnd), eventAt(20000000, kBegin), eventAt(20000001, kEnd)});
    EXPECT_EQ(interval_->getAverageResult(), 8388608.0F);
}

TEST_F(TraceIntervalTest, TheAverageOfNothingIsNotANumber) {
    byThread({});
    EXPECT_TRUE(std::isnan(interval_->getAverageResult()));
}

// Arguments of events.

trace_point eventWithArguments() {
    trace_point event = eventAt(1, kBegin);
    event.arguments = {10, 20, 30, 40};
    return event;
}

TEST_F(TraceIntervalTest, ATracePointCollectsOneArgument) {
    const std::vector points{eventWithArguments(), eventAt(2, kEnd), eventWithArguments()};
    for (int argument = 1; argument <= 4; ++argument) {
        TracePoint point("value", kBegin, argument);
        point.processTracepoints(*clock_.session, points);
        EXPECT_THAT(point.getResults(), ElementsAre(argument * 10, argument * 10));
        EXPECT_EQ(point.getNumTimesTraced(), 0U);
    }
}

TEST_F(TraceIntervalTest, ATracePointOfAnyOtherArgumentCollectsNothing) {
    for (const int argument : {0, 5, -1, std::numeric_limits<int>::min()}) {
        TracePoint point("value", kBegin, argument);
        point.processTracepoints(*clock_.session, std::vector{eventWithArguments()});
        EXPECT_FALSE(point.hasResults());
    }
}

TEST_F(TraceIntervalTest, TheAverageOfATracePointIsInfinite) {
    TracePoint point("value", kBegin, 1);
    point.processTracepoints(*clock_.session, std::vector{eventWithArguments()});
    EXPECT_EQ(point.getAverageResult(), std::numeric_limits<float>::infinity());
}

} // namespace

} // namespace vela
