#include "backends/AudioIssueDetected.h"
#include "common/values/TextualForm.h"

#include <functional>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <limits>
#include <random>
#include <type_traits>
#include <utility>
#include <vector>

namespace vela::telemmetrics {

namespace {

using ::testing::ElementsAre;
using namespace std::string_view_literals;

std::string bytesOf(const AudioIssueDetected& record) {
    RecordWriter writer;
    record.writeTo(writer);
    return writer.bytes();
}

AudioIssueDetected fullRecord() {
    AudioIssueDetected record;
    record.issuetype = "silence";
    record.node = "mixer";
    record.rtaidclient = "player";
    record.timestamp = 300;
    record.presence = AudioIssueDetected::kTimestampPresent;
    record.duration = 5;
    return record;
}

/// A record and whether it could be read.
struct Reading {
    bool read;
    AudioIssueDetected record;
};
Reading readingOf(std::string_view bytes, AudioIssueDetected record = {}) {
    RecordReader reader(bytes);
    const bool read = record.readFrom(reader);
    return {read, std::move(record)};
}
bool canBeRead(std::string_view bytes) { return readingOf(bytes).read; }

/// Keeps what it is told as texts.
class RecordingFormatter final : public RecordTextFormatter {
public:
    std::vector<std::string> told;

    void beginObject(std::string_view name) override { told.push_back("{ " + std::string(name)); }
    void endObject() override { told.emplace_back("}"); }
    void format(std::string_view name, std::string_view text) override {
        told.push_back(std::string(name) + " = \"" + std::string(text) + "\"");
    }
    void format(std::string_view name, std::int32_t number) override {
        told.push_back(std::string(name) + " = " + std::to_string(number));
    }
    void format(std::string_view name, std::uint64_t number) override {
        told.push_back(std::string(name) + " = " + std::to_string(number) + "u");
    }
};

TEST(AudioIssueDetectedTest, ANewRecordIsEmpty) {
    const AudioIssueDetected record;
    EXPECT_EQ(record.issuetype, "");
    EXPECT_EQ(record.node, "");
    EXPECT_EQ(record.rtaidclient, "");
    EXPECT_EQ(record.timestamp, 0U);
    EXPECT_EQ(record.duration, 0);
    EXPECT_EQ(record.presence, 0U);
    EXPECT_FALSE(record.hasTimestamp());
}

// Writing

TEST(AudioIssueDetectedTest, AFreshRecordHasEveryFieldButTheTimestamp) {
    EXPECT_EQ(bytesOf({}), "\x10\x00\x1A\x00\x22\x00\x2A\x00"sv);
}

TEST(AudioIssueDetectedTest, FieldsAreWrittenInTheOrderOfTheirNumbers) {
    EXPECT_EQ(bytesOf(fullRecord()), "\x08\xAC\x02\x10\x05\x1A\x07silence\x22\x05mixer\x2A\x06player"sv);
}

TEST(AudioIssueDetectedTest, ATimestampOfZeroIsWrittenWhenItIsPresent) {
    AudioIssueDetected record;
    record.presence = AudioIssueDetected::kTimestampPresent;
    EXPECT_EQ(bytesOf(record), "\x08\x00\x10\x00\x1A\x00\x22\x00\x2A\x00"sv);
}

TEST(AudioIssueDetectedTest, ATimestampThatIsNotPresentIsNotWritten) {
    AudioIssueDetected record;
    record.timestamp = 300;
    EXPECT_EQ(bytesOf(record), "\x10\x00\x1A\x00\x22\x00\x2A\x00"sv);
}

TEST(AudioIssueDetectedTest, TheGreatestTimestampTakesTenBytes) {
    AudioIssueDetected record;
    record.timestamp = std::numeric_limits<std::uint64_t>::max();
    record.presence = AudioIssueDetected::kTimestampPresent;
    EXPECT_EQ(bytesOf(record), "\x08\xFF\xFF\xFF\xFF\xFF\xFF\xFF\xFF\xFF\x01\x10\x00\x1A\x00\x22\x00\x2A\x00"sv);
}

TEST(AudioIssueDetectedTest, ANegativeDurationTakesTenBytes) {
    AudioIssueDetected record;
    record.duration = -1;
    EXPECT_EQ(bytesOf(record), "\x10\xFF\xFF\xFF\xFF\xFF\xFF\xFF\xFF\xFF\x01\x1A\x00\x22\x00\x2A\x00"sv);
    record.duration = std::numeric_limits<std::int32_t>::min();
    EXPECT_EQ(bytesOf(record), "\x10\x80\x80\x80\x80\xF8\xFF\xFF\xFF\xFF\x01\x1A\x00\x22\x00\x2A\x00"sv);
}

TEST(AudioIssueDetectedTest, TheGreatestDurationTakesFiveBytes) {
    AudioIssueDetected record;
    record.duration = std::numeric_limits<std::int32_t>::max();
    EXPECT_EQ(bytesOf(record), "\x10\xFF\xFF\xFF\xFF\x07\x1A\x00\x22\x00\x2A\x00"sv);
}

TEST(AudioIssueDetectedTest, ALongTextsLengthTakesTwoBytes) {
    AudioIssueDetected record;
    record.node = std::string(200, 'n');
    EXPECT_EQ(bytesOf(record),
              std::string("\x10\x00\x1A\x00\x22\xC8\x01"sv) + std::string(200, 'n') + std::string("\x2A\x00"sv));
}

TEST(AudioIssueDetectedTest, TextsTakeAnyBytes) {
    AudioIssueDetected record;
    record.issuetype = std::string("a\0\xFF"sv);
    EXPECT_EQ(bytesOf(record), "\x10\x00\x1A\x03"
                               "a\0\xFF\x22\x00\x2A\x00"sv);
    EXPECT_EQ(readingOf(bytesOf(record)).record, record);
}

// Reading

TEST(AudioIssueDetectedTest, WhatWasWrittenIsReadAgain) {
    const Reading reading = readingOf(bytesOf(fullRecord()));
    EXPECT_TRUE(reading.read);
    EXPECT_EQ(reading.record, fullRecord());
    EXPECT_EQ(reading.record.timestamp, 300U);
    EXPECT_EQ(reading.record.issuetype, "silence");
    EXPECT_EQ(reading.record.node, "mixer");
    EXPECT_EQ(reading.record.rtaidclient, "player");
}

TEST(AudioIssueDetectedTest, NothingCanBeRead) {
    const Reading reading = readingOf("");
    EXPECT_TRUE(reading.read);
    EXPECT_EQ(reading.record, AudioIssueDetected());
}

TEST(AudioIssueDetectedTest, WhatIsNotReadStays) {
    const Reading reading = readingOf("\x10\x07"sv, fullRecord());
    EXPECT_TRUE(reading.read);
    EXPECT_EQ(reading.record.duration, 7);
    EXPECT_EQ(reading.record.timestamp, 300U);
    EXPECT_TRUE(reading.record.hasTimestamp());
    EXPECT_EQ(reading.record.issuetype, "silence");
}

TEST(AudioIssueDetectedTest, ALaterFieldReplacesAnEarlierOne) {
    const Reading reading = readingOf("\x1A\x03one\x10\x01\x1A\x02tw\x10\x02"sv);
    EXPECT_TRUE(reading.read);
    EXPECT_EQ(reading.record.issuetype, "tw");
    EXPECT_EQ(reading.record.duration, 2);
}

TEST(AudioIssueDetectedTest, ATimestampIsMarkedAsPresent) {
    const Reading reading = readingOf("\x08\x00"sv);
    EXPECT_TRUE(reading.read);
    EXPECT_TRUE(reading.record.hasTimestamp());
    EXPECT_EQ(reading.record.timestamp, 0U);
}

TEST(AudioIssueDetectedTest, ADurationIsTheLowerHalfOfItsNumber) {
    EXPECT_EQ(readingOf("\x10\x80\x80\x80\x80\x10"sv).record.duration, 0);
    EXPECT_EQ(readingOf("\x10\xFF\xFF\xFF\xFF\x0F"sv).record.duration, -1);
    EXPECT_EQ(readingOf("\x10\xFF\xFF\xFF\xFF\xFF\xFF\xFF\xFF\xFF\x01"sv).record.duration, -1);
}

TEST(AudioIssueDetectedTest, TheEndOfAGroupEndsTheRecord) {
    const Reading reading = readingOf("\x10\x05\x0C\x10\x07"sv);
    EXPECT_TRUE(reading.read);
    EXPECT_EQ(reading.record.duration, 5);
}

TEST(AudioIssueDetectedTest, TheEndOfAGroupEndsTheRecordBeforeBytesThatAreBroken) {
    EXPECT_TRUE(canBeRead("\x34\x10\x80"sv)); // of field 6
    EXPECT_TRUE(canBeRead("\x14\x80"sv));     // of a field that is known
}

TEST(AudioIssueDetectedTest, ANumberThatIsCutOffIsAnError) {
    EXPECT_FALSE(canBeRead("\x10"sv));
    EXPECT_FALSE(canBeRead("\x10\x80"sv));
    EXPECT_FALSE(canBeRead("\x08\xFF\xFF"sv));
    EXPECT_FALSE(canBeRead("\x80"sv)); // in the tag
}

TEST(AudioIssueDetectedTest, WhatStoodBeforeAnErrorIsKept) {
    const Reading reading = readingOf("\x10\x05\x08\x80"sv);
    EXPECT_FALSE(reading.read);
    EXPECT_EQ(reading.record.duration, 5);
    EXPECT_FALSE(reading.record.hasTimestamp());
}

TEST(AudioIssueDetectedTest, ANumberOfTenBytesIsReadWithoutItsSurplusBits) {
    const Reading reading = readingOf("\x08\x80\x80\x80\x80\x80\x80\x80\x80\x80\x7F"sv);
    EXPECT_TRUE(reading.read);
    EXPECT_EQ(reading.record.timestamp, 0x8000000000000000U);
}

TEST(AudioIssueDetectedTest, ANumberOfElevenBytesIsAnError) {
    EXPECT_FALSE(canBeRead("\x08\x80\x80\x80\x80\x80\x80\x80\x80\x80\x80\x00"sv));
    EXPECT_FALSE(canBeRead("\x88\x80\x80\x80\x80\x80\x80\x80\x80\x80\x00\x05"sv)); // the tag
}

TEST(AudioIssueDetectedTest, ANumberMayBeLongerThanItNeeds) {
    EXPECT_EQ(readingOf("\x90\x80\x00\x85\x80\x00"sv).record.duration, 5);
}

TEST(AudioIssueDetectedTest, KnownFieldsGoByTheirNumberWhateverTheirWireType) {
    const Reading timestamp = readingOf("\x0A\x05"sv); // wire type 2
    EXPECT_TRUE(timestamp.read);
    EXPECT_TRUE(timestamp.record.hasTimestamp());
    EXPECT_EQ(timestamp.record.timestamp, 5U);
    const Reading issuetype = readingOf("\x18\x01\x41"sv); // wire type 0
    EXPECT_TRUE(issuetype.read);
    EXPECT_EQ(issuetype.record.issuetype, "A");
    EXPECT_EQ(readingOf("\x17\x09"sv).record.duration, 9); // wire type 7
}

TEST(AudioIssueDetectedTest, UnknownFieldsAreSkippedByTheirWireType) {
    const auto skips = [](std::string_view field) {
        const Reading reading = readingOf(std::string(field) + "\x10\x05");
        return reading.read && reading.record.duration == 5 && reading.record.issuetype.empty();
    };
    EXPECT_TRUE(skips("\x30\xFF\x01"sv));
    EXPECT_TRUE(skips("\x31\x10\x11\x12\x13\x14\x15\x16\x17"sv));
    EXPECT_TRUE(skips("\x32\x03\x1A\x01x"sv));
    EXPECT_TRUE(skips("\x35\x10\x11\x12\x13"sv));
    EXPECT_TRUE(skips("\x00\x01"sv));                     // field 0
    EXPECT_TRUE(skips("\xFA\xFF\xFF\xFF\x0F\x01x"sv));    // the greatest field number
    EXPECT_TRUE(skips("\x88\x80\x80\x80\x80\x01\x01"sv)); // beyond it: not taken for field 1
}

TEST(AudioIssueDetectedTest, AnUnknownGroupIsSkippedWithAllThatIsInIt) {
    // Field 6 as a group: a number, a text, a group with a number, four and eight bytes.
    const Reading reading = readingOf("\x33\x10\x07\x1A\x01x\x3B\x08\x01\x3C\x35"
                                      "abcd\x31"
                                      "abcdefgh\x34\x10\x05"sv);
    EXPECT_TRUE(reading.read);
    EXPECT_EQ(reading.record.duration, 5);
    EXPECT_EQ(reading.record.issuetype, "");
    EXPECT_FALSE(reading.record.hasTimestamp());
}

TEST(AudioIssueDetectedTest, GroupsMayBeNestedDeeply) {
    constexpr std::size_t kDepth = 1000000;
    EXPECT_TRUE(canBeRead(std::string(kDepth, '\x33') + std::string(kDepth, '\x34')));
    EXPECT_FALSE(canBeRead(std::string(kDepth, '\x33') + std::string(kDepth - 1, '\x34')));
}

TEST(AudioIssueDetectedTest, AFieldThatCannotBeSkippedIsAnError) {
    EXPECT_FALSE(canBeRead("\x36\x10\x05"sv));     // wire type 6
    EXPECT_FALSE(canBeRead("\x37\x10\x05"sv));     // wire type 7
    EXPECT_FALSE(canBeRead("\x30\x80"sv));         // a number that is cut off
    EXPECT_FALSE(canBeRead("\x31\x01\x02\x03"sv)); // seven bytes are too few
    EXPECT_FALSE(canBeRead("\x32\x05"
                           "abcd"sv));             // a length beyond the end
    EXPECT_FALSE(canBeRead("\x35\x01\x02\x03"sv)); // three bytes are too few
    EXPECT_FALSE(canBeRead("\x33\x10\x05"sv));     // a group without an end
    EXPECT_FALSE(canBeRead("\x33\x36\x34"sv));     // wire type 6 inside a group
    EXPECT_FALSE(canBeRead("\x33\x80"sv));         // a tag inside a group that is cut off
}

TEST(AudioIssueDetectedTest, NothingIsReadAfterAFieldThatCannotBeSkipped) {
    EXPECT_EQ(readingOf("\x36\x10\x05"sv).record.duration, 0);
}

TEST(AudioIssueDetectedTest, ATextThatIsCutOffIsAnErrorAndLeavesTheField) {
    const Reading reading = readingOf("\x1A\x05"
                                      "abcd"sv,
                                      fullRecord());
    EXPECT_FALSE(reading.read);
    EXPECT_EQ(reading.record.issuetype, "silence");
    EXPECT_FALSE(canBeRead("\x22"sv));
    EXPECT_FALSE(canBeRead("\x2A\xFF\xFF\xFF\xFF\xFF\xFF\xFF\xFF\xFF\x01x"sv));
}

// Text

TEST(AudioIssueDetectedTest, TheTextHasTheFieldsInTheOrderOfTheirNames) {
    RecordingFormatter formatter;
    fullRecord().formatText(formatter, "issue");
    EXPECT_THAT(formatter.told, ElementsAre("{ issue", "duration = 5", "issuetype = \"silence\"", "node = \"mixer\"",
                                            "rtaidclient = \"player\"", "timestamp = 300u", "}"));
}

TEST(AudioIssueDetectedTest, TheTextLeavesOutATimestampThatIsNotPresent) {
    RecordingFormatter formatter;
    AudioIssueDetected record;
    record.timestamp = 300;
    record.formatText(formatter, "");
    EXPECT_THAT(formatter.told,
                ElementsAre("{ ", "duration = 0", "issuetype = \"\"", "node = \"\"", "rtaidclient = \"\"", "}"));
}

TEST(AudioIssueDetectedTest, ADictionaryOfTheFieldsHasTheirOrder) {
    RecordDictionaryFormatter formatter;
    AudioIssueDetected record = fullRecord();
    record.duration = -5;
    record.formatText(formatter, "issue");
    EXPECT_EQ(textualForm(Value(formatter.fields())),
              "{duration = \"-5\"; issuetype = silence; node = mixer; rtaidclient = player; timestamp = 300;}");
}

// Equality, hash, copies

TEST(AudioIssueDetectedTest, RecordsWithTheSameFieldsAreEqual) {
    EXPECT_EQ(fullRecord(), fullRecord());
    EXPECT_EQ(hash_value(fullRecord()), hash_value(fullRecord()));
}

TEST(AudioIssueDetectedTest, EverySingleFieldMakesRecordsUnequal) {
    const auto differs = [](void (*change)(AudioIssueDetected&)) {
        AudioIssueDetected changed = fullRecord();
        change(changed);
        return !(changed == fullRecord()) && !(fullRecord() == changed);
    };
    EXPECT_TRUE(differs([](AudioIssueDetected& record) { record.issuetype += '\0'; }));
    EXPECT_TRUE(differs([](AudioIssueDetected& record) { record.node = "Mixer"; }));
    EXPECT_TRUE(differs([](AudioIssueDetected& record) { record.rtaidclient.clear(); }));
    EXPECT_TRUE(differs([](AudioIssueDetected& record) { record.duration = -5; }));
    EXPECT_TRUE(differs([](AudioIssueDetected& record) { record.timestamp = 301; }));
}

TEST(AudioIssueDetectedTest, RecordsThatDifferInTheTimestampsPresenceAreUnequal) {
    AudioIssueDetected without = fullRecord();
    without.presence = 0;
    EXPECT_EQ(without.timestamp, fullRecord().timestamp);
    EXPECT_FALSE(without == fullRecord());
    EXPECT_FALSE(fullRecord() == without);
}

TEST(AudioIssueDetectedTest, ATimestampThatIsNotPresentDoesNotCount) {
    AudioIssueDetected one = fullRecord();
    AudioIssueDetected other = fullRecord();
    one.presence = 0;
    other.presence = 0;
    other.timestamp = 7;
    EXPECT_EQ(one, other);
    EXPECT_EQ(hash_value(one), hash_value(other));
}

TEST(AudioIssueDetectedTest, TheHashIsTheSumOfItsParts) {
    constexpr std::hash<std::string> kHash;
    const std::size_t texts = kHash("silence") ^ kHash("mixer") ^ kHash("player");
    AudioIssueDetected record = fullRecord();
    EXPECT_EQ(hash_value(record), 300U ^ 5U ^ texts);
    record.presence = 0;
    EXPECT_EQ(hash_value(record), 5U ^ texts);
    record.duration = -1;
    EXPECT_EQ(hash_value(record), 0xFFFFFFFFFFFFFFFFU ^ texts);
}

TEST(AudioIssueDetectedTest, EqualTextsCancelOutInTheHash) {
    AudioIssueDetected record;
    record.issuetype = "same";
    record.node = "same";
    record.rtaidclient = "other";
    EXPECT_EQ(hash_value(record), std::hash<std::string>()("other"));
}

TEST(AudioIssueDetectedTest, CopiesAndMovesKeepEveryField) {
    const AudioIssueDetected original = fullRecord();
    AudioIssueDetected copy(original);
    EXPECT_EQ(copy, original);
    const AudioIssueDetected moved(std::move(copy));
    EXPECT_EQ(moved, original);
    AudioIssueDetected assigned;
    assigned = moved;
    EXPECT_EQ(assigned, original);
    AudioIssueDetected moveAssigned;
    moveAssigned = std::move(assigned);
    EXPECT_EQ(moveAssigned, original);
    EXPECT_EQ(moveAssigned.timestamp, 300U);
    EXPECT_TRUE(std::is_nothrow_move_constructible_v<AudioIssueDetected>);
}

TEST(AudioIssueDetectedTest, SwapExchangesEveryField) {
    AudioIssueDetected one = fullRecord();
    AudioIssueDetected other;
    other.node = "other";
    other.duration = -7;
    other.timestamp = 9;
    const AudioIssueDetected before = other;
    swap(one, other);
    EXPECT_EQ(other, fullRecord());
    EXPECT_EQ(one, before);
    EXPECT_EQ(one.timestamp, 9U);
    EXPECT_FALSE(one.hasTimestamp());
}

TEST(AudioIssueDetectedTest, RecordsOfAnyContentAreReadAsTheyWereWritten) {
    // NOLINTNEXTLINE(cert-msc32-c,cert-msc51-cpp): a failure must be met again
    std::mt19937_64 random(20260101);
    const auto text = [&random] {
        std::string bytes(random() % 300, '\0');
        for (char& byte : bytes) {
            byte = static_cast<char>(random());
        }
        return bytes;
    };
    for (int round = 0; round < 200; ++round) {
        AudioIssueDetected record;
        record.issuetype = text();
        record.node = text();
        record.rtaidclient = text();
        record.timestamp = random() >> random() % 64;
        record.duration = static_cast<std::int32_t>(static_cast<std::uint32_t>(random() >> random() % 64));
        record.presence = random() % 2 == 0 ? AudioIssueDetected::kTimestampPresent : 0;
        const Reading reading = readingOf(bytesOf(record));
        ASSERT_TRUE(reading.read);
        ASSERT_EQ(reading.record, record);
        ASSERT_EQ(hash_value(reading.record), hash_value(record));
    }
}

} // namespace

} // namespace vela::telemmetrics
