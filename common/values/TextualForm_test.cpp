#include "common/values/Dictionary.h"
#include "common/values/TextualForm.h"

#include <cmath>
#include <cstdint>
#include <gtest/gtest.h>
#include <limits>

namespace vela {

namespace {

std::string form(const Value& value) { return textualForm(value); }

TEST(TextualFormTest, AStringAtTheTopIsItself) {
    EXPECT_EQ(form("two words"), "two words");
    EXPECT_EQ(form("a \"quoted\"\nline"), "a \"quoted\"\nline");
    EXPECT_EQ(form(""), "");
}

TEST(TextualFormTest, NumbersAreTheirShortestDigits) {
    EXPECT_EQ(form(true), "1");
    EXPECT_EQ(form(false), "0");
    EXPECT_EQ(form(std::numeric_limits<std::int64_t>::min()), "-9223372036854775808");
    EXPECT_EQ(form(std::numeric_limits<std::uint64_t>::max()), "18446744073709551615");
    EXPECT_EQ(form(0.5), "0.5");
    EXPECT_EQ(form(1.0), "1");
    EXPECT_EQ(form(-0.0), "-0");
    EXPECT_EQ(form(0.1), "0.1");
    EXPECT_EQ(form(0.1F), "0.1");
    EXPECT_EQ(form(0.0F), "0");
    EXPECT_EQ(form(1700000000.123456), "1700000000.123456");
    EXPECT_EQ(form(1.0 / 3.0), "0.3333333333333333");
    EXPECT_EQ(form(100000.0), "100000");
    EXPECT_EQ(form(-12.75), "-12.75");
}

TEST(TextualFormTest, VeryLargeAndVerySmallRealsHaveAnExponent) {
    EXPECT_EQ(form(1e16), "1e+16");
    EXPECT_EQ(form(9007199254740993.0), "9007199254740992");
    EXPECT_EQ(form(0.00001), "0.00001");
    EXPECT_EQ(form(0.000001), "1e-06");
    EXPECT_EQ(form(5e-324), "5e-324");
    EXPECT_EQ(form(1.7976931348623157e308), "1.7976931348623157e+308");
}

TEST(TextualFormTest, WhatIsNoNumberSaysSo) {
    EXPECT_EQ(form(std::nan("")), "nan");
    EXPECT_EQ(form(std::numeric_limits<double>::infinity()), "inf");
    EXPECT_EQ(form(-std::numeric_limits<double>::infinity()), "-inf");
}

// Every text of a real must name that real.
TEST(TextualFormTest, RealsReadBackAsThemselves) {
    double number = 1.0;
    for (int step = 0; step < 4000; ++step) {
        number = number * 1.0173 + 1e-3;
        for (const double real : {number, 1 / number, std::round(number * 1e6) / 1e6, std::round(number * 16) / 16}) {
            EXPECT_EQ(std::strtod(form(real).c_str(), nullptr), real);
            EXPECT_EQ(std::strtod(form(-real).c_str(), nullptr), -real);
            const auto narrow = static_cast<float>(real);
            EXPECT_EQ(std::strtof(form(narrow).c_str(), nullptr), narrow);
        }
    }
}

TEST(TextualFormTest, NoneIsNull) { EXPECT_EQ(form(Value()), "(null)"); }

TEST(TextualFormTest, DatesAreUtcWithoutFraction) {
    EXPECT_EQ(form(Date{0}), "1970-01-01 00:00:00 +0000");
    EXPECT_EQ(form(Date{1795228205.9}), "2026-11-21 02:30:05 +0000");
    EXPECT_EQ(form(Date{-0.5}), "1969-12-31 23:59:59 +0000");
    EXPECT_EQ(form(Date{951782400}), "2000-02-29 00:00:00 +0000");
}

TEST(TextualFormTest, ADateThatIsNoneSaysSo) {
    EXPECT_EQ(form(Date{std::nan("")}), "(invalid date)");
    EXPECT_EQ(form(Date{1e18}), "(invalid date)");
    EXPECT_EQ(form(Date{-1e18}), "(invalid date)");
    EXPECT_EQ(form(Date{253402300800.0}), "(invalid date)");
    EXPECT_EQ(form(Date{253402300799.0}), "9999-12-31 23:59:59 +0000");
    EXPECT_EQ(form(Date{-62135596800.0}), "0001-01-01 00:00:00 +0000");
}

TEST(TextualFormTest, DataIsHexadecimal) {
    EXPECT_EQ(form(Data("\x0f\xbd\x77")), "<0fbd77>");
    EXPECT_EQ(form(Data("")), "<>");
}

TEST(TextualFormTest, ContainersAreOneLine) {
    EXPECT_EQ(form(Dictionary{{"audiotag", "GenericStart"}, {"list", Array{1, "two words", true}}}),
              "{audiotag = GenericStart; list = (1, \"two words\", 1);}");
    EXPECT_EQ(form(Array{}), "()");
    EXPECT_EQ(form(Dictionary{}), "{}");
    EXPECT_EQ(form(Array{Array{}, Dictionary{{"a", Dictionary{}}}}), "((), {a = {};})");
}

TEST(TextualFormTest, LeavesAreQuotedWhereTheyMustBe) {
    EXPECT_EQ(form(Array{"", "a-b", "a=b", "a/b", "a//b", "a.b:c$d_e"}),
              "(\"\", \"a-b\", \"a=b\", a/b, \"a//b\", a.b:c$d_e)");
    EXPECT_EQ(form(Array{-1, 0.5, 1e-7}), "(\"-1\", 0.5, \"1e-07\")");
    EXPECT_EQ(form(Dictionary{{"two words", 1}}), "{\"two words\" = 1;}");
    EXPECT_EQ(form(Array{Date{0}}), "(\"1970-01-01 00:00:00 +0000\")");
}

TEST(TextualFormTest, LeavesEscapeWhatWouldEndThem) {
    EXPECT_EQ(form(Array{"say \"no\\\""}), "(\"say \\\"no\\\\\\\"\")");
    EXPECT_EQ(form(Array{"\a\b\t\n\v\f\r\x01\x1f\x7f"}), "(\"\\a\\b\\t\\n\\v\\f\\r\\001\\037\\177\")");
    EXPECT_EQ(form(Array{std::string_view("a\0b", 3)}), "(\"a\\000b\")");
}

TEST(TextualFormTest, LeavesKeepUtf8AndReplaceWhatIsNot) {
    EXPECT_EQ(form(Array{"caf\u00e9"}), "(\"caf\u00e9\")");
    EXPECT_EQ(form(Array{"a\xFFz"}), "(\"a\uFFFDz\")");
}

} // namespace

} // namespace vela
