#include "common/values/Dictionary.h"
#include "common/values/Value.h"

#include <cmath>
#include <cstdint>
#include <gtest/gtest.h>
#include <limits>

namespace vela {

namespace {

constexpr auto kLargest = std::numeric_limits<std::int64_t>::max();
constexpr auto kSmallest = std::numeric_limits<std::int64_t>::min();
constexpr auto kLargestUnsigned = std::numeric_limits<std::uint64_t>::max();

TEST(ValueTest, ANewValueIsNone) {
    const Value value;
    EXPECT_EQ(value.kind(), ValueKind::None);
    EXPECT_FALSE(value);
}

TEST(ValueTest, EachTypeGivesItsKind) {
    EXPECT_EQ(Value(true).kind(), ValueKind::Boolean);
    EXPECT_EQ(Value(1).kind(), ValueKind::Integer);
    EXPECT_EQ(Value(std::uint16_t{1}).kind(), ValueKind::Integer);
    EXPECT_EQ(Value(1.0).kind(), ValueKind::Real);
    EXPECT_EQ(Value(1.0F).kind(), ValueKind::Real32);
    EXPECT_EQ(Value(Date{1}).kind(), ValueKind::Date);
    EXPECT_EQ(Value("text").kind(), ValueKind::String);
    EXPECT_EQ(Value(Data("bytes")).kind(), ValueKind::Data);
    EXPECT_EQ(Value(Array()).kind(), ValueKind::Array);
    EXPECT_EQ(Value(Dictionary()).kind(), ValueKind::Dictionary);
}

TEST(ValueTest, UnsignedNumbersAreIntegersUpToTheSignedRange) {
    EXPECT_EQ(Value(static_cast<std::uint64_t>(kLargest)).kind(), ValueKind::Integer);
    const Value above(static_cast<std::uint64_t>(kLargest) + 1);
    EXPECT_EQ(above.kind(), ValueKind::Unsigned);
    EXPECT_EQ(above.ref().unsignedInteger(), 9223372036854775808U);
}

TEST(ValueTest, KeepsWhatItWasGiven) {
    EXPECT_TRUE(Value(true).ref().boolean());
    EXPECT_EQ(Value(kSmallest).ref().integer(), kSmallest);
    EXPECT_EQ(Value(0.1).ref().real(), 0.1);
    EXPECT_EQ(Value(0.1F).ref().real(), static_cast<double>(0.1F));
    EXPECT_EQ(Value(Date{-1.5}).ref().date().seconds, -1.5);
    EXPECT_EQ(Value("text").ref().text(), "text");
    EXPECT_EQ(Value(Data(std::string_view("\0b", 2))).ref().bytes(), std::string_view("\0b", 2));
}

TEST(ValueTest, ACopySharesTheObject) {
    const Value text("text");
    const Value copy = text;
    EXPECT_TRUE(copy.ref().isSameObject(text));
}

TEST(ValueTest, AMovedFromValueIsNone) {
    Value text("text");
    const Value moved = std::move(text);
    EXPECT_EQ(moved.ref().text(), "text");
    EXPECT_FALSE(text); // NOLINT(bugprone-use-after-move): this is what is tested
}

TEST(ValueTest, AssignmentToItselfKeepsTheValue) {
    Value text("text");
    const Value& same = text;
    text = same;
    EXPECT_EQ(text.ref().text(), "text");
}

TEST(ValueEqualityTest, IntegerBooleanAndRealOneAreThreeValues) {
    EXPECT_NE(Value(1), Value(true));
    EXPECT_NE(Value(1), Value(1.0));
    EXPECT_NE(Value(true), Value(1.0));
    EXPECT_NE(Value(0), Value(false));
}

TEST(ValueEqualityTest, RealsOfBothWidthsAreEqualByNumber) {
    EXPECT_EQ(Value(0.5), Value(0.5F));
    EXPECT_NE(Value(0.1), Value(0.1F));
}

TEST(ValueEqualityTest, NotANumberRepeatsItself) {
    EXPECT_EQ(Value(std::nan("1")), Value(std::nan("2")));
    EXPECT_NE(Value(std::nan("")), Value(0.0));
}

TEST(ValueEqualityTest, ZerosOfBothSignsAreEqual) { EXPECT_EQ(Value(0.0), Value(-0.0)); }

TEST(ValueEqualityTest, StringAndDataOfTheSameBytesDiffer) { EXPECT_NE(Value("ab"), Value(Data("ab"))); }

TEST(ValueEqualityTest, DateAndRealOfTheSameSecondsDiffer) { EXPECT_NE(Value(Date{1.5}), Value(1.5)); }

TEST(ValueEqualityTest, SignedAndUnsignedWithTheSameBitsDiffer) { EXPECT_NE(Value(-1), Value(kLargestUnsigned)); }

TEST(ValueEqualityTest, NoneEqualsOnlyNone) {
    EXPECT_EQ(Value(), Value());
    EXPECT_NE(Value(), Value(false));
    EXPECT_NE(Value(), Value(""));
}

// Lengths around the widths at which the comparison changes its way.
TEST(ValueEqualityTest, StringsDifferWhereverOneByteDiffers) {
    for (const std::size_t length : {1U, 7U, 8U, 9U, 15U, 16U, 17U, 24U, 31U, 32U, 33U, 64U, 65U, 200U}) {
        const std::string text(length, 'a');
        EXPECT_EQ(Value(std::string_view(text)), Value(std::string_view(text))) << length;
        for (std::size_t index = 0; index < length; ++index) {
            std::string other = text;
            other[index] = 'b';
            EXPECT_NE(Value(std::string_view(text)), Value(std::string_view(other))) << length << " at " << index;
        }
    }
}

TEST(ValueEqualityTest, AStringIsNotItsBeginning) {
    EXPECT_NE(Value("abc"), Value("ab"));
    EXPECT_NE(Value(std::string_view("ab\0", 3)), Value("ab"));
    EXPECT_NE(Value(""), Value(std::string_view("\0", 1)));
}

TEST(ValueNumberTest, ComparesByNumberWhateverTheKind) {
    EXPECT_TRUE(numericallyEqual(Value(1), Value(1.0)));
    EXPECT_TRUE(numericallyEqual(Value(true), Value(1)));
    EXPECT_TRUE(numericallyEqual(Value(false), Value(0.0)));
    EXPECT_TRUE(numericallyEqual(Value(0.5F), Value(0.5)));
    EXPECT_FALSE(numericallyEqual(Value(1), Value(2)));
    EXPECT_FALSE(numericallyEqual(Value(1), Value(1.5)));
}

TEST(ValueNumberTest, LargeIntegersAreNotComparedAsRoundedReals) {
    EXPECT_FALSE(numericallyEqual(Value(9007199254740993), Value(9007199254740992.0)));
    EXPECT_TRUE(numericallyEqual(Value(9007199254740992), Value(9007199254740992.0)));
    EXPECT_FALSE(numericallyEqual(Value(kLargest), Value(0x1p63)));
    EXPECT_TRUE(numericallyEqual(Value(kSmallest), Value(-0x1p63)));
    EXPECT_TRUE(numericallyEqual(Value(0x8000000000000000U), Value(0x1p63)));
    EXPECT_FALSE(numericallyEqual(Value(kLargestUnsigned), Value(0x1p64)));
    EXPECT_FALSE(numericallyEqual(Value(-1), Value(kLargestUnsigned)));
    EXPECT_TRUE(numericallyEqual(Value(kLargestUnsigned), Value(kLargestUnsigned)));
}

TEST(ValueNumberTest, WhatIsNoNumberEqualsNothing) {
    EXPECT_FALSE(numericallyEqual(Value("1"), Value("1")));
    EXPECT_FALSE(numericallyEqual(Value(), Value()));
    EXPECT_FALSE(numericallyEqual(Value(std::nan("")), Value(std::nan(""))));
    EXPECT_FALSE(numericallyEqual(Value(std::nan("")), Value(1)));
}

TEST(ValueNumberTest, ReadsANumberAsAnother) {
    EXPECT_EQ(Value(true).ref().doubleValue(), 1.0);
    EXPECT_EQ(Value(-3).ref().doubleValue(), -3.0);
    EXPECT_EQ(Value(0x8000000000000000U).ref().doubleValue(), 0x1p63);
    EXPECT_EQ(Value("2.5").ref().doubleValue(7.0), 7.0);
    EXPECT_TRUE(Value(0.25).ref().booleanValue());
    EXPECT_FALSE(Value(-0.0).ref().booleanValue());
    EXPECT_TRUE(Value(-1).ref().booleanValue());
    EXPECT_FALSE(Value("true").ref().booleanValue());
    EXPECT_TRUE(Value("true").ref().booleanValue(true));
}

TEST(ValueNumberTest, ARealReadAsAnIntegerIsCutAndKeptInRange) {
    EXPECT_EQ(Value(2.9).ref().integerValue(), 2);
    EXPECT_EQ(Value(-2.9).ref().integerValue(), -2);
    EXPECT_EQ(Value(1e300).ref().integerValue(), kLargest);
    EXPECT_EQ(Value(-1e300).ref().integerValue(), kSmallest);
    EXPECT_EQ(Value(std::nan("")).ref().integerValue(5), 0);
    EXPECT_EQ(Value(kLargestUnsigned).ref().integerValue(), kLargest);
    EXPECT_EQ(Value("2").ref().integerValue(5), 5);
}

TEST(StringTest, EqualStringsMadeApartAreNotTheSameObject) {
    const String constant("spoor");
    const String other("spoor");
    EXPECT_EQ(constant, other);
    EXPECT_FALSE(constant.isSameObject(other));
}

TEST(StringTest, IdentitySurvivesTheWayThroughADictionary) {
    const String constant("spoor");
    const Dictionary configuration = {{"type", constant}, {"other", "spoor"}};
    EXPECT_TRUE(configuration.find("type").string().isSameObject(constant));
    EXPECT_FALSE(configuration.find("other").string().isSameObject(constant));
    EXPECT_TRUE(configuration.setting(Key("more"), 1).find("type").string().isSameObject(constant));
}

TEST(StringTest, AllEmptyStringsAreOneObject) {
    EXPECT_TRUE(String().isSameObject(String("")));
    EXPECT_EQ(Value("").ref().text(), "");
}

TEST(StringTest, HoldsNulBytes) {
    const String text(std::string_view("a\0b", 3));
    EXPECT_EQ(text.view().size(), 3U);
}

} // namespace

} // namespace vela
