#include "common/VelaReportingVocabulary.h"
#include "reporters/pipewire/ReportDelivery.h"
#include "reporters/pipewire/ReportSender.h"

#include <algorithm>
#include <atomic>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <mutex>
#include <string>
#include <vector>

namespace vela::reporter {
namespace {

using ::testing::ElementsAre;
using ::testing::IsEmpty;
using Lines = std::vector<std::string>;

/// A service that may go away and come again. Thread-safe.
class FakeService final : public ServiceCalls {
public:
    bool isConnected() const override { return isThere; }
    std::uint64_t connections() const override { return times; }
    bool createSession(const SessionDescription& session) override { return add("create", session.reporterID); }
    bool startSession(std::int64_t reporterID) override { return add("start", reporterID); }
    bool send(std::int64_t reporterID, const Report& report) override {
        return add("send " + std::to_string(report.type), reporterID);
    }
    bool destroySession(std::int64_t reporterID) override { return add("destroy", reporterID); }
    bool stopSession(std::int64_t reporterID, std::chrono::milliseconds /*timeout*/) override {
        add("stop", reporterID);
        if (lateStops > 0) {
            --lateStops;
            return false;
        }
        if (unansweredStops > 0) {
            --unansweredStops;
            restart();
            return false;
        }
        return true;
    }
    void restart() { ++times; }
    Lines take() {
        const std::lock_guard lock(mutex_);
        return std::exchange(lines_, {});
    }

    std::atomic<bool> isThere = true;
    std::atomic<bool> isFull = false;
    std::atomic<std::uint64_t> times = 1;
    std::atomic<int> lateStops = 0;       ///< that are handled, and answered too late
    std::atomic<int> unansweredStops = 0; ///< in which the service ends, and comes again

private:
    bool add(const std::string& line, std::int64_t reporterID) {
        const std::lock_guard lock(mutex_);
        if (!isFull) {
            lines_.push_back(line + " " + std::to_string(reporterID));
        }
        return !isFull;
    }

    std::mutex mutex_;
    Lines lines_;
};

Call create(std::int64_t id = 7) {
    CreateCall call;
    call.session.reporterID = id;
    return call;
}
Call condition(std::uint16_t type) { return SendCall{7, {0, AudioEventCategoryVolume, type, true, {}}}; }
Call remark(std::uint16_t type) { return SendCall{7, {0, AudioEventCategoryError, type, false, {}}}; }

class ReportDeliveryTest : public ::testing::Test {
protected:
    bool perform(const std::vector<Call>& calls) {
        return std::ranges::all_of(calls, [this](const Call& call) { return delivery.perform(call); });
    }

    FakeService service;
    ReportDelivery delivery{service};
};

TEST_F(ReportDeliveryTest, BringsCallsInTheirOrder) {
    EXPECT_TRUE(perform({create(), StartCall{7}, condition(1), remark(6), StopCall{7}, DestroyCall{7}}));
    EXPECT_THAT(service.take(), ElementsAre("create 7", "start 7", "send 1 7", "send 6 7", "stop 7", "destroy 7"));
}

TEST_F(ReportDeliveryTest, CreatesWithoutAServiceAndWaitsWithTheRest) {
    service.isThere = false;
    EXPECT_TRUE(perform({create()}));
    EXPECT_FALSE(perform({StartCall{7}}));
    EXPECT_THAT(service.take(), ElementsAre("create 7"));
    service.isThere = true;
    EXPECT_TRUE(perform({StartCall{7}}));
    EXPECT_THAT(service.take(), ElementsAre("start 7"));
}

TEST_F(ReportDeliveryTest, AFullQueueIsTriedAgain) {
    service.isFull = true;
    EXPECT_FALSE(perform({create()}));
    service.isFull = false;
    EXPECT_TRUE(perform({create(), StartCall{7}}));
    service.isFull = true;
    EXPECT_FALSE(perform({condition(1)}));
}

TEST_F(ReportDeliveryTest, ANewServiceIsToldTheConditionsOfTheRun) {
    perform({create(), StartCall{7}, condition(1), remark(6), condition(2)});
    service.take();
    service.restart();
    EXPECT_TRUE(perform({condition(3)}));
    EXPECT_THAT(service.take(), ElementsAre("send 1 7", "send 2 7", "send 3 7"));
    EXPECT_TRUE(perform({condition(4)}));
    EXPECT_THAT(service.take(), ElementsAre("send 4 7"));
}

TEST_F(ReportDeliveryTest, ANewServiceIsToldTheConditionsBeforeTheStop) {
    perform({create(), StartCall{7}, condition(1)});
    service.take();
    service.restart();
    EXPECT_TRUE(perform({StopCall{7}}));
    EXPECT_THAT(service.take(), ElementsAre("send 1 7", "stop 7"));
}

TEST_F(ReportDeliveryTest, AStopThatIsNotAnsweredRepeatsTheWholeRun) {
    perform({create(), StartCall{7}, condition(1), condition(2)});
    service.take();
    service.unansweredStops = 1;
    EXPECT_FALSE(perform({StopCall{7}}));
    EXPECT_TRUE(perform({StopCall{7}}));
    EXPECT_THAT(service.take(),
                ElementsAre("stop 7", "stop 7", "create 7", "start 7", "send 1 7", "send 2 7", "stop 7"));
}

TEST_F(ReportDeliveryTest, AStopThatIsAnsweredTooLateIsMadeAgainAlone) {
    perform({create(), StartCall{7}, condition(1)});
    service.take();
    service.lateStops = 1;
    EXPECT_FALSE(perform({StopCall{7}}));
    EXPECT_TRUE(perform({StopCall{7}}));
    EXPECT_THAT(service.take(), ElementsAre("stop 7", "stop 7"));
}

TEST_F(ReportDeliveryTest, AServiceThatIsAlwaysTooLateIsNotToldTheRunAgain) {
    perform({create(), StartCall{7}, condition(1)});
    service.take();
    service.lateStops = 3;
    EXPECT_FALSE(perform({StopCall{7}}));
    EXPECT_FALSE(perform({StopCall{7}}));
    EXPECT_FALSE(perform({StopCall{7}}));
    EXPECT_TRUE(perform({StopCall{7}}));
    EXPECT_THAT(service.take(), ElementsAre("stop 7", "stop 7", "stop 7", "stop 7"));
}

TEST_F(ReportDeliveryTest, AServiceThatEndsAfterALateStopIsToldTheWholeRun) {
    perform({create(), StartCall{7}, condition(1)});
    service.take();
    service.lateStops = 1;
    EXPECT_FALSE(perform({StopCall{7}}));
    service.restart();
    EXPECT_TRUE(perform({StopCall{7}}));
    EXPECT_THAT(service.take(), ElementsAre("stop 7", "stop 7", "create 7", "start 7", "send 1 7", "stop 7"));
}

TEST_F(ReportDeliveryTest, ARunIsRepeatedOnceWhenTheNewServiceIsLateToo) {
    perform({create(), StartCall{7}, condition(1)});
    service.take();
    service.unansweredStops = 1;
    EXPECT_FALSE(perform({StopCall{7}}));
    service.lateStops = 1;
    EXPECT_FALSE(perform({StopCall{7}}));
    EXPECT_TRUE(perform({StopCall{7}}));
    EXPECT_THAT(service.take(), ElementsAre("stop 7", "stop 7", "stop 7", "create 7", "start 7", "send 1 7", "stop 7"));
}

TEST_F(ReportDeliveryTest, ARunIsForgottenWithItsStop) {
    perform({create(), StartCall{7}, condition(1), StopCall{7}});
    service.take();
    service.restart();
    EXPECT_TRUE(perform({StartCall{7}, condition(2), StopCall{7}, DestroyCall{7}}));
    EXPECT_THAT(service.take(), ElementsAre("start 7", "send 2 7", "stop 7", "destroy 7"));
}

TEST_F(ReportDeliveryTest, WhatIsSaidOutsideARunIsNotRepeated) {
    perform({create(), remark(6)});
    service.restart();
    service.take();
    EXPECT_TRUE(perform({remark(6)}));
    EXPECT_THAT(service.take(), ElementsAre("send 6 7"));
}

TEST_F(ReportDeliveryTest, CallsOfUnknownSessionsAreDone) {
    EXPECT_TRUE(perform({StartCall{7}, condition(1), StopCall{7}, DestroyCall{7}}));
    EXPECT_THAT(service.take(), IsEmpty());
}

TEST_F(ReportDeliveryTest, KeepsTheStartAndTheLatestConditions) {
    perform({create(), StartCall{7}, condition(AudioEventTypeStart)});
    for (std::size_t i = 0; i < ReportDelivery::kMostConditions + 10; ++i) {
        perform({condition(AudioEventTypeState)});
    }
    service.take();
    service.restart();
    EXPECT_TRUE(perform({StopCall{7}}));
    const Lines lines = service.take();
    EXPECT_EQ(lines.size(), ReportDelivery::kMostConditions + 1);
    EXPECT_EQ(lines.front(), "send 1 7");
}

TEST(ReportSenderTest, BringsCallsOnItsThread) {
    FakeService service;
    ReportSender sender(service);
    SessionDescription session;
    session.reporterID = 7;
    sender.createSession(session);
    sender.startSession(7);
    sender.send(7, {0, AudioEventCategoryVolume, AudioEventTypeState, true, {}});
    sender.stopSession(7);
    sender.destroySession(7);
    EXPECT_EQ(sender.end(std::chrono::seconds(30)), 0);
    EXPECT_THAT(service.take(), ElementsAre("create 7", "start 7", "send 18 7", "stop 7", "destroy 7"));
}

TEST(ReportSenderTest, WaitsForAServiceThatComesLater) {
    FakeService service;
    service.isThere = false;
    ReportSender sender(service);
    SessionDescription session;
    session.reporterID = 7;
    sender.createSession(session);
    sender.startSession(7);
    sender.stopSession(7);
    service.isThere = true;
    EXPECT_EQ(sender.end(std::chrono::seconds(30)), 0);
    EXPECT_THAT(service.take(), ElementsAre("create 7", "start 7", "stop 7"));
}

TEST(ReportSenderTest, DoesNotWaitLongerThanItsPatience) {
    FakeService service;
    service.isThere = false;
    ReportSender sender(service);
    SessionDescription session;
    session.reporterID = 7;
    sender.createSession(session);
    sender.startSession(7);
    sender.stopSession(7);
    EXPECT_EQ(sender.end(std::chrono::milliseconds(20)), 2);
}

TEST(ReportSenderTest, TakesEndsOnlyWhenTooMuchWaits) {
    FakeService service;
    service.isFull = true;
    ReportSender sender(service);
    sender.createSession({}); // is not taken, so that all others wait behind it
    for (std::size_t i = 1; i < ReportSender::kMostCalls; ++i) {
        sender.startSession(7);
    }
    EXPECT_EQ(sender.dropped(), 0);
    sender.stopSession(7);
    EXPECT_EQ(sender.dropped(), 0);
    SessionDescription other;
    other.reporterID = 8;
    sender.createSession(other);
    sender.startSession(7);
    EXPECT_EQ(sender.dropped(), 2);
    sender.stopSession(7);
    sender.destroySession(8);
    EXPECT_EQ(sender.dropped(), 4) << "the ends of what was not taken";
    sender.destroySession(7);
    EXPECT_EQ(sender.dropped(), 4);
    EXPECT_EQ(sender.end(std::chrono::milliseconds(0)), 20'002);
}

TEST(ReportSenderTest, StreamsThatComeAndGoWithoutAServiceDoNotPileUp) {
    FakeService service;
    service.isThere = false;
    ReportSender sender(service);
    for (std::int64_t id = 1; id <= 30'000; ++id) {
        SessionDescription session;
        session.reporterID = id;
        sender.createSession(session);
        sender.startSession(id);
        sender.stopSession(id);
        sender.destroySession(id);
    }
    // The first session's creation is brought, and everything else waits behind its start.
    const std::size_t left = sender.end(std::chrono::milliseconds(0));
    EXPECT_LE(left, 20'003);
    EXPECT_GE(left, 19'999);
    EXPECT_GE(sender.dropped(), 99'996);
}

} // namespace
} // namespace vela::reporter
