// Settings out of TOML text, and out of the command line's `section.key=value`. Outside bytes: everything is bounded
// and nothing throws. Pure functions.
#pragma once

#include "common/Settings.h"
#include "platform/Result.h"

#include <cstddef>
#include <string>
#include <string_view>
#include <vector>

namespace vela::platform {

/// Longest text that is read.
constexpr std::size_t kTomlBytes = std::size_t{1024} * 1024;

struct TomlReading {
    std::vector<RawSetting> settings; ///< in the order of the text
    std::vector<SettingError> errors; ///< with line and column
};

/// Reads what `file` holds. Text that is no TOML gives one error and no settings; a value of a kind that no setting has
/// (a date, a table, a mixed list) gives an error each, beside the settings that could be read.
TomlReading readTomlSettings(std::string_view text, const std::string& file);

/// `section.key=value`, where the value is TOML or, when it is none that a setting can have, taken as plain text. A key
/// may stand in quotation marks.
Result<RawSetting> readSettingOption(std::string_view option);

} // namespace vela::platform
