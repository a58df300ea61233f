#include "platform/host/SettingsDeviceProperties.h"
#include "testing/DevicePropertiesContract.h"

#include <gtest/gtest.h>
#include <optional>

namespace vela::platform {

namespace {

struct SettingsHarness {
    SettingsHarness() { settings_.features = {{"AudioAnalytics/Tracing", true}, {"AudioAnalytics/Gauges", false}}; }
    const DeviceProperties& properties(bool internalBuild) {
        settings_.device.internalBuild = internalBuild;
        return properties_;
    }

    Settings settings_;
    SettingsDeviceProperties properties_{settings_};
};

TEST(SettingsDevicePropertiesTest, OnlyInternalBuildHasAnAnswer) {
    Settings settings;
    settings.device.internalBuild = true;
    const SettingsDeviceProperties properties(settings);
    EXPECT_EQ(properties.booleanProperty("InternalBuild"), std::optional(true));
    EXPECT_EQ(properties.booleanProperty("InternalBuild2"), std::nullopt);
    EXPECT_EQ(properties.booleanProperty("Sealed"), std::nullopt);
}

} // namespace

} // namespace vela::platform

namespace vela::testing {

INSTANTIATE_TYPED_TEST_SUITE_P(Settings, DevicePropertiesContract, platform::SettingsHarness);

} // namespace vela::testing
