// The device's properties and feature flags as the settings say them: `[device]` and `[features]`. Immutable.
#pragma once

#include "common/Settings.h"
#include "platform/DeviceProperties.h"

#include <optional>
#include <string_view>

namespace vela::platform {

class SettingsDeviceProperties final : public DeviceProperties {
public:
    /// `settings` outlives this and stays as it is.
    explicit SettingsDeviceProperties(const Settings& settings) : settings_(settings) {}

    /// Of "InternalBuild"; a device has no answer to any other name.
    std::optional<bool> booleanProperty(std::string_view name) const override {
        return name == "InternalBuild" ? std::optional(settings_.device.internalBuild) : std::nullopt;
    }
    bool featureEnabled(std::string_view domain, std::string_view name) const override {
        return settings_.featureEnabled(domain, name);
    }

private:
    const Settings& settings_;
};

} // namespace vela::platform
