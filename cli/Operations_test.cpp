#include "cli/Operations.h"
#include "common/values/Dictionary.h"
#include "platform/dbus/MessageWriter.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

namespace vela {
namespace {

using platform::dbus::BodyReader;
using platform::dbus::MessageHeader;
using ::testing::ElementsAre;
using ::testing::IsEmpty;
using ::testing::Optional;
using ::testing::StartsWith;

std::string faultOf(std::string_view name, const std::vector<Value>& arguments) {
    std::string bytes = "before";
    const auto done = appendCall(bytes, 1, *findOperation(name), arguments);
    EXPECT_EQ(done ? "before" : bytes, "before");
    return done ? "no fault" : done.failure().description;
}

/// A call that was read back.
struct Call {
    Call(std::string_view name, const std::vector<Value>& arguments) {
        EXPECT_TRUE(appendCall(bytes, 5, *findOperation(name), arguments));
        EXPECT_EQ(header.read(bytes), std::nullopt);
    }
    std::string bytes;
    MessageHeader header;
};

TEST(OperationsTest, ACallNamesItsOperation) {
    const Call call("createReportingSession", {42});
    EXPECT_EQ(call.header.serial, 5U);
    EXPECT_EQ(call.header.member, "createReportingSession");
    EXPECT_EQ(call.header.path, "/com/orvex/vela/reporting/server");
    EXPECT_EQ(call.header.interface, "com.orvex.vela.reporting.VelaReportingServiceProtocol");
    EXPECT_EQ(call.header.signature, "x");
    EXPECT_EQ(BodyReader(call.header).int64(), 42);
}

TEST(OperationsTest, NamesStandForTheirNumbers) {
    const Call call("sendMessage", {Dictionary{{"a", 1}}, "Playback", "Start", Array{7, 8}});
    BodyReader body(call.header);
    EXPECT_EQ(body.dictionary(), (Dictionary{{"a", 1}}));
    EXPECT_EQ(body.uint32(), 4U);
    EXPECT_EQ(body.uint16(), 1);
    EXPECT_THAT(body.optionalInt64s(), Optional(ElementsAre(7, 8)));
    const Call type("setServiceType", {"muse", 42});
    EXPECT_EQ(BodyReader(type.header).uint16(), 1);
    const Call unknown("setServiceType", {"unknown", 42});
    EXPECT_EQ(BodyReader(unknown.header).uint16(), 65535);
}

TEST(OperationsTest, WithoutReporterIDsAMessageGoesToAll) {
    const Call all("sendMessage", {Dictionary(), 4, 1});
    BodyReader body(all.header);
    body.dictionary();
    body.uint32();
    body.uint16();
    EXPECT_EQ(body.optionalInt64s(), std::nullopt);
    const Call none("sendMessage", {Dictionary(), 4, 1, Array()});
    BodyReader other(none.header);
    other.dictionary();
    other.uint32();
    other.uint16();
    EXPECT_THAT(other.optionalInt64s(), Optional(IsEmpty()));
}

TEST(OperationsTest, AWrongArgumentIsNamed) {
    EXPECT_EQ(faultOf("sendMessage", {"a", 1, 1}), "MESSAGE is no dictionary");
    EXPECT_EQ(faultOf("sendMessage", {Dictionary(), 1, 1, Array{"a"}}), "REPORTER-IDS is no list of whole numbers");
}

TEST(OperationsTest, AWrongNumberOfArgumentsShowsTheUsage) {
    EXPECT_EQ(faultOf("sendMessage", {Dictionary()}),
              "the operation is called as: sendMessage MESSAGE CATEGORY TYPE [REPORTER-IDS]");
    EXPECT_EQ(faultOf("getAllReporters", {1}), "the operation is called as: getAllReporters");
}

TEST(OperationsTest, ThereAreElevenOperations) {
    EXPECT_EQ(operations().size(), 11U);
    EXPECT_EQ(findOperation("SendMessage"), nullptr);
}

TEST(OperationsTest, AReplyOfAnotherKindIsRefused) {
    std::string bytes;
    platform::dbus::MessageWriter writer(bytes);
    writer.beginReturn({.serial = 1, .replySerial = 5, .sender = {}, .signature = "b"});
    writer.boolean(true);
    ASSERT_TRUE(writer.finish());
    MessageHeader header;
    ASSERT_EQ(header.read(bytes), std::nullopt);
    const auto value = replyValue(*findOperation("createReportingSession"), header);
    ASSERT_TRUE(value);
    EXPECT_EQ(*value, Value(true));
    EXPECT_FALSE(replyValue(*findOperation("getAllReporters"), header));
}

TEST(OperationsTest, ATextIsNoReporterID) {
    const std::string range = "is no whole number from -9223372036854775808 to 9223372036854775807";
    EXPECT_EQ(faultOf("createReportingSession", {"player"}), "REPORTER-ID \"player\" " + range);
    EXPECT_EQ(faultOf("createReportingSession", {"42"}), "REPORTER-ID \"42\" " + range);
    EXPECT_EQ(faultOf("createReportingSession", {1.0}), "REPORTER-ID 1.0 " + range);
    EXPECT_EQ(faultOf("createReportingSession", {true}), "REPORTER-ID true " + range);
    EXPECT_EQ(faultOf("createReportingSession", {Array{1, 2}}), "REPORTER-ID " + range);
    EXPECT_EQ(faultOf("createReportingSession", {std::uint64_t{9223372036854775808U}}),
              "REPORTER-ID 9223372036854775808 " + range);
}

TEST(OperationsTest, WhatIsNeitherANumberNorANameIsShownWithTheNames) {
    const std::string serviceTypes =
        "is no whole number from 0 to 65535 and none of the names generic, muse, telephony, haptics, alarms, "
        "standalone, soundautoconfig, longformaudio, nonlongformaudio, audiodeviceusage, alerts, test, apiusage, "
        "systemsounds, unknown";
    EXPECT_EQ(faultOf("setServiceType", {"music", 1}), "SERVICE-TYPE \"music\" " + serviceTypes);
    EXPECT_EQ(faultOf("setServiceType", {65536, 1}), "SERVICE-TYPE 65536 " + serviceTypes);
    const std::string categories =
        "is no whole number from 0 to 4294967295 and none of the names Generic, Record, Input, Playback, Output, "
        "PlaybackAndRecord, IO, Setup, ClientRequest, RouteChange, Error, HwStatsing, Performance, Volume, "
        "HearingHealth";
    EXPECT_EQ(faultOf("sendMessage", {Dictionary(), -1, 1}), "CATEGORY -1 " + categories);
    EXPECT_EQ(faultOf("sendMessage", {Dictionary(), "playback", 1}), "CATEGORY \"playback\" " + categories);
    EXPECT_EQ(faultOf("sendMessage", {Dictionary(), 1, "Started"}),
              "TYPE \"Started\" is no whole number from 0 to 65535 and none of the names Start, Stop, Activate, "
              "Deactivate, Setup, Error, IssueDetector, Joule, AudioUnitUsage, MIDIDriver, Summary, "
              "HeadphoneAudioExposure, AudioExposure, Listeningenhancement, Gauge, Simple, Histogram, State, Unknown");
}

TEST(OperationsTest, NamesThatSeveralNumbersHaveStandForNone) {
    const Call call("sendMessage", {Dictionary(), "Generic", "Unknown"});
    BodyReader body(call.header);
    body.dictionary();
    EXPECT_EQ(body.uint32(), 1U);
    EXPECT_EQ(body.uint16(), 65535);
    EXPECT_THAT(faultOf("sendMessage", {Dictionary(), "Undefined", 1}), StartsWith("CATEGORY \"Undefined\" is no "));
    EXPECT_THAT(faultOf("sendMessage", {Dictionary(), 1, "Generic"}), StartsWith("TYPE \"Generic\" is no "));
}

TEST(OperationsTest, ArgumentsBeyondTheLimitsOfAMessageNameThem) {
    const std::string bytes(std::size_t{64} * 1024 * 1024 + 1, 'a');
    EXPECT_EQ(
        faultOf("setConfiguration", {Dictionary{{"data", Data(bytes)}}, 42}),
        "the arguments are too large for one call: a D-Bus message has at most 128 MiB, an array or data in it 64 "
        "MiB");
}

} // namespace
} // namespace vela
