#include "common/values/TextPlace.h"

#include <gtest/gtest.h>
#include <string>

namespace vela {

namespace {

std::string place(std::string_view text, std::size_t offset) {
    const TextPlace found = textPlaceAt(text, offset);
    return std::to_string(found.line) + ":" + std::to_string(found.column);
}

TEST(TextPlaceTest, TheStartIsLineOneColumnOne) { EXPECT_EQ(place("", 0), "1:1"); }

TEST(TextPlaceTest, ALineEndBelongsToTheLineThatItEnds) {
    EXPECT_EQ(place("ab\ncd", 2), "1:3");
    EXPECT_EQ(place("ab\ncd", 3), "2:1");
    EXPECT_EQ(place("ab\ncd", 4), "2:2");
}

TEST(TextPlaceTest, CarriageReturnAndLineFeedAreOneLineEnd) {
    EXPECT_EQ(place("a\r\nb", 3), "2:1");
    EXPECT_EQ(place("a\rb", 2), "2:1");
    EXPECT_EQ(place("a\n\rb", 3), "3:1");
}

TEST(TextPlaceTest, ColumnsCountCharactersNotBytes) { EXPECT_EQ(place("\xC3\xA9\xF0\x9F\x98\x80x", 6), "1:3"); }

TEST(TextPlaceTest, AnOffsetBehindTheTextIsItsEnd) { EXPECT_EQ(place("ab", 9), "1:3"); }

TEST(TextPlaceTest, ValidUtf8HasNoInvalidPlace) {
    EXPECT_EQ(firstInvalidUtf8(""), std::nullopt);
    EXPECT_EQ(firstInvalidUtf8("gr\xC3\xB6\xC3\x9F"
                               "e"),
              std::nullopt);
}

TEST(TextPlaceTest, TheFirstInvalidByteIsFound) {
    EXPECT_EQ(firstInvalidUtf8("\xC3\xB6\xFFx\xFF"), 2U);
    EXPECT_EQ(firstInvalidUtf8("abcdefghijkl\xC3"), 12U);
}

} // namespace

} // namespace vela
