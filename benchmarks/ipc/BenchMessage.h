// The message that every peer of ipc_benchmark moves: 12 entries (3 booleans, 4 integers, 3 reals, 2 strings of 24
// characters), each number's own, and the plain map that the echoes decode it into. Pure functions.
#pragma once

#include <cstdint>
#include <cstdio>
#include <map>
#include <string>
#include <string_view>
#include <variant>

namespace vela::ipcbench {

using PlainValue = std::variant<bool, std::int64_t, double, std::string>;
using PlainMap = std::map<std::string, PlainValue>;

inline constexpr std::size_t kEntries = 12;
inline constexpr std::uint32_t kCategory = 4;
inline constexpr std::uint16_t kType = 1;

/// Calls `add(key, value)` for each entry; a value is a bool, an std::int64_t, a double or an std::string_view.
template <class Add>
void forEachEntry(std::int64_t number, const Add& add) {
    char devices[40];
    std::snprintf(devices, sizeof(devices), "Speaker,Receiver%08lld", static_cast<long long>(number));
    add("session_output_running", number / 100 % 2 == 0);
    add("spatializationEnabled", false);
    add("muted", number % 2 == 0);
    add("underruns", number);
    add("frames", number * 512);
    add("mChannelsPerFrame", std::int64_t{2});
    add("sample_rate", std::int64_t{48'000});
    add("NexoSessionVolume", static_cast<double>(number / 50 % 16) / 16);
    add("load", static_cast<double>(number) / 1024);
    add("velareporting_timestamp", 1.7e9 + static_cast<double>(number));
    add("route", std::string_view(devices));
    add("session_selected_format", std::string_view("48000 Hz, 2 ch, F32 LE.."));
}

/// So that no decoding is left out: what a decoded message must answer.
inline bool isWhole(const PlainMap& message) {
    return message.size() == kEntries && !std::get<bool>(message.at("spatializationEnabled")) &&
           std::get<std::string>(message.at("session_selected_format")).size() == 24;
}

} // namespace vela::ipcbench
