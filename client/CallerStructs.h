// Structs of the C API, which begin with the size that their user knows them by. Pure functions.
#pragma once

#include "client/include/vela/reporting.h"
#include "common/values/Utf8.h"

#include <algorithm>
#include <cstddef>
#include <cstring>
#include <span>
#include <string>
#include <string_view>

namespace vela::client {

/// Copies as much of a struct as its user has, whose `size` stays.
template <class Struct>
void copyOut(const Struct& from, Struct* to) {
    constexpr std::size_t kAfterSize = sizeof(std::size_t);
    if (to->size > kAfterSize) {
        const std::size_t bytes = std::min(to->size, sizeof(Struct)) - kAfterSize;
        std::memcpy(reinterpret_cast<char*>(to) + kAfterSize, reinterpret_cast<const char*>(&from) + kAfterSize, bytes);
    }
}

/// Reads a struct as far as its user has it; the rest of `to`, which is clear, stays. False when it has nothing, or
/// sets members that this library does not know.
template <class Struct>
bool copyIn(const Struct* from, Struct& to) {
    if (from->size <= sizeof(from->size)) {
        return false;
    }
    const auto* bytes = reinterpret_cast<const char*>(from);
    for (std::size_t index = sizeof(Struct); index < from->size; ++index) {
        if (bytes[index] != 0) {
            return false;
        }
    }
    std::memcpy(&to, from, std::min(from->size, sizeof(Struct)));
    return true;
}

/// `text` with its NUL, cut between two characters.
inline void copyText(const std::string& text, std::span<char> to) {
    std::size_t bytes = 0;
    while (bytes < text.size()) {
        const Utf8Step step = utf8Step(std::string_view(text).substr(bytes));
        if (bytes + step.bytes >= to.size()) {
            break;
        }
        bytes += step.bytes;
    }
    std::memcpy(to.data(), text.data(), bytes);
    to[bytes] = '\0';
}

} // namespace vela::client
