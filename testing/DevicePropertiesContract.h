// What every DeviceProperties does, as a test suite that runs on the fake and on the real one.
//
// A harness has `const DeviceProperties& properties(bool internalBuild)`, whose boolean property "InternalBuild" is
// that, with the feature "Tracing" of "AudioAnalytics" on, "Gauges" of "AudioAnalytics" off; nothing else.
#pragma once

#include "platform/DeviceProperties.h"

#include <gtest/gtest.h>
#include <optional>

namespace vela::testing {

template <class Harness>
class DevicePropertiesContract : public ::testing::Test {
protected:
    const platform::DeviceProperties& properties(bool internalBuild = true) {
        return harness_.properties(internalBuild);
    }

    Harness harness_;
};

TYPED_TEST_SUITE_P(DevicePropertiesContract);

TYPED_TEST_P(DevicePropertiesContract, APropertyAnswersItsValue) {
    EXPECT_EQ(this->properties(true).booleanProperty("InternalBuild"), std::optional(true));
    EXPECT_EQ(this->properties(false).booleanProperty("InternalBuild"), std::optional(false));
}

TYPED_TEST_P(DevicePropertiesContract, APropertyThatIsNotSetHasNoAnswer) {
    EXPECT_EQ(this->properties().booleanProperty("internalbuild"), std::nullopt);
    EXPECT_EQ(this->properties().booleanProperty(""), std::nullopt);
}

TYPED_TEST_P(DevicePropertiesContract, AFeatureIsOnWhereItWasSetSo) {
    EXPECT_TRUE(this->properties().featureEnabled("AudioAnalytics", "Tracing"));
    EXPECT_FALSE(this->properties().featureEnabled("AudioAnalytics", "Gauges"));
}

TYPED_TEST_P(DevicePropertiesContract, AFeatureThatIsNotSetIsOff) {
    EXPECT_FALSE(this->properties().featureEnabled("AudioAnalytics", "Other"));
    EXPECT_FALSE(this->properties().featureEnabled("Other", "Tracing"));
    EXPECT_FALSE(this->properties().featureEnabled("Tracing", "AudioAnalytics"));
}

REGISTER_TYPED_TEST_SUITE_P(DevicePropertiesContract, APropertyAnswersItsValue, APropertyThatIsNotSetHasNoAnswer,
                            AFeatureIsOnWhereItWasSetSo, AFeatureThatIsNotSetIsOff);

} // namespace vela::testing
