// The dictionary against nlohmann::ordered_json and std::map of std::variant, with one message of 12 entries: 3
// booleans, 4 integers, 3 reals, 2 strings of 24 characters. Every figure stands beside its peers' in one run.
#include "common/values/Dictionary.h"
#include "common/values/Json.h"

#include <benchmark/benchmark.h>
#include <cstdint>
#include <map>
#include <nlohmann/json.hpp>
#include <string>
#include <variant>

namespace {

using vela::Dictionary;
using vela::DictionaryBuilder;
using vela::Key;
using Json = nlohmann::ordered_json;
using Map = std::map<std::string, std::variant<bool, std::int64_t, double, std::string>>;

constexpr const char* kKeys[12] = {"session_output_running",
                                   "spatializationEnabled",
                                   "ringerstate",
                                   "msgidx",
                                   "msgcnt",
                                   "mChannelsPerFrame",
                                   "sample_rate",
                                   "NexoSessionVolume",
                                   "session_duration",
                                   "systemuptime_sec",
                                   "active_devices",
                                   "session_selected_format"};
constexpr const char* kDevices = "Speaker,BuiltInReceiver1";
constexpr const char* kFormat = "48000 Hz, 2 ch, F32 LE..";

// What differs from message to message.
struct Numbers {
    std::int64_t index;
    double uptime;
};

// Adds the twelve entries through `add(key index, value)`.
template <class Add>
void fill(const Add& add, const Numbers& numbers) {
    add(0, true);
    add(1, false);
    add(2, true);
    add(3, numbers.index);
    add(4, numbers.index + 1);
    add(5, std::int64_t{2});
    add(6, std::int64_t{48000});
    add(7, 0.4375);
    add(8, 12.75);
    add(9, numbers.uptime);
    add(10, kDevices);
    add(11, kFormat);
}

Dictionary makeWithText(const Numbers& numbers) {
    DictionaryBuilder builder;
    fill([&](int key, auto value) { builder.add(std::string_view(kKeys[key]), value); }, numbers);
    return builder.build();
}

Dictionary makeWithKeys(const Numbers& numbers) {
    static const std::vector<Key> keys(std::begin(kKeys), std::end(kKeys));
    DictionaryBuilder builder;
    fill([&](int key, auto value) { builder.add(keys[static_cast<std::size_t>(key)], value); }, numbers);
    return builder.build();
}

Json makeJson(const Numbers& numbers) {
    Json json = Json::object();
    fill([&](int key, auto value) { json[kKeys[key]] = value; }, numbers);
    return json;
}

Map makeMap(const Numbers& numbers) {
    Map map;
    fill(
        [&](int key, auto value) {
            if constexpr (std::is_same_v<decltype(value), const char*>) {
                map[kKeys[key]] = std::string(value);
            } else {
                map[kKeys[key]] = value;
            }
        },
        numbers);
    return map;
}

template <class Make>
void build(benchmark::State& state, Make make) {
    Numbers numbers{0, 1000.5};
    for (auto _ : state) {
        ++numbers.index;
        benchmark::DoNotOptimize(make(numbers));
    }
}
BENCHMARK_CAPTURE(build, dictionary_from_text_keys, makeWithText);
BENCHMARK_CAPTURE(build, dictionary_from_made_keys, makeWithKeys);
BENCHMARK_CAPTURE(build, ordered_json, makeJson);
BENCHMARK_CAPTURE(build, std_map, makeMap);

void copyWithKey_dictionary(benchmark::State& state) {
    const Dictionary message = makeWithText({1, 1000.5});
    const Key tag("audiotag");
    const vela::String text("PlaybackStart");
    for (auto _ : state) {
        benchmark::DoNotOptimize(message.setting(tag, text));
    }
}
void copyWithKey_dictionary_newString(benchmark::State& state) {
    const Dictionary message = makeWithText({1, 1000.5});
    const Key tag("audiotag");
    for (auto _ : state) {
        benchmark::DoNotOptimize(message.setting(tag, "PlaybackStart"));
    }
}
void copyWithKey_ordered_json(benchmark::State& state) {
    const Json message = makeJson({1, 1000.5});
    for (auto _ : state) {
        Json copy = message;
        copy["audiotag"] = "PlaybackStart";
        benchmark::DoNotOptimize(copy);
    }
}
void copyWithKey_std_map(benchmark::State& state) {
    const Map message = makeMap({1, 1000.5});
    for (auto _ : state) {
        Map copy = message;
        copy["audiotag"] = std::string("PlaybackStart");
        benchmark::DoNotOptimize(copy);
    }
}
BENCHMARK(copyWithKey_dictionary);
BENCHMARK(copyWithKey_dictionary_newString);
BENCHMARK(copyWithKey_ordered_json);
BENCHMARK(copyWithKey_std_map);

template <class Make>
void compareEqual(benchmark::State& state, Make make) {
    const auto left = make({1, 1000.5});
    const auto right = make({1, 1000.5});
    bool equal = true;
    for (auto _ : state) {
        benchmark::DoNotOptimize(left);
        equal = equal && left == right;
        benchmark::DoNotOptimize(equal);
    }
    if (!equal) {
        state.SkipWithError("two equal messages compare unequal");
    }
}
BENCHMARK_CAPTURE(compareEqual, dictionary, makeWithText);
BENCHMARK_CAPTURE(compareEqual, ordered_json, makeJson);
BENCHMARK_CAPTURE(compareEqual, std_map, makeMap);

void compactJson_dictionary(benchmark::State& state) {
    const Dictionary message = makeWithText({1, 1000.5});
    std::string text;
    for (auto _ : state) {
        text.clear();
        vela::appendJson(text, vela::Value(message), vela::JsonLayout::Compact);
        benchmark::DoNotOptimize(text.data());
    }
}
void compactJson_dictionary_newText(benchmark::State& state) {
    const vela::Value message = makeWithText({1, 1000.5});
    for (auto _ : state) {
        benchmark::DoNotOptimize(vela::jsonText(message));
    }
}
void compactJson_ordered_json(benchmark::State& state) {
    const Json message = makeJson({1, 1000.5});
    for (auto _ : state) {
        benchmark::DoNotOptimize(message.dump());
    }
}
BENCHMARK(compactJson_dictionary);
BENCHMARK(compactJson_dictionary_newText);
BENCHMARK(compactJson_ordered_json);

} // namespace

BENCHMARK_MAIN();
