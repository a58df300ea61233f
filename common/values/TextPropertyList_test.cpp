#include "common/values/TextPropertyList.h"
#include "common/values/TextualForm.h"

#include <gtest/gtest.h>
#include <string>

namespace vela {

namespace {

using namespace std::string_view_literals;

Value read(std::string_view text, const TextPropertyListLimits& limits = {}) {
    const auto result = readTextPropertyList(text, limits);
    if (const auto* const error = std::get_if<TextPropertyListError>(&result)) {
        ADD_FAILURE() << text << ": " << error->line << ":" << error->column << ": " << error->reason;
        return {};
    }
    return std::get<Value>(result);
}

/// "line:column: reason", or "" when the text is taken.
std::string errorOf(std::string_view text, const TextPropertyListLimits& limits = {}) {
    const auto result = readTextPropertyList(text, limits);
    const auto* const error = std::get_if<TextPropertyListError>(&result);
    return error == nullptr ? ""
                            : std::to_string(error->line) + ":" + std::to_string(error->column) + ": " + error->reason;
}

Value data(std::string_view bytes) { return Data(bytes); }

std::string nested(std::size_t depth) { return std::string(depth, '(') + std::string(depth, ')'); }

// Strings

TEST(TextPropertyListTest, ABareWordIsAString) { EXPECT_EQ(read("GenericStart"), Value("GenericStart")); }

TEST(TextPropertyListTest, AQuotedStringIsAString) {
    EXPECT_EQ(read("\"two words\""), Value("two words"));
    EXPECT_EQ(read("'two words'"), Value("two words"));
    EXPECT_EQ(read("\"\""), Value(""));
}

TEST(TextPropertyListTest, TheOtherQuotationMarkIsOrdinaryInAQuotedString) {
    EXPECT_EQ(read("\"it's\""), Value("it's"));
    EXPECT_EQ(read("'a \"b\"'"), Value("a \"b\""));
}

TEST(TextPropertyListTest, AQuotedStringMayHoldLineEnds) { EXPECT_EQ(read("\"a\nb\""), Value("a\nb")); }

TEST(TextPropertyListTest, AQuotedStringMayHoldNul) { EXPECT_EQ(read("\"a\0b\""sv), Value("a\0b"sv)); }

TEST(TextPropertyListTest, EveryUnquotedCharacterIsTaken) {
    EXPECT_EQ(read("ABZabz019_$/:.-"), Value("ABZabz019_$/:.-"));
}

TEST(TextPropertyListTest, OtherCharactersDoNotStandUnquoted) {
    for (const char* const text : {"@", "+", "%", "*", "!", "\\", "#", "\xC3\xA9"}) {
        EXPECT_EQ(errorOf(text), "1:1: a value is expected here") << text;
    }
}

TEST(TextPropertyListTest, APathIsAString) { EXPECT_EQ(read("/tmp/traces.plist"), Value("/tmp/traces.plist")); }

TEST(TextPropertyListTest, TwoSlashesInsideAWordDoNotBeginAComment) {
    EXPECT_EQ(read("http://host/a"), Value("http://host/a"));
}

TEST(TextPropertyListTest, TwoSlashesAtTheStartOfAWordBeginAComment) {
    EXPECT_EQ(errorOf("//tmp"), "1:6: there is no value");
    EXPECT_EQ(read("( a, //b\n c )"), Value(Array{"a", "c"}));
}

TEST(TextPropertyListTest, SlashAndStarAtTheStartOfAWordBeginAComment) {
    EXPECT_EQ(read("( a, /*b*/ c )"), Value(Array{"a", "c"}));
}

TEST(TextPropertyListTest, Utf8StandsInQuotedStrings) {
    EXPECT_EQ(read("\"gr\xC3\xB6\xC3\x9F"
                   "e \xF0\x9F\x98\x80\""),
              Value("gr\xC3\xB6\xC3\x9F"
                    "e \xF0\x9F\x98\x80"));
}

TEST(TextPropertyListTest, AStringWithoutItsEndIsRefused) {
    EXPECT_EQ(errorOf("( a,\n \"b )"), "2:2: this string has no end");
    EXPECT_EQ(errorOf("'"), "1:1: this string has no end");
}

// Escapes

TEST(TextPropertyListTest, SimpleEscapesAreTheirCharacters) {
    EXPECT_EQ(read(R"("\a\b\f\n\r\t\v\\\"\'")"), Value("\a\b\f\n\r\t\v\\\"'"));
}

TEST(TextPropertyListTest, AnEscapedLineEndIsALineEnd) { EXPECT_EQ(read("\"a\\\nb\""), Value("a\nb")); }

TEST(TextPropertyListTest, AnUnknownEscapeIsRefused) {
    EXPECT_EQ(errorOf(R"("a\x41")"), "1:3: unknown escape");
    EXPECT_EQ(errorOf(R"("\8")"), "1:2: unknown escape");
    EXPECT_EQ(errorOf(R"("\u0041")"), "1:2: unknown escape");
}

TEST(TextPropertyListTest, AnEscapeAtTheEndOfTheTextIsRefused) {
    EXPECT_EQ(errorOf("\"a\\"), "1:3: this escape has no end");
}

TEST(TextPropertyListTest, OctalEscapesHaveOneToThreeDigits) {
    EXPECT_EQ(read(R"("\7\12\101")"), Value("\a\nA"));
    EXPECT_EQ(read(R"("\1011")"), Value("A1"));
    EXPECT_EQ(read(R"("\78")"), Value("\a"
                                      "8"));
    EXPECT_EQ(read(R"("\0")"), Value("\0"sv));
}

TEST(TextPropertyListTest, OctalEscapesFrom200NameNextStepCharacters) {
    EXPECT_EQ(read(R"("\200")"), Value("\xC2\xA0"));     // no-break space
    EXPECT_EQ(read(R"("\201")"), Value("\xC3\x80"));     // A with grave
    EXPECT_EQ(read(R"("\244")"), Value("\xE2\x81\x84")); // fraction slash
    EXPECT_EQ(read(R"("\256")"), Value("\xEF\xAC\x81")); // ligature fi
    EXPECT_EQ(read(R"("\275")"), Value("\xE2\x80\xB0")); // per mille
    EXPECT_EQ(read(R"("\320")"), Value("\xE2\x80\x94")); // em dash
    EXPECT_EQ(read(R"("\335")"), Value("\xC3\xA9"));     // e with acute
    EXPECT_EQ(read(R"("\375")"), Value("\xC3\xBF"));     // y with diaeresis
}

TEST(TextPropertyListTest, OctalEscapesWithoutACharacterAreRefused) {
    EXPECT_EQ(errorOf(R"("\376")"), "1:2: this octal escape names no character");
    EXPECT_EQ(errorOf(R"("\377")"), "1:2: this octal escape names no character");
    EXPECT_EQ(errorOf(R"("ab\400")"), "1:4: an octal escape is at most \\377");
}

TEST(TextPropertyListTest, UnicodeEscapesHaveOneToFourDigits) {
    EXPECT_EQ(read(R"("\U41")"), Value("A"));
    EXPECT_EQ(read(R"("\Ue9x")"), Value("\xC3\xA9x"));
    EXPECT_EQ(read(R"("\U20aC1")"), Value("\xE2\x82\xAC"
                                          "1"));
}

TEST(TextPropertyListTest, AUnicodeEscapeWithoutDigitsIsRefused) {
    EXPECT_EQ(errorOf(R"("\Ux")"), "1:4: one to four hexadecimal digits after \\U is expected here");
}

TEST(TextPropertyListTest, SurrogatePairsAreJoined) { EXPECT_EQ(read(R"("\Ud83d\UDE00")"), Value("\xF0\x9F\x98\x80")); }

TEST(TextPropertyListTest, LoneSurrogatesAreRefused) {
    EXPECT_EQ(errorOf(R"("\Ud83d")"), "1:2: this surrogate stands alone");
    EXPECT_EQ(errorOf(R"("\Ude00")"), "1:2: this surrogate stands alone");
    EXPECT_EQ(errorOf(R"("\Ud83d\U41")"), "1:2: this surrogate stands alone");
    EXPECT_EQ(errorOf(R"("\Ud83d\n")"), "1:2: this surrogate stands alone");
    EXPECT_EQ(errorOf(R"("\Ud83d\Ud83d")"), "1:2: this surrogate stands alone");
}

// Data

TEST(TextPropertyListTest, DataIsPairsOfHexadecimalDigits) {
    EXPECT_EQ(read("<0fbd77 71>"), data("\x0F\xBD\x77\x71"));
    EXPECT_EQ(read("<0FBD>"), data("\x0F\xBD"));
    EXPECT_EQ(read("<>"), data(""));
    EXPECT_EQ(read("< 00\n\t01 >"), data("\0\1"sv));
}

TEST(TextPropertyListTest, AnOddDigitIsRefused) {
    EXPECT_EQ(errorOf("<0fb>"), "1:5: the byte's second hexadecimal digit is expected here");
    EXPECT_EQ(errorOf("<0 f>"), "1:3: the byte's second hexadecimal digit is expected here");
    EXPECT_EQ(errorOf("<0"), "1:3: the text ends where the byte's second hexadecimal digit is expected");
}

TEST(TextPropertyListTest, OtherCharactersInDataAreRefused) {
    EXPECT_EQ(errorOf("<0g>"), "1:3: the byte's second hexadecimal digit is expected here");
    EXPECT_EQ(errorOf("<*I5>"), "1:2: two hexadecimal digits or \">\" is expected here");
}

TEST(TextPropertyListTest, DataWithoutItsEndIsRefused) {
    EXPECT_EQ(errorOf("<00"), "1:4: the text ends where two hexadecimal digits or \">\" is expected");
}

// Arrays

TEST(TextPropertyListTest, AnArrayHasCommasBetweenItsValues) {
    EXPECT_EQ(read("(a, \"b c\", <00>, (), {})"), Value(Array{"a", "b c", data("\0"sv), Array{}, Dictionary{}}));
}

TEST(TextPropertyListTest, AnEmptyArrayHasNoValues) { EXPECT_EQ(read("( )"), Value(Array{})); }

TEST(TextPropertyListTest, OneCommaMayFollowTheLastValue) { EXPECT_EQ(read("(a, b,)"), Value(Array{"a", "b"})); }

TEST(TextPropertyListTest, ACommaWithoutAValueIsRefused) {
    EXPECT_EQ(errorOf("(,)"), "1:2: a value is expected here");
    EXPECT_EQ(errorOf("(a,,b)"), "1:4: a value is expected here");
}

TEST(TextPropertyListTest, ValuesWithoutACommaAreRefused) {
    EXPECT_EQ(errorOf("(a b)"), "1:4: \",\" or \")\" is expected here");
}

TEST(TextPropertyListTest, AnArrayWithoutItsEndIsRefused) {
    EXPECT_EQ(errorOf("(a"), "1:3: the text ends where \",\" or \")\" is expected");
    EXPECT_EQ(errorOf("(a,"), "1:4: the text ends where a value is expected");
}

TEST(TextPropertyListTest, NullReadsAsAnArrayOfOneString) { EXPECT_EQ(read("(null)"), Value(Array{"null"})); }

// Dictionaries

TEST(TextPropertyListTest, ADictionaryHasEntries) {
    EXPECT_EQ(read("{ a = b; \"c d\" = ( e ); 'f' = { g = h; }; }"),
              Value(Dictionary{{"a", "b"}, {"c d", Array{"e"}}, {"f", Dictionary{{"g", "h"}}}}));
}

TEST(TextPropertyListTest, AnEmptyDictionaryHasNoEntries) { EXPECT_EQ(read("{}"), Value(Dictionary{})); }

TEST(TextPropertyListTest, TheOrderOfKeysIsKept) {
    EXPECT_EQ(textualForm(read("{z = 1; a = 2; m = 3;}")), "{z = 1; a = 2; m = 3;}");
}

TEST(TextPropertyListTest, AKeyByItselfIsItsOwnValue) {
    EXPECT_EQ(read("{ a; \"b c\"; }"), Value(Dictionary{{"a", "a"}, {"b c", "b c"}}));
}

TEST(TextPropertyListTest, AnEmptyKeyIsAKey) { EXPECT_EQ(read("{ \"\" = a; }"), Value(Dictionary{{"", "a"}})); }

TEST(TextPropertyListTest, EveryEntryNeedsItsSemicolon) {
    EXPECT_EQ(errorOf("{ a = b }"), "1:9: \";\" is expected here");
    EXPECT_EQ(errorOf("{ a }"), "1:5: \"=\" or \";\" is expected here");
    EXPECT_EQ(errorOf("{ a = b"), "1:8: the text ends where \";\" is expected");
}

TEST(TextPropertyListTest, AnEntryWithoutAValueIsRefused) {
    EXPECT_EQ(errorOf("{ a = ; }"), "1:7: a value is expected here");
}

TEST(TextPropertyListTest, OnlyAStringIsAKey) {
    EXPECT_EQ(errorOf("{ <00> = a; }"), "1:3: a key or \"}\" is expected here");
    EXPECT_EQ(errorOf("{ (a) = a; }"), "1:3: a key or \"}\" is expected here");
    EXPECT_EQ(errorOf("{ ; }"), "1:3: a key or \"}\" is expected here");
}

TEST(TextPropertyListTest, ARepeatedKeyIsRefused) {
    EXPECT_EQ(errorOf("{ a = 1;\n \"a\" = 2; }"), "2:2: this key stands there already");
    EXPECT_EQ(errorOf("{ a; a; }"), "1:6: this key stands there already");
    EXPECT_EQ(errorOf("a = 1; a = 2;"), "1:8: this key stands there already");
}

TEST(TextPropertyListTest, TheSameKeyMayStandInTwoDictionaries) {
    EXPECT_EQ(read("{ a = { a = 1; }; }"), Value(Dictionary{{"a", Dictionary{{"a", "1"}}}}));
}

TEST(TextPropertyListTest, ADictionaryWithoutItsEndIsRefused) {
    EXPECT_EQ(errorOf("{ a = b;"), "1:9: the text ends where a key or \"}\" is expected");
}

// Strings files

TEST(TextPropertyListTest, EntriesWithoutBracesAreADictionary) {
    EXPECT_EQ(read("/* names */\n\"device_name\" = \"Kitchen\";\nshort;\n"),
              Value(Dictionary{{"device_name", "Kitchen"}, {"short", "short"}}));
}

TEST(TextPropertyListTest, AStringsFileMayHoldContainers) {
    EXPECT_EQ(read("a = { b = c; }; d = (e);"), Value(Dictionary{{"a", Dictionary{{"b", "c"}}}, {"d", Array{"e"}}}));
}

TEST(TextPropertyListTest, AStringsFileNeedsEverySemicolon) {
    EXPECT_EQ(errorOf("a = b"), "1:6: the text ends where \";\" is expected");
    EXPECT_EQ(errorOf("a = b; c"), "1:9: the text ends where \"=\" or \";\" is expected");
}

TEST(TextPropertyListTest, AStringsFileHoldsNothingButEntries) {
    EXPECT_EQ(errorOf("a = b; }"), "1:8: a key is expected here");
}

// Space, comments, the whole text

TEST(TextPropertyListTest, WhiteSpaceAndCommentsStandAnywhereBetweenWords) {
    EXPECT_EQ(read("/* a */ { // b\n a /**/ =\v/* ; */\fb /* \" */ ;\r /* // */ }// end"),
              Value(Dictionary{{"a", "b"}}));
}

TEST(TextPropertyListTest, ACommentInAStringIsText) { EXPECT_EQ(read("\"/* a */ // b\""), Value("/* a */ // b")); }

TEST(TextPropertyListTest, ACommentWithoutItsEndIsRefused) {
    EXPECT_EQ(errorOf("{ a = b; } /* c"), "1:12: this comment has no end");
    EXPECT_EQ(errorOf("/*/"), "1:1: this comment has no end");
}

TEST(TextPropertyListTest, ALineCommentEndsWithACarriageReturnToo) { EXPECT_EQ(read("// a\rb"), Value("b")); }

TEST(TextPropertyListTest, AnEmptyTextIsRefused) {
    EXPECT_EQ(errorOf(""), "1:1: there is no value");
    EXPECT_EQ(errorOf(" \n// nothing\n"), "3:1: there is no value");
}

TEST(TextPropertyListTest, NothingMayFollowTheValue) {
    EXPECT_EQ(errorOf("two words"), "1:5: there is something after the value");
    EXPECT_EQ(errorOf("{ a = b; } c"), "1:12: there is something after the value");
    EXPECT_EQ(errorOf("() ()"), "1:4: there is something after the value");
}

TEST(TextPropertyListTest, AByteOrderMarkIsSkipped) {
    EXPECT_EQ(read("\xEF\xBB\xBF{ a = b; }"), Value(Dictionary{{"a", "b"}}));
    EXPECT_EQ(errorOf("\xEF\xBB\xBF@"), "1:1: a value is expected here");
}

TEST(TextPropertyListTest, Utf16IsRefused) {
    EXPECT_EQ(errorOf("\xFF\xFE{\0}\0"sv), "1:1: the text is UTF-16, only UTF-8 is taken");
    EXPECT_EQ(errorOf("\xFE\xFF\0{\0}"sv), "1:1: the text is UTF-16, only UTF-8 is taken");
}

TEST(TextPropertyListTest, InvalidUtf8IsRefusedWhereverItStands) {
    EXPECT_EQ(errorOf("\"a\xC3(\""), "1:3: this is not UTF-8");
    EXPECT_EQ(errorOf("a // \xFF"), "1:6: this is not UTF-8");
    EXPECT_EQ(errorOf("\"\xED\xA0\x80\""), "1:2: this is not UTF-8");
}

TEST(TextPropertyListTest, ColumnsCountCharacters) {
    EXPECT_EQ(errorOf("(\"\xC3\xA9\xF0\x9F\x98\x80\" @)"), "1:7: \",\" or \")\" is expected here");
}

// Limits

TEST(TextPropertyListTest, TheLimitOfBytesIsExact) {
    EXPECT_EQ(read("abcd", {.bytes = 4}), Value("abcd"));
    EXPECT_EQ(errorOf("abcde", {.bytes = 4}), "1:1: the text has 5 bytes, the limit \"bytes\" is 4");
}

TEST(TextPropertyListTest, TheLimitOfDepthIsExact) {
    EXPECT_EQ(read("((a))", {.depth = 2}), Value(Array{Value(Array{"a"})}));
    EXPECT_EQ(errorOf("((()))", {.depth = 2}), "1:3: the containers stand too deep, the limit \"depth\" is 2");
    EXPECT_EQ(errorOf("{a={b={};};}", {.depth = 2}), "1:7: the containers stand too deep, the limit \"depth\" is 2");
    EXPECT_EQ(errorOf("a = ();", {.depth = 1}), "1:5: the containers stand too deep, the limit \"depth\" is 1");
}

TEST(TextPropertyListTest, ContainersSideBySideAreNotDeep) {
    EXPECT_EQ(read("((), (), {})", {.depth = 2}), Value(Array{Array{}, Array{}, Dictionary{}}));
}

TEST(TextPropertyListTest, TheUsualDepthIs128) {
    EXPECT_EQ(errorOf(nested(128)), "");
    EXPECT_EQ(errorOf(nested(129)), "1:129: the containers stand too deep, the limit \"depth\" is 128");
}

TEST(TextPropertyListTest, VeryManyOpenBracketsAreRefused) {
    EXPECT_EQ(errorOf(std::string(200000, '(')), "1:129: the containers stand too deep, the limit \"depth\" is 128");
}

TEST(TextPropertyListTest, TheLimitOfValuesCountsContainersAndLeavesButNotKeys) {
    EXPECT_EQ(read("{a = (b); c;}", {.values = 4}), Value(Dictionary{{"a", Array{"b"}}, {"c", "c"}}));
    EXPECT_EQ(errorOf("{a = (b); c;}", {.values = 3}), "1:12: there are too many values, the limit \"values\" is 3");
    EXPECT_EQ(errorOf("(<00>)", {.values = 1}), "1:6: there are too many values, the limit \"values\" is 1");
}

// Writing and reading again

void expectRoundTrip(const Value& value) { EXPECT_EQ(read(textualForm(value)), value) << textualForm(value); }

TEST(TextPropertyListTest, ContainersOfStringsComeBack) {
    expectRoundTrip(Array{"a", "", "two words", "//x", "/*x*/", "a//b", "-1", "1.5", "(null)", "{", "=;,", "'\"\\"});
    expectRoundTrip(Dictionary{{"", ""}, {"two words", "x"}, {"a", "b"}, {"\xC3\xA9", "\xF0\x9F\x98\x80"}});
}

TEST(TextPropertyListTest, EveryAsciiCharacterComesBack) {
    ArrayBuilder builder;
    for (int character = 0; character < 0x80; ++character) {
        builder.add(Value(std::string_view(std::string(1, static_cast<char>(character)) + "1")));
    }
    expectRoundTrip(builder.build());
}

TEST(TextPropertyListTest, DataComesBack) { expectRoundTrip(Array{data(""), data("\0\xFF"sv), data("abc")}); }

TEST(TextPropertyListTest, NestedContainersComeBack) {
    expectRoundTrip(Dictionary{{"Children", Array{Dictionary{{"Name", "a b"}, {"Children", Array{}}}, Dictionary{}}}});
}

TEST(TextPropertyListTest, NumbersComeBackAsStrings) {
    EXPECT_EQ(read(textualForm(Value(Dictionary{{"a", 4660}, {"b", true}, {"c", -1.5}}))),
              Value(Dictionary{{"a", "4660"}, {"b", "1"}, {"c", "-1.5"}}));
}

} // namespace

} // namespace vela
