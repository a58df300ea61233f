// Settings of vela-pipewire-reporter: defaults, a file, single settings of the command line; the last wins. As strict
// as the service's: an unknown key, a wrong type or an impossible value is an error. Plain data; the functions are pure
// apart from reading the file.
#pragma once

#include "common/Settings.h"
#include "platform/FileSystem.h"
#include "reporters/pipewire/NamePolicy.h"

#include <optional>
#include <span>
#include <string>
#include <vector>

namespace vela::reporter {

/// Read when it is there and no other file is named.
inline constexpr const char* kReporterSettingsFile = "/etc/vela/pipewire-reporter.toml";

struct ReporterSettings {
    std::string remote;  ///< name of the audio server's socket; empty: the server library's own choice
    std::string address; ///< of the service; empty: the client library's own choice
    std::string folder;  ///< of the channel files; empty: the client library's own choice
    NameTreatment names = NameTreatment::Report;
    std::vector<std::string> leftOutApplications; ///< shell patterns, here and below
    std::vector<std::string> leftOutRoles;
    std::vector<std::string> leftOutNodes;
    bool deviceSessions = false;
    bool statistics = true;
};

struct ReporterSettingsReading {
    std::optional<ReporterSettings> settings; ///< there exactly when there are no errors
    std::vector<SettingError> errors;
};

/// The defaults under `given`, of which a later one replaces an earlier one of the same key.
ReporterSettingsReading mergeReporterSettings(std::span<const RawSetting> given);

/// `file` is that of `--settings`, which must exist; `options` those of each `--set`, in order. `standardFile` stands
/// for kReporterSettingsFile in tests.
ReporterSettingsReading loadReporterSettings(const std::optional<std::string>& file,
                                             const std::vector<std::string>& options, const platform::FileSystem& files,
                                             const std::string& standardFile = kReporterSettingsFile);

/// A settings file in which every setting stands as a comment, with its description and default.
std::string exampleReporterSettings();

} // namespace vela::reporter
