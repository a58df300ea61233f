// What sessions may keep in memory, and what becomes of the rest.
#include "session/Session_test.h"

namespace vela {

namespace {

using ::testing::ElementsAre;
using ::testing::IsEmpty;
using ::testing::SizeIs;

/// A tagged message of one text of 64 bytes takes 16 + 2 * 9 (padded) of its own, 8 + 64 for the text and 8 + 16 for
/// the tag "GenericStart".
constexpr std::uint64_t kMessageBytes = 16 + 2 * 8 + 8 + 8 + 64 + 8 + 16;

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
    EXPECT_EQ(sendTo(session(), message('c')), "limits.session_bytes is 408 B");
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
    EXPECT_EQ(sendTo(session(), message('a')), "limits.total_bytes is 272 B");
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
