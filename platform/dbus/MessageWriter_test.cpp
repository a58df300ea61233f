// What is written, byte by byte and read back.
#include "platform/dbus/MessageBytes_test.h"
#include "platform/dbus/MessageReader.h"
#include "platform/dbus/MessageWriter.h"

#include <cmath>
#include <gmock/gmock.h>
#include <gtest/gtest.h>

namespace vela::platform::dbus {

namespace {

using ::testing::ElementsAre;
using ::testing::Optional;
using std::string_view_literals::operator""sv;

constexpr CallHeader kCall = {.serial = 7, .path = "/a", .interface = "i.j", .member = "M"};

CallHeader callWith(std::string_view signature) {
    CallHeader header = kCall;
    header.signature = signature;
    return header;
}

/// A written message, read back.
struct ReadBack {
    explicit ReadBack(std::string_view message) {
        const auto error = header.read(message);
        EXPECT_FALSE(error) << error->text;
    }
    MessageHeader header;
};

Dictionary throughTheWire(const Dictionary& dictionary) {
    std::string buffer;
    MessageWriter writer(buffer);
    writer.beginCall(callWith("a{sv}"));
    writer.dictionary(dictionary);
    EXPECT_TRUE(writer.finish());
    const ReadBack back(buffer);
    BodyReader reader(back.header);
    Dictionary result = reader.dictionary();
    reader.finish();
    EXPECT_FALSE(reader.error()) << reader.error()->text;
    return result;
}

TEST(MessageWriterTest, ACallIsTheseBytes) {
    std::string buffer;
    MessageWriter writer(buffer);
    writer.beginCall({.serial = 7, .path = "/a", .interface = {}, .member = "M", .signature = "y"});
    writer.byte(5);
    ASSERT_TRUE(writer.finish());
    // As these tests' machines order them: little-endian.
    EXPECT_EQ(buffer, "l\1\0\1\1\0\0\0\7\0\0\0\x27\0\0\0"
                      "\1\1o\0\2\0\0\0/a\0\0\0\0\0\0"
                      "\3\1s\0\1\0\0\0M\0\0\0\0\0\0\0"
                      "\x08\1g\0\1y\0\0"
                      "\5"sv);
}

TEST(MessageWriterTest, HeadersAreReadBack) {
    std::string buffer;
    MessageWriter writer(buffer);
    writer.beginCall({.serial = 9,
                      .path = "/a/b",
                      .interface = "i.j",
                      .member = "M",
                      .destination = "d.e",
                      .signature = {},
                      .replyExpected = false});
    ASSERT_TRUE(writer.finish());
    const ReadBack call(buffer);
    EXPECT_EQ(call.header.type, MessageType::MethodCall);
    EXPECT_EQ(call.header.destination, "d.e");
    EXPECT_FALSE(call.header.replyExpected());

    buffer.clear();
    writer.beginReturn({.serial = 1, .replySerial = 9, .sender = "s.t", .signature = "b"});
    writer.boolean(true);
    ASSERT_TRUE(writer.finish());
    const ReadBack reply(buffer);
    EXPECT_EQ(reply.header.type, MessageType::MethodReturn);
    EXPECT_EQ(reply.header.replySerial, 9U);
    EXPECT_EQ(reply.header.sender, "s.t");

    buffer.clear();
    writer.error(kNoReplyError, "text", {.serial = 2, .replySerial = 9, .sender = {}, .signature = {}});
    const ReadBack error(buffer);
    EXPECT_EQ(error.header.type, MessageType::Error);
    EXPECT_EQ(error.header.errorName, "org.freedesktop.DBus.Error.NoReply");
    BodyReader reader(error.header);
    EXPECT_EQ(reader.string(), "text");

    buffer.clear();
    writer.beginSignal(kCall);
    ASSERT_TRUE(writer.finish());
    EXPECT_EQ(ReadBack(buffer).header.type, MessageType::Signal);
}

TEST(MessageWriterTest, MessagesStandBehindEachOtherWithoutPadding) {
    std::string buffer = "x";
    MessageWriter writer(buffer);
    for (int count = 0; count < 2; ++count) {
        writer.beginCall(callWith("y"));
        writer.byte(5);
        ASSERT_TRUE(writer.finish());
    }
    std::string_view rest = std::string_view(buffer).substr(1);
    for (int count = 0; count < 2; ++count) {
        const Frame frame = frameOf(rest);
        ASSERT_EQ(frame.state, Frame::State::Known);
        EXPECT_EQ(ReadBack(rest.substr(0, frame.bytes)).header.body, "\5");
        rest.remove_prefix(frame.bytes);
    }
    EXPECT_EQ(rest, "");
}

TEST(MessageWriterTest, EveryBasicTypeIsReadBack) {
    std::string buffer;
    MessageWriter writer(buffer);
    writer.beginCall(callWith("ybnqiuxtdsgayaxaaxaax"));
    writer.byte(1);
    writer.boolean(true);
    writer.int16(-2);
    writer.uint16(3);
    writer.int32(-4);
    writer.uint32(5);
    writer.int64(-6);
    writer.uint64(7);
    writer.real(8.5);
    writer.string("nine");
    writer.signature("a{sv}");
    writer.data("\0\1"sv);
    writer.int64s(std::vector<std::int64_t>{10, 11});
    writer.optionalInt64s(std::nullopt);
    writer.optionalInt64s(std::vector<std::int64_t>{12});
    ASSERT_TRUE(writer.finish());
    const ReadBack back(buffer);
    BodyReader reader(back.header);
    EXPECT_EQ(reader.byte(), 1);
    EXPECT_TRUE(reader.boolean());
    EXPECT_EQ(reader.int16(), -2);
    EXPECT_EQ(reader.uint16(), 3);
    EXPECT_EQ(reader.int32(), -4);
    EXPECT_EQ(reader.uint32(), 5U);
    EXPECT_EQ(reader.int64(), -6);
    EXPECT_EQ(reader.uint64(), 7U);
    EXPECT_EQ(reader.real(), 8.5);
    EXPECT_EQ(reader.string(), "nine");
    EXPECT_EQ(reader.signature(), "a{sv}");
    EXPECT_EQ(reader.data(), "\0\1"sv);
    EXPECT_THAT(reader.int64s(), ElementsAre(10, 11));
    EXPECT_EQ(reader.optionalInt64s(), std::nullopt);
    EXPECT_THAT(reader.optionalInt64s(), Optional(ElementsAre(12)));
    reader.finish();
    EXPECT_FALSE(reader.error());
}

TEST(MessageWriterTest, ValuesAreReadBackAsTheyWere) {
    const Dictionary nested{{"inner", Array{1, "two", Value(Array{3.5})}}, {"empty", Dictionary()}};
    const Dictionary all{{"boolean", true},
                         {"integer", -1},
                         {"unsigned", 18446744073709551615U},
                         {"real", 0.1},
                         {"string", "\xC3\xA4"},
                         {"empty", ""},
                         {"data", Data("\0\xFF"sv)},
                         {"date", Date{-1.25}},
                         {"array", Array{false, Date{2}, Data()}},
                         {"none", Array()},
                         {"dictionary", nested},
                         {"", 12}};
    EXPECT_EQ(throughTheWire(all), all);
    EXPECT_EQ(throughTheWire({}), Dictionary());
    EXPECT_TRUE(throughTheWire(all).hasSameKeysInOrder(all));
}

TEST(MessageWriterTest, ARealOf32BitsArrivesAsTheSameNumber) {
    const Dictionary back = throughTheWire({{"real", 0.1F}});
    EXPECT_EQ(back.find("real").kind(), ValueKind::Real);
    EXPECT_EQ(back.find("real").real(), static_cast<double>(0.1F));
}

TEST(MessageWriterTest, RealsKeepEveryBit) {
    EXPECT_TRUE(std::isnan(throughTheWire({{"r", std::nan("")}}).find("r").real()));
    EXPECT_TRUE(std::signbit(throughTheWire({{"r", -0.0}}).find("r").real()));
}

TEST(MessageWriterTest, BytesThatAreNoTextAreReplaced) {
    EXPECT_EQ(throughTheWire({{"k\xFF", "a\0b\xC3"sv}}), (Dictionary{{"k\xEF\xBF\xBD", "a\xEF\xBF\xBD"
                                                                                       "b\xEF\xBF\xBD"}}));
}

TEST(MessageWriterTest, VariantsOfAFixedTypeAreWrittenAsThat) {
    std::string buffer;
    MessageWriter writer(buffer);
    writer.beginReturn({.serial = 1, .replySerial = 2, .sender = {}, .signature = "a{sv}"});
    const auto entries = writer.openDictionary();
    writer.key("reporterID");
    writer.variantInt64(42);
    writer.key("serviceType");
    writer.variantUint16(65535);
    writer.closeArray(entries);
    ASSERT_TRUE(writer.finish());
    const ReadBack back(buffer);
    EXPECT_EQ(back.header.body, "\x36\0\0\0\0\0\0\0"
                                "\x0A\0\0\0reporterID\0\1x\0\0\0\0\0\0\0\x2A\0\0\0\0\0\0\0"
                                "\x0B\0\0\0serviceType\0\1q\0\0\xFF\xFF"sv);
}

TEST(MessageWriterTest, AMessageBeyondTheProtocolsLimitsLeavesNothing) {
    std::string buffer = "before";
    MessageWriter writer(buffer);
    writer.beginCall(callWith("ay"));
    writer.data(std::string(kMaximumArrayBytes + 1, 'x'));
    EXPECT_FALSE(writer.finish());
    EXPECT_EQ(buffer, "before");
    writer.beginCall(callWith("ay"));
    writer.data("x");
    EXPECT_TRUE(writer.finish());
}

} // namespace

} // namespace vela::platform::dbus
