// What the tests of this folder share: short ways to write messages and to show them.
#pragma once

#include "common/values/Dictionary.h"
#include "common/values/TextualForm.h"
#include "shaping/StoredMessage.h"

#include <cstdint>
#include <initializer_list>
#include <ostream>
#include <string>
#include <vector>

namespace vela {

// NOLINTNEXTLINE(readability-identifier-naming): the test framework looks for this name
inline void PrintTo(const Dictionary& dictionary, std::ostream* stream) { *stream << textualForm(Value(dictionary)); }
// NOLINTNEXTLINE(readability-identifier-naming)
inline void PrintTo(const Value& value, std::ostream* stream) { *stream << textualForm(value); }

/// The messages as a session keeps them. Kinds and counts are numbers that nobody should look at.
inline std::vector<StoredMessage> storedMessages(const std::vector<Dictionary>& messages) {
    std::vector<StoredMessage> list;
    std::uint32_t number = 0;
    for (const Dictionary& message : messages) {
        ++number;
        list.push_back({number * 7 % 5, number, message});
    }
    return list;
}

/// A message of this time, in epoch seconds, which stands first in it.
inline Dictionary messageAt(double time, std::initializer_list<Dictionary::Initial> entries) {
    DictionaryBuilder message;
    message.add("velareporting_timestamp", time);
    for (const Dictionary::Initial& entry : entries) {
        message.add(entry.key, entry.value);
    }
    return message.build();
}

inline std::vector<std::string> keysOf(const Dictionary& dictionary) {
    std::vector<std::string> keys;
    for (const auto& entry : dictionary) {
        keys.emplace_back(entry.key.text());
    }
    return keys;
}

/// The "play_seconds" of volume messages.
inline std::vector<double> playSecondsOf(const std::vector<Dictionary>& volumeMessages) {
    std::vector<double> seconds;
    for (const Dictionary& message : volumeMessages) {
        seconds.push_back(message.find("play_seconds").doubleValue(-1));
    }
    return seconds;
}

} // namespace vela
