// Arguments of messages, read from literal bytes in both orders.
#include "platform/dbus/MessageBytes_test.h"
#include "platform/dbus/MessageReader.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <limits>

namespace vela::platform::dbus {

namespace {

using ::testing::ElementsAre;
using ::testing::HasSubstr;
using ::testing::Optional;
using ::testing::StartsWith;
using std::string_view_literals::operator""sv;

/// A message with this body, and a reader of it.
class Body {
public:
    explicit Body(Bytes bytes, std::uint32_t depth = 32) : message_(callOf("m", "y", bytes)), depth_(depth) {
        EXPECT_FALSE(header_.read(message_));
    }
    BodyReader reader() const { return BodyReader(header_, depth_); }

private:
    std::string message_;
    MessageHeader header_;
    std::uint32_t depth_;
};

TEST(BodyReaderTest, EveryBasicTypeIsReadInBothOrders) {
    for (const Order order : {Order::Little, Order::Big}) {
        Bytes bytes(order);
        bytes.u8(0xFE).pad(2).u16(0xFFFE).u16(0xFFFE).pad(4).u32(1).u32(0xFFFFFFFE).u32(0xFFFFFFFE);
        bytes.pad(8).u64(0xFFFFFFFFFFFFFFFE).u64(0xFFFFFFFFFFFFFFFE).f64(-1.5);
        bytes.text("h\xC3\xA4").text("/a/b_1").type("a{sv}").array(Bytes(order).u8(1).u8(0).u8(2), 1);
        const Body body(bytes);
        BodyReader reader = body.reader();
        EXPECT_EQ(reader.byte(), 0xFE);
        EXPECT_EQ(reader.int16(), -2);
        EXPECT_EQ(reader.uint16(), 65534);
        EXPECT_TRUE(reader.boolean());
        EXPECT_EQ(reader.int32(), -2);
        EXPECT_EQ(reader.uint32(), 4294967294U);
        EXPECT_EQ(reader.int64(), -2);
        EXPECT_EQ(reader.uint64(), 18446744073709551614U);
        EXPECT_EQ(reader.real(), -1.5);
        EXPECT_EQ(reader.string(), "h\xC3\xA4");
        EXPECT_EQ(reader.objectPath(), "/a/b_1");
        EXPECT_EQ(reader.signature(), "a{sv}");
        EXPECT_EQ(reader.data(), "\1\0\2"sv);
        reader.finish();
        EXPECT_FALSE(reader.error());
    }
}

TEST(BodyReaderTest, ListsOfReporterIDsAreReadInBothOrders) {
    for (const Order order : {Order::Little, Order::Big}) {
        Bytes bytes(order);
        bytes.u32(16).pad(8).u64(5).u64(static_cast<std::uint64_t>(-6));
        const Body body(bytes);
        BodyReader reader = body.reader();
        EXPECT_THAT(reader.int64s(), ElementsAre(5, -6));
        reader.finish();
        EXPECT_FALSE(reader.error());
    }
}

TEST(BodyReaderTest, AnOptionalListIsNoneOrOneListWhichMayBeEmpty) {
    const Body none(Bytes().u32(0));
    BodyReader reader = none.reader();
    EXPECT_EQ(reader.optionalInt64s(), std::nullopt);
    EXPECT_FALSE(reader.error());
    // The inner array's padding to 8 counts for the outer one, elements or not.
    const Body empty(Bytes().u32(4).u32(0));
    reader = empty.reader();
    EXPECT_THAT(reader.optionalInt64s(), Optional(ElementsAre()));
    reader.finish();
    EXPECT_FALSE(reader.error());
    const Body one(Bytes().u32(12).u32(8).u64(3));
    reader = one.reader();
    EXPECT_THAT(reader.optionalInt64s(), Optional(ElementsAre(3)));
    EXPECT_FALSE(reader.error());
}

TEST(BodyReaderTest, TwoOptionalListsAreInvalidArguments) {
    const Body body(Bytes().u32(20).u32(8).u64(3).u32(0).pad(8));
    BodyReader reader = body.reader();
    EXPECT_EQ(reader.optionalInt64s(), std::nullopt);
    ASSERT_TRUE(reader.error());
    EXPECT_EQ(reader.error()->name, kInvalidArgsError);
}

/// The body of one `a{sv}` with the entries that `add` appends.
template <class Add>
Bytes dictionaryBody(Order order, const Add& add) {
    // Entries begin at 8, so that their own alignment starts from there.
    Bytes entries(order);
    add(entries);
    return Bytes(order).array(entries, 8);
}

/// One entry `k` of `type` whose value `add` appends.
template <class Add>
Bytes oneEntry(std::string_view type, const Add& add, Order order = Order::Little) {
    return dictionaryBody(order, [&](Bytes& entries) {
        entries.text("k").type(type);
        add(entries);
    });
}

template <class Add>
Dictionary dictionaryOf(std::string_view type, const Add& add, Order order = Order::Little) {
    const Body body(oneEntry(type, add, order));
    BodyReader reader = body.reader();
    Dictionary result = reader.dictionary();
    reader.finish();
    EXPECT_FALSE(reader.error()) << reader.error()->text;
    return result;
}

TEST(BodyReaderTest, EveryKindOfValueEntersADictionary) {
    for (const Order order : {Order::Little, Order::Big}) {
        const auto one = [order](std::string_view type, auto add) { return dictionaryOf(type, add, order); };
        EXPECT_EQ(one("b", [](Bytes& b) { b.pad(4).u32(1); }), (Dictionary{{"k", true}}));
        EXPECT_EQ(one("b", [](Bytes& b) { b.pad(4).u32(0); }), (Dictionary{{"k", false}}));
        EXPECT_EQ(one("y", [](Bytes& b) { b.u8(255); }), (Dictionary{{"k", 255}}));
        EXPECT_EQ(one("n", [](Bytes& b) { b.pad(2).u16(0x8000); }), (Dictionary{{"k", -32768}}));
        EXPECT_EQ(one("q", [](Bytes& b) { b.pad(2).u16(0x8000); }), (Dictionary{{"k", 32768}}));
        EXPECT_EQ(one("i", [](Bytes& b) { b.pad(4).u32(0x80000000); }), (Dictionary{{"k", -2147483648LL}}));
        EXPECT_EQ(one("u", [](Bytes& b) { b.pad(4).u32(0x80000000); }), (Dictionary{{"k", 2147483648LL}}));
        EXPECT_EQ(one("x", [](Bytes& b) { b.pad(8).u64(0x8000000000000000); }),
                  (Dictionary{{"k", std::numeric_limits<std::int64_t>::min()}}));
        EXPECT_EQ(one("t", [](Bytes& b) { b.pad(8).u64(0x8000000000000000); }),
                  (Dictionary{{"k", 9223372036854775808U}}));
        EXPECT_EQ(one("t", [](Bytes& b) { b.pad(8).u64(7); }), (Dictionary{{"k", 7}}));
        EXPECT_EQ(one("d", [](Bytes& b) { b.pad(8).f64(0.5); }), (Dictionary{{"k", 0.5}}));
        EXPECT_EQ(one("s", [](Bytes& b) { b.text("text"); }), (Dictionary{{"k", "text"}}));
        EXPECT_EQ(one("s", [](Bytes& b) { b.text(""); }), (Dictionary{{"k", ""}}));
        EXPECT_EQ(one("o", [](Bytes& b) { b.text("/a"); }), (Dictionary{{"k", "/a"}}));
        EXPECT_EQ(one("g", [](Bytes& b) { b.type("as"); }), (Dictionary{{"k", "as"}}));
        EXPECT_EQ(one("ay", [](Bytes& b) { b.pad(4).u32(2).raw("\0\1"sv); }), (Dictionary{{"k", Data("\0\1"sv)}}));
        EXPECT_EQ(one("ay", [](Bytes& b) { b.pad(4).u32(0); }), (Dictionary{{"k", Data()}}));
        EXPECT_EQ(one("(sd)", [](Bytes& b) { b.pad(8).text("date").pad(8).f64(12.5); }),
                  (Dictionary{{"k", Date{12.5}}}));
    }
}

TEST(BodyReaderTest, ArraysOfEveryKindEnterADictionary) {
    for (const Order order : {Order::Little, Order::Big}) {
        const auto one = [order](std::string_view type, auto add) { return dictionaryOf(type, add, order); };
        EXPECT_EQ(one("ax", [](Bytes& b) { b.pad(4).u32(16).pad(8).u64(1).u64(2); }), (Dictionary{{"k", Array{1, 2}}}));
        EXPECT_EQ(one("an", [](Bytes& b) { b.pad(4).u32(2).u16(0xFFFF); }), (Dictionary{{"k", Array{-1}}}));
        EXPECT_EQ(one("as", [](Bytes& b) { b.pad(4).u32(14).text("a").text("b"); }),
                  (Dictionary{{"k", Array{"a", "b"}}}));
        EXPECT_EQ(one("as", [](Bytes& b) { b.pad(4).u32(0); }), (Dictionary{{"k", Array()}}));
        EXPECT_EQ(one("av", [](Bytes& b) { b.pad(4).u32(12).type("y").u8(3).type("b").pad(4).u32(1); }),
                  (Dictionary{{"k", Array{3, true}}}));
        EXPECT_EQ(one("aay", [](Bytes& b) { b.pad(4).u32(5).u32(1).u8(9); }), (Dictionary{{"k", Array{Data("\x09")}}}));
        EXPECT_EQ(one("a(sd)", [](Bytes& b) { b.pad(4).u32(24).pad(8).text("date").pad(8).f64(1); }),
                  (Dictionary{{"k", Array{Date{1}}}}));
        EXPECT_EQ(one("aav", [](Bytes& b) { b.pad(4).u32(8).u32(4).type("y").u8(3); }),
                  (Dictionary{{"k", Array{Value(Array{3})}}}));
        EXPECT_EQ(one("aaax", [](Bytes& b) { b.pad(4).u32(0); }), (Dictionary{{"k", Array()}}));
        EXPECT_EQ(one("a{sv}", [](Bytes& b) { b.pad(4).u32(0).pad(8); }), (Dictionary{{"k", Dictionary()}}));
        EXPECT_EQ(one("a{sv}", [](Bytes& b) { b.pad(4).u32(10).pad(8).text("i").type("y").u8(3); }),
                  (Dictionary{{"k", Dictionary{{"i", 3}}}}));
        EXPECT_EQ(one("aa{sv}", [](Bytes& b) { b.pad(4).u32(14).u32(10).pad(8).text("i").type("y").u8(3); }),
                  (Dictionary{{"k", Array{Dictionary{{"i", 3}}}}}));
    }
}

TEST(BodyReaderTest, EntriesKeepTheirOrderAndTheLastOfARepeatedKeyWins) {
    const Body body(dictionaryBody(Order::Little, [](Bytes& entries) {
        entries.text("b").type("y").u8(1).pad(8).text("a").type("y").u8(2).pad(8).text("b").type("y").u8(3);
    }));
    BodyReader reader = body.reader();
    const Dictionary result = reader.dictionary();
    EXPECT_EQ(result, (Dictionary{{"b", 3}, {"a", 2}}));
    EXPECT_EQ((*result.begin()).key.text(), "b");
}

TEST(BodyReaderTest, AnEmptyDictionaryHasItsPaddingAllTheSame) {
    const Body body(Bytes().u32(0).pad(8).u64(9));
    BodyReader reader = body.reader();
    EXPECT_EQ(reader.dictionary(), Dictionary());
    EXPECT_EQ(reader.int64(), 9);
    EXPECT_FALSE(reader.error());
}

TEST(BodyReaderTest, DictionariesInAnArrayAreRead) {
    // The first element begins at 4, so its empty list of entries needs no padding; the second begins at 8.
    const Body body(Bytes().u32(22).u32(0).u32(10).pad(8).text("i").type("y").u8(3));
    BodyReader reader = body.reader();
    EXPECT_EQ(reader.dictionaries(), (Array{Dictionary(), Dictionary{{"i", 3}}}));
    reader.finish();
    EXPECT_FALSE(reader.error());
}

/// The error of a dictionary with one value of `type`.
template <class Add>
ProtocolError errorOf(std::string_view type, const Add& add, std::uint32_t depth = 32) {
    const Body body(oneEntry(type, add), depth);
    BodyReader reader = body.reader();
    EXPECT_EQ(reader.dictionary(), Dictionary());
    reader.finish();
    EXPECT_TRUE(reader.error());
    return reader.error().value_or(ProtocolError());
}

TEST(BodyReaderTest, OtherTypesAreInvalidArgumentsThatNameTheKey) {
    for (const std::string type : {"v", "(ii)", "a{ss}", "a{sx}", "h", "ah", "(s)", "a(ii)", "a{yv}", "((sd))"}) {
        const ProtocolError error = errorOf(type, [](Bytes& bytes) { bytes.pad(8).u64(0).u64(0); });
        EXPECT_EQ(error.name, kInvalidArgsError) << type;
        EXPECT_EQ(error.text, "the value of \"k\" is of the type \"" + type + "\", which no property-list value has");
    }
}

TEST(BodyReaderTest, AnArrayOfWhatNoValueHasIsRefusedWhenItIsEmptyToo) {
    EXPECT_EQ(errorOf("a(ii)", [](Bytes& bytes) { bytes.pad(4).u32(0).pad(8); }).name, kInvalidArgsError);
}

TEST(BodyReaderTest, TheInnermostKeyIsNamed) {
    const ProtocolError error =
        errorOf("a{sv}", [](Bytes& b) { b.pad(4).u32(11).pad(8).text("inner").type("v").type("y"); });
    EXPECT_THAT(error.text, StartsWith("the value of \"inner\" is of the type \"v\""));
}

TEST(BodyReaderTest, AStructOfAStringAndARealIsADateOnlyWhenItSaysSo) {
    const ProtocolError error = errorOf("(sd)", [](Bytes& b) { b.pad(8).text("time").pad(8).f64(1); });
    EXPECT_EQ(error.name, kInvalidArgsError);
    EXPECT_THAT(error.text, HasSubstr("\"k\""));
    EXPECT_THAT(error.text, HasSubstr("\"time\""));
}

TEST(BodyReaderTest, KeysInErrorTextsAreCutAndStayValid) {
    std::string key = "\x01";
    for (int count = 0; count < 1000; ++count) {
        key += "\xC3\xA4";
    }
    const Body body(
        dictionaryBody(Order::Little, [&](Bytes& entries) { entries.text(key).type("v").type("y").u8(1); }));
    BodyReader reader = body.reader();
    reader.dictionary();
    ASSERT_TRUE(reader.error());
    EXPECT_LT(reader.error()->text.size(), 200U);
    EXPECT_THAT(reader.error()->text, StartsWith("the value of \"?\xC3\xA4"));
    EXPECT_TRUE(isValidText(reader.error()->text));
}

TEST(BodyReaderTest, MalformedValuesAreInconsistentMessages) {
    const auto text = [](std::string_view type, auto add) {
        const ProtocolError error = errorOf(type, add);
        EXPECT_EQ(error.name, kInconsistentMessageError);
        return error.text;
    };
    EXPECT_EQ(text("b", [](Bytes& b) { b.pad(4).u32(2); }), "a boolean is neither 0 nor 1");
    EXPECT_EQ(text("s", [](Bytes& b) { b.text("\xFF"); }), "a string is not valid UTF-8 or holds NUL");
    EXPECT_EQ(text("s", [](Bytes& b) { b.text("a\0b"sv); }), "a string is not valid UTF-8 or holds NUL");
    EXPECT_EQ(text("s", [](Bytes& b) { b.text("01234567\0abcdefgh"sv); }), "a string is not valid UTF-8 or holds NUL");
    EXPECT_EQ(text("s", [](Bytes& b) { b.text("\xED\xA0\x80"); }), "a string is not valid UTF-8 or holds NUL");
    EXPECT_EQ(text("s", [](Bytes& b) { b.pad(4).u32(1).raw("ab"); }), "a text does not end in NUL");
    EXPECT_EQ(text("s", [](Bytes& b) { b.pad(4).u32(0xFFFFFFFF).raw("ab"); }), "a value reaches behind the end");
    EXPECT_EQ(text("o", [](Bytes& b) { b.text("a"); }), "an object path has not the form of one");
    EXPECT_EQ(text("g", [](Bytes& b) { b.type("a"); }), "a signature has not the form of one");
    EXPECT_EQ(text("", [](Bytes&) {}), "a variant's signature is not one complete type");
    EXPECT_EQ(text("yy", [](Bytes& b) { b.u8(1).u8(1); }), "a variant's signature is not one complete type");
    EXPECT_EQ(text("x", [](Bytes& b) { b.pad(8, 'x').u64(1); }), "padding is not zero");
    EXPECT_EQ(text("x", [](Bytes& b) { b.pad(8).u32(1); }), "a value reaches behind the end");
    EXPECT_EQ(text("ax", [](Bytes& b) { b.pad(4).u32(9).pad(8).u64(1).u64(2); }),
              "an array's last element reaches behind the array's end");
    EXPECT_EQ(text("ay", [](Bytes& b) { b.pad(4).u32(0x04000001); }), "an array is longer than 64 MiB");
    EXPECT_EQ(text("ay", [](Bytes& b) { b.pad(4).u32(0x04000000); }), "a value reaches behind the end");
}

TEST(BodyReaderTest, EveryShorterBodyFails) {
    const std::string whole =
        oneEntry("a{sv}", [](Bytes& b) { b.pad(4).u32(13).pad(8).text("i").type("s").u32(1).raw("x\0"sv); }).bytes();
    for (std::size_t length = 0; length < whole.size(); ++length) {
        const Body body(Bytes().raw(whole.substr(0, length)));
        BodyReader reader = body.reader();
        reader.dictionary();
        EXPECT_TRUE(reader.error()) << length;
    }
}

TEST(BodyReaderTest, WhatIsLeftOverIsAnError) {
    const Body body(Bytes().u32(1).u8(0));
    BodyReader reader = body.reader();
    EXPECT_TRUE(reader.boolean());
    EXPECT_FALSE(reader.error());
    reader.finish();
    ASSERT_TRUE(reader.error());
    EXPECT_EQ(reader.error()->text, "a body is longer than its signature says");
}

TEST(BodyReaderTest, AfterAnErrorEverythingIsEmpty) {
    const Body body(Bytes().u32(9).u32(1).u32(1));
    BodyReader reader = body.reader();
    EXPECT_FALSE(reader.boolean() && reader.error());
    EXPECT_EQ(reader.uint32(), 0U);
    EXPECT_EQ(reader.string(), "");
    EXPECT_EQ(reader.dictionary(), Dictionary());
    EXPECT_EQ(reader.variant(), Value());
    reader.finish();
    EXPECT_EQ(reader.error()->text, "a boolean is neither 0 nor 1");
}

// Nesting.

TEST(BodyReaderTest, ADictionaryOfNumbersHasTheDepthOne) {
    const Body body(oneEntry("y", [](Bytes& b) { b.u8(1); }), 1);
    BodyReader reader = body.reader();
    EXPECT_EQ(reader.dictionary(), (Dictionary{{"k", 1}}));
    EXPECT_FALSE(reader.error());
}

TEST(BodyReaderTest, NestingBeyondTheDepthNamesTheLimit) {
    for (const char* type : {"a{sv}", "av", "ax"}) {
        const ProtocolError error = errorOf(
            type, [](Bytes& b) { b.pad(4).u32(0).pad(8); }, 1);
        EXPECT_EQ(error.name, kLimitsExceededError);
        EXPECT_EQ(error.text, "limits.value_depth is 1: a value is nested more deeply");
    }
}

TEST(BodyReaderTest, DataIsNoContainer) {
    const Body body(oneEntry("ay", [](Bytes& b) { b.pad(4).u32(0); }), 1);
    BodyReader reader = body.reader();
    EXPECT_EQ(reader.dictionary(), (Dictionary{{"k", Data()}}));
    EXPECT_FALSE(reader.error());
}

TEST(BodyReaderTest, ContainersBesideEachOtherDoNotNest) {
    const Body body(dictionaryBody(Order::Little,
                                   [](Bytes& entries) {
                                       for (int count = 0; count < 100; ++count) {
                                           entries.pad(8).text(std::to_string(count)).type("av").pad(4).u32(0);
                                       }
                                   }),
                    2);
    BodyReader reader = body.reader();
    EXPECT_EQ(reader.dictionary().size(), 100U);
    EXPECT_FALSE(reader.error());
}

} // namespace

} // namespace vela::platform::dbus
