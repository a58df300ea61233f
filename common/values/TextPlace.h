// Places in texts, for the error messages of readers. Pure functions.
#pragma once

#include <cstddef>
#include <optional>
#include <string_view>

namespace vela {

/// A place in a text as an editor shows it: both count from 1, columns in characters. Lines end with CR, LF or both.
struct TextPlace {
    std::size_t line = 1;
    std::size_t column = 1;
};
TextPlace textPlaceAt(std::string_view text, std::size_t offset);

/// Where `text` stops being UTF-8; none when all of it is.
std::optional<std::size_t> firstInvalidUtf8(std::string_view text);

} // namespace vela
