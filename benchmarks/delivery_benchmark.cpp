// The whole road of a message, from another process until it is kept, beside what else might keep it: the built
// service with its store, the journal, a Redis stream, a bare program that inserts into SQLite. Rounds of all of them
// take turns; a figure is the median of the rounds. Then the reporting queue's own share.
//
// usage: delivery_benchmark [ROUNDS] [MESSAGES]
#include "benchmarks/delivery/Peer.h"

#include <algorithm>
#include <cstdio>
#include <cstdlib>

namespace vela::deliverybench {

namespace {

double quantile(std::vector<double> values, double share) {
    std::sort(values.begin(), values.end());
    return values.empty() ? 0 : values[static_cast<std::size_t>(static_cast<double>(values.size() - 1) * share)];
}

/// What one peer came to.
struct Row {
    Peer peer;
    std::vector<Cost> rounds{};

    double median(double Cost::*member) const {
        std::vector<double> values;
        for (const Cost& round : rounds) {
            values.push_back(round.*member);
        }
        return quantile(values, 0.5);
    }
    static double processor(const Cost& cost) { return cost.server + cost.client; }
    double processor() const {
        std::vector<double> values;
        for (const Cost& round : rounds) {
            values.push_back(processor(round));
        }
        return quantile(values, 0.5);
    }
    /// The median of what each round came to beside the other's of the same round.
    double ratioTo(const Row& other) const {
        std::vector<double> values;
        for (std::size_t round = 0; round < rounds.size(); ++round) {
            values.push_back(processor(rounds[round]) / processor(other.rounds[round]));
        }
        return quantile(values, 0.5);
    }
};

void measureAll(std::vector<Row>& rows, std::size_t roundCount, std::size_t messages) {
    for (std::size_t round = 0; round < roundCount; ++round) {
        for (Row& row : rows) {
            if (row.peer.absent.empty()) {
                row.rounds.push_back(row.peer.measure(messages));
            }
        }
    }
}

void printTable(const std::vector<Row>& rows, const Row& journal) {
    constexpr double kMicro = 1e6;
    std::printf("%-14s %8s %8s %8s %10s %11s %8s  %s\n", "", "all us", "server", "client", "to journal", "messages/s",
                "bytes", "a message counts as kept when it is");
    for (const Row& row : rows) {
        if (row.rounds.empty()) {
            std::printf("%-14s left out: %s\n", row.peer.name.c_str(), row.peer.absent.c_str());
            continue;
        }
        char ratio[16] = "-";
        if (!journal.rounds.empty()) {
            std::snprintf(ratio, sizeof(ratio), "%.2f", row.ratioTo(journal));
        }
        std::printf("%-14s %8.2f %8.2f %8.2f %10s %11.0f %8.0f  %s\n", row.peer.name.c_str(), row.processor() * kMicro,
                    row.median(&Cost::server) * kMicro, row.median(&Cost::client) * kMicro, ratio,
                    row.median(&Cost::rate), row.median(&Cost::bytes), row.peer.keeps.c_str());
    }
}

void printGoal(const char* what, double value, double most) {
    std::printf("%-72s %8.2f  %s\n", what, value, value <= most ? "reached" : "MISSED");
}

} // namespace

} // namespace vela::deliverybench

int main(int argc, char** argv) {
    using namespace vela::deliverybench;
    // NOLINTBEGIN(cert-err34-c): numbers of a person
    const int rounds = argc > 1 ? std::max(1, std::atoi(argv[1])) : 3;
    const int messages = argc > 2 ? std::max(1, std::atoi(argv[2])) : 20'000;
    // NOLINTEND(cert-err34-c)
    std::vector<double> latencies;
    std::vector<Row> rows{
        {servicePeer(nullptr)}, {journalPeer()}, {redisPeer()}, {writerPeer()}, {servicePeer(&latencies)}};
    const Row& service = rows[0];
    const Row& journal = rows[1];
    std::printf("%d rounds of %d messages of 12 entries; us: processor time per message\n", rounds, messages);
    measureAll(rows, static_cast<std::size_t>(rounds), static_cast<std::size_t>(messages));
    printTable(rows, journal);
    std::printf("reading 100 rows of a session from the store meanwhile: %zu reads, p50 %.2f ms, p99 %.2f ms\n",
                latencies.size(), quantile(latencies, 0.5) * 1e3, quantile(latencies, 0.99) * 1e3);
    const double share = reportingQueueShare() * 1e6;

    std::printf("\ngoals\n");
    if (!journal.rounds.empty()) {
        printGoal("processor time of a message, times the journal's: at most 0.5", service.ratioTo(journal), 0.5);
    }
    printGoal("bytes on the disk per message: at most 260", service.median(&Cost::bytes), 260);
    printGoal("the reporting queue's share of a message, us: at most 1.5", share, 1.5);
    return EXIT_SUCCESS;
}
