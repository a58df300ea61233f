// The service's settings: typed values in force, where each comes from, and what is wrong with those that were given.
//
// Layers, the last wins: embedded defaults, the settings file, the command line. Readers of files hand over neutral
// `RawSetting`s, so that nothing here knows a file format. Everything is plain data, immutable once read; the functions
// are pure.
#pragma once

#include "platform/Log.h"

#include <chrono>
#include <cstdint>
#include <map>
#include <optional>
#include <span>
#include <string>
#include <string_view>
#include <variant>
#include <vector>

namespace vela {

enum class LogTarget : std::uint8_t { Journal, StandardError };

/// Default values stand in settingsTable(); a `Settings` that nobody read holds nothing useful.
struct Settings {
    struct Device {
        bool internalBuild = false;
    } device;

    /// Feature flags by "Domain/Name"; what is absent is off.
    std::map<std::string, bool, std::less<>> features;

    /// Absolute, placeholders expanded.
    struct Paths {
        std::string root;
        std::string state;
        std::string runtime;
    } paths;

    struct Log {
        LogTarget target{};
        platform::LogLevel level{};
    } log;

    struct Store {
        std::string path;
        std::uint64_t maxBytes = 0;
        std::uint32_t commitMessages = 0;
        std::chrono::milliseconds commitDelay{};
    } store;

    struct Beacon {
        std::vector<std::string> backends;
    } beacon;

    struct Tally {
        std::vector<std::string> used; ///< shell patterns over event names
    } tally;

    /// Sources of each group of driver statistics.
    struct Drivers {
        std::vector<std::string> tarn;
        std::vector<std::string> speaker;
        std::vector<std::string> mca;
        std::vector<std::string> haptics;
        std::vector<std::string> stateTransitionTimes;
        std::vector<std::string> rx;
        std::vector<std::string> tx;
        std::vector<std::string> brook;
    } drivers;

    /// Who may connect beside root and the service's own user.
    struct Access {
        std::vector<std::string> users;
        std::vector<std::string> groups;
    } access;

    struct Limits {
        std::uint64_t messageBytes = 0;
        std::uint32_t valueDepth = 0;
        std::uint32_t sessionsPerClient = 0;
        std::uint32_t clientsPerUser = 0;
        std::uint64_t sessionBytes = 0;
        std::uint64_t totalBytes = 0;
        std::uint64_t unsentReplies = 0; ///< bytes
    } limits;

    bool featureEnabled(std::string_view domain, std::string_view name) const;
};

/// Where a value was written.
struct SettingOrigin {
    enum class Kind : std::uint8_t { Default, File, CommandLine };

    Kind kind = Kind::Default;
    std::string file; ///< for Kind::File
    int line = 0;     ///< for Kind::File, from 1; 0 where it is not known

    /// "default", "/etc/vela/vela-reporting.toml:12", "--set".
    std::string text() const;

    friend bool operator==(const SettingOrigin&, const SettingOrigin&) = default;
};

/// Value of a setting before or after it was checked. Checked numbers, byte sizes and milliseconds are all integers.
using SettingValue = std::variant<std::monostate, bool, std::int64_t, double, std::string, std::vector<std::string>>;

/// One key as a layer gives it. Without a value (std::monostate) it says only that the section was opened there.
struct RawSetting {
    std::string section;
    std::string key;
    SettingValue value;
    SettingOrigin origin;
};

/// One thing that is wrong. Texts from outside are escaped in it, so that it stays one line.
struct SettingError {
    std::string file; ///< file, "--set", or empty where nobody wrote the value
    int line = 0;     ///< from 1; 0 where there is none
    int column = 0;   ///< from 1; 0 where there is none
    std::string key;  ///< "section.key"; empty when no key is to blame
    std::string reason;

    /// `/etc/vela/vela-reporting.toml:12: log.level: "loud" is none of debug, info, default, error`.
    std::string text() const;
};

/// What the defaults of the folders depend on. The caller looks; nothing here reads the environment.
struct SettingsEnvironment {
    bool ordinaryUser = false; ///< not root: folders below the user's own
    std::string runtimeHome;   ///< $XDG_RUNTIME_DIR
    std::string stateHome;     ///< $XDG_STATE_HOME
    std::string home;          ///< $HOME
};

/// A setting as it holds, for listings.
struct SettingInForce {
    std::string section;
    std::string key;
    SettingValue value; ///< byte sizes in bytes, paths expanded
    std::string text;   ///< the value as a settings file would say it: `"256 MiB"`
    SettingOrigin origin;
};

struct SettingsReading {
    std::optional<Settings> settings;    ///< there exactly when there are no errors
    std::vector<SettingInForce> inForce; ///< in the table's order, then further features by name; empty with errors
    std::vector<SettingError> errors;    ///< everything found, up to a hundred and a line that counts the rest
};

/// The defaults under `given`, of which a later one replaces an earlier one of the same key. Every one is checked, also
/// those that are replaced.
SettingsReading mergeSettings(std::span<const RawSetting> given, const SettingsEnvironment& environment);

} // namespace vela
