#include "common/TextFormat.h"
#include "driverstats/VelaReportingDriver.h"
#include "driverstats/VelaReportingIOChannelSubscription.h"

#include <gtest/gtest.h>

namespace vela {

namespace {

TEST(VelaReportingDriverTest, ADriverHasAGroupAndASubgroup) {
    const VelaReportingDriver driver = VelaReportingDriver::driverWithGroupName("Haptics", "Stats");
    EXPECT_EQ(driver.groupName(), "Haptics");
    EXPECT_EQ(driver.subGroupName(), "Stats");
    EXPECT_EQ(driver.description(), "Haptics-Stats");
    EXPECT_EQ(formatText("%@", driver), "Haptics-Stats");
}

TEST(VelaReportingDriverTest, AnAbsentSubgroupIsNull) {
    const VelaReportingDriver driver = VelaReportingDriver::driverWithGroupName("Tarn", std::nullopt);
    EXPECT_EQ(driver.subGroupName(), std::nullopt);
    EXPECT_EQ(driver.description(), "Tarn-(null)");
}

TEST(VelaReportingDriverTest, AnAbsentGroupIsNull) {
    const VelaReportingDriver driver = VelaReportingDriver::driverWithGroupName(std::nullopt, "MCA");
    EXPECT_EQ(driver.groupName(), std::nullopt);
    EXPECT_EQ(driver.description(), "(null)-MCA");
}

TEST(VelaReportingDriverTest, AnEmptyNameIsNotAbsent) {
    EXPECT_EQ(VelaReportingDriver::driverWithGroupName("", "").description(), "-");
}

TEST(VelaReportingIOChannelSubscriptionTest, ANewOneHasItsDriverOnly) {
    const VelaReportingIOChannelSubscription subscription(VelaReportingDriver::driverWithGroupName("Rx", {}));
    EXPECT_EQ(subscription.subscription, nullptr);
    EXPECT_EQ(subscription.subscribedChannels, nullptr);
    EXPECT_EQ(subscription.driver.description(), "Rx-(null)");
}

} // namespace

} // namespace vela
