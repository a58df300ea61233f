#include "client/Operations.h"
#include "client/SessionTable.h"
#include "client/ValueEncoder.h"
#include "common/values/Json.h"
#include "platform/dbus/MessageReader.h"

#include <cstring>
#include <gmock/gmock.h>
#include <gtest/gtest.h>

namespace vela::client {

namespace {

namespace dbus = platform::dbus;
using ::testing::ElementsAre;
using ::testing::IsEmpty;

class SessionTableTest : public ::testing::Test {
protected:
    bool apply(Operation operation, std::int64_t reporterID, std::uint16_t serviceType = 0) {
        CallRecord record;
        record.operation = static_cast<std::uint16_t>(operation);
        record.reporterID = reporterID;
        record.serviceType = serviceType;
        return table_.apply(record);
    }

    bool configure(std::int64_t reporterID, std::string_view key, std::string_view text) {
        const VelaReportingField fields[] = {
            {key.data(), key.size(), VelaReportingTextOfSize(text.data(), text.size())}};
        const ConfigurationArguments arguments{fields, reporterID};
        const std::size_t bytes = measure(arguments, std::size_t{8} << 20).bytes;
        std::vector<std::uint64_t> memory((sizeof(CallRecord) + bytes + 7) / 8);
        auto* const record = new (memory.data()) CallRecord;
        record->operation = static_cast<std::uint16_t>(Operation::SetConfiguration);
        record->reporterID = reporterID;
        record->bodyBytes = static_cast<std::uint32_t>(bytes);
        write(arguments, {record->body(), bytes});
        return table_.apply(*record);
    }

    std::vector<std::string> replayed() const {
        std::string output;
        std::uint32_t serial = 7;
        table_.replay(output, serial);
        std::vector<std::string> texts;
        for (std::string_view rest = output; !rest.empty();) {
            const dbus::Frame frame = dbus::frameOf(rest);
            dbus::MessageHeader header;
            EXPECT_FALSE(header.read(rest.substr(0, frame.bytes)));
            EXPECT_FALSE(header.replyExpected());
            EXPECT_EQ(header.serial, 7 + texts.size());
            rest.remove_prefix(frame.bytes);
            texts.push_back(textOf(header));
        }
        EXPECT_EQ(serial, 7 + texts.size());
        return texts;
    }

    static std::string textOf(const dbus::MessageHeader& header) {
        std::string text(header.member);
        dbus::BodyReader body(header);
        if (header.member == "setServiceType") {
            text += " " + std::to_string(body.uint16());
        } else if (header.member == "setConfiguration") {
            text += " " + jsonText(Value(body.dictionary()));
        }
        text += " " + std::to_string(body.int64());
        body.finish();
        EXPECT_FALSE(body.error());
        return text;
    }

    SessionTable table_;
};

TEST_F(SessionTableTest, NothingIsRepeatedAtFirst) {
    EXPECT_TRUE(table_.empty());
    EXPECT_THAT(replayed(), IsEmpty());
}

TEST_F(SessionTableTest, ASessionIsRepeatedWithAllThatMakesIt) {
    configure(42, "early", "ignored");
    apply(Operation::CreateReportingSession, 42);
    apply(Operation::StartReportingSessionForID, 42);
    configure(42, "a", "1");
    apply(Operation::SetServiceType, 42, 11);
    EXPECT_FALSE(table_.empty());
    EXPECT_THAT(replayed(), ElementsAre("createReportingSession 42", "setServiceType 11 42",
                                        R"(setConfiguration {"a":"1"} 42)", "startReportingSessionForID 42"));
}

TEST_F(SessionTableTest, OnlyWhatWasSetIsRepeated) {
    apply(Operation::CreateReportingSession, 42);
    EXPECT_THAT(replayed(), ElementsAre("createReportingSession 42"));
}

TEST_F(SessionTableTest, SessionsComeInTheOrderOfTheirCreation) {
    for (const std::int64_t id : {5, -3, 900, 1}) {
        apply(Operation::CreateReportingSession, id);
    }
    EXPECT_THAT(replayed(), ElementsAre("createReportingSession 5", "createReportingSession -3",
                                        "createReportingSession 900", "createReportingSession 1"));
}

TEST_F(SessionTableTest, ConfigurationsAreMerged) {
    apply(Operation::CreateReportingSession, 42);
    configure(42, "a", "1");
    configure(42, "b", "2");
    configure(42, "a", "3");
    EXPECT_THAT(replayed(), ElementsAre("createReportingSession 42", R"(setConfiguration {"a":"3","b":"2"} 42)"));
}

TEST_F(SessionTableTest, AStoppedSessionIsNotStarted) {
    apply(Operation::CreateReportingSession, 42);
    apply(Operation::StartReportingSessionForID, 42);
    apply(Operation::StopReportingSessionForID, 42);
    EXPECT_THAT(replayed(), ElementsAre("createReportingSession 42"));
}

TEST_F(SessionTableTest, ADestroyedSessionIsGone) {
    apply(Operation::CreateReportingSession, 42);
    apply(Operation::DestroyReportingSession, 42);
    EXPECT_TRUE(table_.empty());
    EXPECT_THAT(replayed(), IsEmpty());
}

TEST_F(SessionTableTest, TheServiceNeverDestroysTheSessionOfIdentifierZero) {
    apply(Operation::CreateReportingSession, 0);
    apply(Operation::DestroyReportingSession, 0);
    EXPECT_THAT(replayed(), ElementsAre("createReportingSession 0"));
}

TEST_F(SessionTableTest, CreatingASessionAnewForgetsTheOldOne) {
    apply(Operation::CreateReportingSession, 1);
    apply(Operation::CreateReportingSession, 2);
    apply(Operation::SetServiceType, 1, 11);
    configure(1, "a", "1");
    apply(Operation::StartReportingSessionForID, 1);
    apply(Operation::CreateReportingSession, 1);
    EXPECT_THAT(replayed(), ElementsAre("createReportingSession 2", "createReportingSession 1"));
}

TEST_F(SessionTableTest, CallsAboutUnknownSessionsAreIgnored) {
    EXPECT_TRUE(apply(Operation::SetServiceType, 42, 1));
    EXPECT_TRUE(apply(Operation::StartReportingSessionForID, 42));
    EXPECT_TRUE(apply(Operation::SendMessage, 42));
    EXPECT_THAT(replayed(), IsEmpty());
}

TEST_F(SessionTableTest, SessionsBeyondTheLimitAreNotRemembered) {
    for (std::size_t id = 1; id <= SessionTable::kMostSessions; ++id) {
        ASSERT_TRUE(apply(Operation::CreateReportingSession, static_cast<std::int64_t>(id)));
    }
    EXPECT_FALSE(apply(Operation::CreateReportingSession, 99999));
    EXPECT_TRUE(apply(Operation::CreateReportingSession, 1)) << "it is there";
    apply(Operation::DestroyReportingSession, 1);
    EXPECT_TRUE(apply(Operation::CreateReportingSession, 99999));
}

TEST_F(SessionTableTest, ConfigurationsBeyondTheLimitAreNotRemembered) {
    apply(Operation::CreateReportingSession, 42);
    const std::string half(600 * 1024, 'x');
    EXPECT_TRUE(configure(42, "a", half));
    EXPECT_FALSE(configure(42, "b", half));
    EXPECT_TRUE(configure(42, "c", "small"));
    EXPECT_THAT(replayed(), ElementsAre("createReportingSession 42",
                                        "setConfiguration {\"a\":\"" + half + "\",\"c\":\"small\"} 42"));
}

TEST_F(SessionTableTest, WhatReplacesItselfCountsOnce) {
    apply(Operation::CreateReportingSession, 42);
    const std::string large(400 * 1024, 'x');
    for (int round = 0; round < 10; ++round) {
        EXPECT_TRUE(configure(42, "a", large)) << round;
    }
}

} // namespace

} // namespace vela::client
