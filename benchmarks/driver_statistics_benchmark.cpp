// What the drivers' statistics cost at a session's stop: processor time for the difference of 1,000 channels and their
// formatting, a third of each format, histograms of 32 buckets and 8 states each. At most 3 ms.
#include "benchmarks/SessionBench.h"
#include "common/VelaReportingLogCategories.h"
#include "driverstats/VelaReportingDriverStatistics.h"
#include "driverstats/VelaReportingDriverUtility.h"

#include <benchmark/benchmark.h>
#include <cstdint>
#include <cstdio>
#include <memory>
#include <string>
#include <vector>

namespace vela {

namespace {

using platform::HwStatsAnswer;
using platform::HwStatsChannel;
using platform::HwStatsChannels;
using platform::HwStatsFormat;
using platform::HwStatsSamples;
using platform::HwStatsSubscription;

constexpr std::int64_t kChannels = 1'000;
constexpr std::int64_t kBuckets = 32;
constexpr std::uint64_t kStates = 8;

/// A channel with the values that it has after `time`; `generation` is part of its name.
HwStatsChannel channelAt(std::int64_t number, std::int64_t time, std::int64_t generation) {
    constexpr HwStatsFormat kFormats[] = {HwStatsFormat::Simple, HwStatsFormat::State, HwStatsFormat::Histogram};
    HwStatsChannel channel;
    const HwStatsFormat format = kFormats[number % 3];
    channel.format = static_cast<std::uint8_t>(format);
    channel.driverName = "Vela Audio Driver<0x10>";
    channel.group = "Rx";
    channel.subGroup = "Stats " + std::to_string(generation);
    channel.channelName = "Channel_" + std::to_string(number);
    channel.unitLabel = "us";
    channel.simpleValue = (format == HwStatsFormat::Simple ? 1'000 + number : 0) * time;
    if (format == HwStatsFormat::Histogram) {
        for (std::int64_t i = 0; i < kBuckets; ++i) {
            channel.buckets.push_back({i * 125, (i + 1) * 125, 0, (10 * number + i) * time});
        }
        channel.histogramMax = 3'999;
    }
    if (format == HwStatsFormat::State) {
        for (std::uint64_t i = 0; i < kStates; ++i) {
            const auto residency = static_cast<std::uint64_t>(time) * 1'000 * (i + 1);
            channel.states.push_back({"state " + std::to_string(i), static_cast<std::uint64_t>(time) * (i + 7),
                                      residency, static_cast<double>(i + 1) / 37});
        }
    }
    return channel;
}

std::vector<HwStatsChannel> channelsAt(std::int64_t time, std::int64_t generation = 0) {
    std::vector<HwStatsChannel> channels;
    for (std::int64_t number = 0; number < kChannels; ++number) {
        channels.push_back(channelAt(number, time, generation));
    }
    return channels;
}

struct BenchChannels final : HwStatsChannels {};
struct BenchSubscription final : HwStatsSubscription {};
struct BenchSamples final : HwStatsSamples {
    explicit BenchSamples(std::vector<HwStatsChannel> sampled) : channels(std::move(sampled)) {}
    std::vector<HwStatsChannel> channels;
};

/// One driver, whose samplings were made before the clock runs; its differences are worked out as a library would.
class BenchHwStats final : public platform::HwStats {
public:
    std::shared_ptr<const BenchSamples> samples = std::make_shared<BenchSamples>(channelsAt(1));

    HwStatsAnswer<HwStatsChannels> copyChannelsInGroup(std::optional<std::string_view> group,
                                                       std::optional<std::string_view>) override {
        return {group == "Rx" ? std::make_shared<BenchChannels>() : nullptr, std::nullopt};
    }
    std::int32_t channelCount(const HwStatsChannels&) override { return kChannels; }
    SubscriptionAnswer createSubscription(const HwStatsChannels&) override {
        return {std::make_shared<BenchSubscription>(), std::make_shared<BenchChannels>(), std::nullopt};
    }
    HwStatsAnswer<HwStatsSamples> createSamples(const HwStatsSubscription&, const HwStatsChannels&) override {
        return {samples, std::nullopt};
    }
    HwStatsAnswer<HwStatsSamples> createSamplesDelta(const HwStatsSamples* previous,
                                                     const HwStatsSamples& current) override {
        const auto& before = static_cast<const BenchSamples&>(*previous).channels;
        auto difference = std::make_shared<BenchSamples>(static_cast<const BenchSamples&>(current).channels);
        for (std::size_t i = 0; i < before.size(); ++i) {
            subtract(difference->channels[i], before[i]);
        }
        return {std::move(difference), std::nullopt};
    }
    void iterate(const HwStatsSamples& walked, platform::UniqueFunction<int(const HwStatsChannel&)> use) override {
        for (const HwStatsChannel& channel : static_cast<const BenchSamples&>(walked).channels) {
            if (use(channel) != 0) {
                return;
            }
        }
    }

private:
    static void subtract(HwStatsChannel& channel, const HwStatsChannel& before) {
        channel.simpleValue -= before.simpleValue;
        for (std::size_t i = 0; i < channel.buckets.size(); ++i) {
            channel.buckets[i].hits -= before.buckets[i].hits;
        }
        for (std::size_t i = 0; i < channel.states.size(); ++i) {
            channel.states[i].inTransitions -= before.states[i].inTransitions;
            channel.states[i].residency -= before.states[i].residency;
        }
    }
};

/// The three dictionaries' formatting alone.
void format(const std::vector<HwStatsChannel>& channels) {
    VelaReportingDriverStatistics statistics;
    for (const HwStatsChannel& channel : channels) {
        processChannel(channel, statistics);
    }
    benchmark::DoNotOptimize(statistics.simple.build());
    benchmark::DoNotOptimize(statistics.histogram.build());
    benchmark::DoNotOptimize(statistics.state.build());
}

void driverStatistics_format(benchmark::State& state) {
    setLogDestination(nullptr, platform::LogLevel::Error);
    const std::vector<HwStatsChannel> channels = channelsAt(1);
    for (auto _ : state) {
        format(channels);
    }
}

/// As at a session's first stop: no key was seen before.
void driverStatistics_formatOfNewChannels(benchmark::State& state) {
    setLogDestination(nullptr, platform::LogLevel::Error);
    std::int64_t generation = 0;
    for (auto _ : state) {
        const std::vector<HwStatsChannel> channels = channelsAt(1, ++generation);
        const double before = threadSeconds();
        format(channels);
        state.SetIterationTime(threadSeconds() - before);
    }
}

/// The peer: the same texts by the standard library's formatter, keys and dictionaries left out.
void driverStatistics_formatBySnprintf(benchmark::State& state) {
    const std::vector<HwStatsChannel> channels = channelsAt(1);
    for (auto _ : state) {
        char text[200];
        for (const HwStatsChannel& channel : channels) {
            std::string whole;
            for (const auto& bucket : channel.buckets) {
                std::snprintf(text, sizeof(text), "%lld-%lld:%lld;", static_cast<long long>(bucket.lower),
                              static_cast<long long>(bucket.upper), static_cast<long long>(bucket.hits));
                whole += text;
            }
            for (const auto& own : channel.states) {
                std::snprintf(text, sizeof(text), "name:%s,transition:%llu,residency:%llu,duty_cycle:%f;",
                              own.name.c_str(), static_cast<unsigned long long>(own.inTransitions),
                              static_cast<unsigned long long>(own.residency), own.dutyCycle);
                whole += text;
            }
            benchmark::DoNotOptimize(whole);
        }
    }
}

/// A whole stop's part: difference, formatting, and three messages through a session whose back end discards them.
void driverStatistics_differenceFormatAndSend(benchmark::State& state) {
    setLogDestination(nullptr, platform::LogLevel::Error);
    SessionBench bench;
    BenchHwStats hwStats;
    const VelaReportingDriverUtility utility(hwStats, bench.analytics);
    const std::shared_ptr<VelaReportingSession> session = bench.startedSession();
    session->setDriverSnapShot(utility.getSnapShot());
    hwStats.samples = std::make_shared<BenchSamples>(channelsAt(2));
    for (auto _ : state) {
        const double before = threadSeconds();
        utility.sendDriverLogsForSession(session);
        state.SetIterationTime(threadSeconds() - before);
    }
    session->stop();
}

BENCHMARK(driverStatistics_format)->Unit(benchmark::kMicrosecond);
BENCHMARK(driverStatistics_formatOfNewChannels)->Unit(benchmark::kMicrosecond)->UseManualTime();
BENCHMARK(driverStatistics_formatBySnprintf)->Unit(benchmark::kMicrosecond);
BENCHMARK(driverStatistics_differenceFormatAndSend)->Unit(benchmark::kMicrosecond)->UseManualTime();

} // namespace

} // namespace vela

BENCHMARK_MAIN();
