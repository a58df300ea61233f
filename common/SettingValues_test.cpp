#include "common/SettingValues.h"

#include <gtest/gtest.h>
#include <limits>

namespace vela {
namespace {

std::int64_t sizeOf(std::string_view text) {
    const auto size = parseByteSize(text);
    return size ? *size : -1;
}

std::string faultOf(std::string_view text) {
    const auto size = parseByteSize(text);
    return size ? "" : size.failure().description;
}

TEST(ByteSizeTest, EveryUnitIsRead) {
    EXPECT_EQ(sizeOf("4096 B"), 4096);
    EXPECT_EQ(sizeOf("64 KiB"), 65536);
    EXPECT_EQ(sizeOf("256 MiB"), 268435456);
    EXPECT_EQ(sizeOf("1 GiB"), 1073741824);
    EXPECT_EQ(sizeOf("2 TiB"), 2199023255552);
}

TEST(ByteSizeTest, TheSpaceMayBeAbsentOrLonger) {
    EXPECT_EQ(sizeOf("64KiB"), 65536);
    EXPECT_EQ(sizeOf("64   KiB"), 65536);
}

TEST(ByteSizeTest, DigitsAloneAreBytes) { EXPECT_EQ(sizeOf("4096"), 4096); }

TEST(ByteSizeTest, TheLargestSizeThatFitsIsRead) {
    EXPECT_EQ(sizeOf("9223372036854775807"), std::numeric_limits<std::int64_t>::max());
    EXPECT_EQ(sizeOf("8388607 TiB"), 9223370937343148032);
}

TEST(ByteSizeTest, WhatOverflowsIsRefused) {
    EXPECT_EQ(faultOf("8388608 TiB"), "\"8388608 TiB\" is more bytes than can be counted");
    EXPECT_EQ(faultOf("9223372036854775808"), "\"9223372036854775808\" is more bytes than can be counted");
    EXPECT_EQ(faultOf("99999999999999999999 B"), "\"99999999999999999999 B\" is more bytes than can be counted");
}

TEST(ByteSizeTest, NoBytesAreRefused) {
    EXPECT_EQ(faultOf("0"), "\"0\" is no bytes at all");
    EXPECT_EQ(faultOf("0 MiB"), "\"0 MiB\" is no bytes at all");
}

TEST(ByteSizeTest, AnUnknownUnitIsRefused) {
    EXPECT_EQ(faultOf("5 MB"), "\"5 MB\" has no known unit (B, KiB, MiB, GiB, TiB)");
    EXPECT_EQ(faultOf("5 mib"), "\"5 mib\" has no known unit (B, KiB, MiB, GiB, TiB)");
    EXPECT_EQ(faultOf("1.5 GiB"), "\"1.5 GiB\" has no known unit (B, KiB, MiB, GiB, TiB)");
    EXPECT_EQ(faultOf("5 MiB "), "\"5 MiB \" has no known unit (B, KiB, MiB, GiB, TiB)");
}

TEST(ByteSizeTest, WhatDoesNotBeginWithANumberIsRefused) {
    for (const char* text : {"", " ", "MiB", " 5 MiB", "-5 MiB", "+5", "x5", "5 "}) {
        EXPECT_EQ(faultOf(text), "\"" + std::string(text) + "\" is no size such as \"256 MiB\"") << text;
    }
}

TEST(ByteSizeTest, ATextHasTheLargestUnitThatDivides) {
    EXPECT_EQ(byteSizeText(1), "1 B");
    EXPECT_EQ(byteSizeText(1000), "1000 B");
    EXPECT_EQ(byteSizeText(1536), "1536 B");
    EXPECT_EQ(byteSizeText(65536), "64 KiB");
    EXPECT_EQ(byteSizeText(268435456), "256 MiB");
    EXPECT_EQ(byteSizeText(2199023255552), "2 TiB");
}

TEST(SettingTextTest, MarksAndControlCharactersAreEscaped) {
    EXPECT_EQ(quotedText("a\"b\\c"), R"("a\"b\\c")");
    EXPECT_EQ(quotedText(std::string_view("\n\t\x1b\x7f\0", 5)), R"("\n\t\u001b\u007f\u0000")");
    EXPECT_EQ(quotedText("\xc2\x9b"), R"("\u009b")");
}

TEST(SettingTextTest, OtherCharactersStayAndBytesThatAreNoneBecomeTheReplacement) {
    EXPECT_EQ(quotedText("gr\xc3\xbc\xc3\x9f"), "\"gr\xc3\xbc\xc3\x9f\"");
    EXPECT_EQ(quotedText("a\xff"), "\"a\xef\xbf\xbd\"");
}

TEST(SettingTextTest, CharactersThatChangeHowOthersAreShownAreEscaped) {
    EXPECT_EQ(quotedText("\u202e\u202c\u2066\u2069\u200f\u2028"), R"("\u202e\u202c\u2066\u2069\u200f\u2028")");
    EXPECT_EQ(quotedText("\u200d\u2014\u2065"), "\"\u200d\u2014\u2065\"");
}

TEST(SettingTextTest, EscapedTextHasNoMarksAround) { EXPECT_EQ(escapedText("a\nb"), "a\\nb"); }

TEST(SettingTextTest, EscapedTextLeavesMarksThatStandInIt) {
    EXPECT_EQ(escapedText("\"x\\y\" is none\u009b\xff"), "\"x\\y\" is none\\u009b\xef\xbf\xbd");
}

TEST(SettingTextTest, EveryKindOfValueHasItsText) {
    EXPECT_EQ(valueText(true), "true");
    EXPECT_EQ(valueText(false), "false");
    EXPECT_EQ(valueText(std::int64_t{-5}), "-5");
    EXPECT_EQ(valueText(0.5), "0.5");
    EXPECT_EQ(valueText(std::string("x")), "\"x\"");
    EXPECT_EQ(valueText(std::vector<std::string>{}), "[]");
    EXPECT_EQ(valueText(std::vector<std::string>{"a", "b"}), R"(["a", "b"])");
    EXPECT_EQ(valueText(std::monostate()), "nothing");
}

TEST(SettingTextTest, ShownTextsEndAfterEightyBytes) {
    EXPECT_EQ(shownValue(std::string(80, 'x')), "\"" + std::string(80, 'x') + "\"");
    EXPECT_EQ(shownValue(std::string(81, 'x')), "\"" + std::string(80, 'x') + "...\"");
}

TEST(SettingTextTest, ShownListsEndAfterEightTexts) {
    EXPECT_EQ(shownValue(std::vector<std::string>(9, "x")), R"(["x", "x", "x", "x", "x", "x", "x", "x", ...])");
    EXPECT_EQ(shownValue(std::vector<std::string>(8, "x")), R"(["x", "x", "x", "x", "x", "x", "x", "x"])");
}

} // namespace
} // namespace vela
