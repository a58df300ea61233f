#include "platform/hwstats/PowerSources.h"
#include "platform/hwstats/SystemTree_test.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

namespace vela::platform::hwstats {
namespace {

using ::testing::ElementsAre;
using ::testing::IsEmpty;

const HwStatsGroupName kTarn{"Tarn", std::nullopt};

class PowerSourcesTest : public ::testing::Test {
protected:
    void writeIdleState(const std::string& cpu, const std::string& state, const std::string& name,
                        const std::string& usage, const std::string& time) const {
        const std::string folder = "/sys/devices/system/cpu/" + cpu + "/cpuidle/" + state;
        tree_.write(folder + "/name", name + "\n");
        tree_.write(folder + "/usage", usage + "\n");
        tree_.write(folder + "/time", time + "\n");
    }
    void writePower(const std::string& device, const std::string& status, const std::string& active,
                    const std::string& suspended) const {
        tree_.write("/sys/devices/" + device + "/power/runtime_status", status + "\n");
        tree_.write("/sys/devices/" + device + "/power/runtime_active_time", active + "\n");
        tree_.write("/sys/devices/" + device + "/power/runtime_suspended_time", suspended + "\n");
    }
    std::vector<std::string> lines(SystemSource& source) const { return linesOf(sampled(source, tree_, clock_)); }

    const SystemTree tree_{};
    testing::ManualClock clock_;
};

TEST_F(PowerSourcesTest, EveryProcessorHasItsIdleStates) {
    writeIdleState("cpu0", "state0", "POLL", "3", "40");
    writeIdleState("cpu0", "state1", "C1", "5", "600");
    writeIdleState("cpu10", "state0", "POLL", "1", "2");
    writeIdleState("cpu2", "state0", "POLL", "7", "8");
    tree_.write("/sys/devices/system/cpu/cpufreq/policy0/x", "");
    CpuIdleSource source(kTarn);
    EXPECT_THAT(lines(source), ElementsAre("cpuidle/Tarn/- cpu0: POLL 3x 40000, C1 5x 600000",
                                           "cpuidle/Tarn/- cpu2: POLL 7x 8000", "cpuidle/Tarn/- cpu10: POLL 1x 2000"));
}

TEST_F(PowerSourcesTest, AnIdleStateThatCannotBeReadIsLeftOut) {
    writeIdleState("cpu0", "state0", "POLL", "3", "40");
    writeIdleState("cpu0", "state1", "C1", "many", "600");
    CpuIdleSource source(kTarn);
    EXPECT_THAT(lines(source), ElementsAre("cpuidle/Tarn/- cpu0: POLL 3x 40000"));
}

TEST_F(PowerSourcesTest, AMachineWithoutAnyHasNoChannels) {
    CpuIdleSource idle(kTarn);
    DevFreqSource frequencies(kTarn);
    RuntimePmSource power(kTarn);
    EXPECT_THAT(lines(idle), IsEmpty());
    EXPECT_THAT(lines(frequencies), IsEmpty());
    EXPECT_THAT(lines(power), IsEmpty());
}

constexpr const char* kTransStat = "     From  :   To\n"
                                   "           : 100000000 200000000 400000000   time(ms)\n"
                                   "* 100000000:         0         3         1       120\n"
                                   "  200000000:         2         0         0        34\n"
                                   "  400000000:         2         0         0         5\n"
                                   "Total transition : 8\n";

TEST_F(PowerSourcesTest, AFrequencyIsAStateWithTheTransitionsIntoIt) {
    tree_.write("/sys/class/devfreq/gpu/trans_stat", kTransStat);
    DevFreqSource source(kTarn);
    EXPECT_THAT(lines(source), ElementsAre("devfreq/Tarn/- gpu: 100000000 4x 120000000, 200000000 3x 34000000, "
                                           "400000000 1x 5000000"));
}

TEST_F(PowerSourcesTest, TextsThatAreNoTableOfTransitionsHaveNoStates) {
    EXPECT_THAT(readTransStat(""), IsEmpty());
    EXPECT_THAT(readTransStat("Not Supported.\n"), IsEmpty());
    EXPECT_THAT(readTransStat("Total transition : 0\n"), IsEmpty());
    EXPECT_THAT(readTransStat("  100: 0 3 120\n"), IsEmpty()) << "cut: there is no second row";
    EXPECT_THAT(readTransStat("  100: 0 x 120\n  200: 1 0 5\n"), IsEmpty());
    EXPECT_THAT(readTransStat("  100:\n"), IsEmpty());
}

TEST_F(PowerSourcesTest, DevicesThatWereEverSuspendedAreNamedByTheirPath) {
    writePower("pci0/0000:00:1f.3", "active", "1500", "20");
    writePower("pci0/0000:00:1f.3/card0", "suspended", "7", "8");
    writePower("pci0/0000:00:02.0", "active", "99", "0");
    writePower("platform/pcspkr", "unsupported", "0", "0");
    RuntimePmSource source(kTarn);
    EXPECT_THAT(lines(source),
                ElementsAre("runtimepm/Tarn/- pci0/0000:00:1f.3: active 0x 1500000000, suspended 0x 20000000",
                            "runtimepm/Tarn/- pci0/0000:00:1f.3/card0: active 0x 7000000, suspended 0x 8000000"));
}

TEST_F(PowerSourcesTest, LinksBetweenDevicesAreNotFollowed) {
    writePower("a", "active", "1", "1");
    tree_.link("/sys/devices/a/back", tree_.root() + "/sys/devices");
    RuntimePmSource source(kTarn);
    EXPECT_EQ(lines(source).size(), 1U);
}

TEST_F(PowerSourcesTest, NewDevicesAreFoundWithinAMinute) {
    writePower("a", "active", "1", "1");
    RuntimePmSource source(kTarn);
    EXPECT_EQ(lines(source).size(), 1U);
    writePower("b", "active", "1", "1");
    clock_.advance(std::chrono::seconds(59));
    EXPECT_EQ(lines(source).size(), 1U);
    clock_.advance(std::chrono::seconds(1));
    EXPECT_EQ(lines(source).size(), 2U);
    tree_.remove("/sys/devices/a");
    EXPECT_EQ(lines(source).size(), 1U) << "a device that is gone is not waited for";
}

TEST_F(PowerSourcesTest, NamesThatAreNoTextAreMadeOne) {
    writeIdleState("cpu0", "state0", "C\x01\xFF\xC3\xA9", "3", "40");
    CpuIdleSource source(kTarn);
    EXPECT_THAT(lines(source), ElementsAre("cpuidle/Tarn/- cpu0: C??\xC3\xA9 3x 40000"));
}

/// What the machine that runs the test has; on one without idle states it finds none.
TEST_F(PowerSourcesTest, ThisMachineIsRead) {
    const std::string root;
    SystemReading system(root, clock_);
    Samples samples;
    samples.time = nanosecondsOf(clock_);
    CpuIdleSource idle(kTarn);
    DevFreqSource frequencies(kTarn);
    RuntimePmSource power(kTarn);
    idle.sample(system, samples);
    frequencies.sample(system, samples);
    power.sample(system, samples);
    const bool hasIdleStates = std::filesystem::exists("/sys/devices/system/cpu/cpu0/cpuidle/state0/usage");
    EXPECT_TRUE(!hasIdleStates || !samples.blocks.empty());
    for (const SampleBlock& block : samples.blocks) {
        EXPECT_FALSE(block.table->channels.empty()) << block.key;
    }
}

} // namespace
} // namespace vela::platform::hwstats
