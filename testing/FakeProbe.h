// A performance-trace service whose traces do what a test says, when it says so, on the thread that says so. Keeps what
// it was asked in order. Thread-safe; delegates are called outside the lock.
#pragma once

#include "platform/Mutex.h"
#include "platform/Probe.h"

#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <utility>
#include <vector>

namespace vela::testing {

class FakeProbe final : public platform::Probe {
public:
    using Delegate = platform::ProbeTraceDelegate;

    /// "makeProbeTraceConfig 1", "createProbeTraceSession 1" (the configuration's template), "setDelegate" or
    /// "setDelegate null", "startProbeTrace", "stopProbeTrace", "released" (a session).
    std::vector<std::string> calls() const {
        const MutexLock lock(state_->mutex);
        return state_->calls;
    }
    void clear() {
        const MutexLock lock(state_->mutex);
        state_->calls.clear();
    }
    /// Called after every call with its text, outside the lock: a test's place to answer.
    void setObserver(std::function<void(const std::string& call)> observer) {
        const MutexLock lock(state_->mutex);
        state_->observer = std::move(observer);
    }
    /// From now on a trace that is stopped completes at once, within the call; none ends it.
    void completeWhenStopped(std::optional<std::string> url) {
        const MutexLock lock(state_->mutex);
        state_->url = std::move(url);
    }
    /// Of the session that had one last; null when that was taken off, or is gone.
    std::shared_ptr<Delegate> delegate() const {
        const MutexLock lock(state_->mutex);
        return state_->delegate.lock();
    }

    std::shared_ptr<platform::ProbeTraceConfig> makeProbeTraceConfig(int templateNumber) override {
        state_->note("makeProbeTraceConfig " + std::to_string(templateNumber));
        return std::make_shared<Config>(templateNumber);
    }
    std::shared_ptr<platform::ProbeTraceSession>
    createProbeTraceSession(const platform::ProbeTraceConfig& config) override {
        state_->note("createProbeTraceSession " + std::to_string(dynamic_cast<const Config&>(config).templateNumber));
        return std::make_shared<Session>(state_);
    }

private:
    struct Config final : platform::ProbeTraceConfig {
        explicit Config(int number) : templateNumber(number) {}
        const int templateNumber;
    };

    struct State {
        void note(const std::string& call) {
            std::function<void(const std::string&)> called;
            {
                const MutexLock lock(mutex);
                calls.push_back(call);
                called = observer;
            }
            if (called) {
                called(call);
            }
        }

        void completeWhereAskedTo() {
            std::shared_ptr<Delegate> called;
            std::optional<std::string> file;
            {
                const MutexLock lock(mutex);
                called = delegate.lock();
                file = url;
            }
            if (called != nullptr && file) {
                called->performanceTraceDidComplete(*file, "token", std::nullopt);
            }
        }

        Mutex mutex;
        std::optional<std::string> url VELA_GUARDED_BY(mutex);
        std::vector<std::string> calls VELA_GUARDED_BY(mutex);
        std::function<void(const std::string&)> observer VELA_GUARDED_BY(mutex);
        std::weak_ptr<Delegate> delegate VELA_GUARDED_BY(mutex);
    };

    class Session final : public platform::ProbeTraceSession {
    public:
        explicit Session(std::shared_ptr<State> state) : state_(std::move(state)) {}
        ~Session() override { state_->note("released"); }
        Session(const Session&) = delete;
        Session& operator=(const Session&) = delete;

        void setDelegate(std::weak_ptr<Delegate> delegate) override {
            // What is no longer held weakly anywhere cannot be told from none.
            const bool none = delegate.expired();
            {
                const MutexLock lock(state_->mutex);
                state_->delegate = std::move(delegate);
            }
            state_->note(none ? "setDelegate null" : "setDelegate");
        }
        void startProbeTrace() override { state_->note("startProbeTrace"); }
        void stopProbeTrace() override {
            state_->note("stopProbeTrace");
            state_->completeWhereAskedTo();
        }

    private:
        const std::shared_ptr<State> state_;
    };

    const std::shared_ptr<State> state_ = std::make_shared<State>();
};

} // namespace vela::testing
