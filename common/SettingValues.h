// Texts of setting values: byte sizes, quoted texts, and values as a settings file writes them. Pure functions.
#pragma once

#include "common/Settings.h"
#include "platform/Result.h"

#include <cstdint>
#include <string>
#include <string_view>

namespace vela {

/// "256 MiB", "64KiB", "4096 B", "4096": a number of bytes. 0 and what does not fit in 63 bits are refused.
platform::Result<std::int64_t> parseByteSize(std::string_view text);

/// In the largest unit that leaves a whole number: "256 MiB", "1000 B".
std::string byteSizeText(std::int64_t bytes);

/// `text` in quotation marks as a settings file reads it back. Control characters are escaped, bytes that are no UTF-8
/// become U+FFFD.
std::string quotedText(std::string_view text);

/// An outside text that must not break a line: control characters as in `quotedText`, all others as they are.
std::string escapedText(std::string_view text);

/// `value` as a settings file would say it, for messages: texts of more than 80 bytes and lists of more than 8 texts
/// are shortened.
std::string shownValue(const SettingValue& value);

/// `value` as a settings file would say it, in full.
std::string valueText(const SettingValue& value);

} // namespace vela
