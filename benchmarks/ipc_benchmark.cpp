// What a message costs from a client's call to the service's answer, beside the plainest echo that moves the same
// message and beside sd-bus. Each subject has its server in a process of its own. Rounds are interleaved, and figures
// are medians over the rounds; a ratio is the median of the ratios within each round, so that a busy machine weighs on
// both sides. (a) and (b) decode the message into a map and answer; (c) is the service with all its work: session,
// list, bridges, real-time reporting of the first sessions into its store. Each client has a session of its own, and
// writes calls that it makes together as the client library does, many at a time.
//
// usage: ipc_benchmark [ROUNDS [CLIENTS]]
// With CLIENTS, only for so many clients, and nothing of the service at rest.

#include "benchmarks/ipc/Measurement.h"
#include "benchmarks/ipc/ServiceAtRest.h"

#include <algorithm>
#include <array>
#include <cstdio>
#include <cstdlib>
#include <map>
#include <string_view>
#include <tuple>
#include <vector>

namespace vela::ipcbench {

namespace {

constexpr std::array kPhases{Phase::Waiting, Phase::WaitingTogether, Phase::WaitingApart, Phase::InFlight,
                             Phase::OneWay};
constexpr std::size_t kMessages = 48'000;
constexpr std::size_t kWaitingMessages = 16'000;

using Rounds = std::vector<Measurement>;
using Key = std::tuple<unsigned, Phase, std::size_t>; ///< clients, phase, subject

bool isWaiting(Phase phase) { return phase != Phase::InFlight && phase != Phase::OneWay; }

double median(std::vector<double> values) {
    if (values.empty()) {
        return 0;
    }
    std::sort(values.begin(), values.end());
    const std::size_t middle = values.size() / 2;
    return values.size() % 2 == 1 ? values[middle] : (values[middle - 1] + values[middle]) / 2;
}

double medianOf(const Rounds& rounds, double Measurement::*member) {
    std::vector<double> values;
    for (const Measurement& round : rounds) {
        values.push_back(round.*member);
    }
    return median(values);
}

double medianRatio(const Rounds& rounds, const Rounds& to, double Measurement::*member) {
    std::vector<double> values;
    for (std::size_t round = 0; round < rounds.size(); ++round) {
        values.push_back(rounds[round].*member / to[round].*member);
    }
    return median(values);
}

const char* nameOf(Phase phase) {
    switch (phase) {
    case Phase::Waiting:
        return "waiting for each reply, wherever the scheduler puts them";
    case Phase::WaitingTogether:
        return "waiting for each reply, on one processor with the server";
    case Phase::WaitingApart:
        return "waiting for each reply, on another processor than the server";
    case Phase::InFlight:
        return "256 calls in flight";
    case Phase::OneWay:
        return "without replies";
    }
    return "";
}

std::map<Key, Rounds> measureAll(const std::vector<Subject>& subjects, const std::vector<unsigned>& clientCounts,
                                 int rounds) {
    std::map<Key, Rounds> results;
    for (int round = 0; round < rounds; ++round) {
        for (const unsigned clients : clientCounts) {
            for (const Phase phase : kPhases) {
                for (std::size_t subject = 0; subject < subjects.size(); ++subject) {
                    const std::size_t messages = isWaiting(phase) ? kWaitingMessages : kMessages;
                    results[{clients, phase, subject}].push_back(measure(subjects[subject], clients, phase, messages));
                }
            }
        }
    }
    return results;
}

void printTable(const std::vector<Subject>& subjects, const std::vector<unsigned>& clientCounts,
                const std::map<Key, Rounds>& results) {
    for (const unsigned clients : clientCounts) {
        for (const Phase phase : kPhases) {
            std::printf("\n%u client%s, %s\n%-16s %9s %9s %9s | %11s %9s | %10s %10s\n", clients,
                        clients == 1 ? "" : "s", nameOf(phase), "", "p50 us", "p99 us", "p50 to a", "messages/s",
                        "to a", "client us", "server us");
            for (std::size_t subject = 0; subject < subjects.size(); ++subject) {
                const Rounds& rounds = results.at({clients, phase, subject});
                const Rounds& echo = results.at({clients, phase, 0});
                if (!rounds.front().measured) {
                    std::printf("%-16s not built: the library is not there\n", subjects[subject].name.c_str());
                    continue;
                }
                std::printf("%-16s ", subjects[subject].name.c_str());
                if (isWaiting(phase)) {
                    std::printf("%9.1f %9.1f %9.2f", medianOf(rounds, &Measurement::p50) * 1e6,
                                medianOf(rounds, &Measurement::p99) * 1e6,
                                medianRatio(rounds, echo, &Measurement::p50));
                } else {
                    std::printf("%9s %9s %9s", "", "", "");
                }
                std::printf(" | %11.0f %9.2f | %10.2f %10.2f", medianOf(rounds, &Measurement::rate),
                            medianRatio(rounds, echo, &Measurement::rate),
                            medianOf(rounds, &Measurement::clientTime) * 1e6,
                            medianOf(rounds, &Measurement::serverTime) * 1e6);
                const double lost = medianOf(rounds, &Measurement::lost);
                std::printf(lost > 0 ? "  %.1f %% of the deliveries given up\n" : "\n", lost * 100);
            }
        }
    }
}

void printGoal(const char* what, double value, bool reached) {
    std::printf("%-72s %8.2f  %s\n", what, value, reached ? "reached" : "MISSED");
}

void printGoals(const std::map<Key, Rounds>& results) {
    const auto rounds = [&results](Phase phase, std::size_t subject) -> const Rounds& {
        return results.at({1, phase, subject});
    };
    std::printf("\ngoals, with one client\n");
    for (const Phase phase : kPhases) {
        if (isWaiting(phase)) {
            const double ratio = medianRatio(rounds(phase, 2), rounds(phase, 0), &Measurement::p50);
            std::printf("%s:\n", nameOf(phase));
            printGoal("  round trip p50, times that of (a): at most 1.8", ratio, ratio <= 1.8);
        }
    }
    const double toEcho = medianRatio(rounds(Phase::InFlight, 2), rounds(Phase::InFlight, 0), &Measurement::rate);
    printGoal("messages a second with 256 in flight, times those of (a): at least 0.45", toEcho, toEcho >= 0.45);
    if (rounds(Phase::InFlight, 1).front().measured) {
        const double toBus = medianRatio(rounds(Phase::InFlight, 2), rounds(Phase::InFlight, 1), &Measurement::rate);
        printGoal("messages a second with 256 in flight, times those of (b): at least 2", toBus, toBus >= 2);
    }
}

void printAtRest(const char* what, const AtRest& rest, unsigned seconds) {
    std::printf("at rest for %u s, %-28s resident %5.1f MB, voluntary context switches %llu, others %llu\n", seconds,
                what, rest.residentBytes / 1e6, static_cast<unsigned long long>(rest.wakeUps),
                static_cast<unsigned long long>(rest.preempted));
}

void measureRest() {
    constexpr unsigned kStarts = 21;
    constexpr unsigned kSeconds = 5;
    const std::vector<double> replies = firstReplies(kStarts);
    std::printf("\n");
    if (replies.empty()) {
        std::printf("systemd-socket-activate is not there: no start on demand\n");
    } else {
        const double middle = replies[replies.size() / 2] * 1e3;
        std::printf("first reply after a start on demand, ms: least %.1f, most %.1f of %u\n", replies.front() * 1e3,
                    replies.back() * 1e3, kStarts);
        printGoal("first reply after a start on demand, median, ms: at most 15", middle, middle <= 15);
    }
    const AtRest alone = serviceAtRest(false, kSeconds);
    printAtRest("no client:", alone, kSeconds);
    printAtRest("a started session:", serviceAtRest(true, kSeconds), kSeconds);
    printGoal("resident memory at rest, MB: at most 10", alone.residentBytes / 1e6, alone.residentBytes <= 10e6);
    printGoal("wake-ups at rest: none", static_cast<double>(alone.wakeUps), alone.wakeUps == 0);
}

} // namespace

} // namespace vela::ipcbench

int main(int argc, char** argv) {
    using namespace vela::ipcbench;
    constexpr int kRounds = 5;
    // NOLINTBEGIN(cert-err34-c): numbers of a person
    const int rounds = argc > 1 ? std::max(1, std::atoi(argv[1])) : kRounds;
    const int onlyClients = argc > 2 ? std::max(1, std::atoi(argv[2])) : 0;
    // NOLINTEND(cert-err34-c)
    std::vector<unsigned> clientCounts{1, 8, 64};
    if (onlyClients > 0) {
        clientCounts = {static_cast<unsigned>(onlyClients)};
    }
    const std::vector<Subject> subjects{echoSubject(), sdBusSubject(), serviceSubject()};
    std::printf("%d rounds; client us and server us: processor time per message\n", rounds);
    const auto results = measureAll(subjects, clientCounts, rounds);
    printTable(subjects, clientCounts, results);
    if (clientCounts.front() == 1) {
        printGoals(results);
    }
    if (onlyClients == 0) {
        measureRest();
    }
    return EXIT_SUCCESS;
}
