#include "platform/plist/Scalars.h"

#include <cmath>
#include <cstdint>
#include <gtest/gtest.h>
#include <limits>

namespace vela::platform::plist {

namespace {

using namespace std::string_view_literals;

TEST(ScalarsTest, IntegersAreDecimalWithAnOptionalSign) {
    EXPECT_EQ(parseInteger("0"), Value(0));
    EXPECT_EQ(parseInteger("42"), Value(42));
    EXPECT_EQ(parseInteger("-7"), Value(-7));
    EXPECT_EQ(parseInteger("+7"), Value(7));
    EXPECT_EQ(parseInteger("-0"), Value(0));
}

TEST(ScalarsTest, IntegersMayBeHexadecimal) {
    EXPECT_EQ(parseInteger("0x1F"), Value(31));
    EXPECT_EQ(parseInteger("0X001f"), Value(31));
    EXPECT_EQ(parseInteger("-0x10"), Value(-16));
    EXPECT_EQ(parseInteger("0xffffffffffffffff"), Value(std::numeric_limits<std::uint64_t>::max()));
}

TEST(ScalarsTest, IntegersReachFromTheSmallestSignedToTheLargestUnsigned) {
    EXPECT_EQ(parseInteger("-9223372036854775808"), Value(std::numeric_limits<std::int64_t>::min()));
    EXPECT_EQ(parseInteger("9223372036854775807"), Value(std::numeric_limits<std::int64_t>::max()));
    EXPECT_EQ(parseInteger("9223372036854775808"), Value(std::uint64_t{1} << 63U));
    EXPECT_EQ(parseInteger("9223372036854775808")->kind(), ValueKind::Unsigned);
    EXPECT_EQ(parseInteger("18446744073709551615"), Value(std::numeric_limits<std::uint64_t>::max()));
    EXPECT_EQ(parseInteger("18446744073709551616"), std::nullopt);
    EXPECT_EQ(parseInteger("-9223372036854775809"), std::nullopt);
    EXPECT_EQ(parseInteger("0x10000000000000000"), std::nullopt);
}

TEST(ScalarsTest, WhatIsNoIntegerIsRefused) {
    for (const char* const text :
         {"", "-", "+", "--1", "+-1", "12abc", "abc", "1.0", "1e3", " 7", "7 ", "0x", "0xg", "x1"}) {
        EXPECT_EQ(parseInteger(text), std::nullopt) << text;
    }
}

TEST(ScalarsTest, ADecimalIntegerWithALeadingZeroIsRefused) {
    EXPECT_EQ(parseInteger("007"), std::nullopt);
    EXPECT_EQ(parseInteger("-01"), std::nullopt);
    EXPECT_EQ(parseInteger("00"), std::nullopt);
}

TEST(ScalarsTest, RealsAreDecimal) {
    EXPECT_EQ(parseReal("0.1"), 0.1);
    EXPECT_EQ(parseReal("-2.5e-3"), -0.0025);
    EXPECT_EQ(parseReal("+1E3"), 1000.0);
    EXPECT_EQ(parseReal(".5"), 0.5);
    EXPECT_EQ(parseReal("2."), 2.0);
    EXPECT_EQ(parseReal("12"), 12.0);
    EXPECT_EQ(parseReal("1.7976931348623157e308"), std::numeric_limits<double>::max());
    EXPECT_EQ(parseReal("5e-324"), std::numeric_limits<double>::denorm_min());
}

TEST(ScalarsTest, MinusZeroKeepsItsSign) {
    const auto zero = parseReal("-0.0");
    ASSERT_TRUE(zero);
    EXPECT_EQ(*zero, 0.0);
    EXPECT_TRUE(std::signbit(*zero));
}

TEST(ScalarsTest, RealsMayBeInfiniteOrNoNumber) {
    EXPECT_TRUE(std::isnan(parseReal("nan").value()));
    EXPECT_TRUE(std::isnan(parseReal("NaN").value()));
    EXPECT_EQ(parseReal("inf"), std::numeric_limits<double>::infinity());
    EXPECT_EQ(parseReal("+Infinity"), std::numeric_limits<double>::infinity());
    EXPECT_EQ(parseReal("-INF"), -std::numeric_limits<double>::infinity());
}

TEST(ScalarsTest, WhatIsNoRealIsRefused) {
    for (const char* const text :
         {"", "-", ".", "e5", "1e", "1e+", "1,5", "0x1p3", "1.5f", " 1", "1 ", "nan(1)", "infinit", "1.2.3"}) {
        EXPECT_EQ(parseReal(text), std::nullopt) << text;
    }
}

TEST(ScalarsTest, ARealOutsideTheRangeIsRefused) {
    EXPECT_EQ(parseReal("1e309"), std::nullopt);
    EXPECT_EQ(parseReal("-1e999"), std::nullopt);
    EXPECT_EQ(parseReal("1e-999"), std::nullopt);
}

TEST(ScalarsTest, DatesAreSecondsSince1970) {
    EXPECT_EQ(parseDate("1970-01-01T00:00:00Z"), Date{0});
    EXPECT_EQ(parseDate("2001-01-01T00:00:00Z"), Date{978307200});
    EXPECT_EQ(parseDate("2026-11-21T02:43:25Z"), Date{1795229005});
    EXPECT_EQ(parseDate("1969-12-31T23:59:59Z"), Date{-1});
    EXPECT_EQ(parseDate("0001-01-01T00:00:00Z"), Date{-62135596800});
    EXPECT_EQ(parseDate("9999-12-31T23:59:59Z"), Date{253402300799});
}

TEST(ScalarsTest, OnlyDaysOfTheCalendarAreDates) {
    EXPECT_EQ(parseDate("2024-02-29T00:00:00Z"), Date{1709164800});
    EXPECT_EQ(parseDate("2000-02-29T00:00:00Z"), Date{951782400});
    for (const char* const text :
         {"2023-02-29T00:00:00Z", "1900-02-29T00:00:00Z", "2023-04-31T00:00:00Z", "2023-13-01T00:00:00Z",
          "2023-00-01T00:00:00Z", "2023-01-00T00:00:00Z", "0000-01-01T00:00:00Z"}) {
        EXPECT_EQ(parseDate(text), std::nullopt) << text;
    }
}

TEST(ScalarsTest, OnlyTimesOfTheDayAreDates) {
    for (const char* const text : {"2023-01-01T24:00:00Z", "2023-01-01T00:60:00Z", "2023-01-01T00:00:60Z"}) {
        EXPECT_EQ(parseDate(text), std::nullopt) << text;
    }
}

TEST(ScalarsTest, OtherFormsOfADateAreRefused) {
    for (const char* const text :
         {"", "2023-01-01", "2023-01-01T00:00:00", "2023-01-01T00:00:00.5Z", "2023-01-01T00:00:00+00:00",
          "2023-1-01T00:00:00Z", "2023-01-01 00:00:00Z", "2023-01-01T00:00:00z", " 2023-01-01T00:00:00Z",
          "-023-01-01T00:00:00Z", "2023/01/01T00:00:00Z", "2023-01-01T00:00: 1Z"}) {
        EXPECT_EQ(parseDate(text), std::nullopt) << text;
    }
}

TEST(ScalarsTest, Base64IsBytes) {
    EXPECT_EQ(parseBase64(""), "");
    EXPECT_EQ(parseBase64("AA=="), "\0"sv);
    EXPECT_EQ(parseBase64("AAE="), "\0\1"sv);
    EXPECT_EQ(parseBase64("AAEC"), "\0\1\2"sv);
    EXPECT_EQ(parseBase64("D713cQ=="), "\x0F\xBD\x77\x71");
    EXPECT_EQ(parseBase64("+/+/"), "\xFB\xFF\xBF");
}

TEST(ScalarsTest, WhiteSpaceMayStandInBase64) { EXPECT_EQ(parseBase64("\n\tAA EC\r\nAw\t==\n"), "\0\1\2\3"sv); }

TEST(ScalarsTest, WhatIsNoBase64IsRefused) {
    for (const char* const text :
         {"A", "AA", "AAA", "AA=", "A===", "====", "=AAA", "AA=A", "AA==AAAA", "A*==", "AA-_", "AAEC="}) {
        EXPECT_EQ(parseBase64(text), std::nullopt) << text;
    }
}

TEST(ScalarsTest, Base64WithBitsBehindItsLastByteIsRefused) {
    EXPECT_EQ(parseBase64("AB=="), std::nullopt);
    EXPECT_EQ(parseBase64("AAF="), std::nullopt);
}

} // namespace

} // namespace vela::platform::plist
