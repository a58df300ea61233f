// A preferences store as a test fills it. Thread-safe.
#pragma once

#include "platform/Mutex.h"
#include "platform/Preferences.h"

#include <cstdint>
#include <map>
#include <string>
#include <string_view>
#include <utility>

namespace vela::testing {

class FakePreferences final : public platform::Preferences {
public:
    void set(std::string_view domain, std::string_view key, Value value) {
        const MutexLock lock(mutex_);
        values_[{std::string(domain), std::string(key)}] = std::move(value);
    }
    void remove(std::string_view domain, std::string_view key) {
        const MutexLock lock(mutex_);
        values_.erase({std::string(domain), std::string(key)});
    }
    /// How often a value was asked for.
    std::uint64_t queries() const {
        const MutexLock lock(mutex_);
        return queries_;
    }

    Value copyValue(std::string_view domain, std::string_view key) const override {
        const MutexLock lock(mutex_);
        ++queries_;
        const auto found = values_.find({std::string(domain), std::string(key)});
        return found == values_.end() ? Value() : found->second;
    }

private:
    mutable Mutex mutex_;
    std::map<std::pair<std::string, std::string>, Value> values_ VELA_GUARDED_BY(mutex_);
    mutable std::uint64_t queries_ VELA_GUARDED_BY(mutex_) = 0;
};

} // namespace vela::testing
