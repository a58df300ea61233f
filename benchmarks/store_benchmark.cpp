// What a real-time reporting message of twelve entries costs on its way into the store: processor time of the whole
// process (sender and writer) and bytes on the disk. The processor's time is what counts; how long a commit takes is
// the disk's affair.
#include "platform/linux/LinuxClock.h"
#include "platform/sqlite/DeliveryStore.h"
#include "platform/sqlite/StoreBeacon.h"

#include <benchmark/benchmark.h>
#include <cstdint>
#include <cstdlib>
#include <ctime>
#include <filesystem>
#include <memory>
#include <string>
#include <thread>

namespace vela {

namespace {

constexpr std::int64_t kBatch = 4'096;
constexpr benchmark::IterationCount kBatches = 40;

double processSeconds() {
    timespec time{};
    clock_gettime(CLOCK_PROCESS_CPUTIME_ID, &time);
    return static_cast<double>(time.tv_sec) + 1e-9 * static_cast<double>(time.tv_nsec);
}

Dictionary benchMessage(std::int64_t number) {
    return {{"velareporting_timestamp", 1'700'000'000.25 + static_cast<double>(number)},
            {"route", "Speaker"},
            {"device_uid", "AudioDevice-0123456789"},
            {"sample_rate", 48'000.0},
            {"io_buffer_frames", 512},
            {"channels", 2},
            {"format", "lpcm float32 interleaved"},
            {"is_running", true},
            {"volume", 0.25},
            {"host_time", number * 512},
            {"overloads", number % 3},
            {"application", "com.example.player"}};
}

class BenchFolder {
public:
    BenchFolder() {
        std::string pattern = (std::filesystem::temp_directory_path() / "store-benchmark-XXXXXX").string();
        path_ = mkdtemp(pattern.data());
    }
    ~BenchFolder() { std::filesystem::remove_all(path_); }
    BenchFolder(const BenchFolder&) = delete;
    BenchFolder& operator=(const BenchFolder&) = delete;
    std::string file() const { return path_ + "/deliveries.db"; }

private:
    std::string path_;
};

/// A message that finds the queue full waits a moment: nothing is lost, so that the figures are of stored messages.
void send(platform::BeaconSession& session, const Dictionary& message) {
    while (!session.sendBeaconMessage(3, 5, message)) {
        std::this_thread::yield();
    }
}

void storeMessages(benchmark::State& state, std::uint64_t maxBytes) {
    const BenchFolder folder;
    const platform::LinuxClock clock;
    DeliveryLedger ledger(1);
    const auto entry = ledger.open(1, 42);
    platform::DeliveryStore::Options options;
    options.file = {folder.file(), maxBytes, ""};
    options.commitMessages = static_cast<std::size_t>(state.range(0));
    auto opened = platform::DeliveryStore::open(options, ledger, clock);
    if (!opened) {
        state.SkipWithError(opened.failure().description.c_str());
        return;
    }
    const std::unique_ptr<platform::DeliveryStore> store = *std::move(opened);
    platform::StoreBeacon beacon(*store, {"store"});
    const auto session = beacon.createBeaconSession({{"session_id", 42}}, {{"service_name", "benchmark"}});
    const LedgerScope scope(entry);
    std::int64_t number = 0;
    for (auto _ : state) {
        std::vector<Dictionary> messages;
        for (std::int64_t index = 0; index < kBatch; ++index) {
            messages.push_back(benchMessage(number++));
        }
        const double before = processSeconds();
        for (const Dictionary& message : messages) {
            entry->received(DeliveryBackend::Beacon);
            send(*session, message);
        }
        store->commitAll();
        state.SetIterationTime(processSeconds() - before);
    }
    const auto messages = static_cast<double>(number);
    state.counters["per_message"] =
        benchmark::Counter(messages, benchmark::Counter::kIsRate | benchmark::Counter::kInvert);
    store->close();
    state.counters["file_bytes_per_message"] =
        static_cast<double>(std::filesystem::file_size(folder.file())) / messages;
    state.counters["evicted"] = static_cast<double>(store->status().evicted);
}

void store_unbounded(benchmark::State& state) { storeMessages(state, std::uint64_t{1} << 30U); }
/// The bound is reached early, so that every group evicts as much as it stores.
void store_atTheBound(benchmark::State& state) { storeMessages(state, std::uint64_t{8} << 20U); }

BENCHMARK(store_unbounded)->Arg(64)->Arg(1024)->UseManualTime()->Iterations(kBatches);
BENCHMARK(store_atTheBound)->Arg(64)->Arg(1024)->UseManualTime()->Iterations(kBatches);

} // namespace

} // namespace vela

BENCHMARK_MAIN();
