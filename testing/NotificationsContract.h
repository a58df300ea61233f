// What every Notifications does, as a test suite that runs on the fake and on the real one.
//
// A harness has: `Notifications& notifications()`; `std::unique_ptr<SerialQueue> makeQueue()`; `void post(name)`, which
// leaves the state; `void post(name, state)`; `void settle(done)`, which returns when `done()` is true and everything
// that was posted before has been delivered.
#pragma once

#include "platform/Notifications.h"
#include "platform/WorkQueue.h"
#include "testing/Record.h"

#include <algorithm>
#include <cstddef>
#include <cstdint>
#include <gtest/gtest.h>
#include <limits>
#include <memory>
#include <optional>
#include <string_view>
#include <vector>

namespace vela::testing {

template <class Harness>
class NotificationsContract : public ::testing::Test {
protected:
    ~NotificationsContract() override {
        // The queue outlives the registrations.
        for (std::int32_t token = 1; token <= 20; ++token) {
            notifications().cancel(token);
        }
    }

    platform::Notifications& notifications() { return harness_.notifications(); }
    /// Registers for `name`; calls note their token.
    std::int32_t registered(std::string_view name) {
        const platform::NotificationRegistration registration =
            notifications().registerForNotification(name, *queue_, [this](std::int32_t token) { calls_.add(token); });
        EXPECT_EQ(registration.status, 0);
        return registration.token;
    }
    std::size_t callsOf(std::int32_t token) const {
        const std::vector<int> numbers = calls_.numbers();
        return static_cast<std::size_t>(std::count(numbers.begin(), numbers.end(), token));
    }
    /// Waits until everything posted so far was delivered.
    void settle() {
        const std::int32_t mark = registered("settled");
        harness_.post("settled");
        harness_.settle([this, mark] { return callsOf(mark) > 0; });
        notifications().cancel(mark);
    }

    Record calls_;
    Harness harness_;
    const std::unique_ptr<platform::SerialQueue> queue_ = harness_.makeQueue();
};

TYPED_TEST_SUITE_P(NotificationsContract);

TYPED_TEST_P(NotificationsContract, TokensCountFromOne) {
    EXPECT_EQ(this->registered("a"), 1);
    EXPECT_EQ(this->registered("b"), 2);
    EXPECT_EQ(this->registered("a"), 3);
}

TYPED_TEST_P(NotificationsContract, APostCallsTheHandlerOnItsQueueWithItsToken) {
    std::int32_t told = 0;
    bool onQueue = false;
    const auto registration =
        this->notifications().registerForNotification("a", *this->queue_, [&](std::int32_t token) {
            told = token;
            onQueue = this->queue_->isCurrent();
        });
    this->harness_.post("a");
    this->settle();
    EXPECT_EQ(told, registration.token);
    EXPECT_TRUE(onQueue);
}

TYPED_TEST_P(NotificationsContract, EveryRegistrationOfTheNameIsCalledAndNoOther) {
    const std::int32_t first = this->registered("a");
    const std::int32_t other = this->registered("b");
    const std::int32_t second = this->registered("a");
    this->harness_.post("a");
    this->settle();
    EXPECT_EQ(this->callsOf(first), 1U);
    EXPECT_EQ(this->callsOf(second), 1U);
    EXPECT_EQ(this->callsOf(other), 0U);
}

TYPED_TEST_P(NotificationsContract, WhatWasPostedBeforeARegistrationIsNotDeliveredToIt) {
    this->registered("other");
    this->harness_.post("a", 5);
    this->settle();
    const std::int32_t token = this->registered("a");
    this->settle();
    EXPECT_EQ(this->callsOf(token), 0U);
    EXPECT_EQ(this->notifications().state(token), std::optional<std::uint64_t>(5));
}

TYPED_TEST_P(NotificationsContract, ANameThatWasNeverPostedHasNoState) {
    EXPECT_EQ(this->notifications().state(this->registered("a")), std::nullopt);
}

TYPED_TEST_P(NotificationsContract, TheStateIsThatOfTheLastPost) {
    constexpr std::uint64_t kMost = std::numeric_limits<std::uint64_t>::max();
    const std::int32_t token = this->registered("a");
    this->harness_.post("a", 1);
    EXPECT_EQ(this->notifications().state(token), std::optional<std::uint64_t>(1));
    this->harness_.post("a", kMost);
    EXPECT_EQ(this->notifications().state(token), std::optional(kMost));
    this->harness_.post("a", 0);
    EXPECT_EQ(this->notifications().state(token), std::optional<std::uint64_t>(0));
}

TYPED_TEST_P(NotificationsContract, APostWithoutAStateLeavesIt) {
    const std::int32_t token = this->registered("a");
    this->harness_.post("a", 7);
    this->settle();
    this->harness_.post("a");
    this->settle();
    EXPECT_EQ(this->callsOf(token), 2U);
    EXPECT_EQ(this->notifications().state(token), std::optional<std::uint64_t>(7));
}

TYPED_TEST_P(NotificationsContract, AHandlerSeesTheStateOfItsPost) {
    std::optional<std::uint64_t> seen;
    this->notifications().registerForNotification(
        "a", *this->queue_, [&](std::int32_t token) { seen = this->notifications().state(token); });
    this->harness_.post("a", 3);
    this->settle();
    EXPECT_EQ(seen, std::optional<std::uint64_t>(3));
}

TYPED_TEST_P(NotificationsContract, ATokenThatWasNeverGivenHasNoState) {
    this->harness_.post("a", 1);
    EXPECT_EQ(this->notifications().state(1), std::nullopt);
    EXPECT_EQ(this->notifications().state(-1), std::nullopt);
}

TYPED_TEST_P(NotificationsContract, AfterACancelNothingIsCalledAndTheStateIsNone) {
    const std::int32_t token = this->registered("a");
    const std::int32_t kept = this->registered("a");
    this->harness_.post("a", 1);
    this->settle();
    this->notifications().cancel(token);
    this->harness_.post("a", 2);
    this->settle();
    EXPECT_EQ(this->callsOf(token), 1U);
    EXPECT_EQ(this->callsOf(kept), 2U);
    EXPECT_EQ(this->notifications().state(token), std::nullopt);
    EXPECT_EQ(this->notifications().state(kept), std::optional<std::uint64_t>(2));
}

TYPED_TEST_P(NotificationsContract, ACallThatWaitsInTheQueueIsNotMadeAfterACancel) {
    const auto slow = this->harness_.makeQueue();
    slow->suspend();
    const auto registration = this->notifications().registerForNotification(
        "a", *slow, [this](std::int32_t token) { this->calls_.add(token); });
    const std::int32_t prompt = this->registered("a");
    this->harness_.post("a");
    this->settle();
    EXPECT_EQ(this->callsOf(prompt), 1U);
    this->notifications().cancel(registration.token);
    bool drained = false;
    slow->post([&] {
        drained = true;
        this->calls_.add(1000);
    });
    slow->resume();
    this->harness_.settle([this] { return this->callsOf(1000) == 1; });
    EXPECT_TRUE(drained);
    EXPECT_EQ(this->callsOf(registration.token), 0U);
}

TYPED_TEST_P(NotificationsContract, AHandlerMayCancelItself) {
    this->notifications().registerForNotification("a", *this->queue_, [this](std::int32_t token) {
        this->notifications().cancel(token);
        this->calls_.add(token);
    });
    this->harness_.post("a");
    this->settle();
    this->harness_.post("a");
    this->settle();
    EXPECT_EQ(this->callsOf(1), 1U);
}

TYPED_TEST_P(NotificationsContract, ACancelDestroysTheHandler) {
    int destroyed = 0;
    const auto registration = this->notifications().registerForNotification(
        "a", *this->queue_, [trace = Trace([&destroyed] { ++destroyed; })](std::int32_t) {});
    EXPECT_EQ(destroyed, 0);
    this->notifications().cancel(registration.token);
    EXPECT_EQ(destroyed, 1);
}

TYPED_TEST_P(NotificationsContract, ATokenThatWasNeverGivenMayBeCancelled) {
    this->notifications().cancel(77);
    this->notifications().cancel(this->registered("a"));
    this->notifications().cancel(1);
    EXPECT_EQ(this->registered("a"), 2);
}

REGISTER_TYPED_TEST_SUITE_P(NotificationsContract, TokensCountFromOne, APostCallsTheHandlerOnItsQueueWithItsToken,
                            EveryRegistrationOfTheNameIsCalledAndNoOther,
                            WhatWasPostedBeforeARegistrationIsNotDeliveredToIt, ANameThatWasNeverPostedHasNoState,
                            TheStateIsThatOfTheLastPost, APostWithoutAStateLeavesIt, AHandlerSeesTheStateOfItsPost,
                            ATokenThatWasNeverGivenHasNoState, AfterACancelNothingIsCalledAndTheStateIsNone,
                            ACallThatWaitsInTheQueueIsNotMadeAfterACancel, AHandlerMayCancelItself,
                            ACancelDestroysTheHandler, ATokenThatWasNeverGivenMayBeCancelled);

} // namespace vela::testing
