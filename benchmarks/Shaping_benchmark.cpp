// What shaping costs at the end of a session, for sessions of different lengths: the time for one message should not
// grow with their number.
#include "common/VelaReportingLogCategories.h"
#include "shaping/RapidMessages.h"
#include "shaping/VolumeMessages.h"

#include <array>
#include <benchmark/benchmark.h>
#include <cstdint>
#include <string>
#include <vector>

namespace vela {

namespace {

/// A session of mixed messages. One of ten starts or stops output or changes the volume, one of ten is a spatial
/// setting, half of these in bursts.
std::vector<StoredMessage> mixedSession(std::size_t size) {
    std::vector<StoredMessage> messages;
    messages.reserve(size);
    double time = 1.7e9;
    for (std::uint32_t index = 0; messages.size() < size; ++index) {
        time += index % 20 == 14 ? 0.25 : 1.0;
        DictionaryBuilder message;
        message.add("velareporting_timestamp", time);
        message.add("systemuptime_sec", time - 1.6e9);
        message.add("processuptime_ms", index);
        message.add("audiotag", "PlaybackStart");
        switch (index % 20) {
        case 0:
            message.add("session_output_running", index % 100 != 80);
            break;
        case 10:
            message.add("NexoSessionVolume", static_cast<double>(index % 160) / 160);
            break;
        case 13:
        case 14:
            message.add("spatializationEnabled", index % 3 == 0);
            message.add("spatial-audio-accessory-feature", 1);
            break;
        case 5:
        case 15:
            message.add("session_selected_format", "48000 Hz, 2 ch, F32 LE");
            message.add("active_devices", "Speaker,BuiltInReceiver1");
            message.add("mChannelsPerFrame", 2);
            break;
        default:
            message.add("underruns", index % 7);
            message.add("sample_rate", 48000);
            message.add("buffer_frames", 512);
            message.add("route", "Speaker");
            break;
        }
        messages.push_back({index % 20, index / 20, message.build()});
    }
    return messages;
}

/// A session whose messages are all spatial settings, `pause` seconds apart, of two kinds.
std::vector<StoredMessage> spatialSession(std::size_t size, double pause) {
    std::vector<StoredMessage> messages;
    messages.reserve(size);
    for (std::uint32_t index = 0; index < size; ++index) {
        DictionaryBuilder message;
        message.add("velareporting_timestamp", 1.7e9 + index * pause);
        message.add(index % 2 == 0 ? "spatializationEnabled" : "spatial-audio-accessory-feature", true);
        message.add("audiotag", "PlaybackState");
        messages.push_back({0, index, message.build()});
    }
    return messages;
}

/// A session in which every message changes the volume.
std::vector<StoredMessage> changingSession(std::size_t size) {
    std::vector<StoredMessage> messages;
    messages.reserve(size);
    for (std::uint32_t index = 0; index < size; ++index) {
        DictionaryBuilder message;
        message.add("velareporting_timestamp", 1.7e9 + index);
        message.add("session_output_running", true);
        message.add("NexoSessionVolume", static_cast<double>(index % 16) / 16);
        messages.push_back({0, index, message.build()});
    }
    return messages;
}

void run(benchmark::State& state, const std::vector<StoredMessage>& messages) {
    setLogDestination(nullptr, platform::LogLevel::Error);
    std::size_t made = 0;
    for (auto _ : state) {
        std::vector<Dictionary> output = createVolumeMessages(messages, "com.example.player", 0.5);
        made = output.size();
        benchmark::DoNotOptimize(output.data());
    }
    state.counters["made"] = static_cast<double>(made);
    state.counters["per_message"] =
        benchmark::Counter(static_cast<double>(messages.size()),
                           benchmark::Counter::kIsIterationInvariantRate | benchmark::Counter::kInvert);
}

void volumeMessages_mixed(benchmark::State& state) {
    run(state, mixedSession(static_cast<std::size_t>(state.range(0))));
}
void volumeMessages_everyOneChanges(benchmark::State& state) {
    run(state, changingSession(static_cast<std::size_t>(state.range(0))));
}
void volumeMessages_oneBurst(benchmark::State& state) {
    run(state, spatialSession(static_cast<std::size_t>(state.range(0)), 0.5));
}
void volumeMessages_burstsOfOne(benchmark::State& state) {
    run(state, spatialSession(static_cast<std::size_t>(state.range(0)), 3.0));
}

constexpr std::int64_t kShort = 10'000;
constexpr std::int64_t kLong = 1'000'000;
BENCHMARK(volumeMessages_mixed)->RangeMultiplier(10)->Range(kShort, kLong)->Unit(benchmark::kMillisecond);
BENCHMARK(volumeMessages_everyOneChanges)->RangeMultiplier(10)->Range(kShort, kLong)->Unit(benchmark::kMillisecond);
BENCHMARK(volumeMessages_oneBurst)->RangeMultiplier(10)->Range(kShort, kLong)->Unit(benchmark::kMillisecond);
BENCHMARK(volumeMessages_burstsOfOne)->RangeMultiplier(10)->Range(kShort, kLong)->Unit(benchmark::kMillisecond);

} // namespace

} // namespace vela

BENCHMARK_MAIN();
