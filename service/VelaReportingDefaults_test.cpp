#include "service/VelaReportingDefaults.h"
#include "testing/FakePreferences.h"

#include <gtest/gtest.h>

namespace vela {

namespace {

class VelaReportingDefaultsTest : public ::testing::Test {
protected:
    Dictionary defaults() const { return VelaReportingDefaults(preferences_); }

    testing::FakePreferences preferences_;
};

TEST_F(VelaReportingDefaultsTest, WithNothingSetReportingIsNotDisabledAndTheDeviceHasNoName) {
    EXPECT_EQ(defaults(), (Dictionary{{"disable_reporting", false}}));
}

TEST_F(VelaReportingDefaultsTest, WhatIsSetIsRead) {
    preferences_.set("com.orvex.vela", "device_name", "Kitchen");
    preferences_.set("com.orvex.vela", "disable_reporting", true);
    EXPECT_EQ(defaults(), (Dictionary{{"device_name", "Kitchen"}, {"disable_reporting", true}}));
}

TEST_F(VelaReportingDefaultsTest, OnlyTheSuiteOfTheServiceIsRead) {
    preferences_.set("com.orvex.lobby", "device_name", "Kitchen");
    preferences_.set("com.orvex.vela.reporting", "disable_reporting", true);
    EXPECT_EQ(defaults(), (Dictionary{{"disable_reporting", false}}));
}

TEST_F(VelaReportingDefaultsTest, ADeviceNameThatIsNoStringIsNone) {
    preferences_.set("com.orvex.vela", "device_name", 5);
    EXPECT_EQ(defaults(), (Dictionary{{"disable_reporting", false}}));
}

TEST_F(VelaReportingDefaultsTest, AnEmptyDeviceNameIsOne) {
    preferences_.set("com.orvex.vela", "device_name", "");
    EXPECT_EQ(defaults(), (Dictionary{{"device_name", ""}, {"disable_reporting", false}}));
}

TEST_F(VelaReportingDefaultsTest, ANumberIsReadAsABoolean) {
    preferences_.set("com.orvex.vela", "disable_reporting", 2);
    EXPECT_EQ(defaults(), (Dictionary{{"disable_reporting", true}}));
    preferences_.set("com.orvex.vela", "disable_reporting", 0);
    EXPECT_EQ(defaults(), (Dictionary{{"disable_reporting", false}}));
    preferences_.set("com.orvex.vela", "disable_reporting", Array{1});
    EXPECT_EQ(defaults(), (Dictionary{{"disable_reporting", false}}));
}

} // namespace

} // namespace vela
