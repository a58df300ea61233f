// JSON text of values: one line, or two spaces of indentation.
//
// Strings are UTF-8 with the fewest escapes (invalid bytes become U+FFFD); a real always shows that it is one ("1.0"),
// in its shortest digits; data is base64; a date is ISO 8601 UTC text; what JSON cannot say (not a number, an infinity,
// none, an invalid date) is null. Keys stand in the dictionary's order.
#pragma once

#include "common/values/Value.h"

#include <cstdint>
#include <string>

namespace vela {

enum class JsonLayout : std::uint8_t {
    Compact, ///< one line without spaces
    Pretty,  ///< two spaces of indentation, one value a line
};

std::string jsonText(ValueRef value, JsonLayout layout = JsonLayout::Compact);
/// `depth`: how many containers the value stands in, for the indentation of the pretty layout.
void appendJson(std::string& text, ValueRef value, JsonLayout layout = JsonLayout::Compact, std::size_t depth = 0);

/// The dictionary's values without their keys, in order, as a JSON array on one line.
void appendJsonValues(std::string& text, const Dictionary& dictionary);

/// `text` as a JSON string, quotation marks included.
void appendJsonString(std::string& json, std::string_view text);

} // namespace vela
