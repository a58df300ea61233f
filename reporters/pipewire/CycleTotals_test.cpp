#include "reporters/pipewire/CycleTotals.h"
#include "reporters/pipewire/RecordedCalls_test.h"

#include <gtest/gtest.h>

namespace vela::reporter {
namespace {

TEST(CycleTotalsTest, AreEmptyAtFirst) {
    const CycleTotals totals;
    EXPECT_EQ(totals.cycles(), 0);
    EXPECT_EQ(fieldsText(totals.summary()), " cycles=0 incomplete_cycles=0");
    EXPECT_TRUE(totals.histograms().empty());
}

TEST(CycleTotalsTest, HaveMeansAndGreatestTimes) {
    CycleTotals totals;
    totals.add(StatisticsSink::CycleTimes{10, 100});
    totals.add(StatisticsSink::CycleTimes{30, 500});
    totals.add(std::nullopt);
    EXPECT_EQ(fieldsText(totals.summary()), " cycles=3 incomplete_cycles=1 wait_mean_us=20 wait_max_us=30 "
                                            "busy_mean_us=300 busy_max_us=500");
}

TEST(CycleTotalsTest, BoundsBelongToTheBucketAbove) {
    CycleTotals totals;
    totals.add(StatisticsSink::CycleTimes{0, 50});
    totals.add(StatisticsSink::CycleTimes{49, 99});
    EXPECT_EQ(fieldsText(totals.histograms()), " wait_us=\"0-50:2\" busy_us=\"50-100:2\"");
}

TEST(CycleTotalsTest, TimesBeyondTheBoundsAreInTheLastBucket) {
    CycleTotals totals;
    totals.add(StatisticsSink::CycleTimes{100000, 9999999});
    EXPECT_EQ(fieldsText(totals.histograms()), " wait_us=\"50000-100000:1\" busy_us=\"50000-100000:1\"");
}

} // namespace
} // namespace vela::reporter
