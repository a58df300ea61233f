// 200,000 events per second from two processes with three threads each: none is lost, and those of one thread stay in
// their order. VELA_TRACE_LOAD_SECONDS says for how long; without it, one second.
#include "platform/linux/FileDescriptor.h"
#include "platform/spoor/SpoorHarness_test.h"
#include "platform/spoor/TraceEmitter.h"

#include <array>
#include <chrono>
#include <csignal>
#include <cstdlib>
#include <gtest/gtest.h>
#include <string>
#include <sys/wait.h>
#include <thread>
#include <unistd.h>
#include <utility>
#include <vector>

namespace vela::platform {
namespace {

using spoor::Emission;
using spoor::TraceEmitter;

constexpr std::uint64_t kProcesses = 2;
constexpr std::uint64_t kThreads = 3;
constexpr std::uint64_t kPerMillisecondAndThread = 34; // 204,000 a second in all

std::uint64_t milliseconds() {
    const char* const seconds = std::getenv("VELA_TRACE_LOAD_SECONDS"); // NOLINT(concurrency-mt-unsafe)
    return seconds == nullptr ? 1'000 : std::strtoull(seconds, nullptr, 10) * 1'000;
}

/// Emits a thread's events, some each millisecond. Answers how many were not taken.
std::uint64_t emitAll(TraceEmitter& emitter, std::uint64_t thread) {
    std::uint64_t refused = 0;
    auto next = std::chrono::steady_clock::now();
    for (std::uint64_t millisecond = 0; millisecond < milliseconds(); ++millisecond) {
        for (std::uint64_t i = 0; i < kPerMillisecondAndThread; ++i) {
            const std::uint64_t number = millisecond * kPerMillisecondAndThread + i;
            refused += emitter.emitNow(kTestCode, {thread, number, 0, 0}) == Emission::Emitted ? 0U : 1U;
        }
        next += std::chrono::milliseconds(1);
        std::this_thread::sleep_until(next);
    }
    return refused;
}

/// A process that waits for the name of a runtime folder, then emits there. Made before this one has threads.
class EmittingProcess {
public:
    explicit EmittingProcess(std::uint64_t number) {
        std::array<int, 2> pipes{};
        EXPECT_EQ(pipe(pipes.data()), 0);
        pid_ = fork();
        if (pid_ == 0) {
            close(pipes[1]);
            _exit(run(FileDescriptor(pipes[0]), number));
        }
        close(pipes[0]);
        order_ = FileDescriptor(pipes[1]);
    }
    ~EmittingProcess() {
        order_ = FileDescriptor();
        waitForEnd();
    }
    EmittingProcess(const EmittingProcess&) = delete;
    EmittingProcess& operator=(const EmittingProcess&) = delete;

    void start(const std::string& runtimeFolder) {
        EXPECT_EQ(write(order_.get(), runtimeFolder.data(), runtimeFolder.size()),
                  static_cast<ssize_t>(runtimeFolder.size()));
    }
    /// 0 when every event was taken.
    int waitForEnd() {
        int status = 0;
        if (pid_ > 0) {
            waitpid(std::exchange(pid_, -1), &status, 0);
        }
        return status;
    }

private:
    static int run(const FileDescriptor& order, std::uint64_t process) {
        // One reading, not until the end: the other process has a copy of this one's order.
        std::array<char, 4096> path{};
        const ssize_t got = read(order.get(), path.data(), path.size());
        if (got <= 0) {
            return 0; // its test was skipped
        }
        const std::string runtimeFolder(path.data(), static_cast<std::size_t>(got));
        auto* const emitter = new TraceEmitter({{runtimeFolder, true}});
        std::array<std::uint64_t, kThreads> refused{};
        std::vector<std::thread> threads;
        for (std::uint64_t i = 0; i < kThreads; ++i) {
            threads.emplace_back([&, i] { refused[i] = emitAll(*emitter, process * kThreads + i); });
        }
        for (std::thread& thread : threads) {
            thread.join();
        }
        return refused == std::array<std::uint64_t, kThreads>{} ? 0 : 1;
    }

    FileDescriptor order_;
    pid_t pid_ = -1;
};

template <class Harness>
class EmitterLoadTest : public ::testing::Test {
protected:
    EmittingProcess first_{0};
    EmittingProcess second_{1};
    Harness harness_;
};
TYPED_TEST_SUITE(EmitterLoadTest, BothWays);

TYPED_TEST(EmitterLoadTest, NoneOfManyEventsIsLost) {
    std::array<std::uint64_t, kProcesses * kThreads> next{};
    std::uint64_t outOfOrder = 0;
    std::atomic<bool> completed = false;
    const auto session = this->harness_.spoor().createSession();
    session->setCompletionHandler([&] { completed = true; });
    EXPECT_EQ(session->eventsRange(kTestCode, kTestCode,
                                   [&](const SpoorEvent& event) {
                                       std::uint64_t& expected = next.at(event.arguments[0]);
                                       outOfOrder += event.arguments[1] == expected ? 0U : 1U;
                                       expected = event.arguments[1] + 1;
                                   }),
              0);
    ASSERT_EQ(session->start(this->harness_.queue()), 0);
    for (EmittingProcess* const process : {&this->first_, &this->second_}) {
        process->start(this->harness_.runtimeFolder());
    }
    for (EmittingProcess* const process : {&this->first_, &this->second_}) {
        EXPECT_EQ(process->waitForEnd(), 0) << "an event was not taken";
    }
    EXPECT_EQ(session->end(), 0);
    ASSERT_TRUE(testing::waitUntil([&] { return completed.load(); }));
    EXPECT_EQ(session->lostEvents(), 0U);
    EXPECT_EQ(outOfOrder, 0U);
    for (const std::uint64_t count : next) {
        EXPECT_EQ(count, milliseconds() * kPerMillisecondAndThread);
    }
}

} // namespace
} // namespace vela::platform
