// UTF-8 as the writers and readers of values need it. Pure functions.
#pragma once

#include <cstddef>
#include <cstdint>
#include <string>
#include <string_view>

namespace vela {

/// One step through a text that may hold anything.
struct Utf8Step {
    char32_t codePoint = 0;  ///< meaningless when the step is not valid
    std::uint32_t bytes = 0; ///< bytes to go on by: of the character, or 1 for a byte that begins none
    bool valid = false;
};

/// The character at the start of `text`, which must not be empty. Overlong forms, surrogates and what lies above
/// U+10FFFF are not valid.
Utf8Step utf8Step(std::string_view text);

bool isValidUtf8(std::string_view text);

/// How many bytes at the start of `text` are ASCII.
std::size_t asciiPrefix(std::string_view text);

/// Appends a code point below 0x110000 that is no surrogate.
void appendUtf8(std::string& text, char32_t codePoint);

} // namespace vela
