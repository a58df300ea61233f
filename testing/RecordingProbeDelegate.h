// A delegate of performance traces for tests.
#pragma once

#include "platform/Mutex.h"
#include "platform/Probe.h"

#include <algorithm>
#include <cstddef>
#include <functional>
#include <optional>
#include <string>
#include <vector>

namespace vela::testing {

/// Keeps what it is told: "start", "stop", "complete", with " failed" behind where there was an error. Thread-safe.
class RecordingProbeDelegate final : public platform::ProbeTraceDelegate {
public:
    using MaybeFailure = std::optional<platform::Failure>;

    void performanceTraceDidStart(const MaybeFailure& error) override { take("start", error, {}, onStart); }
    void performanceTraceDidStop(const MaybeFailure& error) override { take("stop", error, {}, onStop); }
    void performanceTraceDidComplete(const std::string& url, const std::string&, const MaybeFailure& error) override {
        take("complete", error, url, onComplete);
    }

    std::vector<std::string> calls() const {
        const MutexLock lock(mutex_);
        return calls_;
    }
    bool was(const std::string& call) const {
        const MutexLock lock(mutex_);
        return std::find(calls_.begin(), calls_.end(), call) != calls_.end();
    }
    std::ptrdiff_t completions() const {
        const MutexLock lock(mutex_);
        return static_cast<std::ptrdiff_t>(urls_.size());
    }
    /// Of each completion.
    std::vector<std::string> urls() const {
        const MutexLock lock(mutex_);
        return urls_;
    }
    /// Of each call that had one.
    std::vector<platform::Failure> failures() const {
        const MutexLock lock(mutex_);
        return failures_;
    }

    // Run within the call, after it was kept. Set before the trace starts.
    std::function<void()> onStart;
    std::function<void()> onStop;
    std::function<void()> onComplete;

private:
    void take(const std::string& name, const MaybeFailure& error, const std::optional<std::string>& url,
              const std::function<void()>& then) {
        {
            const MutexLock lock(mutex_);
            calls_.push_back(error ? name + " failed" : name);
            if (error) {
                failures_.push_back(*error);
            }
            if (url) {
                urls_.push_back(*url);
            }
        }
        if (then) {
            then();
        }
    }

    mutable Mutex mutex_;
    std::vector<std::string> calls_ VELA_GUARDED_BY(mutex_);
    std::vector<std::string> urls_ VELA_GUARDED_BY(mutex_);
    std::vector<platform::Failure> failures_ VELA_GUARDED_BY(mutex_);
};

} // namespace vela::testing
