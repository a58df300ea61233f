// The queues of testing/ManualWorkQueues.h. Not thread-safe.
#pragma once

#include "testing/ManualWorkQueues.h"

#include <cassert>
#include <memory>
#include <string>
#include <string_view>
#include <utility>

namespace vela::testing {

/// What both kinds of queue do.
template <class Interface>
class ManualQueueHandle : public Interface {
public:
    ManualQueueHandle(ManualWorkQueues& queues, std::string_view name, bool serial) : queues_(queues), name_(name) {
        state_->serial = serial;
        queues_.addQueue(state_);
    }

    ~ManualQueueHandle() override { queues_.removeQueue(state_); }

    void post(platform::WorkItem item) override { queues_.post(*state_, std::move(item)); }

    void postAfter(platform::Nanoseconds delay, platform::WorkItem item) override {
        if (delay <= platform::Nanoseconds::zero()) {
            post(std::move(item));
            return;
        }
        if (state_->closed) {
            return;
        }
        queues_.addTimer(delay, state_.get(), [this, item = std::move(item)]() mutable { post(std::move(item)); });
    }

    bool isCurrent() const override { return queues_.isRunning(*state_); }

    std::string_view name() const override { return name_; }

protected:
    ManualWorkQueues& queues() const { return queues_; }
    const std::shared_ptr<ManualQueue>& state() const { return state_; }

private:
    ManualWorkQueues& queues_;
    const std::string name_;
    const std::shared_ptr<ManualQueue> state_ = std::make_shared<ManualQueue>();
};

class ManualSerialQueue final : public ManualQueueHandle<platform::SerialQueue> {
public:
    ManualSerialQueue(ManualWorkQueues& queues, std::string_view name) : ManualQueueHandle(queues, name, true) {}
    ~ManualSerialQueue() override;

    void suspend() override { ++state()->suspensions; }
    void resume() override { resumeWith(nullptr); }
    void resumeWith(platform::WorkItem first) override {
        assert(state()->suspensions > 0);
        --state()->suspensions;
        if (first) {
            queues().postFirst(*state(), std::move(first));
        }
    }
};

} // namespace vela::testing
