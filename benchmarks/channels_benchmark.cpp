// What channels cost: an update of each format on the publisher's side (a counter at most 20 ns, a histogram at most
// 40 ns, through the C functions), and processor time for a sampling of 1,000 channels of one driver, a third of each
// format, histograms of 32 buckets and 8 states each (at most 2 ms), its difference and its handing out.
#include "client/include/vela/channels.h"
#include "platform/hwstats/LinuxHwStats.h"
#include "platform/linux/LinuxClock.h"

#include <benchmark/benchmark.h>
#include <cstdint>
#include <cstdlib>
#include <filesystem>
#include <string>
#include <vector>

namespace {

using namespace vela;

constexpr std::size_t kChannels = 1'000;
constexpr std::size_t kBuckets = 32;

/// The channels of one driver, in a folder that is gone with them. In memory where that can be.
class Driver {
public:
    Driver() {
        const char* const parent = std::filesystem::exists("/dev/shm") ? "/dev/shm" : "/tmp";
        folder_ = std::string(parent) + "/vela-benchmark-XXXXXX";
        if (mkdtemp(folder_.data()) == nullptr) {
            std::abort();
        }
        const char* const states[] = {"a", "b", "c", "d", "e", "f", "g", "h"};
        std::vector<std::int64_t> bounds;
        for (std::size_t i = 0; i <= kBuckets; ++i) {
            bounds.push_back(static_cast<std::int64_t>(i) * 125);
        }
        std::vector<std::string> names;
        names.reserve(kChannels);
        std::vector<VelaReportingChannelDefinition> definitions;
        for (std::size_t i = 0; i < kChannels; ++i) {
            const char* const name = names.emplace_back("Channel_" + std::to_string(i)).c_str();
            definitions.push_back(i % 3 == 0 ? VelaReportingCounterDefinition(name)
                                  : i % 3 == 1
                                      ? VelaReportingHistogramDefinition(name, "us", bounds.data(), bounds.size())
                                      : VelaReportingStateDefinition(name, states, std::size(states)));
        }
        VelaReportingChannelsOptions options{};
        options.size = sizeof(options);
        options.driver = "Vela Audio Driver<0x10>";
        options.group = "Rx";
        options.folder = folder_.c_str();
        if (VelaReportingChannelsCreate(&options, definitions.data(), definitions.size(), &channels_, nullptr) !=
            VelaReportingStatusOk) {
            std::abort();
        }
        update();
    }
    ~Driver() {
        VelaReportingChannelsDestroy(channels_);
        std::filesystem::remove_all(folder_);
    }
    Driver(const Driver&) = delete;
    Driver& operator=(const Driver&) = delete;

    VelaReportingChannel* channel(std::size_t index) const { return VelaReportingChannelsGet(channels_, index); }
    const std::string& folder() const { return folder_; }
    /// Every channel once.
    void update() {
        ++updates_;
        for (std::size_t i = 0; i < kChannels; ++i) {
            VelaReportingCounterAdd(channel(i), 1);
            VelaReportingHistogramRecord(channel(i), static_cast<std::int64_t>(updates_ * 37 + i) % 4'000);
            VelaReportingStateEnter(channel(i), (updates_ + i) % 8);
        }
    }

private:
    std::string folder_;
    VelaReportingChannels* channels_ = nullptr;
    std::uint64_t updates_ = 0;
};

void channels_counterAdd(benchmark::State& state) {
    const Driver driver;
    VelaReportingChannel* const channel = driver.channel(0);
    for (auto _ : state) {
        VelaReportingCounterAdd(channel, 1);
        benchmark::ClobberMemory();
    }
}

void channels_histogramRecord(benchmark::State& state) {
    const Driver driver;
    VelaReportingChannel* const channel = driver.channel(1);
    std::uint32_t value = 1;
    for (auto _ : state) {
        value = value * 1'664'525 + 1'013'904'223; // no branch can be foreseen
        VelaReportingHistogramRecord(channel, static_cast<std::int64_t>(value >> 20U));
        benchmark::ClobberMemory();
    }
}

void channels_stateEnter(benchmark::State& state) {
    const Driver driver;
    VelaReportingChannel* const channel = driver.channel(2);
    std::uint64_t time = 1;
    for (auto _ : state) {
        ++time;
        VelaReportingStateEnterAt(channel, time % 8, time);
        benchmark::ClobberMemory();
    }
}

void channels_stateEnterWithClock(benchmark::State& state) {
    const Driver driver;
    VelaReportingChannel* const channel = driver.channel(2);
    std::uint64_t next = 0;
    for (auto _ : state) {
        VelaReportingStateEnter(channel, ++next % 8);
        benchmark::ClobberMemory();
    }
}

/// A subscription to the group of one driver.
class Sampler {
public:
    explicit Sampler(const std::string& folder)
        : hwStats_({folder, "/nonexistent", {{{"Rx", {}}, {platform::HwStatsSource::Channels}}}}, clock_),
          subscription_(hwStats_.createSubscription(*hwStats_.copyChannelsInGroup("Rx", {}).thing)) {}

    std::shared_ptr<const platform::HwStatsSamples> sample() {
        return hwStats_.createSamples(*subscription_.subscription, *subscription_.subscribed).thing;
    }
    platform::LinuxHwStats& hwStats() { return hwStats_; }

private:
    const platform::LinuxClock clock_;
    platform::LinuxHwStats hwStats_;
    const platform::HwStats::SubscriptionAnswer subscription_;
};

/// The first one of a service, which reads what the channels are.
void channels_firstSampling(benchmark::State& state) {
    const Driver driver;
    for (auto _ : state) {
        Sampler sampler(driver.folder());
        benchmark::DoNotOptimize(sampler.sample());
    }
}

void channels_sampling(benchmark::State& state) {
    const Driver driver;
    Sampler sampler(driver.folder());
    for (auto _ : state) {
        benchmark::DoNotOptimize(sampler.sample());
    }
}

void channels_difference(benchmark::State& state) {
    Driver driver;
    Sampler sampler(driver.folder());
    const auto before = sampler.sample();
    driver.update();
    const auto after = sampler.sample();
    for (auto _ : state) {
        benchmark::DoNotOptimize(sampler.hwStats().createSamplesDelta(before.get(), *after));
    }
}

void channels_iterating(benchmark::State& state) {
    const Driver driver;
    Sampler sampler(driver.folder());
    const auto samples = sampler.sample();
    std::size_t channels = 0;
    for (auto _ : state) {
        sampler.hwStats().iterate(*samples, [&](const platform::HwStatsChannel& channel) {
            benchmark::DoNotOptimize(&channel);
            ++channels;
            return 0;
        });
    }
    state.counters["channels"] = static_cast<double>(channels) / static_cast<double>(state.iterations());
}

BENCHMARK(channels_counterAdd);
BENCHMARK(channels_histogramRecord);
BENCHMARK(channels_stateEnter);
BENCHMARK(channels_stateEnterWithClock);
BENCHMARK(channels_firstSampling)->Unit(benchmark::kMicrosecond);
BENCHMARK(channels_sampling)->Unit(benchmark::kMicrosecond);
BENCHMARK(channels_difference)->Unit(benchmark::kMicrosecond);
BENCHMARK(channels_iterating)->Unit(benchmark::kMicrosecond);

} // namespace

BENCHMARK_MAIN();
