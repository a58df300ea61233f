#include "common/values/Dictionary.h"
#include "common/values/TextualForm.h"
#include "platform/plist/BinaryReader.h"

#include <cmath>
#include <cstdint>
#include <gtest/gtest.h>
#include <limits>
#include <string>
#include <vector>

namespace vela::platform::plist {

namespace {

using namespace std::string_literals;

void appendBigEndian(std::string& bytes, std::uint64_t number, std::size_t count) {
    for (std::size_t index = count; index > 0; --index) {
        bytes += static_cast<char>(static_cast<unsigned char>((number >> (8 * (index - 1))) & 0xFFU));
    }
}

/// Everything about a binary list but its objects, so that a test can say what is wrong with it.
struct Frame {
    std::uint64_t top = 0;
    std::size_t offsetBytes = 1;
    std::size_t referenceBytes = 1;
    std::string behindObjects = {};
    std::string unused = "\0\0\0\0\0\0"s;
};

std::string list(const std::vector<std::string>& objects, const Frame& frame = {}) {
    std::string bytes = "bplist00";
    std::string table;
    for (const std::string& object : objects) {
        appendBigEndian(table, bytes.size(), frame.offsetBytes);
        bytes += object;
    }
    bytes += frame.behindObjects;
    const std::size_t tableAt = bytes.size();
    bytes += table + frame.unused;
    appendBigEndian(bytes, frame.offsetBytes, 1);
    appendBigEndian(bytes, frame.referenceBytes, 1);
    appendBigEndian(bytes, objects.size(), 8);
    appendBigEndian(bytes, frame.top, 8);
    appendBigEndian(bytes, tableAt, 8);
    return bytes;
}

/// `bytes` with the trailer's number at `offset` in it replaced.
std::string withTrailer(std::string bytes, std::size_t offset, std::uint64_t number) {
    std::string field;
    appendBigEndian(field, number, 8);
    return bytes.replace(bytes.size() - 32 + offset, 8, field);
}

Value read(const std::string& bytes, const PropertyListLimits& limits = {}) {
    auto result = readBinary(bytes, limits);
    if (!result) {
        ADD_FAILURE() << result.failure().description;
        return {};
    }
    return *std::move(result);
}

/// The failure's text, or "" when the input is taken.
std::string errorOf(const std::string& bytes, const PropertyListLimits& limits = {}) {
    const auto result = readBinary(bytes, limits);
    return result ? "" : result.failure().description;
}

/// Arrays of ten references each to the next one, and at last a leaf: 10^levels values.
std::vector<std::string> doublings(std::size_t levels, const std::string& leaf) {
    std::vector<std::string> objects;
    for (std::size_t level = 0; level < levels; ++level) {
        objects.push_back("\xAA" + std::string(10, static_cast<char>(level + 1)));
    }
    objects.push_back(leaf);
    return objects;
}

const std::string kTrue = "\x09";

// Leaves

TEST(BinaryReaderTest, TruthValues) {
    EXPECT_EQ(read(list({"\x08"})), Value(false));
    EXPECT_EQ(read(list({"\x09"})), Value(true));
}

TEST(BinaryReaderTest, IntegersOfOneToFourBytesAreUnsigned) {
    EXPECT_EQ(read(list({"\x10\xFF"})), Value(255));
    EXPECT_EQ(read(list({"\x11\xFF\xFE"})), Value(65534));
    EXPECT_EQ(read(list({"\x12\xFF\xFF\xFF\xFF"})), Value(4294967295));
}

TEST(BinaryReaderTest, IntegersOfEightBytesAreSigned) {
    EXPECT_EQ(read(list({"\x13\xFF\xFF\xFF\xFF\xFF\xFF\xFF\xFE"})), Value(-2));
    EXPECT_EQ(read(list({"\x13\x80\0\0\0\0\0\0\0"s})), Value(std::numeric_limits<std::int64_t>::min()));
    EXPECT_EQ(read(list({"\x13\x7F\xFF\xFF\xFF\xFF\xFF\xFF\xFF"})), Value(std::numeric_limits<std::int64_t>::max()));
}

TEST(BinaryReaderTest, IntegersOfSixteenBytesFit64BitsUnsigned) {
    const std::string zeros(8, '\0');
    EXPECT_EQ(read(list({"\x14" + zeros + std::string(8, '\xFF')})), Value(std::numeric_limits<std::uint64_t>::max()));
    EXPECT_EQ(read(list({"\x14" + zeros + "\0\0\0\0\0\0\0\7"s})), Value(7));
    EXPECT_EQ(errorOf(list({"\x14" + "\0\0\0\0\0\0\0\1"s + zeros})),
              "property list: byte 8: this integer of 16 bytes does not fit 64 bits");
    EXPECT_EQ(errorOf(list({"\x14" + std::string(16, '\xFF')})),
              "property list: byte 8: this integer of 16 bytes does not fit 64 bits");
}

TEST(BinaryReaderTest, OtherIntegersAreRefused) {
    EXPECT_EQ(errorOf(list({"\x15" + std::string(32, '\0')})), "property list: byte 8: unknown integer");
}

TEST(BinaryReaderTest, RealsOfFourBytesAre32BitReals) {
    const Value value = read(list({"\x22\x3D\xCC\xCC\xCD"}));
    EXPECT_EQ(value.kind(), ValueKind::Real32);
    EXPECT_EQ(value, Value(0.1F));
    EXPECT_EQ(textualForm(value), "0.1");
}

TEST(BinaryReaderTest, RealsOfEightBytesAreReals) {
    const Value value = read(list({"\x23\x3F\xB9\x99\x99\x99\x99\x99\x9A"}));
    EXPECT_EQ(value.kind(), ValueKind::Real);
    EXPECT_EQ(value, Value(0.1));
    EXPECT_TRUE(std::isnan(read(list({"\x23\x7F\xF8\0\0\0\0\0\0"s})).ref().real()));
    EXPECT_EQ(read(list({"\x23\xFF\xF0\0\0\0\0\0\0"s})), Value(-std::numeric_limits<double>::infinity()));
}

TEST(BinaryReaderTest, RealsOfOtherWidthsAreRefused) {
    EXPECT_EQ(errorOf(list({"\x21\0\0"s})), "property list: byte 8: a real has 4 or 8 bytes");
}

TEST(BinaryReaderTest, DatesCountFrom2001) {
    EXPECT_EQ(read(list({"\x33\0\0\0\0\0\0\0\0"s})), Value(Date{978307200}));
    EXPECT_EQ(read(list({"\x33\xBF\xE0\0\0\0\0\0\0"s})), Value(Date{978307199.5}));
    EXPECT_EQ(read(list({"\x33\xC1\xCD\x27\xE4\x40\0\0\0"s})), Value(Date{0}));
    EXPECT_EQ(read(list({"\x33\xC2\x2D\x63\xC3\x7F\0\0\0"s})), Value(Date{-62135596800}));
}

TEST(BinaryReaderTest, ADateThatIsNoNumberIsRefused) {
    EXPECT_EQ(errorOf(list({"\x33\x7F\xF8\0\0\0\0\0\0"s})), "property list: byte 8: this date is not a number");
    EXPECT_EQ(errorOf(list({"\x33\x7F\xF0\0\0\0\0\0\0"s})), "property list: byte 8: this date is not a number");
    EXPECT_EQ(errorOf(list({"\x32\0\0\0\0"s})), "property list: byte 8: a date has 8 bytes");
}

TEST(BinaryReaderTest, DataIsItsBytes) {
    EXPECT_EQ(read(list({"\x43\0\xFF\1"s})), Value(Data("\0\xFF\1"s)));
    EXPECT_EQ(read(list({"\x40"})), Value(Data("")));
}

TEST(BinaryReaderTest, AsciiStrings) {
    EXPECT_EQ(read(list({"\x57Kitchen"})), Value("Kitchen"));
    EXPECT_EQ(read(list({"\x50"})), Value(""));
    EXPECT_EQ(read(list({"\x53"
                         "a\0b"s})),
              Value(std::string_view("a\0b", 3)));
}

TEST(BinaryReaderTest, AnAsciiStringOfOtherBytesIsRefused) {
    EXPECT_EQ(errorOf(list({"\x52"
                            "a\xE9"})),
              "property list: byte 8: this string is not ASCII");
}

TEST(BinaryReaderTest, Utf16Strings) {
    EXPECT_EQ(read(list({"\x63\0\xE9\xD8\x3D\xDE\0"s})), Value("\xC3\xA9\xF0\x9F\x98\x80"));
    EXPECT_EQ(read(list({"\x60"})), Value(""));
    EXPECT_EQ(read(list({"\x62\0a\0\0"s})), Value(std::string_view("a\0", 2)));
}

TEST(BinaryReaderTest, Utf16WithLoneSurrogatesIsRefused) {
    const std::string reason = "property list: byte 8: this string is not UTF-16";
    EXPECT_EQ(errorOf(list({"\x61\xD8\x3D"})), reason);
    EXPECT_EQ(errorOf(list({"\x61\xDE\0"s})), reason);
    EXPECT_EQ(errorOf(list({"\x62\xD8\x3D\0a"s})), reason);
    EXPECT_EQ(errorOf(list({"\x62\xD8\x3D\xD8\x3D"})), reason);
}

TEST(BinaryReaderTest, ALongCountFollowsAsAnInteger) {
    EXPECT_EQ(read(list({"\x5F\x10\x03"
                         "abc"})),
              Value("abc"));
    EXPECT_EQ(read(list({"\x5F\x11\x01\x2C" + std::string(300, 'x')}, {.offsetBytes = 2})),
              Value(std::string(300, 'x').c_str()));
    EXPECT_EQ(read(list({"\x4F\x13\0\0\0\0\0\0\0\1z"s})), Value(Data("z")));
}

TEST(BinaryReaderTest, AMalformedCountIsRefused) {
    const std::string reason = "property list: byte 8: the count of this object is malformed";
    EXPECT_EQ(errorOf(list({"\x5F"})), reason);
    EXPECT_EQ(errorOf(list({"\x5F\x51"
                            "a"})),
              reason);
    EXPECT_EQ(errorOf(list({"\x5F\x14" + std::string(16, '\0')})), reason);
    EXPECT_EQ(errorOf(list({"\x5F\x12\0\0"s})), reason);
}

TEST(BinaryReaderTest, KindsThatAreNoValuesAreRefused) {
    EXPECT_EQ(errorOf(list({"\0"s})), "property list: byte 8: null is not taken");
    EXPECT_EQ(errorOf(list({"\x80\1"})), "property list: byte 8: an archiver's UID is not taken");
    EXPECT_EQ(errorOf(list({"\xC1\1", kTrue})), "property list: byte 8: a set is not taken");
    EXPECT_EQ(errorOf(list({"\x0F"})), "property list: byte 8: unknown object");
    EXPECT_EQ(errorOf(list({"\x71"
                            "a"})),
              "property list: byte 8: unknown object");
    EXPECT_EQ(errorOf(list({"\xB0"})), "property list: byte 8: unknown object");
}

TEST(BinaryReaderTest, ObjectsThatNothingRefersToAreCheckedToo) {
    EXPECT_EQ(errorOf(list({kTrue, "\x80\1"})), "property list: byte 9: an archiver's UID is not taken");
    EXPECT_EQ(errorOf(list({kTrue, "\x51\xE9"})), "property list: byte 9: this string is not ASCII");
    EXPECT_EQ(errorOf(list({kTrue, "\xA1\7"})), "property list: byte 10: there is no object of this number");
}

// Containers

TEST(BinaryReaderTest, ArraysReferToTheirValues) {
    EXPECT_EQ(read(list({"\xA2\2\1",
                         "\x51"
                         "a",
                         kTrue})),
              Value(Array{true, "a"}));
    EXPECT_EQ(read(list({"\xA0"})), Value(Array{}));
}

TEST(BinaryReaderTest, DictionariesReferToKeysThenValues) {
    EXPECT_EQ(textualForm(read(list({"\xD2\1\2\3\4", "\x51z",
                                     "\x51"
                                     "a",
                                     "\x51x", "\x51y"}))),
              "{z = x; a = y;}");
    EXPECT_EQ(read(list({"\xD0"})), Value(Dictionary{}));
}

TEST(BinaryReaderTest, AnEmptyKeyIsAKey) {
    EXPECT_EQ(read(list({"\xD1\1\2", "\x50", kTrue})), Value(Dictionary{{"", true}}));
}

TEST(BinaryReaderTest, OnlyAStringIsAKey) {
    EXPECT_EQ(errorOf(list({"\xD1\1\1", kTrue})), "property list: byte 8: a key of this dictionary is not a string");
    EXPECT_EQ(errorOf(list({"\xD1\0\1"s, kTrue})), "property list: byte 8: a key of this dictionary is not a string");
}

TEST(BinaryReaderTest, ARepeatedKeyIsRefused) {
    const std::string reason = "property list: byte 8: a key of this dictionary stands there twice";
    EXPECT_EQ(errorOf(list({"\xD2\1\1\2\2", "\x51z", kTrue})), reason);
    EXPECT_EQ(errorOf(list({"\xD2\1\2\3\3", "\x51z", "\x61\0z"s, kTrue})), reason);
}

TEST(BinaryReaderTest, OffsetsAndReferencesMayHaveEightBytes) {
    EXPECT_EQ(read(list({"\xA1\0\0\0\0\0\0\0\1"s, kTrue}, {.offsetBytes = 8, .referenceBytes = 8})),
              Value(Array{true}));
}

TEST(BinaryReaderTest, TheTopObjectMayStandAnywhere) {
    EXPECT_EQ(read(list({kTrue, "\xA1\0"s}, {.top = 1})), Value(Array{true}));
}

TEST(BinaryReaderTest, AReferenceOutOfRangeIsRefused) {
    EXPECT_EQ(errorOf(list({"\xA1\1"})), "property list: byte 9: there is no object of this number");
    EXPECT_EQ(errorOf(list({"\xD1\1\2", "\x50"})), "property list: byte 10: there is no object of this number");
}

TEST(BinaryReaderTest, ACycleIsRefused) {
    EXPECT_EQ(errorOf(list({"\xA1\0"s})), "property list: byte 8: this container is inside itself");
    EXPECT_EQ(errorOf(list({"\xA1\1", "\xD1\2\0"s, "\x50"})), "property list: byte 8: this container is inside itself");
}

TEST(BinaryReaderTest, ASharedObjectIsReadOnceAndShared) {
    const Value value = read(list({"\xA2\1\1", "\x51"
                                               "a"}));
    EXPECT_EQ(value, Value(Array{"a", "a"}));
    const Array array = value.ref().array();
    EXPECT_TRUE(array[0].isSameObject(array[1]));
}

TEST(BinaryReaderTest, AnObjectInsideAnotherIsRefused) {
    // The string's second character is an object of the offset table as well.
    std::string bytes = list({"\x52"
                              "a\x09",
                              kTrue});
    bytes[bytes.size() - 33] = 10;
    EXPECT_EQ(errorOf(bytes), "property list: byte 10: this object begins inside another one");
    bytes[bytes.size() - 33] = 8;
    EXPECT_EQ(errorOf(bytes), "property list: byte 8: this object begins inside another one");
}

TEST(BinaryReaderTest, BytesThatBelongToNoObjectAreSkipped) {
    EXPECT_EQ(read(list({kTrue}, {.behindObjects = "\0\0\0"s})), Value(true));
}

// Extents, trailer

TEST(BinaryReaderTest, AnObjectThatReachesIntoTheTableIsRefused) {
    const std::string reason = "property list: byte 8: this object reaches beyond the objects";
    EXPECT_EQ(errorOf(list({"\x52"
                            "a"})),
              reason);
    EXPECT_EQ(errorOf(list({"\x61\0"s})), reason);
    EXPECT_EQ(errorOf(list({"\x13\0"s})), reason);
    EXPECT_EQ(errorOf(list({"\xA2\0"s})), reason);
    EXPECT_EQ(errorOf(list({"\xD1\0"s})), reason);
    EXPECT_EQ(errorOf(list({"\x5F\x12\x7F\xFF\xFF\xFF"})), reason);
    EXPECT_EQ(errorOf(list({"\xDF\x13\xFF\xFF\xFF\xFF\xFF\xFF\xFF\xFF"})), reason);
    EXPECT_EQ(errorOf(list({"\xAF\x10\x2F"}, {.referenceBytes = 8})), reason);
}

TEST(BinaryReaderTest, AnOffsetOutsideTheObjectsIsRefused) {
    std::string bytes = list({kTrue});
    for (const char offset : {'\0', '\7', '\x09', '\xFF'}) {
        bytes[9] = offset;
        EXPECT_EQ(errorOf(bytes), "property list: byte 9: this offset is outside the objects") << int{offset};
    }
}

TEST(BinaryReaderTest, AMissingTrailerIsRefused) {
    EXPECT_EQ(errorOf("bplist00"), "property list: byte 8: the trailer is missing");
    EXPECT_EQ(errorOf("bplist00" + std::string(31, '\0')), "property list: byte 39: the trailer is missing");
    EXPECT_EQ(errorOf("bplist15"), "property list: byte 0: the header \"bplist00\" is missing");
}

TEST(BinaryReaderTest, TheTrailersUnusedBytesAreZero) {
    EXPECT_EQ(errorOf(list({kTrue}, {.unused = "\0\0\0\0\0\1"s})),
              "property list: byte 10: the trailer's unused bytes are not zero");
}

TEST(BinaryReaderTest, SizesOfOffsetsAndReferencesAreOneToEight) {
    const std::string reason = "property list: byte 16: offsets and references have 1 to 8 bytes";
    for (const std::size_t at : {16U, 17U}) {
        for (const char size : {'\0', '\x09', '\xFF'}) {
            std::string bytes = list({kTrue});
            bytes[at] = size;
            EXPECT_EQ(errorOf(bytes), reason) << at << " " << int{size};
        }
    }
}

TEST(BinaryReaderTest, TheNumberOfObjectsIsThatOfTheTable) {
    const std::string reason = "property list: byte 18: the number of objects is not that of the offset table";
    const std::string bytes = list({kTrue});
    EXPECT_EQ(errorOf(withTrailer(bytes, 8, 0)), reason);
    EXPECT_EQ(errorOf(withTrailer(bytes, 8, 2)), reason);
    EXPECT_EQ(errorOf(withTrailer(bytes, 8, std::uint64_t{1} << 60U)), reason);
    EXPECT_EQ(errorOf(withTrailer(bytes, 8, std::numeric_limits<std::uint64_t>::max())), reason);
}

TEST(BinaryReaderTest, TheTopObjectIsOneOfThem) {
    EXPECT_EQ(errorOf(list({kTrue}, {.top = 1})), "property list: byte 26: there is no such top object");
}

TEST(BinaryReaderTest, TheTableIsInsideTheBytes) {
    const std::string reason = "property list: byte 34: the offset table is outside the bytes";
    const std::string bytes = list({kTrue});
    EXPECT_EQ(errorOf(withTrailer(bytes, 24, 0)), reason);
    EXPECT_EQ(errorOf(withTrailer(bytes, 24, 11)), reason);
    EXPECT_EQ(errorOf(withTrailer(bytes, 24, std::numeric_limits<std::uint64_t>::max())), reason);
}

// Limits

TEST(BinaryReaderTest, TheLimitOfBytesIsExact) {
    EXPECT_EQ(read(list({kTrue}), {.bytes = 42}), Value(true));
    EXPECT_EQ(errorOf(list({kTrue}), {.bytes = 41}),
              "property list: byte 0: the input has 42 bytes, the limit \"bytes\" is 41");
}

TEST(BinaryReaderTest, TheLimitOfDepthIsExact) {
    const std::vector<std::string> three = {"\xA1\1", "\xA1\2", "\xA0"};
    EXPECT_EQ(read(list(three), {.depth = 3}), Value(Array{Value(Array{Value(Array{})})}));
    EXPECT_EQ(errorOf(list(three), {.depth = 2}),
              "property list: byte 12: the containers stand too deep, the limit \"depth\" is 2");
}

TEST(BinaryReaderTest, TheDepthOfASharedContainerCountsWhereItStandsDeepest) {
    // First met at depth 2, where it fits, then inside another array.
    const std::string bytes = list({"\xA2\1\2", "\xA1\3", "\xA1\1", kTrue});
    EXPECT_EQ(read(bytes, {.depth = 3}), Value(Array{Array{true}, Array{Value(Array{true})}}));
    EXPECT_EQ(errorOf(bytes, {.depth = 2}),
              "property list: byte 11: the containers stand too deep, the limit \"depth\" is 2");
}

TEST(BinaryReaderTest, TheLimitOfValuesIsExact) {
    const std::string bytes = list({"\xD1\1\2", "\x50", "\xA2\3\3", kTrue});
    EXPECT_EQ(read(bytes, {.values = 4}), Value(Dictionary{{"", Array{true, true}}}));
    EXPECT_EQ(errorOf(bytes, {.values = 3}),
              "property list: byte 8: there are too many values, the limit \"values\" is 3");
}

TEST(BinaryReaderTest, SharedObjectsCountAsOftenAsTheyAreUsed) {
    EXPECT_EQ(errorOf(list(doublings(4, kTrue))), "");
    EXPECT_EQ(errorOf(list(doublings(20, kTrue))),
              "property list: byte 173: there are too many values, the limit \"values\" is 65536");
}

TEST(BinaryReaderTest, SharedStringsCountTheirBytesAsOftenAsTheyAreUsed) {
    const std::string thousand = "\x5F\x11\x03\xE8" + std::string(1000, 'x');
    const std::string reason =
        "strings and data have more bytes together than 4 times the limit \"bytes\", which is 20000";
    EXPECT_EQ(errorOf(list(doublings(1, thousand), {.offsetBytes = 2}), {.bytes = 20000}), "");
    EXPECT_EQ(errorOf(list(doublings(2, thousand), {.offsetBytes = 2}), {.bytes = 20000}),
              "property list: byte 8: " + reason);
}

TEST(BinaryReaderTest, SharedKeysCountTheirBytesAsOftenAsTheyAreUsed) {
    const std::string thousand = "\x5F\x11\x03\xE8" + std::string(1000, 'x');
    const std::string array = "\xAF\x11\0\x64"s + std::string(100, '\1');
    EXPECT_EQ(
        errorOf(list({array, "\xD1\2\3", thousand, kTrue}, {.offsetBytes = 2}), {.bytes = 20000}),
        "property list: byte 8: strings and data have more bytes together than 4 times the limit \"bytes\", which is "
        "20000");
}

} // namespace

} // namespace vela::platform::plist
