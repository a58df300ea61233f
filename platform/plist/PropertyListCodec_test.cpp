#include "common/values/Dictionary.h"
#include "common/values/TextualForm.h"
#include "platform/plist/LibplistComparison.h"
#include "platform/plist/LibplistWriter.h"
#include "platform/plist/PropertyListCodec.h"

#include <clocale>
#include <cmath>
#include <cstdint>
#include <gtest/gtest.h>
#include <limits>
#include <string>

namespace vela::platform {

namespace {

using namespace std::string_literals;

constexpr PropertyListFormat kFormats[] = {PropertyListFormat::Xml, PropertyListFormat::Binary,
                                           PropertyListFormat::Text};

Value read(const std::string& bytes) {
    auto result = PropertyListCodec().read(bytes);
    if (!result) {
        ADD_FAILURE() << bytes << ": " << result.failure().description;
        return {};
    }
    return *std::move(result);
}

std::string readingError(const std::string& bytes) {
    const auto result = PropertyListCodec().read(bytes);
    return result ? "" : result.failure().description;
}

std::string write(const Value& value, PropertyListFormat format) {
    auto result = PropertyListCodec().write(value, format);
    if (!result) {
        ADD_FAILURE() << result.failure().description;
        return {};
    }
    return *std::move(result);
}

std::string writingError(const Value& value, PropertyListFormat format) {
    const auto result = PropertyListCodec().write(value, format);
    return result ? "" : result.failure().description;
}

std::string writingError(const Value& value) {
    return writingError(value, PropertyListFormat::Xml) + "|" + writingError(value, PropertyListFormat::Binary);
}

Value rewritten(const Value& value, PropertyListFormat format) { return read(write(value, format)); }

/// What stands between <plist> and </plist>, without its line ends.
std::string xmlBody(const Value& value) {
    const std::string xml = write(value, PropertyListFormat::Xml);
    const std::string start = "<plist version=\"1.0\">\n";
    const std::size_t from = xml.find(start) + start.size();
    return xml.substr(from, xml.rfind("\n</plist>") - from);
}

Value nested(std::size_t depth) {
    Value value(Array{});
    for (std::size_t level = 1; level < depth; ++level) {
        value = Value(Array{std::move(value)});
    }
    return value;
}

const Value& everyKind() {
    static const Value value(Dictionary{{"yes", true},
                                        {"no", false},
                                        {"integer", -7},
                                        {"unsigned", std::numeric_limits<std::uint64_t>::max()},
                                        {"real", 0.1},
                                        {"real32", 0.1F},
                                        {"string", "two words"},
                                        {"data", Data("\x0F\xBD\0\x71"s)},
                                        {"date", Date{1795229005}},
                                        {"array", Array{1, "a", Array{}}},
                                        {"dictionary", Dictionary{{"z", 1}, {"a", 2}}}});
    return value;
}

// Formats

TEST(PropertyListCodecTest, TheFormatIsToldByTheFirstBytes) {
    const std::string xml = "<plist><string>x</string></plist>";
    EXPECT_EQ(read(xml), Value("x"));
    EXPECT_EQ(read("\n\t " + xml), Value("x"));
    EXPECT_EQ(read("\xEF\xBB\xBF" + xml), Value("x"));
    EXPECT_EQ(read("<?xml version=\"1.0\"?>" + xml), Value("x"));
    EXPECT_EQ(read("<!DOCTYPE plist>" + xml), Value("x"));
    EXPECT_EQ(read("<!-- a -->" + xml), Value("x"));
    EXPECT_EQ(read("bplist00\x51x\x08\0\0\0\0\0\0\1\1\0\0\0\0\0\0\0\1\0\0\0\0\0\0\0\0\0\0\0\0\0\0\0\x0A"s), Value("x"));
    EXPECT_EQ(read("x"), Value("x"));
    EXPECT_EQ(read("bplist"), Value("bplist"));
}

TEST(PropertyListCodecTest, DataInTheTextFormIsNotTakenForXml) {
    EXPECT_EQ(read("<0fbd77 71>"), Value(Data("\x0F\xBD\x77\x71")));
    EXPECT_EQ(read("<>"), Value(Data("")));
    EXPECT_EQ(read(" <de>"), Value(Data("\xDE")));
}

TEST(PropertyListCodecTest, FailuresNameThePlaceAndTheReason) {
    EXPECT_EQ(readingError("{ a = b; }\n}"), "property list: line 2, column 1: there is something after the value");
    EXPECT_EQ(readingError("<plist>\n<dict/>"),
              "property list: line 2, column 8: the text ends where a tag is expected");
    EXPECT_EQ(readingError("bplist00"), "property list: byte 8: the trailer is missing");
    EXPECT_EQ(PropertyListCodec().read("{").failure().code, 0);
}

TEST(PropertyListCodecTest, NothingIsNoPropertyList) {
    EXPECT_EQ(readingError(""), "property list: line 1, column 1: there is no value");
    EXPECT_EQ(readingError("\xEF\xBB\xBF"), "property list: line 1, column 1: there is no value");
}

TEST(PropertyListCodecTest, Utf16IsRefused) {
    EXPECT_EQ(readingError("\xFF\xFE<\0p\0"s),
              "property list: line 1, column 1: the text is UTF-16, only UTF-8 is taken");
}

TEST(PropertyListCodecTest, TheLimitsHoldForEveryFormat) {
    const PropertyListCodec codec;
    for (const PropertyListFormat format : kFormats) {
        const std::string bytes = write(nested(3), format);
        EXPECT_TRUE(codec.read(bytes, {.bytes = bytes.size(), .depth = 3, .values = 3}));
        EXPECT_NE(codec.read(bytes, {.bytes = bytes.size() - 1}).failure().description.find("the limit \"bytes\" is "),
                  std::string::npos);
        EXPECT_NE(codec.read(bytes, {.depth = 2}).failure().description.find("the limit \"depth\" is 2"),
                  std::string::npos);
        EXPECT_NE(codec.read(bytes, {.values = 2}).failure().description.find("the limit \"values\" is 2"),
                  std::string::npos);
    }
}

// Writing and reading again

TEST(PropertyListCodecTest, EveryKindComesBackFromXmlAndBinary) {
    EXPECT_EQ(rewritten(everyKind(), PropertyListFormat::Xml), everyKind());
    EXPECT_EQ(rewritten(everyKind(), PropertyListFormat::Binary), everyKind());
}

TEST(PropertyListCodecTest, TheTextFormKeepsTextAndData) {
    EXPECT_EQ(write(Dictionary{{"a", 1}, {"b", Array{"two words", Data("\x0F")}}}, PropertyListFormat::Text),
              "{a = 1; b = (\"two words\", <0f>);}");
    EXPECT_EQ(rewritten(Dictionary{{"a", 1}, {"b", Array{"x", Data("\x0F")}}}, PropertyListFormat::Text),
              Value(Dictionary{{"a", "1"}, {"b", Array{"x", Data("\x0F")}}}));
}

TEST(PropertyListCodecTest, LeavesByThemselvesComeBack) {
    for (const Value& value : {Value("x"), Value("two words"), Value(""), Value("//"), Value(Data("\x0F"))}) {
        for (const PropertyListFormat format : kFormats) {
            EXPECT_EQ(rewritten(value, format), value) << textualForm(value);
        }
    }
    EXPECT_EQ(rewritten(-1.5, PropertyListFormat::Text), Value("-1.5"));
}

TEST(PropertyListCodecTest, EmptyContainersComeBack) {
    for (const PropertyListFormat format : kFormats) {
        EXPECT_EQ(rewritten(Array{}, format), Value(Array{}));
        EXPECT_EQ(rewritten(Dictionary{}, format), Value(Dictionary{}));
    }
}

TEST(PropertyListCodecTest, TheOrderOfKeysIsKept) {
    const Value value(Dictionary{{"z", "1"}, {"a", "2"}, {"m", "3"}});
    for (const PropertyListFormat format : kFormats) {
        EXPECT_EQ(textualForm(rewritten(value, format)), "{z = 1; a = 2; m = 3;}");
    }
}

TEST(PropertyListCodecTest, TheOrderOfManyKeysIsKept) {
    DictionaryBuilder builder;
    for (int index = 0; index < 2000; ++index) {
        builder.add("key " + std::to_string(index * 7919 % 2000), std::to_string(index).c_str());
    }
    const Value value(builder.build());
    for (const PropertyListFormat format : kFormats) {
        EXPECT_EQ(textualForm(rewritten(value, format)), textualForm(value));
    }
}

TEST(PropertyListCodecTest, AnEmptyKeyComesBack) {
    for (const PropertyListFormat format : kFormats) {
        EXPECT_EQ(rewritten(Dictionary{{"", "x"}}, format), Value(Dictionary{{"", "x"}}));
    }
}

TEST(PropertyListCodecTest, IntegersKeepTheirSign) {
    const Value value(Array{-1, std::numeric_limits<std::uint64_t>::max(), std::uint64_t{1} << 63U,
                            std::numeric_limits<std::int64_t>::min(), std::numeric_limits<std::int64_t>::max(), 0, 255,
                            256, 65536, std::uint32_t{4294967295}});
    EXPECT_EQ(rewritten(value, PropertyListFormat::Xml), value);
    EXPECT_EQ(rewritten(value, PropertyListFormat::Binary), value);
    EXPECT_EQ(xmlBody(std::numeric_limits<std::uint64_t>::max()), "<integer>18446744073709551615</integer>");
    EXPECT_EQ(xmlBody(-1), "<integer>-1</integer>");
}

TEST(PropertyListCodecTest, RealsKeepTheirNumber) {
    const Value value(Array{0.1, 1.0 / 3, 1e300, std::numeric_limits<double>::denorm_min(), -1.5, 1e23, 0.1F, 1000.0,
                            std::numeric_limits<double>::quiet_NaN(), std::numeric_limits<double>::infinity(),
                            -std::numeric_limits<double>::infinity()});
    EXPECT_EQ(rewritten(value, PropertyListFormat::Xml), value);
    EXPECT_EQ(rewritten(value, PropertyListFormat::Binary), value);
}

TEST(PropertyListCodecTest, A32BitRealIsWrittenAsAReal) {
    EXPECT_EQ(xmlBody(2.5F), "<real>2.5</real>");
    EXPECT_EQ(rewritten(0.1F, PropertyListFormat::Binary).kind(), ValueKind::Real32);
    EXPECT_EQ(rewritten(0.1F, PropertyListFormat::Xml).kind(), ValueKind::Real);
}

TEST(PropertyListCodecTest, RealsAreWrittenWithAPointWhateverTheLocale) {
    const std::string before = std::setlocale(LC_NUMERIC, nullptr);
    bool found = false;
    for (const char* const locale : {"de_DE.UTF-8", "de_DE.utf8", "fr_FR.UTF-8", "fr_FR.utf8"}) {
        found = found || std::setlocale(LC_NUMERIC, locale) != nullptr;
    }
    if (!found) {
        GTEST_SKIP() << "no locale with a decimal comma is installed";
    }
    const std::string written = xmlBody(2.5);
    const Value value = read("<plist><real>2.5</real></plist>");
    std::setlocale(LC_NUMERIC, before.c_str());
    EXPECT_EQ(written, "<real>2.5</real>");
    EXPECT_EQ(value, Value(2.5));
}

TEST(PropertyListCodecTest, DatesComeBack) {
    const Value value(Array{Date{0}, Date{-1}, Date{978307200}, Date{-30610224000}, Date{253402300799},
                            Date{-2208988800}, Date{4102444800}});
    EXPECT_EQ(rewritten(value, PropertyListFormat::Xml), value);
    EXPECT_EQ(rewritten(value, PropertyListFormat::Binary), value);
    EXPECT_EQ(xmlBody(Date{1795229005}), "<date>2026-11-21T02:43:25Z</date>");
    EXPECT_EQ(xmlBody(Date{-1}), "<date>1969-12-31T23:59:59Z</date>");
}

TEST(PropertyListCodecTest, AFractionOfASecondIsKeptInBinaryAndDroppedInXml) {
    EXPECT_EQ(rewritten(Date{978307199.25}, PropertyListFormat::Binary), Value(Date{978307199.25}));
    EXPECT_EQ(xmlBody(Date{978307199.25}), "<date>2000-12-31T23:59:59Z</date>");
    EXPECT_EQ(xmlBody(Date{978307200.75}), "<date>2001-01-01T00:00:00Z</date>");
    EXPECT_EQ(xmlBody(Date{-0.5}), "<date>1969-12-31T23:59:59Z</date>");
}

TEST(PropertyListCodecTest, DatesThatTheFormatCannotSayAreRefused) {
    const std::string years = "property list: a date lies outside the years 1000 to 9999";
    EXPECT_EQ(writingError(Date{-30610224001}, PropertyListFormat::Xml), years);
    EXPECT_EQ(writingError(Date{253402300800}, PropertyListFormat::Xml), years);
    EXPECT_EQ(writingError(Date{-30610224001}, PropertyListFormat::Binary), "");
    const std::string number = "property list: a date is not a number";
    EXPECT_EQ(writingError(Date{std::nan("")}), number + "|" + number);
    EXPECT_EQ(writingError(Array{Date{std::numeric_limits<double>::infinity()}}), number + "|" + number);
}

TEST(PropertyListCodecTest, DataComesBack) {
    std::string bytes;
    for (int byte = 0; byte < 256; ++byte) {
        bytes += static_cast<char>(static_cast<unsigned char>(byte));
        for (const PropertyListFormat format : kFormats) {
            ASSERT_EQ(rewritten(Array{Data(bytes)}, format), Value(Array{Data(bytes)})) << byte;
        }
    }
    EXPECT_EQ(rewritten(Data(""), PropertyListFormat::Xml), Value(Data("")));
    EXPECT_EQ(rewritten(Data(""), PropertyListFormat::Binary), Value(Data("")));
}

TEST(PropertyListCodecTest, MarkupAndLineEndsInStringsComeBack) {
    const Value value(Dictionary{{"<key>&amp;\r\n", "a<b>&c;\"'\r\n\t]]>\rd\n"}, {" x ", " y "}});
    for (const PropertyListFormat format : kFormats) {
        EXPECT_EQ(rewritten(value, format), value);
    }
}

TEST(PropertyListCodecTest, CharactersBeyondAsciiComeBack) {
    const Value value(Dictionary{{"gr\xC3\xB6\xC3\x9F"
                                  "e",
                                  "\xE2\x82\xAC \xF0\x9F\x98\x80 \x7F"}});
    for (const PropertyListFormat format : kFormats) {
        EXPECT_EQ(rewritten(value, format), value);
    }
}

TEST(PropertyListCodecTest, ControlCharactersAreRefusedInXmlOnly) {
    const std::string reason = "property list: a string holds a character that XML forbids";
    for (const char* const text : {"a\x01", "\x1B[1m", "\xEF\xBF\xBE"}) {
        EXPECT_EQ(writingError(text), reason + "|");
        EXPECT_EQ(writingError(Dictionary{{text, 1}}), reason + "|");
        EXPECT_EQ(rewritten(text, PropertyListFormat::Binary), Value(text));
    }
}

TEST(PropertyListCodecTest, NulInAStringIsRefusedInXmlAndBinary) {
    const std::string reason = "property list: a string holds NUL";
    const std::string_view text("a\0b", 3);
    EXPECT_EQ(writingError(Array{text}), reason + "|" + reason);
    EXPECT_EQ(writingError(Dictionary{{text, 1}}), reason + "|" + reason);
    EXPECT_EQ(rewritten(Array{text}, PropertyListFormat::Text), Value(Array{text}));
}

TEST(PropertyListCodecTest, InvalidUtf8IsRefusedInXmlAndBinary) {
    const std::string reason = "property list: a string is not UTF-8";
    EXPECT_EQ(writingError("a\xFF"), reason + "|" + reason);
    EXPECT_EQ(writingError(Dictionary{{"\xED\xA0\x80", 1}}), reason + "|" + reason);
    EXPECT_EQ(rewritten(Array{"a\xFF"}, PropertyListFormat::Text), Value(Array{"a\xEF\xBF\xBD"}));
}

TEST(PropertyListCodecTest, XmlNamesNoDocumentType) {
    EXPECT_EQ(*PropertyListCodec().write(Value(Dictionary{{"a", "x"}}), PropertyListFormat::Xml),
              "<?xml version=\"1.0\" encoding=\"UTF-8\"?>\n"
              "<plist version=\"1.0\">\n<dict>\n\t<key>a</key>\n\t<string>x</string>\n</dict>\n</plist>\n");
}

TEST(PropertyListCodecTest, NoValueIsNotWritten) {
    for (const PropertyListFormat format : kFormats) {
        EXPECT_EQ(writingError(Value(), format), "property list: there is no value");
    }
}

TEST(PropertyListCodecTest, WhatIsWrittenIsNeverTooDeepToRead) {
    for (const PropertyListFormat format : kFormats) {
        EXPECT_EQ(rewritten(nested(128), format), nested(128));
        EXPECT_EQ(writingError(nested(129), format),
                  "property list: the containers stand too deep, the limit \"depth\" is 128");
    }
}

TEST(PropertyListCodecTest, EqualLeavesOfDifferentKindsStayApartInBinary) {
    const Value value(Array{1, true, 1.0, "1", Data("1"), Date{978307201}, std::uint64_t{1} << 63U,
                            std::numeric_limits<std::int64_t>::min(), -1, std::numeric_limits<std::uint64_t>::max()});
    EXPECT_EQ(rewritten(value, PropertyListFormat::Binary), value);
}

// Against libplist's own readers

TEST(PropertyListCodecTest, LibplistReadsTheSame) {
    for (const PropertyListFormat format : {PropertyListFormat::Xml, PropertyListFormat::Binary}) {
        EXPECT_EQ(plist::differenceFromLibplist(everyKind(), write(everyKind(), format), format), std::nullopt);
    }
}

TEST(PropertyListCodecTest, TheComparisonWithLibplistSeesADifference) {
    const std::string xml = write(Dictionary{{"a", Array{1, "x"}}}, PropertyListFormat::Xml);
    EXPECT_EQ(plist::differenceFromLibplist(Value(Dictionary{{"a", Array{1, "y"}}}), xml, PropertyListFormat::Xml),
              "/a/1: another leaf");
    EXPECT_EQ(plist::differenceFromLibplist(Value(Dictionary{{"b", Array{1, "x"}}}), xml, PropertyListFormat::Xml),
              ": another key in the place of b");
    EXPECT_EQ(plist::differenceFromLibplist(Value(1), "<plist>", PropertyListFormat::Xml), "libplist refuses it");
}

} // namespace

} // namespace vela::platform
