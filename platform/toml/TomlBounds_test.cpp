#include "platform/toml/TomlBounds.h"

#include <gtest/gtest.h>

namespace vela::platform {
namespace {

std::string reasonOf(std::string_view text) {
    const auto refusal = findTomlRefusal(text);
    return refusal ? std::to_string(refusal->line) + ": " + refusal->reason : "";
}

std::string repeated(std::string_view text, int times) {
    std::string result;
    for (int count = 0; count < times; ++count) {
        result += text;
    }
    return result;
}

TEST(TomlBoundsTest, OrdinaryTextIsTaken) {
    EXPECT_EQ(reasonOf(""), "");
    EXPECT_EQ(reasonOf("[log]\nlevel = \"debug\" # why\n[features]\n\"A/B\" = true\n'C/D' = false\n"), "");
    EXPECT_EQ(reasonOf("[tally]\nused = [\"a\",'b', \"c\"]\r\nx.\"y\".z = {a=\"b\"}\n"), "");
}

TEST(TomlBoundsTest, SixteenDotsInALineAreTakenAndSeventeenRefused) {
    EXPECT_EQ(reasonOf("\n[a" + repeated(".a", 16) + "]\n"), "");
    EXPECT_EQ(reasonOf("\n[a" + repeated(".a", 17) + "]\n"), "2: more than 16 dots in one line");
}

TEST(TomlBoundsTest, EveryLineHasItsOwnDots) {
    EXPECT_EQ(reasonOf(repeated("a" + repeated(".a", 16) + "=1\n", 5)), "");
}

TEST(TomlBoundsTest, DotsInTextsAndCommentsDoNotCount) {
    const std::string dots(100, '.');
    EXPECT_EQ(reasonOf("a = \"" + dots + "\" # " + dots + "\n"), "");
    EXPECT_EQ(reasonOf("a = '" + dots + "'\n"), "");
    EXPECT_EQ(reasonOf("a = \"\\\"" + dots + "\\\\\" # " + dots + "\n"), "");
}

TEST(TomlBoundsTest, ABackslashEndsNothingInASingleMarkedText) {
    EXPECT_EQ(reasonOf("a = '\\' \nb" + repeated(".b", 17) + "=1"), "2: more than 16 dots in one line");
}

TEST(TomlBoundsTest, AMarkInACommentBeginsNoText) {
    EXPECT_EQ(reasonOf("# don't\na" + repeated(".a", 17) + "=1"), "2: more than 16 dots in one line");
}

TEST(TomlBoundsTest, ATextWithoutAnEndEndsWithItsLine) {
    EXPECT_EQ(reasonOf("a = \"x\na" + repeated(".a", 17) + "=1"), "2: more than 16 dots in one line");
    EXPECT_EQ(reasonOf("a = \"x\\\na" + repeated(".a", 17) + "=1"), "2: more than 16 dots in one line");
    EXPECT_EQ(reasonOf("a = \"x\\"), "");
}

TEST(TomlBoundsTest, MoreThanTwentyThousandLinesAreRefused) {
    EXPECT_EQ(reasonOf(repeated("\n", 19999)), "");
    EXPECT_EQ(reasonOf(repeated("\n", 20000)), "20001: more than 20000 lines");
}

TEST(TomlBoundsTest, TextsOverSeveralLinesAreRefused) {
    EXPECT_EQ(reasonOf("\na = \"\"\"x\"\"\""), "2: a text over several lines");
    EXPECT_EQ(reasonOf("a = '''x'''"), "1: a text over several lines");
    EXPECT_EQ(reasonOf("a = \"\"\nb = ''\n"), "");
}

TEST(TomlBoundsTest, WhatIsBeyondAsciiStandsInTextsAndComments) {
    EXPECT_EQ(reasonOf("a = \"\xc3\xa9\" # \xc3\xa9\n"), "");
    EXPECT_EQ(reasonOf("\n\xc3\xa9 = 1\n"), "2: a character beyond ASCII outside quotation marks");
    EXPECT_EQ(reasonOf("a = 1\xc2\xa0\n"), "1: a character beyond ASCII outside quotation marks");
}

TEST(TomlBoundsTest, AByteOrderMarkMayBeginTheText) {
    EXPECT_EQ(reasonOf("\xef\xbb\xbf[log]\n"), "");
    EXPECT_EQ(reasonOf("[log]\n\xef\xbb\xbf"), "2: a character beyond ASCII outside quotation marks");
}

TEST(TomlBoundsTest, AMarkInsideAWordIsRefused) {
    EXPECT_EQ(reasonOf("a = 1979-05\"x\""), "1: a quotation mark inside a word");
    EXPECT_EQ(reasonOf("a = \"x\"\"y\""), "1: a quotation mark inside a word");
    EXPECT_EQ(reasonOf("\"x\" = 1"), "");
}

} // namespace
} // namespace vela::platform
