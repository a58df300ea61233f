#include "common/values/Dictionary.h"
#include "common/values/TextualForm.h"
#include "platform/plist/XmlReader.h"

#include <cmath>
#include <gtest/gtest.h>
#include <limits>
#include <string>

namespace vela::platform::plist {

namespace {

using namespace std::string_literals;

Value read(const std::string& text, const PropertyListLimits& limits = {}) {
    auto result = readXml(text, limits);
    if (!result) {
        ADD_FAILURE() << text << ": " << result.failure().description;
        return {};
    }
    return *std::move(result);
}

/// The failure's text, or "" when the input is taken.
std::string errorOf(const std::string& text, const PropertyListLimits& limits = {}) {
    const auto result = readXml(text, limits);
    return result ? "" : result.failure().description;
}

/// `element` as the value of a property list; its first column is 8.
std::string plist(const std::string& element) { return "<plist>" + element + "</plist>"; }

std::string repeated(const std::string& text, std::size_t times) {
    std::string all;
    for (std::size_t index = 0; index < times; ++index) {
        all += text;
    }
    return all;
}

// Kinds

TEST(XmlReaderTest, EveryKindIsRead) {
    EXPECT_EQ(
        read("<?xml version=\"1.0\" encoding=\"UTF-8\"?>\n"
             "<!DOCTYPE plist PUBLIC \"-//EXAMPLE//DTD PLIST 1.0//EN\" \"http://example.org/PropertyList-1.0.dtd\">\n"
             "<plist version=\"1.0\">\n<dict>\n"
             "\t<key>yes</key>\n\t<true/>\n\t<key>no</key>\n\t<false/>\n"
             "\t<key>integer</key>\n\t<integer>-7</integer>\n\t<key>real</key>\n\t<real>0.1</real>\n"
             "\t<key>string</key>\n\t<string>two words</string>\n\t<key>data</key>\n\t<data>\n\tD713cQ==\n\t</data>\n"
             "\t<key>date</key>\n\t<date>2026-11-21T02:43:25Z</date>\n"
             "\t<key>array</key>\n\t<array>\n\t\t<dict/>\n\t</array>\n"
             "</dict>\n</plist>\n"),
        Value(Dictionary{{"yes", true},
                         {"no", false},
                         {"integer", -7},
                         {"real", 0.1},
                         {"string", "two words"},
                         {"data", Data("\x0F\xBD\x77\x71")},
                         {"date", Date{1795229005}},
                         {"array", Array{Dictionary{}}}}));
}

TEST(XmlReaderTest, TheOrderOfKeysIsKept) {
    EXPECT_EQ(textualForm(read(plist("<dict><key>z</key><true/><key>a</key><true/><key>m</key><true/></dict>"))),
              "{z = 1; a = 1; m = 1;}");
}

TEST(XmlReaderTest, EmptyElementsAreEmptyValues) {
    EXPECT_EQ(read(plist("<dict/>")), Value(Dictionary{}));
    EXPECT_EQ(read(plist("<dict></dict>")), Value(Dictionary{}));
    EXPECT_EQ(read(plist("<array/>")), Value(Array{}));
    EXPECT_EQ(read(plist("<array> </array>")), Value(Array{}));
    EXPECT_EQ(read(plist("<string/>")), Value(""));
    EXPECT_EQ(read(plist("<string></string>")), Value(""));
    EXPECT_EQ(read(plist("<data/>")), Value(Data("")));
    EXPECT_EQ(read(plist("<true></true>")), Value(true));
    EXPECT_EQ(read(plist("<false />")), Value(false));
}

TEST(XmlReaderTest, AnEmptyKeyIsAKey) {
    EXPECT_EQ(read(plist("<dict><key/><true/></dict>")), Value(Dictionary{{"", true}}));
    EXPECT_EQ(read(plist("<dict><key></key><true/></dict>")), Value(Dictionary{{"", true}}));
}

TEST(XmlReaderTest, WhiteSpaceBelongsToStringsAndKeys) {
    EXPECT_EQ(read(plist("<dict><key> a </key><string> b\n</string></dict>")), Value(Dictionary{{" a ", " b\n"}}));
}

TEST(XmlReaderTest, AnIntegerAboveTheSignedRangeIsUnsigned) {
    EXPECT_EQ(read(plist("<integer>18446744073709551615</integer>")), Value(std::numeric_limits<std::uint64_t>::max()));
    EXPECT_EQ(read(plist("<integer>-1</integer>")), Value(-1));
}

TEST(XmlReaderTest, MalformedLeavesAreRefused) {
    EXPECT_EQ(errorOf(plist("<integer>12abc</integer>")),
              "property list: line 1, column 8: this is no integer of 64 bits");
    EXPECT_EQ(errorOf(plist("<integer/>")), "property list: line 1, column 8: this is no integer of 64 bits");
    EXPECT_EQ(errorOf(plist("<integer>18446744073709551616</integer>")),
              "property list: line 1, column 8: this is no integer of 64 bits");
    EXPECT_EQ(errorOf(plist("<real>1e999</real>")),
              "property list: line 1, column 8: this is no real number within range");
    EXPECT_EQ(errorOf(plist("<date>2023-02-29T00:00:00Z</date>")),
              "property list: line 1, column 8: this is no date of the form 2026-11-21T02:43:25Z");
    EXPECT_EQ(errorOf(plist("<data>AAA</data>")), "property list: line 1, column 8: this is no base64");
}

TEST(XmlReaderTest, ATruthValueHoldsNothing) {
    EXPECT_EQ(errorOf(plist("<true>1</true>")), "property list: line 1, column 14: a tag is expected here");
    EXPECT_EQ(errorOf(plist("<true><true/></true>")), "property list: line 1, column 14: a truth value holds nothing");
    EXPECT_EQ(errorOf(plist("<true></false>")), "property list: line 1, column 14: a truth value holds nothing");
}

TEST(XmlReaderTest, ALeafHoldsOnlyText) {
    EXPECT_EQ(errorOf(plist("<string>a<b/></string>")), "property list: line 1, column 17: only text may stand here");
}

TEST(XmlReaderTest, UnknownElementsAreRefused) {
    EXPECT_EQ(errorOf(plist("<null/>")), "property list: line 1, column 8: this element is unknown in property lists");
    EXPECT_EQ(errorOf(plist("<Dict/>")), "property list: line 1, column 8: this element is unknown in property lists");
    EXPECT_EQ(errorOf(plist("<plist><true/></plist>")),
              "property list: line 1, column 8: this element is unknown in property lists");
}

// Dictionaries

TEST(XmlReaderTest, KeysAndValuesTakeTurns) {
    EXPECT_EQ(errorOf(plist("<dict><true/></dict>")),
              "property list: line 1, column 14: <key> or </dict> is expected here");
    EXPECT_EQ(errorOf(plist("<dict><key>a</key></dict>")),
              "property list: line 1, column 26: the last key has no value");
    EXPECT_EQ(errorOf(plist("<dict><key>a</key><key>b</key></dict>")),
              "property list: line 1, column 26: <key> stands in dictionaries only, before its value");
    EXPECT_EQ(errorOf(plist("<dict><key>a</key><true/><true/></dict>")),
              "property list: line 1, column 33: <key> or </dict> is expected here");
}

TEST(XmlReaderTest, AKeyOutsideADictionaryIsRefused) {
    EXPECT_EQ(errorOf(plist("<key>a</key>")),
              "property list: line 1, column 8: <key> stands in dictionaries only, before its value");
}

TEST(XmlReaderTest, ARepeatedKeyIsRefused) {
    EXPECT_EQ(errorOf("<plist>\n<dict>\n<key>a</key><true/>\n<key>&#97;</key><true/></dict></plist>"),
              "property list: line 4, column 1: this key stands there already");
}

// Nesting

TEST(XmlReaderTest, ElementsAreClosedInTheirOrder) {
    EXPECT_EQ(errorOf(plist("<array><dict></array></dict>")),
              "property list: line 1, column 21: <key> or </dict> is expected here");
    EXPECT_EQ(errorOf(plist("<array></dict>")), "property list: line 1, column 15: a value is expected here");
    EXPECT_EQ(errorOf(plist("<string>a</key>")), "property list: line 1, column 17: <string> must be closed first");
}

TEST(XmlReaderTest, ATruncatedTextIsRefused) {
    EXPECT_EQ(errorOf("<plist>"), "property list: line 1, column 8: the text ends where a tag is expected");
    EXPECT_EQ(errorOf("<plist><string>a"), "property list: line 1, column 8: <string> has no end");
    EXPECT_EQ(errorOf("<plist><array><true/>"),
              "property list: line 1, column 22: the text ends where a tag is expected");
    EXPECT_EQ(errorOf("<plist><true/></plist"), "property list: line 1, column 15: the tag <plist> is malformed");
    EXPECT_EQ(errorOf("<plist><true"), "property list: line 1, column 8: the tag <true> is malformed");
}

TEST(XmlReaderTest, APropertyListIsExactlyOneValue) {
    EXPECT_EQ(errorOf("<plist></plist>"), "property list: line 1, column 8: there is no value");
    EXPECT_EQ(errorOf("<plist/>"), "property list: line 1, column 1: there is no value");
    EXPECT_EQ(errorOf(plist("<true/><true/>")),
              "property list: line 1, column 15: </plist> is expected here, a property list is one value");
}

TEST(XmlReaderTest, TheRootIsPlist) {
    EXPECT_EQ(errorOf("<?xml version=\"1.0\"?><dict/>"), "property list: line 1, column 22: the root is not <plist>");
    EXPECT_EQ(errorOf("</plist>"), "property list: line 1, column 1: the root is not <plist>");
    EXPECT_EQ(errorOf("<!-- a -->"), "property list: line 1, column 11: the text ends where a tag is expected");
}

TEST(XmlReaderTest, NothingButSpaceAndCommentsMayFollowTheRoot) {
    EXPECT_EQ(read(plist("<true/>") + "\n<!-- end -->\n"), Value(true));
    EXPECT_EQ(errorOf(plist("<true/>") + "x"), "property list: line 1, column 23: there is something after </plist>");
    EXPECT_EQ(errorOf(plist("<true/>") + plist("<true/>")),
              "property list: line 1, column 23: there is something after </plist>");
    EXPECT_EQ(errorOf(plist("<true/>") + "\0"s),
              "property list: line 1, column 23: this is not UTF-8 or a character that XML forbids");
}

TEST(XmlReaderTest, TextBetweenElementsIsRefused) {
    EXPECT_EQ(errorOf(plist("<array>x</array>")), "property list: line 1, column 15: a tag is expected here");
    EXPECT_EQ(errorOf(plist("<array>&#32;</array>")), "property list: line 1, column 15: a tag is expected here");
}

// Tags and attributes

TEST(XmlReaderTest, SpaceMayStandBehindATagsName) {
    EXPECT_EQ(read("<plist >\n<dict ><key >a</key ><string\n>b</string ></dict >\n</plist >"),
              Value(Dictionary{{"a", "b"}}));
}

TEST(XmlReaderTest, ThePlistMaySayItsVersion) {
    EXPECT_EQ(read("<plist version = '1.0' ><true/></plist>"), Value(true));
    EXPECT_EQ(errorOf("<plist version=\"2.0\"><true/></plist>"),
              "property list: line 1, column 7: the version is not 1.0");
}

TEST(XmlReaderTest, OtherAttributesAreRefused) {
    EXPECT_EQ(errorOf("<plist xmlns=\"a\"><true/></plist>"),
              "property list: line 1, column 7: <plist> does not take this attribute");
    EXPECT_EQ(errorOf(plist("<string version=\"1.0\">a</string>")),
              "property list: line 1, column 15: <string> does not take this attribute");
    EXPECT_EQ(errorOf("<plist version=\"1.0\" version=\"1.0\"><true/></plist>"),
              "property list: line 1, column 1: the tag <plist> is malformed");
    EXPECT_EQ(errorOf("<plist version=1.0><true/></plist>"),
              "property list: line 1, column 7: <plist> does not take this attribute");
}

TEST(XmlReaderTest, AVeryLongNameIsShortenedInTheError) {
    EXPECT_EQ(errorOf(plist("<" + std::string(100, 'x') + "!")),
              "property list: line 1, column 8: the tag <" + std::string(40, 'x') + "> is malformed");
}

TEST(XmlReaderTest, MalformedTagsAreRefused) {
    EXPECT_EQ(errorOf(plist("< true/>")), "property list: line 1, column 8: this is no tag of a property list");
    EXPECT_EQ(errorOf(plist("<true//>")), "property list: line 1, column 8: the tag <true> is malformed");
    EXPECT_EQ(errorOf(plist("<array></array/>")), "property list: line 1, column 15: the tag <array> is malformed");
}

// Text

TEST(XmlReaderTest, ReferencesAreTheirCharacters) {
    EXPECT_EQ(read(plist("<string>&lt;&gt;&amp;&quot;&apos;&#233;&#x1F600;&#xe9;&#9;&#13;</string>")),
              Value("<>&\"'\xC3\xA9\xF0\x9F\x98\x80\xC3\xA9\t\r"));
}

TEST(XmlReaderTest, AReferenceIsReadOnce) { EXPECT_EQ(read(plist("<string>&amp;lt;</string>")), Value("&lt;")); }

TEST(XmlReaderTest, ReferencesToNoCharacterAreRefused) {
    for (const char* const reference :
         {"&nbsp;", "&LT;", "&;", "&#;", "&#x;", "&#0;", "&#1;", "&#xD800;", "&#xFFFE;", "&#xFFFF;", "&#x110000;",
          "&#99999999999;", "&#-5;", "&#+5;", "&# 5;", "&#X41;"}) {
        EXPECT_EQ(errorOf(plist("<string>"s + reference + "</string>")),
                  "property list: line 1, column 16: this reference names no character")
            << reference;
    }
}

TEST(XmlReaderTest, AReferenceWithoutItsEndIsRefused) {
    EXPECT_EQ(errorOf(plist("<string>a & b</string>")),
              "property list: line 1, column 18: \"&\" begins a reference, and this one has no end");
}

TEST(XmlReaderTest, CdataIsTextAsItStands) {
    EXPECT_EQ(read(plist("<string>a<![CDATA[<b>&amp;]]]>c<![CDATA[]]></string>")), Value("a<b>&amp;]c"));
    EXPECT_EQ(read(plist("<integer><![CDATA[42]]></integer>")), Value(42));
}

TEST(XmlReaderTest, CdataWithoutItsEndIsRefused) {
    EXPECT_EQ(errorOf(plist("<string><![CDATA[a</string>")),
              "property list: line 1, column 16: this CDATA section has no end");
}

TEST(XmlReaderTest, CdataBetweenElementsIsRefused) {
    EXPECT_EQ(errorOf(plist("<array><![CDATA[]]></array>")),
              "property list: line 1, column 15: this is no tag of a property list");
}

TEST(XmlReaderTest, TheEndOfCdataIsRefusedInText) {
    EXPECT_EQ(errorOf(plist("<string>a]]>b</string>")),
              "property list: line 1, column 17: \"]]>\" must not stand in text");
}

TEST(XmlReaderTest, LineEndsAreLineFeeds) {
    EXPECT_EQ(read(plist("<string>a\r\nb\rc\nd\r\re<![CDATA[\r\n]]></string>")), Value("a\nb\nc\nd\n\ne\n"));
}

TEST(XmlReaderTest, CommentsAreLeftOut) {
    EXPECT_EQ(read("<!-- a --><plist><!-- - --><array><!----><string>x<!-- <y> & -->z</string></array></plist>"),
              Value(Array{"xz"}));
}

TEST(XmlReaderTest, MalformedCommentsAreRefused) {
    EXPECT_EQ(errorOf(plist("<!-- a -- b --><true/>")),
              "property list: line 1, column 15: \"--\" must not stand inside a comment");
    EXPECT_EQ(errorOf("<plist><!-- <true/></plist>"), "property list: line 1, column 8: this comment has no end");
}

TEST(XmlReaderTest, ForbiddenCharactersAreRefusedWhereverTheyStand) {
    const std::string reason = "this is not UTF-8 or a character that XML forbids";
    EXPECT_EQ(errorOf(plist("<string>\x01</string>")), "property list: line 1, column 16: " + reason);
    EXPECT_EQ(errorOf(plist("<string>a\0</string>"s)), "property list: line 1, column 17: " + reason);
    EXPECT_EQ(errorOf(plist("<string>\xC3(</string>")), "property list: line 1, column 16: " + reason);
    EXPECT_EQ(errorOf(plist("<string>\xEF\xBF\xBF</string>")), "property list: line 1, column 16: " + reason);
    EXPECT_EQ(errorOf(plist("<string>\xED\xA0\x80</string>")), "property list: line 1, column 16: " + reason);
    EXPECT_EQ(errorOf(plist("<!-- \x0B -->")), "property list: line 1, column 13: " + reason);
}

// Prolog

TEST(XmlReaderTest, TheDeclarationMayBeAbsent) { EXPECT_EQ(read(plist("<true/>")), Value(true)); }

TEST(XmlReaderTest, AByteOrderMarkIsSkipped) {
    EXPECT_EQ(read("\xEF\xBB\xBF<?xml version='1.0' encoding='utf-8' standalone='yes' ?>" + plist("<true/>")),
              Value(true));
}

TEST(XmlReaderTest, OtherEncodingsAreRefused) {
    EXPECT_EQ(errorOf("<?xml version=\"1.0\" encoding=\"ISO-8859-1\"?>" + plist("<true/>")),
              "property list: line 1, column 42: the encoding is not UTF-8");
    EXPECT_EQ(errorOf("<?xml version=\"1.0\" encoding=\"UTF-16\"?>" + plist("<true/>")),
              "property list: line 1, column 38: the encoding is not UTF-8");
}

TEST(XmlReaderTest, AMalformedDeclarationIsRefused) {
    EXPECT_EQ(errorOf("<?xml?>" + plist("<true/>")),
              "property list: line 1, column 6: the XML declaration must say version=\"1.0\" first");
    EXPECT_EQ(errorOf("<?xml version=\"1.1\"?>" + plist("<true/>")),
              "property list: line 1, column 20: the XML declaration must say version=\"1.0\" first");
    EXPECT_EQ(errorOf("<?xml version=\"1.0\" x=\"1\"?>" + plist("<true/>")),
              "property list: line 1, column 21: the XML declaration is malformed");
    EXPECT_EQ(errorOf("<?xml version=\"1.0\" standalone=\"maybe\"?>" + plist("<true/>")),
              "property list: line 1, column 39: standalone is \"yes\" or \"no\"");
}

TEST(XmlReaderTest, ADeclarationBehindSpaceIsRefused) {
    EXPECT_EQ(errorOf(" <?xml version=\"1.0\"?>" + plist("<true/>")),
              "property list: line 1, column 2: processing instructions are not taken");
}

TEST(XmlReaderTest, ProcessingInstructionsAreRefused) {
    EXPECT_EQ(errorOf(plist("<?run it?><true/>")),
              "property list: line 1, column 8: processing instructions are not taken");
}

TEST(XmlReaderTest, TheDocumentTypeMayBeShort) {
    EXPECT_EQ(read("<!DOCTYPE plist>" + plist("<true/>")), Value(true));
    EXPECT_EQ(read("<!DOCTYPE plist SYSTEM 'file://localhost/plist.dtd' >" + plist("<true/>")), Value(true));
}

TEST(XmlReaderTest, ADocumentTypeWithDeclarationsIsRefused) {
    EXPECT_EQ(errorOf("<!DOCTYPE plist [<!ENTITY a \"b\">]>" + plist("<string>&a;</string>")),
              "property list: line 1, column 17: a document type with declarations of its own is not taken");
    EXPECT_EQ(
        errorOf("<!DOCTYPE plist SYSTEM \"a\" [<!ENTITY a SYSTEM \"file:///a\">]>" + plist("<string>&a;</string>")),
        "property list: line 1, column 28: a document type with declarations of its own is not taken");
}

TEST(XmlReaderTest, AMalformedDocumentTypeIsRefused) {
    EXPECT_EQ(errorOf("<!DOCTYPE html>" + plist("<true/>")),
              "property list: line 1, column 15: the document type is not plist");
    EXPECT_EQ(errorOf("<!DOCTYPE plist PUBLIC \"a\">" + plist("<true/>")),
              "property list: line 1, column 27: the document type is malformed");
    EXPECT_EQ(errorOf("<!DOCTYPE plist PUBLIC \"{a}\" \"b\">" + plist("<true/>")),
              "property list: line 1, column 29: the document type is malformed");
    EXPECT_EQ(errorOf("<!DOCTYPE plist x>" + plist("<true/>")),
              "property list: line 1, column 17: the document type is malformed");
    EXPECT_EQ(errorOf("<!DOCTYPE plist><!DOCTYPE plist>" + plist("<true/>")),
              "property list: line 1, column 17: this is no tag of a property list");
}

// Limits

TEST(XmlReaderTest, TheLimitOfBytesIsExact) {
    EXPECT_EQ(read(plist("<true/>"), {.bytes = 22}), Value(true));
    EXPECT_EQ(errorOf(plist("<true/>"), {.bytes = 21}),
              "property list: line 1, column 1: the input has 22 bytes, the limit \"bytes\" is 21");
}

TEST(XmlReaderTest, TheLimitOfDepthIsExact) {
    EXPECT_EQ(read(plist("<array><dict/></array>"), {.depth = 2}), Value(Array{Dictionary{}}));
    EXPECT_EQ(errorOf(plist("<array><dict/></array>"), {.depth = 1}),
              "property list: line 1, column 15: the containers stand too deep, the limit \"depth\" is 1");
}

TEST(XmlReaderTest, VeryManyOpenArraysAreRefused) {
    EXPECT_EQ(errorOf("<plist>" + repeated("<array>", 30000)),
              "property list: line 1, column 904: the containers stand too deep, the limit \"depth\" is 128");
}

TEST(XmlReaderTest, TheLimitOfValuesIsExact) {
    EXPECT_EQ(read(plist("<dict><key>a</key><true/></dict>"), {.values = 2}), Value(Dictionary{{"a", true}}));
    EXPECT_EQ(errorOf(plist("<array><true/><true/></array>"), {.values = 2}),
              "property list: line 1, column 22: there are too many values, the limit \"values\" is 2");
}

} // namespace

} // namespace vela::platform::plist
