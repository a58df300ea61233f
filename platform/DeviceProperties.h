// Properties of the device and its feature flags, as the device's maker set them.
#pragma once

#include <optional>
#include <string_view>

namespace vela::platform {

/// Thread-safe.
class DeviceProperties {
public:
    virtual ~DeviceProperties() = default;

    /// The truth value of a boolean property ("InternalBuild"), or none when the device has no answer.
    virtual std::optional<bool> booleanProperty(std::string_view name) const = 0;

    /// Whether a feature flag ("AudioAnalytics", "Tracing") is on; false when nobody set it.
    virtual bool featureEnabled(std::string_view domain, std::string_view name) const = 0;
};

} // namespace vela::platform
