// What sessions may keep in memory, and what becomes of the rest.
#include "session/Session_test.h"

namespace vela {

namespace {

using ::testing::ElementsAre;
using ::testing::IsEmpty;
using ::testing::SizeIs;

/// A tagged message of one text of 64 bytes takes 16 + 2 * 9 (padded) of its own, 8 + 64 for the text and 8 + 16 for
/// the tag "GenericStart"; and, as long as few others have them, 32 + 2 * 8 for the list of its keys and 24 + 16 for
/// each key.
constexpr std::uint64_t kMessageBytes = 16 + 2 * 8 + 8 + 8 + 64 + 8 + 16 + 32 + 2 * 8 + 2 * (24 + 16);

class VelaReportingSessionMemoryTest : public SessionTest {
protected:
    Dictionary message(char letter) { return {{"text", std::string_view(std::string(64, letter))}}; }
    void limit(std::uint64_t sessionBytes, std::uint64_t totalBytes) {
        memory_.emplace(VelaReportingSessionLimits{sessionBytes, totalBytes});
        platform_.memory = &*memory_;
    }
    /// The failure of a send, empty when it was taken.
    static std::string sendTo(VelaReportingSession& session, const Dictionary& message) {
        std::string failure;
        session.sendMessage(message, 1, 1, [&](const std::optional<platform::Failure>& error) {
            failure = error ? error->description : "";
        });
        return failure;
    }
    void TearDown() override {
        SessionTest::TearDown();
        EXPECT_EQ(memory_->bytes(), 0U);
    }

    std::optional<VelaReportingSessionMemory> memory_;
};

TEST_F(VelaReportingSessionMemoryTest, AMessageCountsOnceInTheListAndOnceOnItsWay) {
    limit(10000, 10000);
    runningSession();
    send(message('a'));
    EXPECT_EQ(memory_->bytes(), 2 * kMessageBytes);
    queues_.runUntilIdle();
    EXPECT_EQ(memory_->bytes(), kMessageBytes);
}

TEST_F(VelaReportingSessionMemoryTest, ARedundantMessageIsNotKept) {
    limit(10000, 10000);
    runningSession();
    send(message('a'));
    send(message('a'));
    queues_.runUntilIdle();
    EXPECT_EQ(memory_->bytes(), kMessageBytes);
}

TEST_F(VelaReportingSessionMemoryTest, WhatPassesTheSessionsLimitIsRefusedAndCounted) {
    limit(3 * kMessageBytes, 10000);
    runningSession();
    EXPECT_EQ(sendTo(session(), message('a')), "");
    queues_.runUntilIdle();
    EXPECT_EQ(sendTo(session(), message('b')), "");
    queues_.runUntilIdle();
    EXPECT_EQ(sendTo(session(), message('c')), "limits.session_bytes is 792 B");
    queues_.runUntilIdle();
    EXPECT_EQ(memory_->refusals(), 1U);
    EXPECT_THAT(recordedKeys(), ElementsAre("Generic_Start_1", "Generic_Start_2"));
    EXPECT_THAT(sentPayloads(), SizeIs(2));
}

TEST_F(VelaReportingSessionMemoryTest, WhatPassesTheLimitOfAllIsRefused) {
    limit(10000, 2 * kMessageBytes);
    const auto other = makeSession(7);
    other->start();
    EXPECT_EQ(sendTo(*other, message('a')), "");
    runningSession();
    EXPECT_EQ(sendTo(session(), message('a')), "limits.total_bytes is 528 B");
    EXPECT_EQ(memory_->refusals(), 1U);
    other->stop();
    EXPECT_EQ(sendTo(session(), message('a')), "");
}

TEST_F(VelaReportingSessionMemoryTest, ARefusalIsLoggedOncePerStart) {
    limit(1, 10000);
    runningSession();
    send(message('a'));
    send(message('b'));
    const std::string line = "reporter 42 keeps no more messages: limits.session_bytes is 1 B";
    EXPECT_EQ(linesSaying(line), 1U);
    session().stop();
    session().start();
    send(message('c'));
    EXPECT_EQ(linesSaying(line), 2U);
}

TEST_F(VelaReportingSessionMemoryTest, WhatTheSessionSaysAtItsEndIsNeverRefused) {
    limit(2000, 2000);
    runningSession();
    sendOnePlayback();
    while (sendTo(session(), {{"number", static_cast<std::int64_t>(memory_->bytes())}}).empty()) {
    }
    queues_.runUntilIdle();
    beacon_.clearCalls();
    session().stop();
    queues_.runUntilIdle();
    EXPECT_THAT(sentPayloads(), SizeIs(2));
    EXPECT_EQ(memory_->bytes(), 0U);
}

TEST_F(VelaReportingSessionMemoryTest, ASessionThatIsReleasedWithoutStopGivesItsMemoryBack) {
    limit(10000, 10000);
    runningSession();
    send(message('a'));
    queues_.runUntilIdle();
    release();
    EXPECT_EQ(memory_->bytes(), 0U);
}

TEST_F(VelaReportingSessionMemoryTest, InventedKeysCount) {
    limit(100'000, 100'000);
    runningSession();
    const std::string longKey(40'000, 'k');
    EXPECT_EQ(sendTo(session(), {{longKey + '1', 1}}), "");
    EXPECT_EQ(sendTo(session(), {{longKey + '2', 1}}), "limits.session_bytes is 100000 B");
    release();
}

TEST_F(VelaReportingSessionMemoryTest, TheConfigurationCountsAsLongAsTheSessionLives) {
    limit(10'000, 10'000);
    session();
    const std::string text(8'000, 'x');
    EXPECT_EQ(session().setConfiguration(Dictionary{{"text", std::string_view(text)}}), std::nullopt);
    // 24 + 8 of its own, 8 for the text, 32 + 8 for the list of its keys and 24 + 16 for its key.
    EXPECT_EQ(memory_->bytes(), 8'000U + 24 + 8 + 8 + 32 + 8 + 24 + 16);
    EXPECT_EQ(session().setConfiguration(Dictionary{{"text", 1}}), std::nullopt);
    EXPECT_EQ(memory_->bytes(), 24U + 8 + 32 + 8 + 24 + 16);
    release();
    EXPECT_EQ(memory_->bytes(), 0U);
}

TEST_F(VelaReportingSessionMemoryTest, AConfigurationThatPassesALimitLeavesItAsItIsAndIsLoggedOnce) {
    limit(10'000, 10'000);
    session();
    session().setConfiguration(Dictionary{{"text", "old"}});
    const std::uint64_t before = memory_->bytes();
    log_.clear();
    const std::string text(10'000, 'x');
    for (int count = 0; count < 2; ++count) {
        const auto refusal = session().setConfiguration(Dictionary{{"text", std::string_view(text)}, {"more", 1}});
        ASSERT_TRUE(refusal);
        EXPECT_EQ(refusal->description, "limits.session_bytes is 10000 B");
    }
    EXPECT_EQ(session().configuration(), (Dictionary{{"text", "old"}}));
    EXPECT_EQ(memory_->bytes(), before);
    EXPECT_THAT(log_.lines(),
                ElementsAre(sessionLine(
                    LogLevel::Error, "reporter 42 keeps its configuration as it is: limits.session_bytes is 10000 B")));
}

TEST_F(VelaReportingSessionMemoryTest, AMessageOfASessionNotStartedCountsUntilItIsSent) {
    limit(10000, 10000);
    send(message('a'));
    queues_.runUntilIdle();
    EXPECT_EQ(memory_->bytes(), kMessageBytes);
    queues_.advance(std::chrono::seconds(1));
    EXPECT_EQ(memory_->bytes(), 0U);
}

} // namespace

} // namespace vela
