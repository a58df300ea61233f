#include "client/ValueEncoder.h"
#include "common/values/Dictionary.h"
#include "common/values/Json.h"
#include "platform/dbus/MessageReader.h"

#include <array>
#include <cmath>
#include <cstring>
#include <gtest/gtest.h>
#include <limits>
#include <string>
#include <vector>

namespace vela::client {

namespace {

constexpr std::size_t kPlenty = 1 << 20;
constexpr Stamps kStamps{1234.5, 77, 8888};

VelaReportingField field(const char* key, VelaReportingValue value) { return {key, std::strlen(key), value}; }

/// A message as the service reads it.
struct ReadMessage {
    Dictionary dictionary;
    std::uint32_t category = 0;
    std::uint16_t type = 0;
    std::optional<std::vector<std::int64_t>> reporterIDs;
    std::string error;
};

template <class Arguments>
std::string encoded(const Arguments& arguments) {
    const Measure measured = measure(arguments, kPlenty);
    EXPECT_EQ(measured.status, VelaReportingStatusOk);
    // What the writer does not write would show.
    std::string body(measured.bytes, '\xEE');
    write(arguments, std::as_writable_bytes(std::span(body)));
    return body;
}

ReadMessage readBack(const MessageArguments& arguments) {
    const std::string body = encoded(arguments);
    platform::dbus::MessageHeader header;
    header.body = body;
    platform::dbus::BodyReader reader(header);
    ReadMessage message;
    message.dictionary = reader.dictionary();
    message.category = reader.uint32();
    message.type = reader.uint16();
    message.reporterIDs = reader.optionalInt64s();
    reader.finish();
    message.error = reader.error() ? reader.error()->text : "";
    return message;
}

Value readBack(VelaReportingValue value) {
    const VelaReportingField fields[] = {field("k", value)};
    const ReadMessage message = readBack(MessageArguments{fields, 1, 2, true, {}, kStamps});
    EXPECT_EQ(message.error, "");
    EXPECT_EQ(message.dictionary.size(), 4U);
    return Value(message.dictionary.find("k"));
}

Measure measureOf(VelaReportingValue value, std::size_t most = kPlenty) {
    const VelaReportingField fields[] = {field("k", value)};
    return measure(MessageArguments{fields, 1, 2, true, {}, kStamps}, most);
}

TEST(ValueEncoderTest, Booleans) {
    EXPECT_EQ(readBack(VelaReportingBoolean(true)), Value(true));
    EXPECT_EQ(readBack(VelaReportingBoolean(false)), Value(false));
}

TEST(ValueEncoderTest, IntegersHave64Bits) {
    constexpr auto kLeast = std::numeric_limits<std::int64_t>::min();
    EXPECT_EQ(readBack(VelaReportingInteger(kLeast)), Value(kLeast));
    EXPECT_EQ(readBack(VelaReportingInteger(-1)), Value(-1));
}

TEST(ValueEncoderTest, UnsignedIntegersGoBeyondTheSignedRange) {
    constexpr auto kMost = std::numeric_limits<std::uint64_t>::max();
    EXPECT_EQ(readBack(VelaReportingUnsigned(kMost)), Value(kMost));
    EXPECT_EQ(readBack(VelaReportingUnsigned(5)), Value(5));
}

TEST(ValueEncoderTest, Doubles) {
    EXPECT_EQ(readBack(VelaReportingDouble(-0.25)), Value(-0.25));
    EXPECT_EQ(readBack(VelaReportingDouble(std::nan(""))), Value(std::nan("")));
}

TEST(ValueEncoderTest, Texts) {
    EXPECT_EQ(readBack(VelaReportingText("Grüße")), Value("Grüße"));
    EXPECT_EQ(readBack(VelaReportingText("")), Value(""));
    EXPECT_EQ(readBack(VelaReportingTextOfSize(nullptr, 0)), Value(""));
    EXPECT_EQ(readBack(VelaReportingTextOfSize("longer", 4)), Value("long"));
}

TEST(ValueEncoderTest, BytesThatAreNoTextBecomeReplacementCharacters) {
    EXPECT_EQ(readBack(VelaReportingText("a\xFFz")), Value("a\xEF\xBF\xBDz"));
    EXPECT_EQ(readBack(VelaReportingTextOfSize("a\0z", 3)), Value("a\xEF\xBF\xBDz"));
    EXPECT_EQ(readBack(VelaReportingText("cut\xE2\x82")), Value("cut\xEF\xBF\xBD\xEF\xBF\xBD"));
}

TEST(ValueEncoderTest, KeysAreRepairedLikeTexts) {
    const VelaReportingField fields[] = {field("a\xFF", VelaReportingInteger(1))};
    const ReadMessage message = readBack(MessageArguments{fields, 1, 2, true, {}, kStamps});
    EXPECT_EQ(message.dictionary.find("a\xEF\xBF\xBD").integerValue(), 1);
}

TEST(ValueEncoderTest, Data) {
    EXPECT_EQ(readBack(VelaReportingData("\0\xFF", 2)), Value(Data(std::string_view("\0\xFF", 2))));
    EXPECT_EQ(readBack(VelaReportingData(nullptr, 0)), Value(Data()));
}

TEST(ValueEncoderTest, Dates) { EXPECT_EQ(readBack(VelaReportingDate(86400.5)), Value(Date{86400.5})); }

TEST(ValueEncoderTest, ArraysMayHoldEveryKind) {
    const VelaReportingValue values[] = {VelaReportingText("x"), VelaReportingDouble(1.5), VelaReportingBoolean(true),
                                         VelaReportingArray(nullptr, 0)};
    EXPECT_EQ(readBack(VelaReportingArray(values, 4)), Value(Array{"x", 1.5, true, Array()}));
    EXPECT_EQ(readBack(VelaReportingArray(nullptr, 0)), Value(Array()));
}

TEST(ValueEncoderTest, DictionariesWithinDictionaries) {
    const VelaReportingField inner[] = {field("a", VelaReportingInteger(1)), field("b", VelaReportingText("two"))};
    EXPECT_EQ(readBack(VelaReportingDictionary(inner, 2)), Value(Dictionary{{"a", 1}, {"b", "two"}}));
    EXPECT_EQ(readBack(VelaReportingDictionary(nullptr, 0)), Value(Dictionary()));
}

TEST(ValueEncoderTest, EveryAlignmentIsRightWhateverStandsBefore) {
    for (std::size_t length = 0; length < 9; ++length) {
        const std::string text(length, 'x');
        const VelaReportingValue values[] = {VelaReportingText(text.c_str()), VelaReportingDouble(0.5),
                                             VelaReportingBoolean(true), VelaReportingDate(3)};
        EXPECT_EQ(readBack(VelaReportingArray(values, 4)), Value(Array{std::string_view(text), 0.5, true, Date{3}}))
            << length;
    }
}

TEST(ValueEncoderTest, CategoryTypeAndSessionsFollowTheMessage) {
    const std::int64_t ids[] = {42, -1};
    const ReadMessage message = readBack(MessageArguments{{}, 0xFFFFFFFF, 0xFFFE, false, ids, kStamps});
    EXPECT_EQ(message.error, "");
    EXPECT_EQ(message.category, 0xFFFFFFFFU);
    EXPECT_EQ(message.type, 0xFFFE);
    ASSERT_TRUE(message.reporterIDs);
    EXPECT_EQ(*message.reporterIDs, (std::vector<std::int64_t>{42, -1}));
}

TEST(ValueEncoderTest, AllSessionsIsAnotherThingThanNone) {
    EXPECT_EQ(readBack(MessageArguments{{}, 1, 2, true, {}, kStamps}).reporterIDs, std::nullopt);
    const auto none = readBack(MessageArguments{{}, 1, 2, false, {}, kStamps});
    EXPECT_EQ(none.error, "");
    EXPECT_EQ(none.reporterIDs, std::vector<std::int64_t>());
}

TEST(ValueEncoderTest, StampsAreAddedBehindTheMessage) {
    const VelaReportingField fields[] = {field("k", VelaReportingInteger(1))};
    const ReadMessage message = readBack(MessageArguments{fields, 1, 2, true, {}, kStamps});
    EXPECT_EQ(jsonText(Value(message.dictionary)),
              R"({"k":1,"velareporting_timestamp":1234.5,"systemuptime_sec":77,"processuptime_ms":8888})");
}

TEST(ValueEncoderTest, TheUptimeOfTheSystemHas32BitsOnTheWire) {
    const std::string body = encoded(MessageArguments{{}, 1, 2, true, {}, kStamps});
    const std::size_t key = body.find("systemuptime_sec");
    ASSERT_NE(key, std::string::npos);
    EXPECT_EQ(body.substr(key + 17, 3), std::string("\1i\0", 3));
}

TEST(ValueEncoderTest, StampsOfTheCallerStay) {
    const VelaReportingField fields[] = {field("systemuptime_sec", VelaReportingText("mine")),
                                         field("velareporting_timestamp", VelaReportingDouble(1)),
                                         field("processuptime_ms", VelaReportingInteger(2))};
    const ReadMessage message = readBack(MessageArguments{fields, 1, 2, true, {}, kStamps});
    EXPECT_EQ(jsonText(Value(message.dictionary)),
              R"({"systemuptime_sec":"mine","velareporting_timestamp":1.0,"processuptime_ms":2})");
}

TEST(ValueEncoderTest, EachStampStandsForItself) {
    const VelaReportingField fields[] = {field("systemuptime_sec", VelaReportingInteger(3))};
    const ReadMessage message = readBack(MessageArguments{fields, 1, 2, true, {}, kStamps});
    EXPECT_EQ(jsonText(Value(message.dictionary)),
              R"({"systemuptime_sec":3,"velareporting_timestamp":1234.5,"processuptime_ms":8888})");
}

TEST(ValueEncoderTest, AKeyThatOnlyBeginsLikeAStampIsNone) {
    const VelaReportingField fields[] = {field("systemuptime_seC", VelaReportingInteger(3))};
    const ReadMessage message = readBack(MessageArguments{fields, 1, 2, true, {}, kStamps});
    EXPECT_EQ(message.dictionary.size(), 4U);
}

TEST(ValueEncoderTest, ConfigurationsHaveNoStamps) {
    const VelaReportingField fields[] = {field("HostApplicationDisplayID", VelaReportingText("app"))};
    const std::string body = encoded(ConfigurationArguments{fields, -42});
    platform::dbus::MessageHeader header;
    header.body = body;
    platform::dbus::BodyReader reader(header);
    EXPECT_EQ(reader.dictionary(), (Dictionary{{"HostApplicationDisplayID", "app"}}));
    EXPECT_EQ(reader.int64(), -42);
    reader.finish();
    EXPECT_FALSE(reader.error());
}

TEST(ValueEncoderTest, AMessageMayHaveExactlyTheBytesAllowed) {
    const Measure measured = measureOf(VelaReportingText("text"));
    ASSERT_EQ(measured.status, VelaReportingStatusOk);
    EXPECT_EQ(measureOf(VelaReportingText("text"), measured.bytes).status, VelaReportingStatusOk);
    EXPECT_EQ(measureOf(VelaReportingText("text"), measured.bytes - 1).status, VelaReportingStatusTooLarge);
}

TEST(ValueEncoderTest, ALengthBeyondTheLimitIsNotRead) {
    const char byte = 'x';
    EXPECT_EQ(measureOf(VelaReportingTextOfSize(&byte, std::numeric_limits<std::size_t>::max())).status,
              VelaReportingStatusTooLarge);
    EXPECT_EQ(measureOf(VelaReportingData(&byte, kPlenty + 1)).status, VelaReportingStatusTooLarge);
}

TEST(ValueEncoderTest, TheSessionsCountToo) {
    const std::vector<std::int64_t> ids(1000, 1);
    EXPECT_EQ(measure(MessageArguments{{}, 1, 2, false, ids, kStamps}, 8000).status, VelaReportingStatusTooLarge);
}

TEST(ValueEncoderTest, UnknownKindsAreRefused) {
    VelaReportingValue value = VelaReportingInteger(1);
    value.kind = 0;
    EXPECT_EQ(measureOf(value).status, VelaReportingStatusInvalidArgument);
    value.kind = 10;
    EXPECT_EQ(measureOf(value).status, VelaReportingStatusInvalidArgument);
    EXPECT_EQ(measureOf(VelaReportingArray(&value, 1)).status, VelaReportingStatusInvalidArgument);
}

TEST(ValueEncoderTest, NullPointersThatShouldHoldSomethingAreRefused) {
    EXPECT_EQ(measureOf(VelaReportingTextOfSize(nullptr, 1)).status, VelaReportingStatusInvalidArgument);
    EXPECT_EQ(measureOf(VelaReportingData(nullptr, 1)).status, VelaReportingStatusInvalidArgument);
    EXPECT_EQ(measureOf(VelaReportingArray(nullptr, 1)).status, VelaReportingStatusInvalidArgument);
    EXPECT_EQ(measureOf(VelaReportingDictionary(nullptr, 1)).status, VelaReportingStatusInvalidArgument);
    const VelaReportingField fields[] = {{nullptr, 1, VelaReportingInteger(1)}};
    EXPECT_EQ(measure(MessageArguments{fields, 1, 2, true, {}, kStamps}, kPlenty).status,
              VelaReportingStatusInvalidArgument);
}

TEST(ValueEncoderTest, NestingMayBeAsDeepAsTheServiceTakes) {
    std::array<VelaReportingValue, 40> values{};
    values[0] = VelaReportingInteger(1);
    for (std::size_t depth = 1; depth < values.size(); ++depth) {
        values[depth] = VelaReportingArray(&values[depth - 1], 1);
    }
    // 31 arrays in the message's own dictionary.
    EXPECT_EQ(readBack(values[31]).kind(), ValueKind::Array);
    EXPECT_EQ(measureOf(values[32]).status, VelaReportingStatusInvalidArgument);
}

} // namespace

} // namespace vela::client
