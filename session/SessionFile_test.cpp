#include "session/SessionFile.h"

#include <chrono>
#include <cstdint>
#include <gtest/gtest.h>
#include <random>
#include <string>
#include <string_view>

namespace vela {

namespace {

using namespace std::chrono_literals;

platform::WallTime secondsSince1970(std::int64_t seconds) { return platform::WallTime(std::chrono::seconds(seconds)); }

// 2024-01-31 09:15:30 UTC
constexpr std::int64_t kMorning = 1'706'692'530;

TEST(SessionFileDateTest, Utc) { EXPECT_EQ(sessionFileDate(secondsSince1970(kMorning), 0s), "20240131-091530+0000"); }

TEST(SessionFileDateTest, East) { EXPECT_EQ(sessionFileDate(secondsSince1970(kMorning), 1h), "20240131-101530+0100"); }

TEST(SessionFileDateTest, HalfHours) {
    EXPECT_EQ(sessionFileDate(secondsSince1970(kMorning), 5h + 30min), "20240131-144530+0530");
}

TEST(SessionFileDateTest, WestAcrossMidnight) {
    EXPECT_EQ(sessionFileDate(secondsSince1970(kMorning), -9h - 30min), "20240130-234530-0930");
}

TEST(SessionFileDateTest, LessThanAnHourWest) {
    EXPECT_EQ(sessionFileDate(secondsSince1970(kMorning), -45min), "20240131-083030-0045");
}

TEST(SessionFileDateTest, TheYearIsTheCalendars) {
    // 2018-12-31 lies in the first week of 2019.
    EXPECT_EQ(sessionFileDate(secondsSince1970(1'546'214'400), 0s), "20181231-000000+0000");
    // 2024-12-31 23:59:59 UTC is next year in the east.
    EXPECT_EQ(sessionFileDate(secondsSince1970(1'735'689'599), 14h), "20250101-135959+1400");
}

TEST(SessionFileDateTest, LeapDay) {
    EXPECT_EQ(sessionFileDate(secondsSince1970(1'709'164'800), 0s), "20240229-000000+0000");
}

TEST(SessionFileDateTest, FractionsAreCutNotRounded) {
    EXPECT_EQ(sessionFileDate(platform::WallTime(1'706'692'530'999'999'999ns), 0s), "20240131-091530+0000");
}

TEST(SessionFileDateTest, Before1970) {
    EXPECT_EQ(sessionFileDate(platform::WallTime(-1ns), 0s), "19691231-235959+0000");
}

TEST(SafeFileNamePartTest, PlainNamesStay) {
    EXPECT_EQ(safeFileNamePart("com.example.player"), "com.example.player");
    EXPECT_EQ(safeFileNamePart("Music & \"More\" (2)"), "Music & \"More\" (2)");
    EXPECT_EQ(safeFileNamePart("M\xC3\xBCsik"), "M\xC3\xBCsik");
    EXPECT_EQ(safeFileNamePart(""), "");
}

TEST(SafeFileNamePartTest, SlashesAndNulsAndALeadingDotBecomeUnderscores) {
    using namespace std::string_view_literals;
    EXPECT_EQ(safeFileNamePart("../../etc/x"), "_._.._etc_x");
    EXPECT_EQ(safeFileNamePart("/etc/passwd"), "_etc_passwd");
    EXPECT_EQ(safeFileNamePart("a\0b"sv), "a_b");
    EXPECT_EQ(safeFileNamePart("."), "_");
    EXPECT_EQ(safeFileNamePart(".."), "_.");
    EXPECT_EQ(safeFileNamePart("a.b."), "a.b.");
}

TEST(SafeFileNamePartTest, LongNamesAreCutAt128Bytes) {
    EXPECT_EQ(safeFileNamePart(std::string(128, 'a')), std::string(128, 'a'));
    EXPECT_EQ(safeFileNamePart(std::string(129, 'a')), std::string(128, 'a'));
    EXPECT_EQ(safeFileNamePart(std::string(1'000'000, '/')), std::string(128, '_'));
}

TEST(SafeFileNamePartTest, CharactersAreNotCut) {
    EXPECT_EQ(safeFileNamePart(std::string(127, 'a') + "\xC3\xBC"), std::string(127, 'a'));
    EXPECT_EQ(safeFileNamePart(std::string(126, 'a') + "\xC3\xBC"), std::string(126, 'a') + "\xC3\xBC");
    EXPECT_EQ(safeFileNamePart(std::string(125, 'a') + "\xF0\x9F\x8E\xB5"), std::string(125, 'a'));
}

TEST(SafeFileNamePartTest, OddNamesNeverLeaveTheDirectory) {
    std::mt19937 random(1);
    constexpr std::string_view kOdd("/.\0\xFF\xC3\xF0\x9F\\~ \n", 11);
    for (int round = 0; round < 20'000; ++round) {
        std::string name;
        const std::size_t size = random() % 300;
        while (name.size() < size) {
            name += random() % 2 == 0 ? kOdd[random() % kOdd.size()] : static_cast<char>(random() % 256);
        }
        const std::string safe = safeFileNamePart(name);
        ASSERT_LE(safe.size(), 128U);
        ASSERT_EQ(safe.find('/'), std::string::npos);
        ASSERT_EQ(safe.find('\0'), std::string::npos);
        ASSERT_FALSE(safe.starts_with('.'));
        for (std::size_t index = 0; index < safe.size(); ++index) {
            ASSERT_TRUE(safe[index] == name[index] || safe[index] == '_') << index;
        }
        ASSERT_TRUE(safe.size() == name.size() || safe.size() >= 125U);
    }
}

} // namespace

} // namespace vela
