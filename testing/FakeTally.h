// An analytics service that keeps the events it is sent and builds their payloads when a test says so. Thread-safe.
// Payloads that are still unbuilt go with it.
#pragma once

#include "platform/Mutex.h"
#include "platform/Tally.h"

#include <concepts>
#include <cstddef>
#include <functional>
#include <optional>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

namespace vela::testing {

class FakeTally final : public platform::Tally {
public:
    struct Event {
        std::string name;
        std::optional<Dictionary> payload; ///< none until it is built
    };
    using Predicate = std::function<bool(std::string_view eventName)>;
    using Builder = platform::UniqueFunction<Dictionary()>;

    // What a test arranges.
    /// Which events have a consumer: all of them unless a test says otherwise.
    template <std::same_as<bool> Boolean>
    void setUsed(Boolean all) {
        setUsed(Predicate([all](std::string_view) { return all; }));
    }
    void setUsed(Predicate used) {
        const MutexLock lock(mutex_);
        used_ = std::move(used);
    }
    /// Payloads are built inside the send, on the sender's thread.
    void setBuildsAtOnce(bool atOnce) {
        const MutexLock lock(mutex_);
        buildsAtOnce_ = atOnce;
    }
    /// Called at the start of every call with its text, outside the lock.
    void setObserver(std::function<void(std::string_view call)> observer) {
        const MutexLock lock(mutex_);
        observer_ = std::move(observer);
    }

    /// Builds, on this thread, every payload that is not built yet, each once. Answers these payloads.
    std::vector<Dictionary> buildAll() {
        std::vector<Dictionary> payloads;
        for (auto& [place, builder] : takeBuilders()) {
            payloads.push_back(builder());
            builder.reset();
            const MutexLock lock(mutex_);
            events_[place].payload = payloads.back();
        }
        return payloads;
    }
    /// Destroys the builders unrun.
    void dropAll() { takeBuilders(); }

    // What a test looks at.
    /// "isEventUsed NAME" and "send NAME" in the order of the calls.
    std::vector<std::string> calls() const {
        const MutexLock lock(mutex_);
        return calls_;
    }
    std::vector<Event> events() const {
        const MutexLock lock(mutex_);
        return events_;
    }
    std::size_t unbuilt() const {
        const MutexLock lock(mutex_);
        return builders_.size();
    }

    bool tallyIsEventUsed(std::string_view eventName) override {
        note("isEventUsed ", eventName);
        Predicate used;
        {
            const MutexLock lock(mutex_);
            used = used_;
        }
        return used(eventName);
    }
    using Tally::tallySendEventLazy;
    void tallySendEventLazy(std::string_view eventName, Builder payload, std::size_t) override {
        note("send ", eventName);
        if (buildsAtOnce()) {
            Dictionary built = payload();
            const MutexLock lock(mutex_);
            events_.push_back({std::string(eventName), std::move(built)});
            return;
        }
        const MutexLock lock(mutex_);
        builders_.emplace_back(events_.size(), std::move(payload));
        events_.push_back({std::string(eventName), std::nullopt});
    }

private:
    /// Each with its event's place.
    using Builders = std::vector<std::pair<std::size_t, Builder>>;

    void note(std::string_view operation, std::string_view eventName) {
        const std::string call = std::string(operation).append(eventName);
        std::function<void(std::string_view)> observer;
        {
            const MutexLock lock(mutex_);
            calls_.push_back(call);
            observer = observer_;
        }
        if (observer) {
            observer(call);
        }
    }
    bool buildsAtOnce() const {
        const MutexLock lock(mutex_);
        return buildsAtOnce_;
    }
    Builders takeBuilders() {
        const MutexLock lock(mutex_);
        return std::exchange(builders_, {});
    }

    mutable Mutex mutex_;
    Predicate used_ VELA_GUARDED_BY(mutex_) = [](std::string_view) { return true; };
    bool buildsAtOnce_ VELA_GUARDED_BY(mutex_) = false;
    std::function<void(std::string_view)> observer_ VELA_GUARDED_BY(mutex_);
    std::vector<std::string> calls_ VELA_GUARDED_BY(mutex_);
    std::vector<Event> events_ VELA_GUARDED_BY(mutex_);
    Builders builders_ VELA_GUARDED_BY(mutex_);
};

} // namespace vela::testing
