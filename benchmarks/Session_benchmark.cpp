// What `sendMessage` costs the thread that calls it: processor time (not elapsed time) and allocations for one message
// of a started session whose back end discards everything. Messages are sent in batches, so that the clock is read
// between batches only; making them is not counted.
#include "benchmarks/CountedAllocations.h"
#include "benchmarks/SessionBench.h"
#include "common/VelaReportingLogCategories.h"

#include <array>
#include <benchmark/benchmark.h>

namespace vela {

namespace {

constexpr std::size_t kBatch = 64;
constexpr benchmark::IterationCount kBatches = 4'000;

/// `make(number)` is the message sent as the `number`th.
template <class Make>
void sendMessages(benchmark::State& state, SessionBench& bench, const Make& make) {
    setLogDestination(nullptr, platform::LogLevel::Error);
    const std::shared_ptr<VelaReportingSession> session = bench.startedSession();
    std::array<Dictionary, kBatch> batch;
    std::int64_t number = 0;
    std::uint64_t allocated = 0;
    for (auto _ : state) {
        for (Dictionary& message : batch) {
            message = make(number++);
        }
        const std::uint64_t allocationsBefore = allocationsOfThisThread();
        const double before = threadSeconds();
        for (const Dictionary& message : batch) {
            session->sendMessage(message, AudioEventCategoryPlayback, AudioEventTypeState, {});
        }
        state.SetIterationTime(threadSeconds() - before);
        allocated += allocationsOfThisThread() - allocationsBefore;
    }
    const auto messages = static_cast<double>(state.iterations()) * static_cast<double>(kBatch);
    state.counters["per_message"] =
        benchmark::Counter(messages, benchmark::Counter::kIsRate | benchmark::Counter::kInvert);
    state.counters["allocations"] = static_cast<double>(allocated) / messages;
}

void sendMessage_new(benchmark::State& state) {
    SessionBench bench;
    sendMessages(state, bench, benchMessage);
}

void sendMessage_repeat(benchmark::State& state) {
    SessionBench bench;
    const Dictionary message = benchMessage(1);
    const Key time("velareporting_timestamp");
    sendMessages(state, bench, [&](std::int64_t number) { return message.setting(time, static_cast<double>(number)); });
}

// Without the part that wakes a thread: everything stays queued behind the wait for back ends.
void sendMessage_newWhileBackendsAreAwaited(benchmark::State& state) {
    SessionBench bench;
    bench.beacon.answers = false;
    sendMessages(state, bench, benchMessage);
}

BENCHMARK(sendMessage_new)->UseManualTime()->Iterations(kBatches)->Repetitions(5);
BENCHMARK(sendMessage_repeat)->UseManualTime()->Iterations(kBatches)->Repetitions(5);
BENCHMARK(sendMessage_newWhileBackendsAreAwaited)->UseManualTime()->Iterations(kBatches)->Repetitions(5);

} // namespace

} // namespace vela

BENCHMARK_MAIN();
