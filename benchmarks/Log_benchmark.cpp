// What a log line costs: a disabled one against a loop without it, an enabled one against snprintf of the same line.
#include "common/VelaReportingLogCategories.h"

#include <benchmark/benchmark.h>
#include <cinttypes>
#include <cstdint>
#include <cstdio>

namespace vela {

namespace {

class DiscardingSink final : public platform::LogSink {
public:
    void write(const platform::LogRecord& record) override { benchmark::DoNotOptimize(record.text.data()); }
    std::uint64_t lost() const override { return 0; }
};

void emptyLoop(benchmark::State& state) {
    std::int64_t reporterID = 0x7FFFFFFF;
    for (auto _ : state) {
        benchmark::DoNotOptimize(reporterID);
    }
}
BENCHMARK(emptyLoop);

void disabledLine(benchmark::State& state) {
    DiscardingSink sink;
    setLogDestination(&sink, platform::LogLevel::Error);
    std::int64_t reporterID = 0x7FFFFFFF;
    for (auto _ : state) {
        benchmark::DoNotOptimize(reporterID);
        VelaReportingSessionCategory().debug("sending message for session owned by %lli", reporterID);
    }
    setLogDestination(nullptr, platform::LogLevel::Error);
}
BENCHMARK(disabledLine);

void disabledLineOfAHeldCategory(benchmark::State& state) {
    DiscardingSink sink;
    setLogDestination(&sink, platform::LogLevel::Error);
    const LogCategory& category = VelaReportingSessionCategory();
    std::int64_t reporterID = 0x7FFFFFFF;
    for (auto _ : state) {
        benchmark::DoNotOptimize(reporterID);
        category.debug("sending message for session owned by %lli", reporterID);
    }
    setLogDestination(nullptr, platform::LogLevel::Error);
}
BENCHMARK(disabledLineOfAHeldCategory);

void enabledLine(benchmark::State& state) {
    DiscardingSink sink;
    setLogDestination(&sink, platform::LogLevel::Debug);
    std::int64_t reporterID = 0x7FFFFFFF;
    for (auto _ : state) {
        benchmark::DoNotOptimize(reporterID);
        VelaReportingSessionCategory().debug("sending message for session owned by %lli", reporterID);
    }
    setLogDestination(nullptr, platform::LogLevel::Error);
}
BENCHMARK(enabledLine);

void enabledLineWithTextFromOutside(benchmark::State& state) {
    DiscardingSink sink;
    setLogDestination(&sink, platform::LogLevel::Debug);
    const std::string name = "com.example.application.with.a.long.name";
    for (auto _ : state) {
        VelaReportingSessionCategory().debug("connection exited process=%@ uptime_sec=%d", name, 1234);
    }
    setLogDestination(nullptr, platform::LogLevel::Error);
}
BENCHMARK(enabledLineWithTextFromOutside);

void snprintfOfTheLine(benchmark::State& state) {
    std::int64_t reporterID = 0x7FFFFFFF;
    for (auto _ : state) {
        benchmark::DoNotOptimize(reporterID);
        char line[512];
        static_cast<void>(std::snprintf(line, sizeof(line), "%25s:%-5d sending message for session owned by %" PRIi64,
                                        "Log_benchmark", __LINE__, reporterID));
        benchmark::DoNotOptimize(line);
    }
}
BENCHMARK(snprintfOfTheLine);

} // namespace

} // namespace vela

BENCHMARK_MAIN();
