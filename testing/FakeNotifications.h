// A notification service that posts what a test says. Tokens are 1, 2, 3 and so on. Thread-safe. The queues outlive
// it, and so does what its handlers refer to, until they are cancelled.
#pragma once

#include "platform/Mutex.h"
#include "platform/Notifications.h"

#include <atomic>
#include <cstdint>
#include <functional>
#include <map>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

namespace vela::testing {

class FakeNotifications final : public platform::Notifications {
public:
    /// A name that is registered for, and its token.
    struct Registration {
        std::string name;
        std::int32_t token = 0;

        friend bool operator==(const Registration&, const Registration&) = default;
    };

    /// Posts a call of every handler of `name` to its queue, oldest registration first. Each post is a call.
    void post(std::string_view name) {
        const MutexLock lock(mutex_);
        for (const auto& [token, entry] : entries_) {
            if (entry->name == name) {
                entry->queue.post([entry = entry, token = token] {
                    if (!entry->cancelled) {
                        entry->handler(token);
                    }
                });
            }
        }
    }
    /// The state of `name` from now on, for old and new registrations; none cannot be read, as at first. Posts nothing.
    void setState(std::string_view name, std::optional<std::uint64_t> state) {
        const MutexLock lock(mutex_);
        states_[std::string(name)] = state;
    }
    /// Registrations of `name` answer `status` and no token from now on; with 0 they work again.
    void failRegistration(std::string_view name, std::int32_t status) {
        const MutexLock lock(mutex_);
        failures_[std::string(name)] = status;
    }
    /// Called with each name before it is registered for, without a lock.
    void setObserver(std::function<void(std::string_view name)> observer) { observer_ = std::move(observer); }
    /// What is registered now, oldest first.
    std::vector<Registration> registrations() const {
        const MutexLock lock(mutex_);
        std::vector<Registration> registrations;
        for (const auto& [token, entry] : entries_) {
            registrations.push_back({entry->name, token});
        }
        return registrations;
    }

    platform::NotificationRegistration
    registerForNotification(std::string_view name, platform::WorkQueue& queue,
                            platform::UniqueFunction<void(std::int32_t token)> handler) override {
        if (observer_) {
            observer_(name);
        }
        const MutexLock lock(mutex_);
        const auto failure = failures_.find(std::string(name));
        if (failure != failures_.end() && failure->second != 0) {
            return {.status = failure->second, .token = -1};
        }
        const std::int32_t token = ++lastToken_;
        entries_.emplace(token, std::make_shared<Entry>(std::string(name), queue, std::move(handler)));
        return {.status = 0, .token = token};
    }

    std::optional<std::uint64_t> state(std::int32_t token) const override {
        const MutexLock lock(mutex_);
        const auto entry = entries_.find(token);
        if (entry == entries_.end()) {
            return std::nullopt;
        }
        const auto found = states_.find(entry->second->name);
        return found == states_.end() ? std::nullopt : found->second;
    }

    void cancel(std::int32_t token) override {
        std::shared_ptr<Entry> cancelled; // its handler may be the last owner of much; destroyed outside the lock
        const MutexLock lock(mutex_);
        const auto found = entries_.find(token);
        if (found != entries_.end()) {
            cancelled = std::move(found->second);
            cancelled->cancelled = true;
            entries_.erase(found);
        }
    }

private:
    std::function<void(std::string_view name)> observer_; // set before it is used

    struct Entry {
        Entry(std::string itsName, platform::WorkQueue& itsQueue,
              platform::UniqueFunction<void(std::int32_t token)> itsHandler)
            : name(std::move(itsName)),
              queue(itsQueue),
              handler(std::move(itsHandler)) {}

        const std::string name;
        platform::WorkQueue& queue;
        platform::UniqueFunction<void(std::int32_t token)> handler; // confined to the queue
        std::atomic<bool> cancelled = false;
    };

    mutable Mutex mutex_;
    std::map<std::int32_t, std::shared_ptr<Entry>> entries_ VELA_GUARDED_BY(mutex_); // by token, so as registered
    std::map<std::string, std::optional<std::uint64_t>> states_ VELA_GUARDED_BY(mutex_);
    std::map<std::string, std::int32_t> failures_ VELA_GUARDED_BY(mutex_);
    std::int32_t lastToken_ VELA_GUARDED_BY(mutex_) = 0;
};

} // namespace vela::testing
