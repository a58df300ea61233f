#include "platform/hwstats/ForceFeedbackSource.h"
#include "platform/hwstats/SystemTree_test.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

namespace vela::platform::hwstats {
namespace {

using ::testing::ElementsAre;
using ::testing::IsEmpty;

class ForceFeedbackSourceTest : public ::testing::Test {
protected:
    void addDevice(const std::string& name, const std::string& text, const std::string& effects) const {
        tree_.write("/sys/class/input/" + name + "/name", text + "\n");
        tree_.write("/sys/class/input/" + name + "/capabilities/ff", effects + "\n");
    }
    std::vector<std::string> lines() { return linesOf(sampled(source_, tree_, clock_)); }

    const SystemTree tree_{};
    testing::ManualClock clock_;
    ForceFeedbackSource source_{{"Haptics", "Stats"}};
};

TEST_F(ForceFeedbackSourceTest, BitsOfAllWordsCount) {
    EXPECT_EQ(countBits("0"), 0U);
    EXPECT_EQ(countBits("107030000 0"), 6U);
    EXPECT_EQ(countBits("f 1"), 5U);
    EXPECT_EQ(countBits(""), 0U);
    EXPECT_EQ(countBits("nonsense!"), 6U) << "those of e, twice";
}

TEST_F(ForceFeedbackSourceTest, OnlyDevicesWithForceFeedbackCount) {
    addDevice("input3", "Keyboard", "0");
    addDevice("input5", "gamepad", "107030000 0");
    EXPECT_THAT(lines(), ElementsAre("input/Haptics/Stats gamepad effects: 6",
                                     "input/Haptics/Stats gamepad connection: connected 1x 0"));
    clock_.advance(std::chrono::seconds(2));
    EXPECT_THAT(lines(), ElementsAre("input/Haptics/Stats gamepad effects: 6",
                                     "input/Haptics/Stats gamepad connection: connected 1x 2000000000"));
}

TEST_F(ForceFeedbackSourceTest, PowerIsThatOfWhatItIsAttachedTo) {
    addDevice("input5", "gamepad", "1");
    tree_.write("/sys/class/input/input5/power/runtime_status", "unsupported\n");
    tree_.write("/sys/class/input/input5/device/device/power/runtime_status", "active\n");
    tree_.write("/sys/class/input/input5/device/device/power/runtime_active_time", "30\n");
    tree_.write("/sys/class/input/input5/device/device/power/runtime_suspended_time", "7\n");
    EXPECT_THAT(lines(), ElementsAre("input/Haptics/Stats gamepad effects: 1",
                                     "input/Haptics/Stats gamepad connection: connected 1x 0",
                                     "input/Haptics/Stats gamepad power: active 0x 30000000, suspended 0x 7000000"));
}

TEST_F(ForceFeedbackSourceTest, ADeviceThatComesBackIsNew) {
    addDevice("input5", "gamepad", "1");
    lines();
    tree_.remove("/sys/class/input/input5");
    clock_.advance(std::chrono::seconds(1));
    EXPECT_THAT(lines(), IsEmpty());
    addDevice("input5", "gamepad", "1");
    EXPECT_THAT(lines(), ElementsAre("input/Haptics/Stats gamepad effects: 1",
                                     "input/Haptics/Stats gamepad connection: connected 1x 0"));
}

TEST_F(ForceFeedbackSourceTest, AMachineWithoutInputHasNoChannels) { EXPECT_THAT(lines(), IsEmpty()); }

} // namespace
} // namespace vela::platform::hwstats
