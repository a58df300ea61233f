#include "cli/Subcommand.h"
#include "platform/hwstats/ChannelPublisher.h"
#include "testing/TemporaryFolder.h"

#include <atomic>
#include <filesystem>
#include <fstream>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sstream>
#include <thread>

namespace vela {
namespace {

using platform::HwStatsFormat;
using platform::hwstats::ChannelPublisher;
using ::testing::HasSubstr;
using ::testing::StartsWith;

class DriversCommandTest : public ::testing::Test {
protected:
    DriversCommandTest() { std::filesystem::create_directories(folder_ / "hwstats"); }

    /// Runs `velactl drivers` with a runtime folder of its own and without this machine's own numbers.
    int run(std::vector<std::string> arguments) {
        for (const char* group : {"Tarn", "Haptics", "Rx", "Tx"}) {
            arguments.insert(arguments.end(), {"--set", std::string("drivers.") + group + "=[]"});
        }
        arguments.insert(arguments.begin(), "drivers");
        arguments.insert(arguments.end(), {"--set", "paths.runtime=" + folder_.path(), "--set", "paths.state=/s"});
        const std::vector<std::string_view> words(arguments.begin(), arguments.end());
        std::istringstream in;
        std::ostringstream out;
        std::ostringstream error;
        Console console{in, out, error, false, false};
        const int status = runVelactl(words, console);
        out_ = out.str();
        error_ = error.str();
        return status;
    }
    std::unique_ptr<ChannelPublisher> publish() const {
        return *ChannelPublisher::create(folder_ / "hwstats", "test",
                                         {"My Driver",
                                          "Speaker",
                                          std::nullopt,
                                          {{HwStatsFormat::Simple, "xruns", {}, {}, {}},
                                           {HwStatsFormat::Histogram, "busy", "us", {0, 10, 20}, {}},
                                           {HwStatsFormat::State, "stream", {}, {}, {"idle", "running"}}}});
    }

    const testing::TemporaryFolder folder_;
    std::string out_;
    std::string error_;
};

TEST_F(DriversCommandTest, EveryGroupIsListedWithItsChannels) {
    const auto publisher = publish();
    publisher->channels()[0].add(5);
    publisher->channels()[1].record(3);
    publisher->channels()[1].record(12);
    publisher->channels()[2].enter(0, 1);
    // Longer than the test takes, whose time counts as well.
    publisher->channels()[2].enter(1, 1'000'000'000'001);
    publisher->channels()[2].enter(platform::hwstats::kNoState, 4'000'000'000'001);
    ASSERT_EQ(run({}), kDone) << error_;
    EXPECT_EQ(error_, "");
    EXPECT_EQ(out_, "GROUP                    DRIVER     CHANNEL  FORMAT     VALUE\n"
                    "Tarn                     -          -        -          no source\n"
                    "Speaker                  My Driver  xruns    counter    5\n"
                    "Speaker                  My Driver  busy     histogram  2 values, 3 to 12 us: 0-10:1 10-20:1\n"
                    "Speaker                  My Driver  stream   state      idle 1x 1000000.000 ms 25.0 %, "
                    "running 1x 3000000.000 ms 75.0 %\n"
                    "-/MCA                    -          -        -          no channels\n"
                    "Haptics/Stats            -          -        -          no source\n"
                    "StateTransitionTimes_ms  -          -        -          no channels\n"
                    "Rx                       -          -        -          no source\n"
                    "Tx                       -          -        -          no source\n"
                    "-/Brook                  -          -        -          no channels\n");
}

TEST_F(DriversCommandTest, JsonIsALineForEachChannel) {
    const auto publisher = publish();
    publisher->channels()[1].record(3);
    ASSERT_EQ(run({"--json"}), kDone) << error_;
    EXPECT_EQ(out_,
              R"({"group":"Speaker","driver":"My Driver","channel":"xruns","format":"counter","value":0})"
              "\n"
              R"({"group":"Speaker","driver":"My Driver","channel":"busy","unit":"us","format":"histogram","least":3,)"
              R"("greatest":3,"buckets":[{"lower":0,"upper":10,"hits":1},{"lower":10,"upper":20,"hits":0}]})"
              "\n"
              R"({"group":"Speaker","driver":"My Driver","channel":"stream","format":"state","states":[)"
              R"({"name":"idle","transitions":0,"residency":0,"duty_cycle":0.0},)"
              R"({"name":"running","transitions":0,"residency":0,"duty_cycle":0.0}]})"
              "\n");
}

TEST_F(DriversCommandTest, WatchingShowsWhatChanges) {
    const auto publisher = publish();
    publisher->channels()[1].record(3);
    std::atomic<bool> done = false;
    std::thread counting([&] {
        while (!done) {
            publisher->channels()[0].add(1);
            std::this_thread::sleep_for(std::chrono::milliseconds(1));
        }
    });
    EXPECT_EQ(run({"--watch", "--count", "1", "--json"}), kDone) << error_;
    done = true;
    counting.join();
    EXPECT_THAT(out_, StartsWith(R"({"time":)"));
    EXPECT_THAT(out_, HasSubstr(R"("channel":"xruns","format":"counter","value":)"));
    EXPECT_EQ(out_.find("busy"), std::string::npos) << "it did not change";
    EXPECT_EQ(std::ranges::count(out_, '\n'), 1);
}

TEST_F(DriversCommandTest, WatchingWithoutChangesSaysSo) {
    EXPECT_EQ(run({"--watch", "--count=1"}), kDone) << error_;
    EXPECT_THAT(out_, HasSubstr("  no changes\n"));
}

TEST_F(DriversCommandTest, WrongUsageIsTwo) {
    EXPECT_EQ(run({"x"}), kWrongUsage);
    EXPECT_THAT(error_, StartsWith("velactl: it takes no operands; usage: velactl drivers "));
    EXPECT_EQ(run({"--count", "3"}), kWrongUsage);
    EXPECT_THAT(error_, StartsWith("velactl: --count goes with --watch; "));
    EXPECT_EQ(run({"--watch", "--count", "0"}), kWrongUsage);
    EXPECT_THAT(error_, StartsWith("velactl: \"0\" is no number of times; "));
    EXPECT_EQ(run({"--watch", "--count", "often"}), kWrongUsage);
}

TEST_F(DriversCommandTest, ASourceThatIsNoneIsAWrongSetting) {
    EXPECT_EQ(run({"--set", "drivers.Speaker=[\"alsa\"]"}), kFailed);
    EXPECT_EQ(error_, "--set: drivers.Speaker: \"alsa\" is none of channels, alsa-playback, alsa-capture, cpuidle, "
                      "devfreq, runtime-pm, force-feedback\n");
}

TEST_F(DriversCommandTest, AFolderThatCannotBeReadIsSaidOnce) {
    std::filesystem::remove(folder_ / "hwstats");
    std::filesystem::create_symlink("/dev/null", folder_ / "hwstats");
    EXPECT_EQ(run({}), kFailed);
    EXPECT_EQ(error_, "velactl: " + (folder_ / "hwstats") + ": cannot be read: Not a directory\n");
    EXPECT_EQ(run({"--watch", "--count=1"}), kFailed);
    EXPECT_EQ(error_, "velactl: " + (folder_ / "hwstats") + ": cannot be read: Not a directory\n");
}

TEST_F(DriversCommandTest, AFileThatIsWrongIsSaidOnceAndTheOthersAreListed) {
    const auto publisher = publish();
    std::ofstream(folder_ / "hwstats/wr\nong.channels") << "no channel file, but longer than the header of one would "
                                                           "be: that takes some more words to write down";
    EXPECT_EQ(run({}), kFailed);
    EXPECT_EQ(error_, "velactl: " + (folder_ / "hwstats/wr\\nong.channels") + ": it is no channel file\n");
    EXPECT_THAT(out_, HasSubstr("Speaker                  My Driver  xruns    counter    0\n"));
}

} // namespace
} // namespace vela
