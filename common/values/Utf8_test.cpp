#include "common/values/Utf8.h"

#include <gtest/gtest.h>
#include <string>

namespace vela {

namespace {

TEST(Utf8Test, TakesOneCharacterOfEachLength) {
    EXPECT_EQ(utf8Step("a").codePoint, U'a');
    EXPECT_EQ(utf8Step("\u00e9").codePoint, U'\u00e9');
    EXPECT_EQ(utf8Step("\u20ac").codePoint, U'\u20ac');
    EXPECT_EQ(utf8Step("\U0001F50A").codePoint, U'\U0001F50A');
    EXPECT_EQ(utf8Step("\U0001F50A").bytes, 4U);
}

TEST(Utf8Test, RefusesOverlongForms) {
    EXPECT_FALSE(isValidUtf8("\xC0\x80"));
    EXPECT_FALSE(isValidUtf8("\xC1\xBF"));
    EXPECT_FALSE(isValidUtf8("\xE0\x80\xAF"));
    EXPECT_FALSE(isValidUtf8("\xF0\x80\x80\xAF"));
}

TEST(Utf8Test, RefusesSurrogatesAndWhatLiesAboveTheLast) {
    EXPECT_FALSE(isValidUtf8("\xED\xA0\x80"));
    EXPECT_FALSE(isValidUtf8("\xED\xBF\xBF"));
    EXPECT_TRUE(isValidUtf8("\xF4\x8F\xBF\xBF"));
    EXPECT_FALSE(isValidUtf8("\xF4\x90\x80\x80"));
    EXPECT_FALSE(isValidUtf8("\xFF"));
}

TEST(Utf8Test, RefusesACharacterThatIsCut) {
    EXPECT_FALSE(isValidUtf8("\xC3"));
    EXPECT_FALSE(isValidUtf8("abcdefghij\xE2\x82"));
    EXPECT_FALSE(isValidUtf8("\xE2\x82z"));
    EXPECT_FALSE(isValidUtf8("\x80"));
}

TEST(Utf8Test, ABadByteIsOneStep) {
    const Utf8Step step = utf8Step("\xE2z");
    EXPECT_FALSE(step.valid);
    EXPECT_EQ(step.bytes, 1U);
}

TEST(Utf8Test, CountsTheAsciiAtTheStart) {
    EXPECT_EQ(asciiPrefix(""), 0U);
    EXPECT_EQ(asciiPrefix("0123456789"), 10U);
    EXPECT_EQ(asciiPrefix("0123456789\u00e9"), 10U);
    EXPECT_EQ(asciiPrefix("\u00e90123456789"), 0U);
}

TEST(Utf8Test, WritesWhatItReads) {
    for (const char32_t codePoint :
         {U'a', U'\x7F', U'\x80', U'\u07FF', U'\u0800', U'\uFFFD', U'\U00010000', U'\U0010FFFF'}) {
        std::string text;
        appendUtf8(text, codePoint);
        EXPECT_EQ(utf8Step(text).codePoint, codePoint);
        EXPECT_EQ(utf8Step(text).bytes, text.size());
    }
}

} // namespace

} // namespace vela
