#include "cli/Subcommand.h"
#include "platform/linux/LinuxClock.h"
#include "platform/linux/LinuxWorkQueues.h"
#include "platform/spoor/LinuxSpoor.h"
#include "testing/RunningProgram.h"
#include "testing/TemporaryFolder.h"

#include <atomic>
#include <fstream>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sstream>

namespace vela {
namespace {

using ::testing::ElementsAre;
using ::testing::StartsWith;

struct Outcome {
    int status = -1;
    std::string out;
    std::string error;
};

class TraceEmitCommandTest : public ::testing::Test {
protected:
    Outcome emit(const std::vector<std::string_view>& operands) {
        std::istringstream in;
        std::ostringstream out;
        std::ostringstream error;
        Console console{in, out, error};
        const std::string settings = folder_ / "settings.toml";
        const std::ofstream none(settings);
        const std::string set = "paths.runtime=" + folder_.path();
        std::vector<std::string_view> arguments{"trace", "emit", "--settings", settings, "--set", set};
        arguments.insert(arguments.end(), operands.begin(), operands.end());
        const int status = runVelactl(arguments, console);
        return {status, out.str(), error.str()};
    }
    void openService() {
        platform::LinuxSpoorOptions options;
        options.runtimeFolder = folder_.path();
        options.traceFolders.clear();
        spoor_ = std::make_unique<platform::LinuxSpoor>(options, clock_);
    }

    const testing::TemporaryFolder folder_;
    platform::LinuxClock clock_;
    platform::LinuxWorkQueues queues_;
    const std::unique_ptr<platform::SerialQueue> queue_ =
        queues_.makeSerialQueue("trace.test", platform::QualityOfService::Default);
    std::unique_ptr<platform::LinuxSpoor> spoor_;
};

TEST_F(TraceEmitCommandTest, AnEventReachesTheSession) {
    openService();
    std::vector<platform::SpoorEvent> events;
    std::atomic<bool> completed = false;
    const auto session = spoor_->createSession();
    session->setCompletionHandler([&] { completed = true; });
    ASSERT_EQ(session->eventsRange(0x21040100, 0x21040101, [&](const auto& event) { events.push_back(event); }), 0);
    ASSERT_EQ(session->start(*queue_), 0);
    for (const Outcome& outcome :
         {emit({"0x21040100", "1", "0xFF", "18446744073709551615", "7"}), emit({"--", "553910529", "-1"}),
          emit({"0x21040101", "-5", "-9223372036854775808"})}) {
        EXPECT_EQ(outcome.status, kDone);
        EXPECT_EQ(outcome.out + outcome.error, "");
    }
    const Outcome other = emit({"0x21040102"});
    EXPECT_EQ(other.status, kFailed);
    EXPECT_EQ(other.error, "velactl: nobody collects events with this code\n");
    EXPECT_EQ(session->end(), 0);
    ASSERT_TRUE(testing::waitUntil([&] { return completed.load(); }));
    ASSERT_EQ(events.size(), 3U);
    EXPECT_EQ(events[0].eventCode, 0x21040100U);
    EXPECT_THAT(events[0].arguments, ElementsAre(1, 255, 18446744073709551615U, 7));
    EXPECT_EQ(events[1].eventCode, 0x21040101U);
    EXPECT_THAT(events[1].arguments, ElementsAre(18446744073709551615U, 0, 0, 0));
    EXPECT_THAT(events[2].arguments, ElementsAre(18446744073709551611U, 9223372036854775808U, 0, 0));
}

TEST_F(TraceEmitCommandTest, ItSaysWhenNobodyCollects) {
    openService();
    const Outcome outcome = emit({"0x21040100"});
    EXPECT_EQ(outcome.status, kFailed);
    EXPECT_EQ(outcome.error, "velactl: nobody collects trace events\n");
}

TEST_F(TraceEmitCommandTest, ItSaysWhenThereIsNoService) {
    const std::string expected = "velactl: no service in " + folder_.path() + " collects trace events\n";
    EXPECT_EQ(emit({"0x21040100"}).status, kNoService);
    EXPECT_EQ(emit({"0x21040100"}).error, expected);
    openService();
    spoor_.reset();
    EXPECT_EQ(emit({"0x21040100"}).status, kNoService);
    EXPECT_EQ(emit({"0x21040100"}).error, expected);
}

TEST_F(TraceEmitCommandTest, WrongUsageIsOneLineAndTwo) {
    EXPECT_EQ(emit({}).status, kWrongUsage);
    EXPECT_THAT(emit({}).error, StartsWith("velactl: a code is missing; usage: velactl trace emit CODE [ARG]..."));
    for (const char* const code : {"x", "0x", "0x121040100", "4294967296", "1.5", ""}) {
        EXPECT_EQ(emit({code}).status, kWrongUsage) << code;
        EXPECT_THAT(emit({code}).error, StartsWith("velactl: a code is a number of 32 bits, such as 0x21040100, and"));
    }
    EXPECT_EQ(emit({"--", "-1"}).status, kWrongUsage);
    EXPECT_EQ(emit({"1", "2", "3", "4", "5", "6"}).status, kWrongUsage);
    EXPECT_THAT(emit({"1", "2", "3", "4", "5", "6"}).error,
                StartsWith("velactl: an event has at most four arguments; usage: "));
    for (const char* const argument : {"y", "18446744073709551616", "-9223372036854775809", "--1"}) {
        EXPECT_EQ(emit({"--", "1", argument}).status, kWrongUsage) << argument;
    }
    EXPECT_EQ(emit({"--jsn", "1"}).status, kWrongUsage);
    EXPECT_THAT(emit({"-5"}).error,
                StartsWith("velactl: a code is a number of 32 bits, such as 0x21040100, and not -5;"));
    EXPECT_THAT(emit({"1", "-5x"}).error, StartsWith("velactl: an argument is a number of 64 bits, and not -5x;"));
    EXPECT_THAT(emit({"1", "-x"}).error, StartsWith("velactl: there is no option -x;"));
}

} // namespace
} // namespace vela
