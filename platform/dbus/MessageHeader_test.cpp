// Headers of messages, read from literal bytes in both orders.
#include "platform/dbus/MessageBytes_test.h"
#include "platform/dbus/MessageReader.h"
#include "platform/dbus/MessageWriter.h"

#include <cmath>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <limits>

namespace vela::platform::dbus {

namespace {

using std::string_view_literals::operator""sv; // NOLINT(misc-unused-using-decls): the tool does not see literals

// The form of a message.

/// A call of `/a` `M` without arguments, in either order.
constexpr std::string_view kLittleCall = "l\1\0\1\0\0\0\0\7\0\0\0\x1A\0\0\0"
                                         "\1\1o\0\2\0\0\0/a\0\0\0\0\0\0"
                                         "\3\1s\0\1\0\0\0M\0\0\0\0\0\0\0"sv;
constexpr std::string_view kBigCall = "B\1\0\1\0\0\0\0\0\0\0\7\0\0\0\x1A"
                                      "\1\1o\0\0\0\0\2/a\0\0\0\0\0\0"
                                      "\3\1s\0\0\0\0\1M\0\0\0\0\0\0\0"sv;

TEST(MessageReaderTest, ACallIsReadInBothOrders) {
    for (const std::string_view bytes : {kLittleCall, kBigCall}) {
        MessageHeader header;
        ASSERT_FALSE(header.read(bytes));
        EXPECT_EQ(header.type, MessageType::MethodCall);
        EXPECT_EQ(header.serial, 7U);
        EXPECT_EQ(header.path, "/a");
        EXPECT_EQ(header.member, "M");
        EXPECT_EQ(header.interface, "");
        EXPECT_EQ(header.body, "");
        EXPECT_TRUE(header.replyExpected());
    }
}

TEST(MessageReaderTest, AFrameIsIncompleteUntilItsFixedPartIsThere) {
    for (const std::string_view bytes : {kLittleCall, kBigCall}) {
        for (std::size_t length = 0; length < 16; ++length) {
            EXPECT_EQ(frameOf(bytes.substr(0, length)).state, Frame::State::Incomplete) << length;
        }
        const Frame frame = frameOf(bytes.substr(0, 16));
        EXPECT_EQ(frame.state, Frame::State::Known);
        EXPECT_EQ(frame.bytes, 48U);
        EXPECT_EQ(frame.headerBytes, 48U);
        EXPECT_EQ(frame.serial, 7U);
        EXPECT_EQ(frame.type, MessageType::MethodCall);
    }
}

TEST(MessageReaderTest, AFramePadsItsHeaderAndNotItsBody) {
    const Frame frame = frameOf("l\1\1\1\3\0\0\0\7\0\0\0\x09\0\0\0"sv);
    EXPECT_EQ(frame.headerBytes, 32U);
    EXPECT_EQ(frame.bytes, 35U);
    EXPECT_EQ(frame.flags, kNoReplyExpectedFlag);
}

TEST(MessageReaderTest, WhatCannotBeginAMessageIsKnownAtItsFirstWrongByte) {
    EXPECT_EQ(frameOf("L").state, Frame::State::Invalid);
    EXPECT_EQ(frameOf("l\0"sv).state, Frame::State::Invalid);
    EXPECT_EQ(frameOf("l\1\0\2"sv).state, Frame::State::Invalid);
    EXPECT_EQ(frameOf("l\1\0\1\0\0\0\0\0\0\0\0\0\0\0\0"sv).state, Frame::State::Invalid) << "serial 0";
}

TEST(MessageReaderTest, AnnouncedSizesAreLimited) {
    // 128 MiB less the header is the longest body.
    EXPECT_EQ(frameOf("l\1\0\1\xF0\xFF\xFF\x07\7\0\0\0\0\0\0\0"sv).bytes, kMaximumMessageBytes);
    EXPECT_EQ(frameOf("l\1\0\1\xF1\xFF\xFF\x07\7\0\0\0\0\0\0\0"sv).state, Frame::State::Invalid);
    EXPECT_EQ(frameOf("l\1\0\1\xFF\xFF\xFF\xFF\7\0\0\0\0\0\0\0"sv).state, Frame::State::Invalid);
    EXPECT_EQ(frameOf("l\1\0\1\0\0\0\0\7\0\0\0\0\0\0\x04"sv).state, Frame::State::Known);
    EXPECT_EQ(frameOf("l\1\0\1\0\0\0\0\7\0\0\0\1\0\0\x04"sv).state, Frame::State::Invalid);
    EXPECT_EQ(frameOf("l\1\0\1\0\0\0\0\7\0\0\0\xFF\xFF\xFF\xFF"sv).state, Frame::State::Invalid);
}

TEST(MessageReaderTest, EveryShorterOrLongerTextIsNoMessage) {
    MessageHeader header;
    for (std::size_t length = 0; length < kLittleCall.size(); ++length) {
        EXPECT_TRUE(header.read(kLittleCall.substr(0, length))) << length;
    }
    EXPECT_TRUE(header.read(std::string(kLittleCall) + "x"));
}

TEST(MessageReaderTest, AllHeaderFieldsAreRead) {
    Bytes fields;
    textField(fields, HeaderField::Path, "o", "/");
    textField(fields, HeaderField::Interface, "s", "a.b");
    textField(fields, HeaderField::Member, "s", "m_1");
    textField(fields, HeaderField::ErrorName, "s", "e.f");
    fields.pad(8).u8(5).type("u").u32(9);
    textField(fields, HeaderField::Destination, "s", ":1.7");
    textField(fields, HeaderField::Sender, "s", "org.x-y");
    textField(fields, HeaderField::Signature, "g", "u");
    fields.pad(8).u8(9).type("u").u32(0);
    const std::string message = messageOf(MessageType::Signal, fields, Bytes().u32(3));
    MessageHeader header;
    ASSERT_FALSE(header.read(message));
    EXPECT_EQ(header.interface, "a.b");
    EXPECT_EQ(header.member, "m_1");
    EXPECT_EQ(header.errorName, "e.f");
    EXPECT_EQ(header.replySerial, 9U);
    EXPECT_EQ(header.destination, ":1.7");
    EXPECT_EQ(header.sender, "org.x-y");
    EXPECT_EQ(header.signature, "u");
    EXPECT_EQ(header.body, "\3\0\0\0"sv);
    EXPECT_FALSE(header.replyExpected());
}

/// The text of what is wrong with a call of these fields beside a path and a member; empty for nothing.
std::string faultOf(const Bytes& fields, MessageType type = MessageType::MethodCall) {
    MessageHeader header;
    const auto error = header.read(messageOf(type, fields, Bytes(fields.order())));
    EXPECT_TRUE(!error || error->name == kInconsistentMessageError);
    return error ? error->text : "";
}

Bytes callFields() {
    Bytes fields;
    textField(fields, HeaderField::Path, "o", "/a");
    textField(fields, HeaderField::Member, "s", "M");
    return fields;
}

TEST(MessageReaderTest, AnUnknownHeaderFieldIsPassedOver) {
    Bytes fields = callFields();
    fields.pad(8).u8(77).type("a(yv)").pad(4).u32(5).pad(8).u8(1).type("y").u8(9);
    EXPECT_EQ(faultOf(fields), "");
}

TEST(MessageReaderTest, AnUnknownHeaderFieldIsCheckedAllTheSame) {
    Bytes fields = callFields();
    fields.pad(8).u8(77).type("b").pad(4).u32(2);
    EXPECT_EQ(faultOf(fields), "a boolean is neither 0 nor 1");
}

TEST(MessageReaderTest, AnUnknownHeaderFieldMayNotNestForEver) {
    Bytes fields = callFields();
    fields.pad(8).u8(77);
    for (int depth = 0; depth < 1000; ++depth) {
        fields.type("v");
    }
    fields.type("y").u8(1);
    EXPECT_EQ(faultOf(fields), "values are nested too deeply");
}

TEST(MessageReaderTest, FieldsOfTheWrongTypeAreRefused) {
    Bytes fields;
    textField(fields, HeaderField::Path, "s", "/a");
    EXPECT_EQ(faultOf(fields), "a header field is of the wrong type");
}

TEST(MessageReaderTest, FieldsThatStandTwiceAreRefused) {
    Bytes fields = callFields();
    textField(fields, HeaderField::Member, "s", "M");
    EXPECT_EQ(faultOf(fields), "a header field stands twice");
}

TEST(MessageReaderTest, AFieldWithCodeZeroIsRefused) {
    Bytes fields = callFields();
    fields.pad(8).u8(0).type("y").u8(1);
    EXPECT_EQ(faultOf(fields), "a header field has the code 0");
}

TEST(MessageReaderTest, NamesAreChecked) {
    const struct {
        HeaderField code;
        const char* text;
    } wrong[] = {
        {HeaderField::Interface, "nodot"},  {HeaderField::Interface, "a..b"}, {HeaderField::Interface, "a.1b"},
        {HeaderField::ErrorName, ".a.b"},   {HeaderField::ErrorName, "a.b."}, {HeaderField::Destination, ":1."},
        {HeaderField::Destination, "1a.b"}, {HeaderField::Sender, ""},        {HeaderField::Sender, "a.b c"}};
    for (const auto& [code, text] : wrong) {
        Bytes fields = callFields();
        textField(fields, code, "s", text);
        EXPECT_EQ(faultOf(fields), "a name in the header has not the form of one") << text;
    }
}

TEST(MessageReaderTest, MembersAreChecked) {
    for (const char* member : {"", "a.b", "1a", "a-b", "\xC3\xA4"}) {
        Bytes fields;
        textField(fields, HeaderField::Path, "o", "/a");
        textField(fields, HeaderField::Member, "s", member);
        EXPECT_EQ(faultOf(fields), "a name in the header has not the form of one") << member;
    }
}

TEST(MessageReaderTest, ObjectPathsAreChecked) {
    for (const char* path : {"", "a", "/a/", "//", "/a//b", "/a-b", "/\xC3\xA4"}) {
        Bytes fields;
        textField(fields, HeaderField::Path, "o", path);
        EXPECT_EQ(faultOf(fields), "an object path has not the form of one") << path;
    }
}

TEST(MessageReaderTest, WhatATypeDemandsMustBeThere) {
    const Bytes none;
    Bytes path;
    textField(path, HeaderField::Path, "o", "/a");
    Bytes reply;
    reply.pad(8).u8(5).type("u").u32(9);
    EXPECT_EQ(faultOf(none), "a call has no path or no member");
    EXPECT_EQ(faultOf(path), "a call has no path or no member");
    EXPECT_EQ(faultOf(callFields(), MessageType::Signal), "a signal has no path, no interface or no member");
    EXPECT_EQ(faultOf(none, MessageType::MethodReturn), "a reply has no reply serial");
    EXPECT_EQ(faultOf(reply, MessageType::Error), "an error has no reply serial or no name");
    EXPECT_EQ(faultOf(reply, MessageType::MethodReturn), "");
}

TEST(MessageReaderTest, AMessageOfALaterTypeIsRead) { EXPECT_EQ(faultOf(Bytes(), static_cast<MessageType>(200)), ""); }

TEST(MessageReaderTest, ReservedNamesAreRefused) {
    Bytes fields = callFields();
    textField(fields, HeaderField::Interface, "s", "org.freedesktop.DBus.Local");
    EXPECT_EQ(faultOf(fields), "a name is reserved");
}

TEST(MessageReaderTest, FileDescriptorsAreRefused) {
    Bytes fields = callFields();
    fields.pad(8).u8(9).type("u").u32(1);
    EXPECT_EQ(faultOf(fields), "file descriptors were not agreed upon");
}

TEST(MessageReaderTest, AReplySerialIsNotZero) {
    Bytes fields = callFields();
    fields.pad(8).u8(5).type("u").u32(0);
    EXPECT_EQ(faultOf(fields), "a reply serial is zero");
}

TEST(MessageReaderTest, PaddingBehindTheFieldsIsZero) {
    std::string message(kLittleCall);
    message.back() = 'x';
    MessageHeader header;
    ASSERT_TRUE(header.read(message));
    EXPECT_EQ(header.read(message)->text, "padding is not zero");
}

TEST(MessageReaderTest, ABodyNeedsASignature) {
    MessageHeader header;
    const auto error = header.read(messageOf(MessageType::MethodCall, callFields(), Bytes().u32(1)));
    ASSERT_TRUE(error);
    EXPECT_EQ(error->text, "a body has no signature");
}

// A sender's headers, one after the other.

std::string callWith(std::string_view member, std::uint32_t serial, std::string_view signature = {},
                     const Bytes& body = Bytes()) {
    return callOf(member, signature, body, serial);
}

void expectAsByItself(HeaderReader& reader, std::string_view message) {
    MessageHeader alone;
    ASSERT_FALSE(alone.read(message));
    ASSERT_FALSE(reader.read(message));
    const MessageHeader& header = reader.header();
    EXPECT_EQ(header.type, alone.type);
    EXPECT_EQ(header.flags, alone.flags);
    EXPECT_EQ(header.foreignOrder, alone.foreignOrder);
    EXPECT_EQ(header.serial, alone.serial);
    EXPECT_EQ(header.path, alone.path);
    EXPECT_EQ(header.interface, alone.interface);
    EXPECT_EQ(header.member, alone.member);
    EXPECT_EQ(header.signature, alone.signature);
    EXPECT_EQ(header.body.data(), alone.body.data());
    EXPECT_EQ(header.body.size(), alone.body.size());
}

TEST(HeaderReaderTest, RepeatedHeadersAreReadAsByThemselves) {
    HeaderReader reader;
    for (const std::string& message :
         {callWith("One", 1, "x", Bytes().u64(5)), callWith("One", 2, "x", Bytes().u64(6)),
          callWith("One", 3, "y", Bytes().u8(6)), callWith("One", 4, "y", Bytes().u8(7)), callWith("Two", 5),
          callWith("Two", 6), callWith("One", 7, "x", Bytes().u64(5)), std::string(kLittleCall), std::string(kBigCall),
          std::string(kBigCall), std::string(kLittleCall)}) {
        expectAsByItself(reader, message);
    }
}

TEST(HeaderReaderTest, TheTextsOutliveTheFirstMessage) {
    HeaderReader reader;
    {
        const std::string first = callWith("One", 1);
        ASSERT_FALSE(reader.read(first));
    }
    const std::string second = callWith("One", 2);
    ASSERT_FALSE(reader.read(second));
    EXPECT_EQ(reader.header().member, "One");
    EXPECT_EQ(reader.header().serial, 2U);
}

TEST(HeaderReaderTest, ABodyWithoutASignatureIsNoRepetition) {
    HeaderReader reader;
    ASSERT_FALSE(reader.read(callWith("One", 1)));
    EXPECT_TRUE(reader.read(callWith("One", 2, {}, Bytes().u64(5))));
}

TEST(HeaderReaderTest, AnotherLengthThanAnnouncedIsNoRepetition) {
    HeaderReader reader;
    const std::string message = callWith("One", 1, "x", Bytes().u64(5));
    ASSERT_FALSE(reader.read(message));
    EXPECT_TRUE(reader.read(message + '\0'));
    EXPECT_TRUE(reader.read(std::string_view(message).substr(0, message.size() - 1)));
    EXPECT_FALSE(reader.read(message));
}

TEST(HeaderReaderTest, AMessageAfterAnErrorIsReadWhole) {
    HeaderReader reader;
    ASSERT_FALSE(reader.read(kLittleCall));
    std::string broken(kLittleCall);
    broken[16] = 0; // a field's code
    EXPECT_TRUE(reader.read(broken));
    expectAsByItself(reader, kLittleCall);
    expectAsByItself(reader, kLittleCall);
}

TEST(HeaderReaderTest, LongHeadersAreReadEachTime) {
    HeaderReader reader;
    const std::string member(200, 'm');
    const std::string path = "/" + std::string(600, 'p');
    for (const std::uint32_t serial : {1U, 2U}) {
        std::string bytes;
        MessageWriter writer(bytes);
        writer.beginCall({.serial = serial, .path = path, .interface = "a.b", .member = member});
        ASSERT_TRUE(writer.finish());
        expectAsByItself(reader, bytes);
    }
}

} // namespace

} // namespace vela::platform::dbus
