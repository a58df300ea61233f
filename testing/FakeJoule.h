// An energy log that keeps the events it is told. Thread-safe.
#pragma once

#include "platform/Joule.h"
#include "platform/Mutex.h"

#include <cstdint>
#include <functional>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

namespace vela::testing {

class FakeJoule final : public platform::Joule {
public:
    struct Event {
        std::uint32_t clientIdentifier;
        std::string name;
        Dictionary payload;
        Dictionary options;
    };

    /// Called at the start of every call with the event's name, outside the lock.
    void setObserver(std::function<void(std::string_view eventName)> observer) {
        const MutexLock lock(mutex_);
        observer_ = std::move(observer);
    }
    std::vector<Event> events() const {
        const MutexLock lock(mutex_);
        return events_;
    }

    void jouleLogRegisteredEvent(std::uint32_t clientIdentifier, std::string_view eventName, const Dictionary& payload,
                                 const Dictionary& options) override {
        std::function<void(std::string_view)> observer;
        {
            const MutexLock lock(mutex_);
            events_.push_back({clientIdentifier, std::string(eventName), payload, options});
            observer = observer_;
        }
        if (observer) {
            observer(eventName);
        }
    }

private:
    mutable Mutex mutex_;
    std::vector<Event> events_ VELA_GUARDED_BY(mutex_);
    std::function<void(std::string_view)> observer_ VELA_GUARDED_BY(mutex_);
};

} // namespace vela::testing
