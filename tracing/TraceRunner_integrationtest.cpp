// The runner on the system's queues and files: what stands in the folder afterwards, and how the process ends where
// nothing can stand there.
#include "platform/linux/LinuxFileSystem.h"
#include "platform/linux/LinuxMetricsheet.h"
#include "platform/linux/LinuxProcessControl.h"
#include "platform/linux/LinuxWorkQueues.h"
#include "testing/FakeProcessControl.h"
#include "testing/TemporaryFolder.h"
#include "tracing/TraceRunner.h"
#include "tracing/Trace_test.h"

#include <atomic>
#include <cerrno>
#include <filesystem>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <iostream>
#include <nlohmann/json.hpp>
#include <sys/stat.h>
#include <thread>
#include <unistd.h>

namespace vela {

namespace {

using ::testing::Contains;
using ::testing::ElementsAre;
using ::testing::UnorderedElementsAre;

mode_t permissionsOf(const std::string& path) {
    struct stat status {};
    EXPECT_EQ(stat(path.c_str(), &status), 0) << path;
    return status.st_mode & 07777U;
}

class TraceRunnerOnLinuxTest : public ::testing::Test {
protected:
    TraceRunnerPlatform runnerPlatform(platform::ProcessControl& process) {
        return {files_, metricsheet_, process, spoor_, queues_, root_.path()};
    }
    static TraceParams oneInterval() {
        TraceParams params;
        params.name = "start";
        auto point = std::make_unique<TraceDataParams>();
        point->name = "open";
        point->beginCode = kBegin;
        point->endCode = kEnd;
        point->matchedByThread = true;
        params.dataParams.push_back(std::move(point));
        return params;
    }
    /// A run of one trace with one pair of 25 ns.
    void run(platform::ProcessControl& process) {
        TraceRunner runner(runnerPlatform(process));
        const TraceParams params = oneInterval();
        runner.createTraceFromTraceParams(&params);
        runner.runTraces();
        spoor_.replay({eventAt(1'000, kBegin), eventAt(1'025, kEnd)});
        runner.stopTracingandProcessResults();
    }
    std::string content(const std::string& name) const { return *files_.readFile(folder_ + "/" + name, 1'000'000); }

    const testing::TemporaryFolder root_;
    const std::string folder_ = root_.path() + "/private/var/mobile/Library/Logs/Wreckage/DiagnosticLogs/Audio/Traces";
    platform::LinuxFileSystem files_;
    platform::LinuxMetricsheet metricsheet_{files_};
    platform::LinuxWorkQueues queues_;
    testing::FakeSpoor spoor_;
    testing::FakeProcessControl process_;
};

TEST_F(TraceRunnerOnLinuxTest, ARunLeavesItsTwoFiles) {
    const mode_t umaskBefore = umask(0077);
    run(process_);
    umask(umaskBefore);
    EXPECT_EQ(content("tracing_results.msj"),
              "{\"format\":\"metricsheet\",\"writer\":\"VelaReporting\",\"version\":4}\n"
              "{\"name\":\"open\",\"value\":25.0,\"unit\":\"nanoseconds\"}\n");
    const auto picture = nlohmann::json::parse(content("tracing_results.json"));
    EXPECT_EQ(picture["traceEvents"][0]["dur"], 0.025);
    EXPECT_EQ(permissionsOf(folder_), 0777U);
    EXPECT_EQ(permissionsOf(root_ / "private"), 0777U);
    EXPECT_EQ(permissionsOf(folder_ + "/tracing_results.msj"), 0644U);
    EXPECT_EQ(permissionsOf(folder_ + "/tracing_results.json"), 0644U);
    std::vector<std::string> names;
    for (const auto& entry : std::filesystem::directory_iterator(folder_)) {
        names.push_back(entry.path().filename());
    }
    EXPECT_THAT(names, UnorderedElementsAre("tracing_results.msj", "tracing_results.json"));
}

TEST_F(TraceRunnerOnLinuxTest, EveryStopWritesTheFilesAnew) {
    run(process_);
    const std::string first = content("tracing_results.msj");
    run(process_);
    EXPECT_EQ(content("tracing_results.msj"), first);
}

TEST_F(TraceRunnerOnLinuxTest, AFolderInTheResultsPlaceIsLoggedAndTheServiceGoesOn) {
    std::filesystem::create_directories(folder_ + "/tracing_results.msj");
    testing::CapturingLog log;
    run(process_);
    const std::string path = folder_ + "/tracing_results.msj";
    EXPECT_THAT(log.lines(), Contains(traceLine(LogLevel::Error, "TraceRunner",
                                                "can't write trace results at " + path + ": rename to " + path +
                                                    ": Is a directory")));
    EXPECT_THAT(process_.statuses(), ::testing::IsEmpty());
    EXPECT_EQ(nlohmann::json::parse(content("tracing_results.json"))["traceEvents"].size(), 1U);
}

TEST_F(TraceRunnerOnLinuxTest, AFileInTheFoldersPlaceIsLoggedAndEndsTheProcess) {
    std::filesystem::create_directories(std::filesystem::path(folder_).parent_path());
    ASSERT_TRUE(files_.writeFileAtomically(folder_, "", 0644));
    testing::CapturingLog log;
    run(process_);
    EXPECT_THAT(log.lines(), Contains(traceLine(LogLevel::Error, "TraceRunner",
                                                "can't create logging directory at " + folder_ + ": create folder " +
                                                    folder_ + ": Not a directory")));
    EXPECT_EQ(log.lines().back(), traceLine(LogLevel::Info, "TraceRunner", "Failed to open metricsheet writer"));
    EXPECT_THAT(process_.statuses(), ElementsAre(1));
}

// Everybody may rename the folder and put a link in its place.
TEST_F(TraceRunnerOnLinuxTest, AnotherUsersLinkInTheFoldersPlaceIsNotFollowed) {
    constexpr uid_t kStranger = 4001;
    std::filesystem::create_directories(root_ / "precious");
    std::filesystem::create_directories(std::filesystem::path(folder_).parent_path());
    std::filesystem::create_directory_symlink(root_ / "precious", folder_);
    if (lchown(folder_.c_str(), kStranger, kStranger) != 0) {
        GTEST_SKIP() << "gives a link to another user, which takes root";
    }
    testing::CapturingLog log;
    run(process_);
    EXPECT_TRUE(std::filesystem::is_empty(root_ / "precious"));
    EXPECT_THAT(log.lines(), Contains(traceLine(LogLevel::Error, "TraceRunner",
                                                "can't create logging directory at " + folder_ + ": create folder " +
                                                    folder_ + ": a link of user 4001 is not followed")));
    EXPECT_EQ(log.lines().back(), traceLine(LogLevel::Info, "TraceRunner", "Failed to open metricsheet writer"));
    EXPECT_THAT(process_.statuses(), ElementsAre(1));
}

using TraceRunnerOnLinuxDeathTest = TraceRunnerOnLinuxTest;

TEST_F(TraceRunnerOnLinuxDeathTest, WithoutAResultsFileTheProcessEndsWithOneAndRunsNoDestructors) {
    GTEST_FLAG_SET(death_test_style, "threadsafe");
    std::filesystem::create_directories(std::filesystem::path(folder_).parent_path());
    ASSERT_TRUE(files_.writeFileAtomically(folder_, "", 0644));
    struct Tell {
        ~Tell() { std::cerr << "destroyed"; }
    };
    const auto runToItsEnd = [this] {
        static const Tell tell; // exit() would destroy it
        platform::LinuxProcessControl process;
        run(process);
    };
    EXPECT_EXIT(runToItsEnd(), ::testing::ExitedWithCode(1), "^$");
}

TEST_F(TraceRunnerOnLinuxTest, ThreadsMayEmitWhileTracesStartAndStop) {
    std::atomic<bool> stop = false;
    constexpr int kThreads = 3;
    std::vector<std::thread> threads;
    threads.reserve(kThreads);
    for (int i = 0; i < kThreads; ++i) {
        threads.emplace_back([this, &stop] {
            while (!stop) {
                spoor_.emit(kBegin); // never ended
                spoor_.clear();
            }
        });
    }
    for (int round = 0; round < 5; ++round) {
        TraceRunner runner(runnerPlatform(process_));
        const TraceParams params = oneInterval();
        runner.createTraceFromTraceParams(&params);
        runner.createTraceFromTraceParams(&params);
        runner.runTraces();
        spoor_.emit(kBegin);
        spoor_.emit(kEnd);
        if (round == 4) {
            break; // destroyed while it collects
        }
        runner.stopTracingandProcessResults();
        EXPECT_EQ(nlohmann::json::parse(content("tracing_results.json"))["traceEvents"].size(), 2U);
    }
    stop = true;
    for (std::thread& thread : threads) {
        thread.join();
    }
    EXPECT_EQ(spoor_.liveSessions(), 0U);
}

TEST_F(TraceRunnerOnLinuxTest, AStopOnAPoolThreadLeavesTheOtherQueuesRunning) {
    spoor_.setCompletes(false);
    TraceRunner runner(runnerPlatform(process_));
    const TraceParams params = oneInterval();
    runner.createTraceFromTraceParams(&params);
    runner.runTraces();
    const auto reporting = queues_.makeSerialQueue("reporting", platform::QualityOfService::Default);
    const auto stopped = queues_.makeSemaphore(0);
    reporting->post([&] {
        runner.stopTracingandProcessResults();
        stopped->signal();
    });
    // More items that wait than a pool of this machine has threads; then one that ends them all.
    const auto release = queues_.makeSemaphore(0);
    const auto released = queues_.makeSemaphore(0);
    constexpr int kWaiters = 16;
    for (int i = 0; i < kWaiters; ++i) {
        queues_.background().post([&] {
            release->wait(std::nullopt);
            released->signal();
        });
    }
    queues_.background().post([&] {
        for (int i = 0; i < kWaiters; ++i) {
            release->signal();
        }
    });
    for (int i = 0; i < kWaiters; ++i) {
        released->wait(std::nullopt);
    }
    while (!stopped->wait(std::chrono::milliseconds(1))) {
        spoor_.completeEndedSessions();
    }
    EXPECT_THAT(process_.statuses(), ::testing::IsEmpty());
}

} // namespace

} // namespace vela
