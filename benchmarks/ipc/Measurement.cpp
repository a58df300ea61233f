#include "benchmarks/ipc/Measurement.h"

#include "benchmarks/ipc/Placement.h"

#include <algorithm>
#include <ctime>
#include <thread>
#include <unistd.h>
#include <vector>

namespace vela::ipcbench {

namespace {

using Clock = std::chrono::steady_clock;

constexpr std::size_t kWarmUp = 500;

/// What one client does; its numbers are its own, so that no message repeats another.
class Client {
public:
    Client(Channel& channel, unsigned window) : channel_(channel), window_(window) {}

    void run(Phase phase, std::size_t messages) {
        switch (phase) {
        case Phase::Waiting:
        case Phase::WaitingTogether:
        case Phase::WaitingApart:
            waits_.reserve(waits_.size() + messages);
            for (std::size_t count = 0; count < messages; ++count) {
                const Clock::time_point begin = Clock::now();
                channel_.call(number_++);
                waits_.push_back(std::chrono::duration<double>(Clock::now() - begin).count());
            }
            return;
        case Phase::InFlight:
            return runInFlight(messages);
        case Phase::OneWay:
            for (std::size_t count = 1; count < messages; ++count) {
                channel_.post(number_++, false);
                channel_.flush();
            }
            return channel_.call(number_++);
        }
    }
    const std::vector<double>& waits() const { return waits_; }
    void forgetWarmUp() { waits_.clear(); }

private:
    void runInFlight(std::size_t messages) {
        std::size_t posted = 0;
        for (std::size_t taken = 0; taken < messages; ++taken) {
            // Refilled in halves: a program that keeps many calls under way wakes up for many replies.
            if (posted - taken <= window_ / 2) {
                for (; posted < messages && posted - taken < window_; ++posted) {
                    channel_.post(number_++, true);
                }
                channel_.flush();
            }
            channel_.takeReply();
        }
    }

    Channel& channel_;
    const unsigned window_;
    std::int64_t number_ = 0;
    std::vector<double> waits_;
};

template <class Work>
void onThreads(std::vector<Client>& clients, const Work& work) {
    std::vector<std::jthread> threads;
    threads.reserve(clients.size());
    for (Client& client : clients) {
        threads.emplace_back([&client, &work] { work(client); });
    }
}

double secondsOf(clockid_t clock) {
    timespec time{};
    clock_gettime(clock, &time);
    return static_cast<double>(time.tv_sec) + static_cast<double>(time.tv_nsec) / 1e9;
}

Places placesOf(Phase phase) {
    switch (phase) {
    case Phase::WaitingTogether:
        return Places::Together;
    case Phase::WaitingApart:
        return Places::Apart;
    default:
        return Places::Free;
    }
}

double quantile(std::vector<double>& sorted, double share) {
    return sorted.empty() ? 0 : sorted[static_cast<std::size_t>(static_cast<double>(sorted.size() - 1) * share)];
}

} // namespace

double processorSeconds(pid_t process) {
    clockid_t clock{};
    require(clock_getcpuclockid(process, &clock) == 0, "the server is gone");
    return secondsOf(clock);
}

double processorSecondsWhenIdle(pid_t process) {
    constexpr std::chrono::milliseconds kBetween{100};
    double before = processorSeconds(process);
    for (int quiet = 0; quiet < 3;) {
        std::this_thread::sleep_for(kBetween);
        const double now = processorSeconds(process);
        quiet = now == before ? quiet + 1 : 0;
        before = now;
    }
    return before;
}

Measurement measure(const Subject& subject, unsigned clientCount, Phase phase, std::size_t messages) {
    Measurement result;
    if (!subject.start) {
        return result;
    }
    const Placement placement(placesOf(phase));
    placement.serverStarts();
    const auto running = subject.start(clientCount);
    placement.clientsStart();
    std::vector<Client> clients;
    for (const auto& channel : running->channels()) {
        clients.emplace_back(*channel, kInFlight / clientCount);
    }
    onThreads(clients, [&](Client& client) { client.run(phase, kWarmUp / clientCount + 1); });
    for (Client& client : clients) {
        client.forgetWarmUp();
    }
    const double serverBefore = processorSecondsWhenIdle(running->process());
    const double clientBefore = secondsOf(CLOCK_PROCESS_CPUTIME_ID);
    const Clock::time_point begin = Clock::now();
    onThreads(clients, [&](Client& client) { client.run(phase, messages / clientCount); });
    const double seconds = std::chrono::duration<double>(Clock::now() - begin).count();
    const double clientUsed = secondsOf(CLOCK_PROCESS_CPUTIME_ID) - clientBefore;
    const double serverUsed = processorSecondsWhenIdle(running->process()) - serverBefore;
    std::vector<double> waits;
    for (const Client& client : clients) {
        waits.insert(waits.end(), client.waits().begin(), client.waits().end());
    }
    std::sort(waits.begin(), waits.end());
    const auto sent = static_cast<double>(messages / clientCount * clientCount);
    return {.p50 = quantile(waits, 0.5),
            .p99 = quantile(waits, 0.99),
            .rate = sent / seconds,
            .clientTime = clientUsed / sent,
            .serverTime = serverUsed / sent,
            .lost = running->lostShare(),
            .measured = true};
}

} // namespace vela::ipcbench
