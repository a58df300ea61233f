#include "client/WaitingCalls.h"

#include <gtest/gtest.h>
#include <thread>

namespace vela::client {

namespace {

Reply replyWith(VelaReportingStatus status, std::string text = "") {
    Reply reply;
    reply.status = status;
    reply.errorText = std::move(text);
    return reply;
}

TEST(WaitingCallsTest, AnAnswerMayComeBeforeTheWait) {
    WaitingCalls calls;
    WaitingCalls::Waiter waiter(calls);
    EXPECT_NE(waiter.ticket(), 0U);
    EXPECT_TRUE(calls.isWaiting(waiter.ticket()));
    calls.answer(waiter.ticket(), replyWith(VelaReportingStatusRefused, "no"));
    EXPECT_FALSE(calls.isWaiting(waiter.ticket()));
    const Reply reply = waiter.wait(0);
    EXPECT_EQ(reply.status, VelaReportingStatusRefused);
    EXPECT_EQ(reply.errorText, "no");
}

TEST(WaitingCallsTest, AnAnswerFromAnotherThreadEndsTheWait) {
    WaitingCalls calls;
    WaitingCalls::Waiter waiter(calls);
    std::thread other([&] { calls.answer(waiter.ticket(), replyWith(VelaReportingStatusOk)); });
    EXPECT_EQ(waiter.wait(-1).status, VelaReportingStatusOk);
    other.join();
}

TEST(WaitingCallsTest, WithoutAnAnswerTheTimeIsOver) {
    WaitingCalls calls;
    WaitingCalls::Waiter waiter(calls);
    EXPECT_EQ(waiter.wait(1).status, VelaReportingStatusTimeout);
    EXPECT_FALSE(calls.isWaiting(waiter.ticket()));
    calls.answer(waiter.ticket(), replyWith(VelaReportingStatusOk));
}

TEST(WaitingCallsTest, OnlyTheFirstAnswerCounts) {
    WaitingCalls calls;
    WaitingCalls::Waiter waiter(calls);
    calls.answer(waiter.ticket(), replyWith(VelaReportingStatusRefused));
    calls.answer(waiter.ticket(), replyWith(VelaReportingStatusOk));
    calls.answerAll(calls.nextTicket(), VelaReportingStatusNoService, "");
    EXPECT_EQ(waiter.wait(0).status, VelaReportingStatusRefused);
}

TEST(WaitingCallsTest, NobodyIsBehindATicketThatHasGone) {
    WaitingCalls calls;
    std::uint64_t ticket = 0;
    {
        const WaitingCalls::Waiter waiter(calls);
        ticket = waiter.ticket();
    }
    EXPECT_FALSE(calls.isWaiting(ticket));
    calls.answer(ticket, replyWith(VelaReportingStatusOk));
}

TEST(WaitingCallsTest, AllMeansThoseWhoCameBefore) {
    WaitingCalls calls;
    WaitingCalls::Waiter early(calls);
    const std::uint64_t before = calls.nextTicket();
    WaitingCalls::Waiter late(calls);
    calls.answerAll(before, VelaReportingStatusNoService, "nobody there");
    EXPECT_TRUE(calls.isWaiting(late.ticket()));
    const Reply reply = early.wait(0);
    EXPECT_EQ(reply.status, VelaReportingStatusNoService);
    EXPECT_EQ(reply.errorText, "nobody there");
    EXPECT_EQ(late.wait(0).status, VelaReportingStatusTimeout);
}

} // namespace

} // namespace vela::client
