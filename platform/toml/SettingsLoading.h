// From what the command line says to the settings in force: finds the settings file, reads it, puts the single settings
// on top. Shared by all programs, so that they agree. Pure apart from reading files.
#pragma once

#include "common/Settings.h"
#include "platform/FileSystem.h"

#include <optional>
#include <string>
#include <vector>

namespace vela::platform {

/// Read when it is there and no other file is named.
constexpr const char* kSettingsFile = "/etc/vela/vela-reporting.toml";

struct SettingsRequest {
    std::optional<std::string> file;  ///< of `--settings`; it must exist
    std::vector<std::string> options; ///< of each `--set`, in order
    SettingsEnvironment environment;
};

struct LoadedSettings {
    SettingsReading reading;
    std::optional<std::string> file; ///< that was read
};

/// `standardFile` stands for kSettingsFile in tests.
LoadedSettings loadSettings(const SettingsRequest& request, const FileSystem& files,
                            const std::string& standardFile = kSettingsFile);

} // namespace vela::platform
