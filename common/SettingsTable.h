// The one table of all settings. Defaults, checks, listings, the example file and the documentation's tests are made
// from it. Immutable; the functions are pure.
#pragma once

#include "common/Settings.h"

#include <chrono>
#include <cstdint>
#include <span>
#include <string>
#include <string_view>
#include <variant>
#include <vector>

namespace vela {

enum class SettingKind : std::uint8_t { Boolean, Integer, Milliseconds, ByteSize, Choice, Path, TextList };

/// Where a setting's value goes in a Settings.
using SettingSlot = std::variant<bool*, std::uint32_t*, std::uint64_t*, std::chrono::milliseconds*, LogTarget*,
                                 platform::LogLevel*, std::string*, std::vector<std::string>*>;

struct SettingDescription {
    std::string_view section;
    std::string_view key;
    SettingKind kind;
    SettingValue standard;                 ///< the default as a file would give it
    std::int64_t least = 0;                ///< of a number, in its unit
    std::int64_t most = 0;                 ///< of a number, in its unit
    std::vector<std::string_view> choices; ///< of a choice, in the order of its enumeration; of a list's texts
    std::string_view description;          ///< one line without a full stop
    SettingSlot (*slot)(Settings& settings);

    /// "section.key".
    std::string name() const;
};

/// In the order of sections and keys that files and listings use.
std::span<const SettingDescription> settingsTable();

/// The setting of that name, or null.
const SettingDescription* findSetting(std::string_view section, std::string_view key);

/// Whether any setting has this section.
bool isSettingSection(std::string_view section);

/// Whether `section` takes keys beyond the table's: [features], whose keys are "Domain/Name".
bool isOpenSection(std::string_view section);

/// A checked value as a settings file would say it.
std::string settingText(SettingKind kind, const SettingValue& value);

/// "journal, stderr".
std::string choicesText(const SettingDescription& description);

/// "1 MiB to 1 TiB": what a number may be.
std::string rangeText(const SettingDescription& description);

/// What may stand for the setting: "a size, 1 MiB to 1 TiB", "one of journal, stderr".
std::string allowedText(const SettingDescription& description);

/// A settings file in which every setting stands as a comment, with its description and default.
std::string exampleSettingsFile();

} // namespace vela
