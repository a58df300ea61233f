// Memory of a million stored messages whose keys repeat and whose numbers and strings are each message's own: resident
// bytes each, everything in (values, strings, allocator). Prints one line; beside it the same for std::map of
// std::variant.
#include "common/values/Dictionary.h"

#include <cstdint>
#include <cstdio>
#include <map>
#include <string>
#include <unistd.h>
#include <variant>
#include <vector>

namespace {

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

double residentBytes() {
    long pages = 0;
    std::FILE* file = std::fopen("/proc/self/statm", "re");
    if (file == nullptr || std::fscanf(file, "%*s %ld", &pages) != 1) {
        std::perror("/proc/self/statm");
        std::exit(1);
    }
    std::fclose(file);
    return static_cast<double>(pages) * static_cast<double>(sysconf(_SC_PAGESIZE));
}

// Twelve entries: 3 booleans, 4 integers, 3 reals, 2 strings of 24 characters; every number and string differs.
template <class Add>
void fill(std::int64_t number, const Add& add) {
    char text[25];
    std::snprintf(text, sizeof(text), "Speaker,Receiver%08lld", static_cast<long long>(number));
    add(0, number % 2 == 0);
    add(1, number % 3 == 0);
    add(2, number % 5 == 0);
    for (int key = 3; key < 7; ++key) {
        add(key, number * key);
    }
    for (int key = 7; key < 10; ++key) {
        add(key, static_cast<double>(number) / key);
    }
    add(10, std::string_view(text));
    text[0] = 'F';
    add(11, std::string_view(text));
}

vela::Dictionary makeDictionary(std::int64_t number) {
    vela::DictionaryBuilder builder;
    fill(number, [&builder](int key, auto value) { builder.add(kKeys[key], value); });
    return builder.build();
}

Map makeMap(std::int64_t number) {
    Map map;
    fill(number, [&map](int key, auto value) {
        if constexpr (std::is_same_v<decltype(value), std::string_view>) {
            map[kKeys[key]] = std::string(value);
        } else {
            map[kKeys[key]] = value;
        }
    });
    return map;
}

template <class Message>
double bytesPerMessage(std::int64_t count, Message (*make)(std::int64_t)) {
    const double before = residentBytes();
    std::vector<Message> messages;
    messages.reserve(static_cast<std::size_t>(count));
    for (std::int64_t number = 0; number < count; ++number) {
        messages.push_back(make(number));
    }
    return (residentBytes() - before) / static_cast<double>(count);
}

} // namespace

int main() {
    constexpr std::int64_t kMessages = 1'000'000;
    const double dictionary = bytesPerMessage(kMessages, makeDictionary);
    const double map = bytesPerMessage(kMessages / 10, makeMap);
    std::printf(
        "bytes per stored message of 12 entries, all in: dictionary %.0f, std::map of std::variant %.0f (%.1f times)\n",
        dictionary, map, map / dictionary);
    return 0;
}
