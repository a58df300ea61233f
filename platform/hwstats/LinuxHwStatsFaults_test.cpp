// What a sampling leaves out: files of the kernel that do not answer, and channel files that are wrong.
#include "platform/hwstats/ChannelTables_test.h"
#include "platform/hwstats/LinuxHwStats.h"
#include "platform/hwstats/SystemTree_test.h"
#include "testing/CapturingLog.h"
#include "testing/ManualClock.h"
#include "testing/TemporaryFolder.h"

#include <chrono>
#include <condition_variable>
#include <filesystem>
#include <fstream>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <mutex>
#include <thread>

namespace vela::platform {
namespace {

using namespace std::chrono_literals;
using ::testing::ElementsAre;
using ::testing::IsEmpty;

/// Holds up every thread but the test's, as a file does whose driver does not answer: the clock is read before each
/// file.
class HoldingClock final : public Clock {
public:
    MonotonicTime monotonicNow() const override {
        std::unique_lock lock(mutex_);
        changed_.wait(lock, [this] { return !isHolding_ || std::this_thread::get_id() == own_; });
        return times_.monotonicNow();
    }
    WallTime now() const override { return times_.now(); }
    Nanoseconds systemUptime() const override { return times_.systemUptime(); }
    std::chrono::seconds localOffset(WallTime time) const override { return times_.localOffset(time); }

    void release() {
        {
            const std::lock_guard lock(mutex_);
            isHolding_ = false;
        }
        changed_.notify_all();
    }

private:
    const testing::ManualClock times_{};
    const std::thread::id own_ = std::this_thread::get_id();
    mutable std::mutex mutex_;
    mutable std::condition_variable changed_;
    bool isHolding_ = true;
};

class LinuxHwStatsFaultsTest : public ::testing::Test {
public:
    LinuxHwStatsFaultsTest() {
        std::filesystem::create_directories(folder_ / "hwstats");
        tree_.write("/sys/devices/system/cpu/cpu0/cpuidle/state0/name", "C1");
        tree_.write("/sys/devices/system/cpu/cpu0/cpuidle/state0/usage", "4");
        tree_.write("/sys/devices/system/cpu/cpu0/cpuidle/state0/time", "5");
    }
    LinuxHwStatsFaultsTest(const LinuxHwStatsFaultsTest&) = delete;
    LinuxHwStatsFaultsTest& operator=(const LinuxHwStatsFaultsTest&) = delete;
    ~LinuxHwStatsFaultsTest() override { clock_.release(); }

protected:
    LinuxHwStatsOptions options(std::chrono::milliseconds wait) const {
        return {folder_ / "hwstats",
                tree_.root(),
                {{{"Tarn", {}}, {HwStatsSource::CpuIdle}},
                 {{"Rx", {}}, {HwStatsSource::AlsaCapture}},
                 {{"Tx", {}}, {HwStatsSource::AlsaPlayback}},
                 {{"Speaker", {}}, {HwStatsSource::Channels}}},
                wait};
    }
    static std::vector<std::string> sample(LinuxHwStats& hwStats, const char* group) {
        const auto subscription = hwStats.createSubscription(*hwStats.copyChannelsInGroup(group, {}).thing);
        const auto samples = hwStats.createSamples(*subscription.subscription, *subscription.subscribed).thing;
        std::vector<std::string> lines;
        hwStats.iterate(*samples, [&](const HwStatsChannel& channel) {
            lines.push_back(hwstats::lineOf(channel));
            return 0;
        });
        return lines;
    }
    void write(const std::string& name, const std::string& bytes) const {
        std::ofstream(folder_ / "hwstats/" + name, std::ios::binary) << bytes;
    }
    std::vector<std::string> errors() const {
        std::vector<std::string> texts;
        for (const testing::CapturedLine& line : log_.linesOf("velard")) {
            EXPECT_EQ(line.level, LogLevel::Error) << line;
            texts.push_back(line.message);
        }
        return texts;
    }

    const testing::CapturingLog log_;
    const testing::TemporaryFolder folder_;
    const hwstats::SystemTree tree_{};
    HoldingClock clock_; // the library, made in each test, ends before it
};

TEST_F(LinuxHwStatsFaultsTest, AFileThatDoesNotAnswerIsLoggedOnceForAllDrivers) {
    LinuxHwStats hwStats(options(1ms), clock_);
    EXPECT_THAT(sample(hwStats, "Tarn"), IsEmpty());
    EXPECT_THAT(sample(hwStats, "Rx"), IsEmpty());
    EXPECT_THAT(sample(hwStats, "Tx"), IsEmpty());
    EXPECT_THAT(sample(hwStats, "Tarn"), IsEmpty());
    EXPECT_THAT(errors(),
                ElementsAre("the system's numbers for driver Tarn- were not read within 1 ms: until they are, "
                            "samplings are without any"));
    clock_.release();
}

TEST_F(LinuxHwStatsFaultsTest, AFileThatDoesNotAnswerIsWaitedForOnce) {
    LinuxHwStats hwStats(options(300ms), clock_);
    const auto begin = std::chrono::steady_clock::now();
    for (int i = 0; i < 100; ++i) {
        EXPECT_THAT(sample(hwStats, "Tarn"), IsEmpty());
    }
    const auto waited = std::chrono::steady_clock::now() - begin;
    clock_.release();
    EXPECT_GE(waited, 300ms);
    EXPECT_LT(waited, 15s) << "each for itself would take half a minute";
}

TEST_F(LinuxHwStatsFaultsTest, AFileThatAnswersAgainIsReadAgain) {
    LinuxHwStats hwStats(options(1ms), clock_);
    EXPECT_THAT(sample(hwStats, "Tarn"), IsEmpty());
    clock_.release();
    std::vector<std::string> lines;
    const auto deadline = std::chrono::steady_clock::now() + 30s;
    while (lines.empty() && std::chrono::steady_clock::now() < deadline) {
        lines = sample(hwStats, "Tarn");
    }
    EXPECT_THAT(lines, ElementsAre("cpuidle/Tarn/- cpu0: C1 4x 5000"));
}

TEST_F(LinuxHwStatsFaultsTest, AWrongChannelFileIsLoggedOnce) {
    LinuxHwStats hwStats(options(1ms), clock_);
    write("a.channels", "text");
    write("b.channels", hwstats::fileOf(hwstats::exampleTable()));
    EXPECT_EQ(sample(hwStats, "Speaker").size(), 3U);
    EXPECT_EQ(sample(hwStats, "Speaker").size(), 3U);
    EXPECT_THAT(errors(), ElementsAre((folder_ / "hwstats/a.channels") + ": it is shorter than a header"));
}

TEST_F(LinuxHwStatsFaultsTest, FaultsAreToldToWhoAsksForThemInPlaceOfTheLog) {
    LinuxHwStatsOptions chosen = options(1ms);
    std::vector<std::string> faults;
    chosen.complain = [&faults](const std::string& fault) { faults.push_back(fault); };
    LinuxHwStats hwStats(chosen, clock_);
    write("a\n.channels", "text");
    sample(hwStats, "Speaker");
    EXPECT_THAT(faults, ElementsAre((folder_ / "hwstats/a\\n.channels") + ": it is shorter than a header"));
    EXPECT_THAT(errors(), IsEmpty());
}

} // namespace
} // namespace vela::platform
