#include "platform/spoor/FtracePage.h"
#include "platform/spoor/FtracePages_test.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

namespace vela::platform::spoor {
namespace {

using ::testing::ElementsAre;
using ::testing::IsEmpty;

constexpr std::uint64_t kMissed = std::uint64_t{1} << 31U;
constexpr std::uint64_t kStored = std::uint64_t{1} << 30U;

class FtracePageTest : public ::testing::Test {
protected:
    std::uint64_t parse(const std::vector<char>& page) {
        return parseFtracePage(page, {8, 8, 16, 19, 4, 8, 12}, 3, records_);
    }
    std::vector<std::uint64_t> times() const {
        std::vector<std::uint64_t> times;
        for (const TraceRecord& record : records_) {
            times.push_back(record.time);
        }
        return times;
    }

    std::vector<TraceRecord> records_;
};

TEST_F(FtracePageTest, AMarkerHasItsTimeThreadProcessorCodeAndArguments) {
    EXPECT_EQ(parse(BuiltPage(1000).marker(5, 42, 0x21040001, {1, ~std::uint64_t{0}, 3, 4}).page()), 0U);
    EXPECT_THAT(records_, ElementsAre(TraceRecord{1005, 0x21040001, 3, 42, {1, ~std::uint64_t{0}, 3, 4}, 77}));
}

TEST_F(FtracePageTest, TimesAddUp) {
    parse(BuiltPage(1000).marker(5, 1, 1, {}).marker(7, 1, 2, {}).page());
    EXPECT_THAT(times(), ElementsAre(1005, 1012));
}

TEST_F(FtracePageTest, AnEventWhoseSizeStandsBehindItIsRead) {
    parse(BuiltPage(1000).longMarker(5, 42, 7, {1, 2, 3, 4}).marker(1, 43, 8, {}).page());
    EXPECT_THAT(records_,
                ElementsAre(TraceRecord{1005, 7, 3, 42, {1, 2, 3, 4}, 77}, TraceRecord{1006, 8, 3, 43, {}, 77}));
}

TEST_F(FtracePageTest, ALongTimeIsInTwoWords) {
    parse(BuiltPage(1000).word(30, 3).next(2).marker(5, 1, 1, {}).page());
    EXPECT_THAT(times(), ElementsAre(1000 + 3 + (std::uint64_t{2} << 27U) + 5));
}

TEST_F(FtracePageTest, ATimeOfTheClockReplacesTheOneSoFar) {
    parse(BuiltPage(1000).word(31, 3).next(2).marker(5, 1, 1, {}).page());
    EXPECT_THAT(times(), ElementsAre(3 + (std::uint64_t{2} << 27U) + 5));
}

TEST_F(FtracePageTest, WhatWasTakenBackIsSkippedWithItsTime) {
    parse(BuiltPage(1000).word(29, 4).next(12).raw(std::string(8, 'x')).marker(5, 1, 1, {}).page());
    EXPECT_THAT(times(), ElementsAre(1009));
}

TEST_F(FtracePageTest, PaddingWithoutATimeEndsThePage) {
    parse(BuiltPage(1000).marker(1, 1, 1, {}).word(29, 0).marker(5, 1, 2, {}).page());
    EXPECT_THAT(times(), ElementsAre(1001));
}

TEST_F(FtracePageTest, OtherEventsAndOtherMarkersAreSkipped) {
    parse(BuiltPage(1000)
              .marker(1, 1, 1, {}, 18)
              .word(1, 1)
              .next(0)
              .word(12, 1)
              .raw(BuiltPage::event(1, 2, {}, 19, 3))
              .marker(1, 1, 3, {})
              .page());
    EXPECT_THAT(times(), ElementsAre(1004));
}

TEST_F(FtracePageTest, AnEventThatIsCutOffIsNotRead) {
    auto page = BuiltPage(1000).marker(1, 1, 1, {}).marker(1, 1, 2, {}).page();
    page[8] = static_cast<char>(52 + 20);
    parse(page);
    EXPECT_THAT(times(), ElementsAre(1001));
}

TEST_F(FtracePageTest, ASizeBeyondThePageIsCut) {
    auto page = BuiltPage(1000).marker(1, 1, 1, {}).page(0xFFFFF);
    EXPECT_EQ(parse(page), 0U);
    EXPECT_THAT(times(), ElementsAre(1001));
    page.resize(16 + 52);
    records_.clear();
    parse(page);
    EXPECT_THAT(times(), ElementsAre(1001));
}

TEST_F(FtracePageTest, LostEventsAreCountedAsTheKernelSays) {
    const std::string count("\x2A\0\0\0\0\0\0\0", 8);
    EXPECT_EQ(parse(BuiltPage(1000).marker(1, 1, 1, {}).page(kMissed | kStored, count)), 42U);
    EXPECT_EQ(records_.size(), 1U);
}

TEST_F(FtracePageTest, LostEventsOfUnknownNumberCountAsOne) {
    EXPECT_EQ(parse(BuiltPage(1000).marker(1, 1, 1, {}).page(kMissed)), 1U);
}

TEST_F(FtracePageTest, ANumberOfLostEventsThatDoesNotFitCountsAsOne) {
    auto page = BuiltPage(1000).marker(1, 1, 1, {}).page(kMissed | kStored);
    page.resize(16 + 52 + 7);
    EXPECT_EQ(parse(page), 1U);
}

TEST_F(FtracePageTest, AnEmptyPageAndAPieceOfOneHaveNothing) {
    EXPECT_EQ(parse(BuiltPage(1000).page()), 0U);
    EXPECT_EQ(parse({}), 0U);
    EXPECT_EQ(parse(std::vector<char>(15, '\xFF')), 0U);
    EXPECT_THAT(records_, IsEmpty());
}

TEST_F(FtracePageTest, APageOfA32BitKernelIsRead) {
    std::vector<char> page = BuiltPage(1000).marker(1, 1, 1, {}).page();
    page.erase(page.begin() + 12, page.begin() + 16);
    EXPECT_EQ(parseFtracePage(page, {8, 4, 12, 19, 4, 8, 12}, 0, records_), 0U);
    EXPECT_THAT(times(), ElementsAre(1001));
}

TEST(FtraceLayoutTest, TheKernelsTextsAreRead) {
    const auto layout = parseFtraceLayout(kHeaderPage, kRawDataFormat);
    ASSERT_TRUE(layout);
    EXPECT_EQ(*layout, (FtraceLayout{8, 8, 16, 19, 4, 8, 12}));
}

TEST(FtraceLayoutTest, OtherPlacesAreTaken) {
    std::string page = kHeaderPage;
    page.replace(page.find("offset:8;\tsize:8;"), 17, "offset:8;\tsize:4;");
    page.replace(page.find("offset:16;"), 10, "offset:12;");
    std::string format = kRawDataFormat;
    format.replace(format.find("ID: 19"), 6, "ID: 7");
    EXPECT_EQ(parseFtraceLayout(page, format), (FtraceLayout{8, 4, 12, 7, 4, 8, 12}));
}

TEST(FtraceLayoutTest, ATextWithoutAFieldIsRefused) {
    for (const char* const field : {"ID:", "common_pid", " id;", "buf[]"}) {
        std::string format = kRawDataFormat;
        format.replace(format.find(field), 2, "??");
        EXPECT_FALSE(parseFtraceLayout(kHeaderPage, format)) << field;
    }
    for (const char* const field : {"commit", "char data"}) {
        std::string page = kHeaderPage;
        page.replace(page.find(field), 6, "??????");
        EXPECT_FALSE(parseFtraceLayout(page, kRawDataFormat)) << field;
    }
    EXPECT_FALSE(parseFtraceLayout("", ""));
}

TEST(FtraceLayoutTest, AbsurdNumbersAreRefused) {
    for (const char* const absurd : {"ID: 70000", "ID: x", "ID: -1"}) {
        std::string format = kRawDataFormat;
        format.replace(format.find("ID: 19"), 6, absurd);
        EXPECT_FALSE(parseFtraceLayout(kHeaderPage, format)) << absurd;
    }
    for (const char* const absurd : {"offset:99999999999999999999;", "offset:300;", "offset:4;"}) {
        std::string page = kHeaderPage;
        page.replace(page.find("offset:16;"), 10, absurd);
        EXPECT_FALSE(parseFtraceLayout(page, kRawDataFormat)) << absurd;
    }
    std::string page = kHeaderPage;
    page.replace(page.find("size:8;\tsigned:1"), 6, "size:3");
    EXPECT_FALSE(parseFtraceLayout(page, kRawDataFormat));
}

} // namespace
} // namespace vela::platform::spoor
