// What emitting a trace event costs: while nobody collects, beside an empty call (at most 5 ns); into a ring (at most
// 100 ns); and into the kernel's buffer, beside a bare write of the same bytes (at most 1.3 times as long). Through the
// library, in the same run. The library keeps to the first service that it finds, so each way has a process of its own:
// trace_emission_benchmark measures rings, and with --ftrace first, the kernel's buffer where this process may open it.
#include "client/include/vela/trace.h"
#include "platform/linux/LinuxClock.h"
#include "platform/linux/LinuxWorkQueues.h"
#include "platform/spoor/FtracePage.h"
#include "platform/spoor/LinuxSpoor.h"
#include "platform/spoor/TraceRing.h"

#include <algorithm>
#include <benchmark/benchmark.h>
#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <fcntl.h>
#include <filesystem>
#include <iostream>
#include <memory>
#include <string>
#include <string_view>
#include <unistd.h>
#include <vector>

namespace {

using namespace vela;

constexpr std::uint32_t kCode = 0x21040100;
const char* const kInstance = "vela-benchmark";

/// A service with a session that collects and drops. One for the process.
class Service {
public:
    explicit Service(bool usesFtrace) {
        const char* const parent = std::filesystem::exists("/dev/shm") ? "/dev/shm" : "/tmp";
        folder_ = std::string(parent) + "/vela-benchmark-XXXXXX";
        if (mkdtemp(folder_.data()) == nullptr) {
            std::abort();
        }
        setenv("VELA_RUNTIME", folder_.c_str(), 1); // NOLINT(concurrency-mt-unsafe): there is no thread yet
        platform::LinuxSpoorOptions options;
        options.runtimeFolder = folder_;
        options.instanceName = kInstance;
        if (!usesFtrace) {
            options.traceFolders.clear();
        }
        queues_ = std::make_unique<platform::LinuxWorkQueues>();
        queue_ = queues_->makeSerialQueue("trace.benchmark", platform::QualityOfService::Default);
        spoor_ = std::make_unique<platform::LinuxSpoor>(options, clock_);
    }
    ~Service() {
        end();
        spoor_.reset();
        std::filesystem::remove_all(folder_);
    }
    Service(const Service&) = delete;
    Service& operator=(const Service&) = delete;

    void start() {
        session_ = spoor_->createSession();
        session_->eventsRange(kCode, kCode, [this](const platform::SpoorEvent&) { ++collected_; });
        if (session_->start(*queue_) != 0) {
            std::abort();
        }
    }
    void end() { session_.reset(); }
    std::uint64_t collected() const { return collected_; }
    bool usesFtrace() { return spoor_->usesFtrace(); }
    const std::string& folder() const { return folder_; }

private:
    std::string folder_;
    const platform::LinuxClock clock_;
    std::unique_ptr<platform::LinuxWorkQueues> queues_;
    std::unique_ptr<platform::SerialQueue> queue_;
    std::unique_ptr<platform::LinuxSpoor> spoor_;
    std::unique_ptr<platform::SpoorSession> session_;
    std::uint64_t collected_ = 0;
};

Service* service = nullptr;

[[gnu::noinline]] void emptyCall(std::uint32_t code, std::uint64_t argument) {
    benchmark::DoNotOptimize(code);
    benchmark::DoNotOptimize(argument);
}

void emission_emptyCall(benchmark::State& state) {
    std::uint64_t number = 0;
    for (auto _ : state) {
        emptyCall(kCode, ++number);
    }
}

void emission_idle(benchmark::State& state) {
    VelaReportingTracePrepareThread();
    std::uint64_t number = 0;
    for (auto _ : state) {
        vela_trace_emit(kCode, ++number);
        benchmark::ClobberMemory();
    }
}

void emission_idleOfTheService(benchmark::State& state) {
    platform::spoor::TraceEmitter emitter({{service->folder(), true}});
    emitter.prepareThread();
    std::uint64_t number = 0;
    for (auto _ : state) {
        emitter.emit(kCode, {++number, 0, 0, 0});
        benchmark::ClobberMemory();
    }
}

/// A code that nobody asked for, while others are collected.
void emission_otherCode(benchmark::State& state) {
    service->start();
    for (auto _ : state) {
        vela_trace_emit(kCode + 1, 1);
        benchmark::ClobberMemory();
    }
    service->end();
}

void emission_active(benchmark::State& state) {
    service->start();
    std::uint64_t number = 0;
    for (auto _ : state) {
        vela_trace_emit(kCode, ++number, 2, 3, 4);
        benchmark::ClobberMemory();
    }
    service->end();
}

/// The ring alone, without a reader beside it.
void emission_ringAlone(benchmark::State& state) {
    auto ring = platform::spoor::TraceRing::create(service->folder() + "/trace/rings");
    if (!ring) {
        state.SkipWithError("no ring");
        return;
    }
    (*ring)->adopt();
    std::uint64_t number = 0;
    for (auto _ : state) {
        (*ring)->write(platform::spoor::traceNow(), kCode, {++number, 2, 3, 4});
    }
    (*ring)->remove();
}

void emission_clockAlone(benchmark::State& state) {
    for (auto _ : state) {
        benchmark::DoNotOptimize(platform::spoor::traceNow());
    }
}

/// The same bytes into the same file, and nothing else.
void emission_bareWrite(benchmark::State& state) {
    service->start();
    const std::string path = std::string("/sys/kernel/tracing/instances/") + kInstance + "-s0/trace_marker_raw";
    const int file = open(path.c_str(), O_WRONLY | O_CLOEXEC);
    if (file < 0) {
        state.SkipWithError("the marker file cannot be opened");
        service->end();
        return;
    }
    platform::spoor::MarkerEvent event{kCode, 4, {0, 2, 3, 4}};
    for (auto _ : state) {
        ++event.arguments[0];
        benchmark::DoNotOptimize(event);
        if (write(file, &event, sizeof(event)) != static_cast<ssize_t>(sizeof(event))) {
            state.SkipWithError("a write failed");
            break;
        }
    }
    close(file);
    service->end();
}

} // namespace

int main(int argumentCount, char** arguments) {
    const bool usesFtrace = argumentCount > 1 && std::string_view(arguments[1]) == "--ftrace";
    if (usesFtrace) {
        std::rotate(arguments + 1, arguments + 2, arguments + argumentCount);
        --argumentCount;
    }
    Service own(usesFtrace);
    service = &own;
    benchmark::Initialize(&argumentCount, arguments);
    if (usesFtrace) {
        own.start();
        const bool isThere = own.usesFtrace();
        own.end();
        if (!isThere) {
            std::cerr << "the kernel's trace buffer cannot be opened\n";
            return EXIT_FAILURE;
        }
        benchmark::RegisterBenchmark("emission_bareWrite", emission_bareWrite);
        benchmark::RegisterBenchmark("emission_activeInKernel", emission_active);
    } else {
        benchmark::RegisterBenchmark("emission_emptyCall", emission_emptyCall);
        benchmark::RegisterBenchmark("emission_idle", emission_idle);
        benchmark::RegisterBenchmark("emission_idleOfTheService", emission_idleOfTheService);
        benchmark::RegisterBenchmark("emission_otherCode", emission_otherCode);
        benchmark::RegisterBenchmark("emission_clockAlone", emission_clockAlone);
        benchmark::RegisterBenchmark("emission_ringAlone", emission_ringAlone);
        benchmark::RegisterBenchmark("emission_activeInRing", emission_active);
    }
    benchmark::RunSpecifiedBenchmarks();
    benchmark::Shutdown();
    return EXIT_SUCCESS;
}
