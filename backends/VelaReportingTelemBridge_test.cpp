#include "backends/AudioIssueDetected.h"
#include "backends/VelaReportingTelemBridge.h"
#include "common/VelaReportingVocabulary.h"
#include "common/values/TextualForm.h"
#include "testing/CapturingLog.h"
#include "testing/FakeTelem.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <limits>

namespace vela {

namespace {

using platform::LogLevel;
using telemmetrics::AudioIssueDetected;
using telemmetrics::RecordReader;
using testing::CapturedLine;
using ::testing::ElementsAre;
using ::testing::IsEmpty;
using namespace std::string_view_literals;

CapturedLine missing(const std::string& key) {
    return {LogLevel::Error, "velara", "VelaReportingTelemBridge", "Failed to get " + key + " for AudioIssueDetected"};
}

class VelaReportingTelemBridgeTest : public ::testing::Test {
protected:
    void handle(const Dictionary& message, std::uint32_t type = AudioEventTypeIssueDetector,
                std::uint32_t category = AudioEventCategoryError) {
        bridge_.handleEvent(message, category, type, nullptr);
    }
    /// The last record posted, read back.
    AudioIssueDetected posted() const {
        const std::string bytes = telem_.metrics().back().record;
        RecordReader reader(bytes);
        AudioIssueDetected record;
        EXPECT_TRUE(record.readFrom(reader));
        return record;
    }
    std::int32_t durationOf(Value seconds) {
        handle(Dictionary().setting(Key("any_channel_silence_seconds"), std::move(seconds)));
        return posted().duration;
    }
    std::string issueTypeOf(Value value) {
        handle(Dictionary().setting(Key("issue_type"), std::move(value)));
        return posted().issuetype;
    }

    testing::CapturingLog log_;
    testing::FakeTelem telem_;
    VelaReportingTelemBridge bridge_{telem_};
};

TEST_F(VelaReportingTelemBridgeTest, AnIssueIsPostedOnce) {
    handle({{"issue_type", "silence"},
            {"rtaid_client", "player"},
            {"node", "mixer"},
            {"any_channel_silence_seconds", 5},
            {"velareporting_timestamp", 1000.0}});
    const auto metrics = telem_.metrics();
    ASSERT_EQ(metrics.size(), 1U);
    EXPECT_EQ(metrics[0].identifier, 5963779U);
    EXPECT_EQ(metrics[0].record, "\x10\x05\x1A\x07silence\x22\x05mixer\x2A\x06player"sv);
    EXPECT_EQ(textualForm(Value(metrics[0].fields)),
              "{duration = 5; issuetype = silence; node = mixer; rtaidclient = player;}");
    EXPECT_FALSE(posted().hasTimestamp());
    EXPECT_THAT(log_.lines(), IsEmpty());
}

TEST_F(VelaReportingTelemBridgeTest, AnIssueOfWhichNothingIsKnownIsPosted) {
    handle({{"velareporting_timestamp", 1000.0}});
    ASSERT_EQ(telem_.metrics().size(), 1U);
    EXPECT_EQ(telem_.metrics()[0].record, "\x10\x00\x1A\x00\x22\x00\x2A\x00"sv);
    EXPECT_EQ(telem_.metrics()[0].fields,
              (Dictionary{{"duration", 0}, {"issuetype", ""}, {"node", ""}, {"rtaidclient", ""}}));
    EXPECT_THAT(log_.lines(), ElementsAre(missing("issue_type"), missing("rtaid_client"), missing("node"),
                                          missing("any_channel_silence_seconds")));
}

TEST_F(VelaReportingTelemBridgeTest, OneMissingKeyIsLoggedAndStaysEmpty) {
    handle({{"issue_type", "silence"}, {"node", "mixer"}, {"any_channel_silence_seconds", 5}});
    EXPECT_EQ(telem_.metrics()[0].record, "\x10\x05\x1A\x07silence\x22\x05mixer\x2A\x00"sv);
    EXPECT_THAT(log_.lines(), ElementsAre(missing("rtaid_client")));
}

TEST_F(VelaReportingTelemBridgeTest, MessagesOfOtherTypesGiveNothing) {
    for (const std::uint32_t type : {0U, 6U, 8U, 65535U, 65543U}) {
        handle({{"issue_type", "silence"}}, type);
    }
    EXPECT_THAT(telem_.metrics(), IsEmpty());
    EXPECT_THAT(log_.lines(), IsEmpty());
}

TEST_F(VelaReportingTelemBridgeTest, TheCategoryDoesNotMatter) {
    for (const std::uint32_t category : {0U, 11U, 0xFFFFFFFFU}) {
        handle({{"issue_type", "silence"}}, AudioEventTypeIssueDetector, category);
    }
    EXPECT_EQ(telem_.metrics().size(), 3U);
}

TEST_F(VelaReportingTelemBridgeTest, ValuesBecomeTheirText) {
    EXPECT_EQ(issueTypeOf(42), "42");
    EXPECT_EQ(issueTypeOf(-7), "-7");
    EXPECT_EQ(issueTypeOf(2.5), "2.5");
    EXPECT_EQ(issueTypeOf(3.0), "3");
    EXPECT_EQ(issueTypeOf(true), "1");
    EXPECT_EQ(issueTypeOf(false), "0");
    EXPECT_EQ(issueTypeOf(""), "");
    EXPECT_EQ(issueTypeOf(Array{1, "two words"}), "(1, \"two words\")");
    EXPECT_EQ(issueTypeOf(Dictionary{{"a", 1}}), "{a = 1;}");
}

TEST_F(VelaReportingTelemBridgeTest, TextsAreUtf8) { EXPECT_EQ(issueTypeOf("Tön \u266a"), "T\xC3\xB6n \xE2\x99\xAA"); }

TEST_F(VelaReportingTelemBridgeTest, TheDurationIsTheLowerHalfOfAnInteger) {
    EXPECT_EQ(durationOf(5), 5);
    EXPECT_EQ(durationOf(-5), -5);
    EXPECT_EQ(durationOf(std::int64_t{4294967297}), 1);
    EXPECT_EQ(durationOf(std::int64_t{2147483648}), -2147483647 - 1);
    EXPECT_EQ(durationOf(std::numeric_limits<std::uint64_t>::max()), -1);
}

TEST_F(VelaReportingTelemBridgeTest, ADurationsFractionIsCutOff) {
    EXPECT_EQ(durationOf(2.9), 2);
    EXPECT_EQ(durationOf(-2.9), -2);
    EXPECT_EQ(durationOf(true), 1);
}

TEST_F(VelaReportingTelemBridgeTest, ARealBeyondTheRangeIsCutToItFirst) {
    EXPECT_EQ(durationOf(1e300), -1); // the lower half of the greatest 64-bit integer
    EXPECT_EQ(durationOf(-1e300), 0);
    EXPECT_EQ(durationOf(std::numeric_limits<double>::infinity()), -1);
    EXPECT_EQ(durationOf(std::numeric_limits<double>::quiet_NaN()), 0);
}

TEST_F(VelaReportingTelemBridgeTest, ATextsDurationIsTheNumberAtItsStart) {
    EXPECT_EQ(durationOf("12"), 12);
    EXPECT_EQ(durationOf(" \t-12 seconds"), -12);
    EXPECT_EQ(durationOf("+3.9"), 3);
    EXPECT_EQ(durationOf("+-3"), 0);
    EXPECT_EQ(durationOf("long"), 0);
    EXPECT_EQ(durationOf(""), 0);
    EXPECT_EQ(durationOf("   "), 0);
    EXPECT_EQ(durationOf("99999999999999999999"), -1);
    EXPECT_EQ(durationOf("-99999999999999999999"), 0);
}

TEST_F(VelaReportingTelemBridgeTest, WhatIsNoNumberLastsZeroSeconds) {
    EXPECT_EQ(durationOf(Array{5}), 0);
    EXPECT_EQ(durationOf(Data("5")), 0);
    EXPECT_EQ(durationOf(Date{5}), 0);
}

TEST_F(VelaReportingTelemBridgeTest, ANegativeDurationTakesTenBytes) {
    handle({{"issue_type", ""}, {"any_channel_silence_seconds", -1}});
    EXPECT_EQ(telem_.metrics()[0].record, "\x10\xFF\xFF\xFF\xFF\xFF\xFF\xFF\xFF\xFF\x01\x1A\x00\x22\x00\x2A\x00"sv);
}

} // namespace

} // namespace vela
