// What a real-time caller relies on, and that the client's thread rests.
#include "client/Client_integrationtest.h"

#include <csignal>
#include <filesystem>
#include <fstream>
#include <map>
#include <vector>

namespace vela::client {

namespace {

using ClientRealTimeTest = ClientTest;

TEST_F(ClientRealTimeTest, ErrnoStaysAsItWas) {
    const OwnedClient client = make();
    errno = 4711;
    for (int round = 0; round < 100; ++round) {
        sendTwelve(client);
    }
    EXPECT_EQ(errno, 4711);
}

TEST_F(ClientRealTimeTest, MessagesOfManyThreadsComeInEachOnesOrder) {
    constexpr int kThreads = 4;
    constexpr int kMessages = 1500;
    const OwnedClient client = make();
    std::vector<std::thread> threads;
    for (int thread = 0; thread < kThreads; ++thread) {
        threads.emplace_back([&client, thread] {
            for (int number = 0; number < kMessages;) {
                if (send(client, thread * 1'000'000 + number) == VelaReportingStatusOk) {
                    ++number;
                } else {
                    std::this_thread::yield();
                }
            }
        });
    }
    for (std::thread& thread : threads) {
        thread.join();
    }
    service_.waitForCalls(kThreads * kMessages);
    std::map<std::int64_t, std::int64_t> next;
    for (const testing::RecordedCall& call : service_.calls()) {
        const std::int64_t number = call.dictionary.find("n").integerValue();
        ASSERT_EQ(number % 1'000'000, next[number / 1'000'000]++);
    }
    EXPECT_EQ(next.size(), 4U);
}

/// A line of the status file of the client's thread.
std::string threadStatus(const std::string& name) {
    for (const auto& task : std::filesystem::directory_iterator("/proc/self/task")) {
        std::string thread;
        std::getline(std::ifstream(task.path() / "comm"), thread);
        std::ifstream status(task.path() / "status");
        for (std::string line; thread == "vela-reporting" && std::getline(status, line);) {
            if (line.substr(0, name.size() + 1) == name + ":") {
                return line.substr(name.size() + 1);
            }
        }
    }
    return "";
}

TEST_F(ClientRealTimeTest, AtRestNothingWakesTheThread) {
    const OwnedClient client = make();
    VelaReportingCreateReportingSession(client.get(), 42);
    service_.waitForCalls(1);
    ASSERT_NE(threadStatus("voluntary_ctxt_switches"), "");
    // It naps for a while after a call. Asleep it would be seen unchanged over any time; naps end within milliseconds.
    std::string before;
    std::string after = threadStatus("voluntary_ctxt_switches");
    for (int round = 0; round < 100 && before != after; ++round) {
        before = after;
        std::this_thread::sleep_for(std::chrono::milliseconds(250));
        after = threadStatus("voluntary_ctxt_switches");
    }
    EXPECT_EQ(before, after);
    send(client, 1);
    service_.waitForCalls(2);
}

TEST_F(ClientRealTimeTest, SignalsAreForOtherThreads) {
    const OwnedClient client = make();
    waitForConnection(client);
    const std::uint64_t blocked = std::stoull(threadStatus("SigBlk"), nullptr, 16);
    for (const int signal : {SIGTERM, SIGINT, SIGHUP, SIGUSR1, SIGALRM, SIGPIPE, SIGCHLD}) {
        EXPECT_NE(blocked & (std::uint64_t{1} << (signal - 1)), 0U) << signal;
    }
}

} // namespace

} // namespace vela::client
