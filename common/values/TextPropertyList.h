// Reader of the old text form of property lists: `{ key = value; }`, `( a, b )`, `<0fbd77 71>`, plain and quoted
// strings, comments. Every leaf is a string or data. `textualForm` writes this form. Pure functions.
//
// Strict where readers of this form differ: an entry needs its ";", a key may stand once, an unknown escape, a lone
// surrogate, an octal escape above \377 or without a character in the NextStep set is refused, and so is whatever
// follows the value. Entries without braces around the whole text (a "strings file") are a dictionary. The text is
// UTF-8.
#pragma once

#include "common/values/Dictionary.h"

#include <cstddef>
#include <string>
#include <string_view>
#include <variant>

namespace vela {

/// What the reader takes before it refuses the text.
struct TextPropertyListLimits {
    std::size_t bytes = 256 * 1024; ///< length of the text
    std::size_t depth = 128;        ///< containers inside each other; the reader needs stack for so many calls
    std::size_t values = 65536;     ///< values in all; keys do not count
};

/// Why a text was refused, and where (see `TextPlace`).
struct TextPropertyListError {
    std::size_t line = 1;
    std::size_t column = 1;
    std::string reason;
};

/// The value that `text` says, or what is wrong with it. Takes linear time.
std::variant<Value, TextPropertyListError> readTextPropertyList(std::string_view text,
                                                                const TextPropertyListLimits& limits = {});

} // namespace vela
