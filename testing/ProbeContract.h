// What every Probe does, as a test suite that runs on the fake and on the real one.
//
// A harness has: `platform::Probe& probe()`, whose traces run until they are stopped and have a result;
// `platform::Probe& failingProbe()`, whose traces cannot start; and `template <class Done> bool settle(const Done&)`,
// which lets the traces go on until `Done` answers true (true), or gives up (false). It may have a static
// `std::string obstacle()`, which says why the tests cannot run here; empty where they can.
#pragma once

#include "platform/Probe.h"
#include "testing/RecordingProbeDelegate.h"

#include <atomic>
#include <cstddef>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <memory>
#include <string>
#include <thread>

namespace vela::testing {

template <class Harness>
class ProbeContract : public ::testing::Test {
protected:
    using Session = std::shared_ptr<platform::ProbeTraceSession>;
    using Delegate = std::shared_ptr<RecordingProbeDelegate>;

    void SetUp() override {
        if constexpr (requires { Harness::obstacle(); }) {
            if (const std::string obstacle = Harness::obstacle(); !obstacle.empty()) {
                GTEST_SKIP() << obstacle;
            }
        }
    }

    static Session sessionOf(platform::Probe& probe, const Delegate& delegate) {
        const auto config = probe.makeProbeTraceConfig(1);
        EXPECT_NE(config, nullptr);
        Session session = config == nullptr ? nullptr : probe.createProbeTraceSession(*config);
        EXPECT_NE(session, nullptr);
        if (session != nullptr) {
            session->setDelegate(delegate);
        }
        return session;
    }
    Session session() { return sessionOf(harness_.probe(), delegate_); }
    Session failingSession() { return sessionOf(harness_.failingProbe(), delegate_); }
    bool settleUntil(const std::string& call) {
        return harness_.settle([&] { return delegate_->was(call); });
    }
    bool settleUntilCompletions(std::ptrdiff_t count) {
        return harness_.settle([&] { return delegate_->completions() >= count; });
    }
    /// Time enough for an earlier trace to tell more than it should.
    void letAnotherTraceEnd() {
        const auto other = std::make_shared<RecordingProbeDelegate>();
        const Session session = sessionOf(harness_.probe(), other);
        session->startProbeTrace();
        session->stopProbeTrace();
        EXPECT_TRUE(harness_.settle([&] { return other->completions() == 1; }));
    }

    Harness harness_;
    Delegate delegate_ = std::make_shared<RecordingProbeDelegate>();
};

TYPED_TEST_SUITE_P(ProbeContract);

TYPED_TEST_P(ProbeContract, AStartIsTold) {
    const auto session = this->session();
    session->startProbeTrace();
    ASSERT_TRUE(this->settleUntil("start"));
    EXPECT_THAT(this->delegate_->calls(), ::testing::ElementsAre("start"));
}

TYPED_TEST_P(ProbeContract, AStopIsToldAndThenTheCompletionWithTheUrlOfAFile) {
    const auto session = this->session();
    session->startProbeTrace();
    ASSERT_TRUE(this->settleUntil("start"));
    session->stopProbeTrace();
    ASSERT_TRUE(this->settleUntilCompletions(1));
    EXPECT_THAT(this->delegate_->calls(), ::testing::ElementsAre("start", "stop", "complete"));
    EXPECT_THAT(this->delegate_->urls(), ::testing::ElementsAre(::testing::StartsWith("file:///")));
}

TYPED_TEST_P(ProbeContract, AStopRightBehindTheStartIsDoneAfterIt) {
    const auto session = this->session();
    session->startProbeTrace();
    session->stopProbeTrace();
    ASSERT_TRUE(this->settleUntilCompletions(1));
    EXPECT_THAT(this->delegate_->calls(), ::testing::ElementsAre("start", "stop", "complete"));
}

TYPED_TEST_P(ProbeContract, StoppingTwiceCompletesOnce) {
    const auto session = this->session();
    session->startProbeTrace();
    session->stopProbeTrace();
    session->stopProbeTrace();
    ASSERT_TRUE(this->settleUntilCompletions(1));
    session->stopProbeTrace();
    this->letAnotherTraceEnd();
    EXPECT_THAT(this->delegate_->calls(), ::testing::ElementsAre("start", "stop", "complete"));
}

TYPED_TEST_P(ProbeContract, AStopWithoutAStartTellsNothing) {
    const auto session = this->session();
    session->stopProbeTrace();
    this->letAnotherTraceEnd();
    EXPECT_THAT(this->delegate_->calls(), ::testing::IsEmpty());
}

TYPED_TEST_P(ProbeContract, ATraceThatDoesNotStartSaysWhyAndCompletes) {
    const auto session = this->failingSession();
    session->startProbeTrace();
    ASSERT_TRUE(this->settleUntilCompletions(1));
    EXPECT_THAT(this->delegate_->calls(), ::testing::ElementsAre("start failed", "complete failed"));
    EXPECT_THAT(this->delegate_->urls(), ::testing::ElementsAre(""));
    for (const platform::Failure& failure : this->delegate_->failures()) {
        EXPECT_NE(failure.description, "");
    }
}

TYPED_TEST_P(ProbeContract, ATraceThatDoesNotStartCompletesAlsoWhenItsSessionIsLetGoOfAtOnce) {
    auto session = this->failingSession();
    auto* const kept = &session;
    std::atomic<bool> isAsked = false;
    this->delegate_->onStart = [kept, &isAsked] {
        while (!isAsked) {
            std::this_thread::yield();
        }
        kept->reset();
    };
    session->startProbeTrace();
    isAsked = true;
    ASSERT_TRUE(this->settleUntilCompletions(1));
    EXPECT_THAT(this->delegate_->calls(), ::testing::ElementsAre("start failed", "complete failed"));
}

TYPED_TEST_P(ProbeContract, ADelegateThatWasTakenOffIsNotCalled) {
    const auto session = this->session();
    session->setDelegate({});
    session->startProbeTrace();
    session->stopProbeTrace();
    this->letAnotherTraceEnd();
    EXPECT_THAT(this->delegate_->calls(), ::testing::IsEmpty());
}

TYPED_TEST_P(ProbeContract, ADelegateMayBeTakenOffWithinACall) {
    const auto session = this->session();
    this->delegate_->onStart = [&] { session->setDelegate({}); };
    session->startProbeTrace();
    ASSERT_TRUE(this->settleUntil("start"));
    session->stopProbeTrace();
    this->letAnotherTraceEnd();
    EXPECT_THAT(this->delegate_->calls(), ::testing::ElementsAre("start"));
}

TYPED_TEST_P(ProbeContract, TheSessionMayBeLetGoOfWithinItsCompletion) {
    auto session = this->session();
    auto* const kept = &session;
    std::atomic<bool> isAsked = false;
    this->delegate_->onComplete = [kept, &isAsked] {
        while (!isAsked) {
            std::this_thread::yield();
        }
        (*kept)->setDelegate({});
        kept->reset();
    };
    session->startProbeTrace();
    session->stopProbeTrace();
    isAsked = true;
    ASSERT_TRUE(this->settleUntilCompletions(1));
    this->letAnotherTraceEnd();
    EXPECT_THAT(this->delegate_->calls(), ::testing::ElementsAre("start", "stop", "complete"));
}

TYPED_TEST_P(ProbeContract, TheDelegateIsHeldWeakly) {
    const auto session = this->session();
    const std::weak_ptr<RecordingProbeDelegate> delegate = this->delegate_;
    this->delegate_ = std::make_shared<RecordingProbeDelegate>();
    EXPECT_TRUE(delegate.expired());
    session->startProbeTrace();
    session->stopProbeTrace();
    this->letAnotherTraceEnd();
}

TYPED_TEST_P(ProbeContract, EachTraceHasAnotherUrl) {
    for (std::ptrdiff_t traces = 1; traces <= 2; ++traces) {
        const auto session = this->session();
        session->startProbeTrace();
        session->stopProbeTrace();
        ASSERT_TRUE(this->settleUntilCompletions(traces));
    }
    EXPECT_NE(this->delegate_->urls().at(0), this->delegate_->urls().at(1));
}

REGISTER_TYPED_TEST_SUITE_P(ProbeContract, AStartIsTold, AStopIsToldAndThenTheCompletionWithTheUrlOfAFile,
                            AStopRightBehindTheStartIsDoneAfterIt, StoppingTwiceCompletesOnce,
                            AStopWithoutAStartTellsNothing, ATraceThatDoesNotStartSaysWhyAndCompletes,
                            ATraceThatDoesNotStartCompletesAlsoWhenItsSessionIsLetGoOfAtOnce,
                            ADelegateThatWasTakenOffIsNotCalled, ADelegateMayBeTakenOffWithinACall,
                            TheSessionMayBeLetGoOfWithinItsCompletion, TheDelegateIsHeldWeakly, EachTraceHasAnotherUrl);

} // namespace vela::testing
