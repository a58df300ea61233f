#include "platform/spoor/TraceMerge.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

namespace vela::platform::spoor {
namespace {

using ::testing::ElementsAre;
using ::testing::IsEmpty;

void add(TraceMerge& merge, std::uint64_t time, std::uint32_t code) {
    merge.incoming().push_back({time, code, 0, 0, {}});
}

std::vector<std::uint32_t> codesOf(std::span<const TraceRecord> records) {
    std::vector<std::uint32_t> codes;
    for (const TraceRecord& record : records) {
        codes.push_back(record.code);
    }
    return codes;
}

TEST(TraceMergeTest, EventsOfSeveralSourcesComeInTheOrderOfTheirTimes) {
    TraceMerge merge;
    add(merge, 10, 1);
    add(merge, 30, 3);
    add(merge, 20, 2);
    add(merge, 40, 4);
    merge.merge();
    EXPECT_THAT(codesOf(merge.all()), ElementsAre(1, 2, 3, 4));
}

TEST(TraceMergeTest, EqualTimesKeepTheOrderInWhichTheyCame) {
    TraceMerge merge;
    add(merge, 10, 1);
    add(merge, 10, 2);
    merge.merge();
    add(merge, 10, 3);
    merge.merge();
    EXPECT_THAT(codesOf(merge.all()), ElementsAre(1, 2, 3));
}

TEST(TraceMergeTest, WhatIsLaterStays) {
    TraceMerge merge;
    add(merge, 10, 1);
    add(merge, 20, 2);
    add(merge, 30, 3);
    merge.merge();
    EXPECT_THAT(codesOf(merge.until(20)), ElementsAre(1, 2));
    merge.drop(2);
    EXPECT_THAT(codesOf(merge.all()), ElementsAre(3));
    EXPECT_THAT(codesOf(merge.until(29)), IsEmpty());
}

TEST(TraceMergeTest, WhatStayedIsMergedWithWhatComes) {
    TraceMerge merge;
    add(merge, 10, 1);
    add(merge, 30, 3);
    merge.merge();
    merge.drop(1);
    add(merge, 20, 2);
    add(merge, 40, 4);
    merge.merge();
    EXPECT_THAT(codesOf(merge.all()), ElementsAre(2, 3, 4));
    EXPECT_EQ(merge.late(), 0U);
}

TEST(TraceMergeTest, ALateEventIsCountedAndHandedOut) {
    TraceMerge merge;
    add(merge, 10, 1);
    add(merge, 30, 3);
    merge.merge();
    merge.drop(2);
    add(merge, 20, 2);
    add(merge, 30, 4);
    merge.merge();
    EXPECT_EQ(merge.late(), 1U);
    EXPECT_THAT(codesOf(merge.until(30)), ElementsAre(2, 4));
}

TEST(TraceMergeTest, ClearedItHasNothing) {
    TraceMerge merge;
    add(merge, 10, 1);
    merge.merge();
    merge.clear();
    EXPECT_THAT(codesOf(merge.all()), IsEmpty());
    add(merge, 5, 2);
    merge.merge();
    EXPECT_EQ(merge.late(), 0U);
}

} // namespace
} // namespace vela::platform::spoor
