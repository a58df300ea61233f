// A device's properties and feature flags as a test sets them. Thread-safe.
#pragma once

#include "platform/DeviceProperties.h"
#include "platform/Mutex.h"

#include <cstdint>
#include <map>
#include <optional>
#include <string>
#include <string_view>
#include <utility>

namespace vela::testing {

class FakeDeviceProperties final : public platform::DeviceProperties {
public:
    /// None: the device has no answer.
    void setBoolean(const std::string& name, std::optional<bool> value) {
        const MutexLock lock(mutex_);
        booleans_[name] = value;
    }
    void setFeature(const std::string& domain, const std::string& name, bool enabled) {
        const MutexLock lock(mutex_);
        features_[{domain, name}] = enabled;
    }
    /// How often a boolean property was asked for.
    std::uint64_t booleanQueries() const {
        const MutexLock lock(mutex_);
        return booleanQueries_;
    }
    /// How often a feature was asked for.
    std::uint64_t featureQueries() const {
        const MutexLock lock(mutex_);
        return featureQueries_;
    }

    std::optional<bool> booleanProperty(std::string_view name) const override {
        const MutexLock lock(mutex_);
        ++booleanQueries_;
        const auto found = booleans_.find(std::string(name));
        return found == booleans_.end() ? std::nullopt : found->second;
    }
    bool featureEnabled(std::string_view domain, std::string_view name) const override {
        const MutexLock lock(mutex_);
        ++featureQueries_;
        const auto found = features_.find({std::string(domain), std::string(name)});
        return found != features_.end() && found->second;
    }

private:
    mutable Mutex mutex_;
    std::map<std::string, std::optional<bool>> booleans_ VELA_GUARDED_BY(mutex_);
    std::map<std::pair<std::string, std::string>, bool> features_ VELA_GUARDED_BY(mutex_);
    mutable std::uint64_t booleanQueries_ VELA_GUARDED_BY(mutex_) = 0;
    mutable std::uint64_t featureQueries_ VELA_GUARDED_BY(mutex_) = 0;
};

} // namespace vela::testing
