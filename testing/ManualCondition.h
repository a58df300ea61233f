// The conditions of testing/ManualWorkQueues.h. Not thread-safe.
#pragma once

#include "testing/ManualWorkQueues.h"

#include <algorithm>
#include <cassert>
#include <utility>

namespace vela::testing {

class ManualCondition final : public platform::Condition {
public:
    explicit ManualCondition(ManualWorkQueues& queues) : queues_(queues) {}

    void lock() override {
        assert(!locked_);
        locked_ = true;
    }

    void unlock() override {
        assert(locked_);
        locked_ = false;
    }

    platform::MonotonicTime monotonicNow() const override { return queues_.clock_.monotonicNow(); }

    bool waitUntil(platform::MonotonicTime deadline) override {
        assert(locked_);
        ManualClock& clock = queues_.clock_;
        if (queues_.conditionSteps_.empty()) {
            if (deadline == platform::MonotonicTime::max()) {
                ManualWorkQueues::failHopelessWait();
            }
            clock.advance(std::max(deadline - clock.monotonicNow(), platform::Nanoseconds::zero()));
            return false;
        }
        ManualWorkQueues::ConditionStep step = std::move(queues_.conditionSteps_.front());
        queues_.conditionSteps_.pop_front();
        signalled_ = false;
        locked_ = false;
        step(*this);
        lock();
        return signalled_ || clock.monotonicNow() < deadline;
    }

    void signal() override { signalled_ = true; }

private:
    ManualWorkQueues& queues_;
    bool locked_ = false;
    bool signalled_ = false;
};

} // namespace vela::testing
