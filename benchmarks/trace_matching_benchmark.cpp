// What it costs to match the events of a trace: events per second on one thread for 1 and for 1,000 intervals, by
// thread and process-wide (at least 20 million each). Eight threads of one process emit; every event is a begin or an
// end. "alone" walks once for each interval, as a comparison.
#include "common/VelaReportingLogCategories.h"
#include "tracing/Trace.h"

#include <array>
#include <benchmark/benchmark.h>
#include <cstdint>
#include <random>
#include <string>
#include <vector>

namespace vela {

namespace {

constexpr std::uint32_t kFirstCode = 0x21040000;
constexpr std::size_t kEvents = 2'000'000;

/// Times are nanoseconds already, as those of the system's sessions are.
class NanosecondSession final : public platform::SpoorSession {
public:
    void setCompletionHandler(platform::UniqueFunction<void()>) override {}
    void setWallTimesEnabled(bool) override {}
    int eventsRange(std::uint32_t, std::uint32_t, platform::UniqueFunction<void(const trace_point&)>) override {
        return 0;
    }
    int start(platform::SerialQueue&) override { return 0; }
    int end() override { return 0; }
    std::uint64_t lostEvents() const override { return 0; }
    std::uint64_t nanoseconds(std::uint64_t timestamp) const override { return timestamp; }
};

/// Threads take turns at random; each begins an interval and ends it with its next event.
std::vector<trace_point> makeEvents(std::uint32_t intervals, std::uint32_t seed = 1) {
    constexpr std::uint32_t kThreads = 8;
    std::mt19937 random(seed);
    std::array<std::uint32_t, kThreads> open{};
    std::vector<trace_point> events(kEvents);
    for (std::size_t i = 0; i < kEvents; ++i) {
        const std::uint32_t thread = random() % kThreads;
        trace_point& event = events[i];
        event.timestamp = 1'000'000 + 500 * i;
        event.threadID = 4'000 + thread;
        if (open[thread] == 0) {
            open[thread] = 1 + static_cast<std::uint32_t>(random() % intervals);
            event.eventCode = kFirstCode + 2 * open[thread];
        } else {
            event.eventCode = kFirstCode + 2 * open[thread] + 1;
            open[thread] = 0;
        }
    }
    return events;
}

void addIntervals(Trace& trace, std::uint32_t intervals, bool byThread) {
    for (std::uint32_t i = 1; i <= intervals; ++i) {
        trace.addTraceDataToCollect(std::make_unique<TraceInterval>("interval " + std::to_string(i), kFirstCode + 2 * i,
                                                                    kFirstCode + 2 * i + 1, byThread));
    }
}

void run(benchmark::State& state, bool byThread, bool together, std::size_t events) {
    setLogDestination(nullptr, platform::LogLevel::Error);
    const auto intervals = static_cast<std::uint32_t>(state.range(0));
    const std::vector<trace_point> points = makeEvents(intervals);
    const NanosecondSession session;
    std::uint64_t pairs = 0;
    for (auto _ : state) {
        Trace trace("trace", true);
        addIntervals(trace, intervals, byThread);
        if (together) {
            trace.processTracepoints(session, {points.data(), events});
        } else {
            for (const auto& interval : trace.intervals()) {
                interval->processTracepoints(session, {points.data(), events});
            }
        }
        pairs = 0;
        for (const auto& interval : trace.intervals()) {
            pairs += interval->getNumTimesTraced();
        }
        benchmark::DoNotOptimize(pairs);
    }
    state.counters["pairs"] = static_cast<double>(pairs);
    state.SetItemsProcessed(state.iterations() * static_cast<std::int64_t>(events));
}

void matching_byThread(benchmark::State& state) { run(state, true, true, kEvents); }
void matching_processWide(benchmark::State& state) { run(state, false, true, kEvents); }
void matching_byThread_alone(benchmark::State& state) { run(state, true, false, kEvents / 20); }
void matching_processWide_alone(benchmark::State& state) { run(state, false, false, kEvents / 20); }

BENCHMARK(matching_byThread)->Arg(1)->Arg(1'000)->Unit(benchmark::kMillisecond);
BENCHMARK(matching_processWide)->Arg(1)->Arg(1'000)->Unit(benchmark::kMillisecond);
BENCHMARK(matching_byThread_alone)->Arg(1)->Arg(1'000)->Unit(benchmark::kMillisecond);
BENCHMARK(matching_processWide_alone)->Arg(1)->Arg(1'000)->Unit(benchmark::kMillisecond);

} // namespace

} // namespace vela

BENCHMARK_MAIN();
