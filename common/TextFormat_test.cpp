#include "common/TextFormat.h"
#include "common/values/Utf8.h"

#include <clocale>
#include <cmath>
#include <cstdint>
#include <gtest/gtest.h>
#include <limits>
#include <optional>
#include <string>
#include <string_view>

namespace vela {

namespace {

using detail::ArgumentKind;
using detail::FormatVerdict;
using detail::judgeFormat;

enum class Colour : std::uint8_t { Green = 7 };

struct Point {
    int x;
    int y;
};
void appendDescription(std::string& text, const Point& point) { appendFormatted(text, "(%d, %d)", point.x, point.y); }

std::string escaped(std::string_view untrusted) {
    std::string text;
    appendEscaped(text, untrusted);
    return text;
}

/// The characters from `first` to `last`. Written out, some of them would turn the source text round.
std::string utf8From(char32_t first, char32_t last) {
    std::string text;
    for (char32_t codePoint = first; codePoint <= last; ++codePoint) {
        appendUtf8(text, codePoint);
    }
    return text;
}

TEST(TextFormatTest, TextWithoutConversionsStaysAsItIs) {
    EXPECT_EQ(formatText("a line\nof {text}"), "a line\nof {text}");
}

TEST(TextFormatTest, TwoPercentSignsAreOne) { EXPECT_EQ(formatText("%d%% of %%", 50), "50% of %"); }

TEST(TextFormatTest, TheLogPrefixIsAlignedInTwentyFiveAndFiveColumns) {
    EXPECT_EQ(formatText("%25s:%-5d ", "TraceRunner", 42), "              TraceRunner:42    ");
}

TEST(TextFormatTest, TheLogPrefixCutsNothing) {
    EXPECT_EQ(formatText("%25s:%-5d ", "VelaReportingSnagStateManagerUtility", 1234567),
              "VelaReportingSnagStateManagerUtility:1234567 ");
}

TEST(TextFormatTest, LongLengthWordsPrintAllSixtyFourBits) {
    EXPECT_EQ(formatText("sending message for session owned by %lli", std::numeric_limits<std::int64_t>::min()),
              "sending message for session owned by -9223372036854775808");
    EXPECT_EQ(formatText("%llu", std::numeric_limits<std::uint64_t>::max()), "18446744073709551615");
}

TEST(TextFormatTest, AShortLengthWordCutsNothing) {
    EXPECT_EQ(formatText("%hhu %hd %d %u", 1000, 100000, 5000000000, -1), "1000 100000 5000000000 -1");
}

TEST(TextFormatTest, EveryLengthWordIsTaken) {
    EXPECT_EQ(formatText("%hhd %hd %d %ld %lld %zu %qd %lf", 1, 2, 3, 4L, 5LL, std::size_t{6}, 7, 8.0),
              "1 2 3 4 5 6 7 8.000000");
}

TEST(TextFormatTest, ObjectsAreStringsInAnyOfTheirForms) {
    EXPECT_EQ(formatText("com.orvex.vela.%@.%@", "haptics", std::string("Start")), "com.orvex.vela.haptics.Start");
    EXPECT_EQ(formatText("%@ %@ %@", std::string_view("one"), String("two"), Key("three")), "one two three");
}

TEST(TextFormatTest, AGaugeIsWrittenAsItsFormatTextSays) {
    EXPECT_EQ(formatText("count=%d,lower=%lld,upper=%lld,min=%lld,max=%lld,unit=%@::", 3U, std::int64_t{-1},
                         std::int64_t{10}, std::int64_t{0}, std::int64_t{9}, "ms"),
              "count=3,lower=-1,upper=10,min=0,max=9,unit=ms::");
}

TEST(TextFormatTest, ARealHasSixDecimals) {
    EXPECT_EQ(formatText("duty_cycle:%f;", 0.25), "duty_cycle:0.250000;");
    EXPECT_EQ(formatText("%f", 1e-7), "0.000000");
    EXPECT_EQ(formatText("%f", -0.0), "-0.000000");
}

TEST(TextFormatTest, DecimalsAreThoseOfTheExactNumber) {
    EXPECT_EQ(formatText("%.2f %.0f %.0f %.1f", 1.005, 0.5, 1.5, 0.25), "1.00 0 2 0.2");
}

TEST(TextFormatTest, TheLargestRealIsWrittenOut) {
    EXPECT_EQ(formatText("%.99f", std::numeric_limits<double>::max()).size(), 309U + 1 + 99);
    EXPECT_EQ(formatText("%f", std::numeric_limits<double>::lowest()).substr(0, 20), "-1797693134862315708");
}

TEST(TextFormatTest, WhatIsNoNumberIsNamed) {
    EXPECT_EQ(formatText("%f %f %5g %05g", std::numeric_limits<double>::quiet_NaN(), -HUGE_VAL, HUGE_VAL, HUGE_VAL),
              "nan -inf   inf   inf");
}

TEST(TextFormatTest, TheShortFormOfARealHasSixDigits) {
    EXPECT_EQ(formatText("%g %g %g %.3g", 0.0001, 1e10, 123456789.0, 3.14159), "0.0001 1e+10 1.23457e+08 3.14");
}

TEST(TextFormatTest, ARealAsAnObjectHasItsShortestDigits) { EXPECT_EQ(formatText("%@ %@", 0.1, 0.1F), "0.1 0.1"); }

TEST(TextFormatTest, ABooleanIsOneOrZero) { EXPECT_EQ(formatText("%d%i%@%@", true, false, true, false), "1010"); }

TEST(TextFormatTest, AnEnumeratorIsItsNumber) { EXPECT_EQ(formatText("%i %@", Colour::Green, Colour::Green), "7 7"); }

TEST(TextFormatTest, HexadecimalDigitsFollowTheLettersCase) {
    EXPECT_EQ(formatText("%x %X %x", 0xBEEFU, 0xBEEFU, 0), "beef BEEF 0");
    EXPECT_EQ(formatText("%08x", 0x10000004U), "10000004");
    EXPECT_EQ(formatText("%08x", 0xABCU), "00000abc");
}

TEST(TextFormatTest, ANegativeNumberKeepsItsSignInHexadecimal) { EXPECT_EQ(formatText("%x", -255), "-ff"); }

TEST(TextFormatTest, WidthFillsWithSpacesBeforeOrBehind) {
    EXPECT_EQ(formatText("[%5d][%-5d][%5s][%-5s][%3c]", 42, -42, "ab", "ab", 'c'), "[   42][-42  ][   ab][ab   ][  c]");
}

TEST(TextFormatTest, ZerosFillBehindTheSign) {
    EXPECT_EQ(formatText("[%05d][%-05d][%08.2f][%02d]", -42, 42, -1.5, 7), "[-0042][42   ][-0001.50][07]");
}

TEST(TextFormatTest, ThePrecisionOfAnIntegerIsItsLeastNumberOfDigits) {
    EXPECT_EQ(formatText("[%.3d][%6.3d][%06.3d]", 7, -7, 7), "[007][  -007][   007]");
}

TEST(TextFormatTest, ThePrecisionOfATextIsItsLargestNumberOfCharacters) {
    EXPECT_EQ(formatText("[%.2s][%5.2@][%.9s]", "abc", "abc", "abc"), "[ab][   ab][abc]");
    EXPECT_EQ(formatText("%.2s", "\u00e4\u20ac!"), "\u00e4\u20ac");
}

TEST(TextFormatTest, WidthCountsCharactersNotBytes) { EXPECT_EQ(formatText("[%3s]", "\u20ac"), "[  \u20ac]"); }

TEST(TextFormatTest, ACharacterIsWrittenAsItIs) { EXPECT_EQ(formatText("%c%@", 'a', 'b'), "ab"); }

TEST(TextFormatTest, ANullPointerIsNull) {
    const char* const none = nullptr;
    EXPECT_EQ(formatText("%s %@ %@", none, none, nullptr), "(null) (null) (null)");
}

TEST(TextFormatTest, AnAbsentOptionalIsNull) {
    EXPECT_EQ(formatText("%@ %d", std::optional<std::string>(), std::optional<int>()), "(null) (null)");
}

TEST(TextFormatTest, AnOptionalIsItsContent) {
    EXPECT_EQ(formatText("%@ %d", std::optional<std::string>("text"), std::optional<int>(5)), "text 5");
}

TEST(TextFormatTest, ValuesAreInTheirTextualForm) {
    const Dictionary message{{"audiotag", "GenericStart"}, {"count", 3}};
    const Value value(Array{Value(1), Value("two words")});
    EXPECT_EQ(formatText("%@", message), "{audiotag = GenericStart; count = 3;}");
    EXPECT_EQ(formatText("%@ %@", value, value.ref()), R"((1, "two words") (1, "two words"))");
    EXPECT_EQ(formatText("%@ %@", Data("\x01\xff"), Date{0}), "<01ff> 1970-01-01 00:00:00 +0000");
    EXPECT_EQ(formatText("%@ %@", Value(), ValueRef()), "(null) (null)");
}

TEST(TextFormatTest, ATypeWithADescriptionIsPrintable) { EXPECT_EQ(formatText("at %@!", Point{1, -2}), "at (1, -2)!"); }

TEST(TextFormatTest, ATextIsAppendedToWhatIsThere) {
    std::string text = "before ";
    appendFormatted(text, "%5d|", 1);
    EXPECT_EQ(text, "before     1|");
}

TEST(TextFormatTest, ATextMayHoldANul) { EXPECT_EQ(formatText("%@", std::string("a\0b", 3)), std::string("a\0b", 3)); }

TEST(TextFormatTest, NothingIsEscapedOutsideLogs) { EXPECT_EQ(formatText("%@%c", "\n\x1b\xff", '\n'), "\n\x1b\xff\n"); }

TEST(TextFormatTest, TheLocaleChangesNothing) {
    // NOLINTBEGIN(concurrency-mt-unsafe): no other thread runs.
    const std::string before = std::setlocale(LC_ALL, nullptr);
    // Which of them a machine has differs; with none there is nothing that could differ.
    for (const char* const name : {"de_DE.UTF-8", "fr_FR.UTF-8", "C.UTF-8"}) {
        if (std::setlocale(LC_ALL, name) != nullptr) {
            break;
        }
    }
    EXPECT_EQ(formatText("%f %g %@ %d", 1234567.5, 1.5, 1234.5, 1234567), "1234567.500000 1.5 1234.5 1234567");
    EXPECT_NE(std::setlocale(LC_ALL, before.c_str()), nullptr);
    // NOLINTEND(concurrency-mt-unsafe)
}

TEST(TextFormatCheckTest, AFittingTextIsTaken) {
    static_assert(judgeFormat("%25s:%-5d %lli %@%%", {ArgumentKind::Text, ArgumentKind::Integer, ArgumentKind::Integer,
                                                      ArgumentKind::Real}) == FormatVerdict::Fits);
    static_assert(judgeFormat("no argument", {}) == FormatVerdict::Fits);
}

TEST(TextFormatCheckTest, TheNumberOfArgumentsMustBeThatOfTheConversions) {
    static_assert(judgeFormat("%d %d", {ArgumentKind::Integer}) == FormatVerdict::TooFewArguments);
    static_assert(judgeFormat("%d", {ArgumentKind::Integer, ArgumentKind::Integer}) == FormatVerdict::TooManyArguments);
    static_assert(judgeFormat("%%", {ArgumentKind::Integer}) == FormatVerdict::TooManyArguments);
}

TEST(TextFormatCheckTest, AConversionMustSuitItsArgument) {
    static_assert(judgeFormat("%d", {ArgumentKind::Text}) == FormatVerdict::Unsuitable);
    static_assert(judgeFormat("%s", {ArgumentKind::Integer}) == FormatVerdict::Unsuitable);
    static_assert(judgeFormat("%s", {ArgumentKind::Object}) == FormatVerdict::Unsuitable);
    static_assert(judgeFormat("%f", {ArgumentKind::Integer}) == FormatVerdict::Unsuitable);
    static_assert(judgeFormat("%d", {ArgumentKind::Real}) == FormatVerdict::Unsuitable);
    static_assert(judgeFormat("%d", {ArgumentKind::Character}) == FormatVerdict::Unsuitable);
    static_assert(judgeFormat("%c", {ArgumentKind::Integer}) == FormatVerdict::Unsuitable);
}

TEST(TextFormatCheckTest, AMalformedConversionIsRefused) {
    static_assert(judgeFormat("100%", {}) == FormatVerdict::Malformed);
    static_assert(judgeFormat("%5", {ArgumentKind::Integer}) == FormatVerdict::Malformed);
    static_assert(judgeFormat("%n", {ArgumentKind::Integer}) == FormatVerdict::Malformed);
    static_assert(judgeFormat("%*d", {ArgumentKind::Integer}) == FormatVerdict::Malformed);
    static_assert(judgeFormat("%+d", {ArgumentKind::Integer}) == FormatVerdict::Malformed);
    static_assert(judgeFormat("%1000d", {ArgumentKind::Integer}) == FormatVerdict::Malformed);
    static_assert(judgeFormat("%99999999999999999999d", {ArgumentKind::Integer}) == FormatVerdict::Malformed);
    static_assert(judgeFormat("%.100f", {ArgumentKind::Real}) == FormatVerdict::Malformed);
}

TEST(TextFormatCheckTest, ALengthWordMustMakeSense) {
    static_assert(judgeFormat("%ls", {ArgumentKind::Text}) == FormatVerdict::Malformed);
    static_assert(judgeFormat("%l@", {ArgumentKind::Object}) == FormatVerdict::Malformed);
    static_assert(judgeFormat("%hhf", {ArgumentKind::Real}) == FormatVerdict::Malformed);
    static_assert(judgeFormat("%llld", {ArgumentKind::Integer}) == FormatVerdict::Malformed);
    static_assert(judgeFormat("%05s", {ArgumentKind::Text}) == FormatVerdict::Malformed);
}

TEST(TextFormatSourceTest, ASourceIsNamedWithoutFolderAndExtension) {
    static_assert(detail::sourceNameOf("session/VelaReportingSession.cpp") == "VelaReportingSession");
    static_assert(detail::sourceNameOf("/a.b/c/TraceRunner.h") == "TraceRunner");
    static_assert(detail::sourceNameOf("Plain") == "Plain");
    static_assert(detail::sourceNameOf("a.b/Plain") == "Plain");
}

TEST(TextFormatSourceTest, AFormatTextKnowsItsPlace) {
    const FormatText<> format("text");
    const int line = __LINE__ - 1;
    EXPECT_EQ(format.sourceName(), "TextFormat_test");
    EXPECT_EQ(format.line(), line);
    EXPECT_TRUE(format.sourceFile().ends_with("common/TextFormat_test.cpp"));
}

TEST(EscapingTest, ReadableTextStaysAsItIs) {
    EXPECT_EQ(escaped("com.orvex.App \\n ~ \u00e4\u20ac\U0001F50A \u05d0"),
              "com.orvex.App \\n ~ \u00e4\u20ac\U0001F50A \u05d0");
}

TEST(EscapingTest, LineEndsAndTabsHaveTheirLetters) { EXPECT_EQ(escaped("a\nb\r\tc"), "a\\nb\\r\\tc"); }

TEST(EscapingTest, ControlCharactersShowTheirNumber) {
    EXPECT_EQ(escaped(std::string_view("\0\x01\x1b[0m\x1f\x7f", 8)), "\\x00\\x01\\x1b[0m\\x1f\\x7f");
}

TEST(EscapingTest, ControlCharactersAboveAsciiShowTheirCodePoint) {
    EXPECT_EQ(escaped("\u0080\u0085\u009b\u00a0"), "\\u0080\\u0085\\u009b\u00a0");
}

TEST(EscapingTest, SeparatorsOfLinesAndParagraphsShowTheirCodePoint) {
    EXPECT_EQ(escaped("\u2027\u2028\u2029"), "\u2027\\u2028\\u2029");
}

TEST(EscapingTest, BidirectionalControlsShowTheirCodePoint) {
    EXPECT_EQ(escaped(utf8From(0x202A, 0x202E)), "\\u202a\\u202b\\u202c\\u202d\\u202e");
    EXPECT_EQ(escaped(utf8From(0x2066, 0x2069)), "\\u2066\\u2067\\u2068\\u2069");
}

TEST(EscapingTest, TheNeighboursOfBidirectionalControlsStayAsTheyAre) {
    EXPECT_EQ(escaped("\u202f\u2065\u206a"), "\u202f\u2065\u206a");
}

TEST(EscapingTest, BytesThatAreNotUtf8ShowTheirNumber) {
    EXPECT_EQ(escaped("a\xff\xc3(\x80z"), "a\\xff\\xc3(\\x80z");
    EXPECT_EQ(escaped("\xe2\x80"), "\\xe2\\x80");
    EXPECT_EQ(escaped("\xc0\x8a"), "\\xc0\\x8a");          // an overlong line end
    EXPECT_EQ(escaped("\xed\xa0\x80"), "\\xed\\xa0\\x80"); // half of a surrogate pair
}

} // namespace

} // namespace vela
