// Leaves of XML property lists, read to the letter: white space around them is not taken. Pure functions.
#pragma once

#include "common/values/Value.h"

#include <optional>
#include <string>
#include <string_view>

namespace vela::platform::plist {

/// Decimal or "0x" hexadecimal digits with an optional sign, within 64 bits signed or unsigned. A decimal number begins
/// with no zero: readers differ on whether it would be octal.
std::optional<Value> parseInteger(std::string_view text);

/// A decimal number within a double's range, or "nan", "inf", "infinity" in any case; an optional sign.
std::optional<double> parseReal(std::string_view text);

/// "2026-11-21T02:43:25Z", a day of the calendar from the year 1 on.
std::optional<Date> parseDate(std::string_view text);

/// Base64 with its padding; white space may stand anywhere in it.
std::optional<std::string> parseBase64(std::string_view text);

} // namespace vela::platform::plist
