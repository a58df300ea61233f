#include "reporters/pipewire/ReporterSettings.h"

#include "common/SettingSuggestion.h"
#include "common/SettingValues.h"
#include "platform/toml/TomlSettings.h"

#include <algorithm>
#include <array>
#include <iterator>
#include <string_view>
#include <system_error>

namespace vela::reporter {

namespace {

/// Errors beyond these are counted only.
constexpr std::size_t kErrorsShown = 100;
/// Names farther from each other are not taken for a slip.
constexpr std::size_t kNear = 2;

/// Empty when the value was stored, else the reason why it cannot be.
using Store = std::string (*)(ReporterSettings& settings, const SettingValue& value);

struct Description {
    std::string_view section;
    std::string_view key;
    std::string_view standard; ///< as the file would say it
    std::string_view description;
    Store store;
};

template <class Type>
std::string storeAs(Type& target, const SettingValue& value, std::string_view what) {
    if (const auto* const held = std::get_if<Type>(&value)) {
        target = *held;
        return {};
    }
    return shownValue(value) + " is not " + std::string(what);
}

std::string storeTexts(std::vector<std::string>& target, const SettingValue& value) {
    return storeAs(target, value, "a list of texts");
}

std::string storeNames(ReporterSettings& settings, const SettingValue& value) {
    constexpr std::array<std::string_view, 3> kNames{"report", "hash", "omit"};
    const auto* const text = std::get_if<std::string>(&value);
    const auto* const found = text == nullptr ? kNames.end() : std::ranges::find(kNames, *text);
    if (found == kNames.end()) {
        return shownValue(value) + " is none of report, hash, omit";
    }
    settings.names = static_cast<NameTreatment>(found - kNames.begin());
    return {};
}

std::string storeFolder(ReporterSettings& settings, const SettingValue& value) {
    const auto* const text = std::get_if<std::string>(&value);
    if (text == nullptr || (!text->empty() && !text->starts_with('/'))) {
        return shownValue(value) + " is no absolute path";
    }
    settings.folder = *text;
    return {};
}

using S = ReporterSettings;
constexpr std::array<Description, 9> kTable{{
    {"pipewire", "remote", "\"\"",
     "Name of the audio server's socket (a text; empty: $PIPEWIRE_REMOTE or \"pipewire-0\")",
     [](S& s, const SettingValue& v) { return storeAs(s.remote, v, "a text"); }},
    {"service", "address", "\"\"",
     "D-Bus address of the reporting service (a text; empty: $VELA_REPORTING_ADDRESS, the user's or the system's "
     "service)",
     [](S& s, const SettingValue& v) { return storeAs(s.address, v, "a text"); }},
    {"names", "applications", "\"report\"",
     "What becomes of applications' names: reported, replaced by a hash that differs between devices, left out (one of "
     "report, hash, omit)",
     storeNames},
    {"leave_out", "applications", "[]", "Applications whose streams are not reported (a list of shell patterns)",
     [](S& s, const SettingValue& v) { return storeTexts(s.leftOutApplications, v); }},
    {"leave_out", "roles", "[]", "Media roles whose streams are not reported (a list of shell patterns)",
     [](S& s, const SettingValue& v) { return storeTexts(s.leftOutRoles, v); }},
    {"leave_out", "nodes", "[]", "Names of nodes that are not reported (a list of shell patterns)",
     [](S& s, const SettingValue& v) { return storeTexts(s.leftOutNodes, v); }},
    {"devices", "sessions", "false", "Whether sinks and sources have sessions of their own (true or false)",
     [](S& s, const SettingValue& v) { return storeAs(s.deviceSessions, v, "true or false"); }},
    {"statistics", "publish", "true", "Whether the cycles of nodes are published as channel files (true or false)",
     [](S& s, const SettingValue& v) { return storeAs(s.statistics, v, "true or false"); }},
    {"statistics", "folder", "\"\"",
     "Folder of the channel files (an absolute path; empty: hwstats below $VELA_RUNTIME, $XDG_RUNTIME_DIR/vela or "
     "/run/vela)",
     storeFolder},
}};

std::string nameOf(const Description& setting) { return std::string(setting.section) + "." + std::string(setting.key); }

/// `; did you mean names.applications?`, or nothing.
std::string suggestionFor(const std::string& name) {
    const Description* nearest = nullptr;
    std::size_t least = kNear + 1;
    for (const Description& setting : kTable) {
        const std::size_t distance = editDistance(name, nameOf(setting));
        if (distance < least) {
            least = distance;
            nearest = &setting;
        }
    }
    return nearest == nullptr ? "" : "; did you mean " + nameOf(*nearest) + "?";
}

class Merge {
public:
    void take(const RawSetting& given);
    ReporterSettingsReading finish() &&;

private:
    void add(const SettingOrigin& origin, std::string key, std::string reason);

    ReporterSettings settings_;
    std::vector<SettingError> errors_;
    std::size_t uncounted_ = 0;
};

void Merge::add(const SettingOrigin& origin, std::string key, std::string reason) {
    if (errors_.size() == kErrorsShown) {
        ++uncounted_;
        return;
    }
    const bool isOption = origin.kind == SettingOrigin::Kind::CommandLine;
    errors_.push_back({isOption ? "--set" : origin.file, origin.line, 0, std::move(key), std::move(reason)});
}

void Merge::take(const RawSetting& given) {
    const bool isSection =
        std::ranges::any_of(kTable, [&](const Description& setting) { return setting.section == given.section; });
    if (std::holds_alternative<std::monostate>(given.value)) {
        if (!isSection) {
            add(given.origin, displayedName(given.section), "there is no such section");
        }
        return;
    }
    const auto* const setting = std::ranges::find_if(
        kTable, [&](const Description& known) { return known.section == given.section && known.key == given.key; });
    const std::string name = displayedName(given.section + "." + given.key);
    if (setting == kTable.end()) {
        add(given.origin, name, "there is no such setting" + suggestionFor(name));
        return;
    }
    if (std::string reason = setting->store(settings_, given.value); !reason.empty()) {
        add(given.origin, name, std::move(reason));
    }
}

ReporterSettingsReading Merge::finish() && {
    if (errors_.empty()) {
        return {std::move(settings_), {}};
    }
    if (uncounted_ > 0) {
        errors_.push_back({"", 0, 0, "", "and " + std::to_string(uncounted_) + " more"});
    }
    return {std::nullopt, std::move(errors_)};
}

/// What a file and the command line gave, before it is merged.
struct Layers {
    std::vector<RawSetting> settings;
    std::vector<SettingError> errors;
};

void addFile(Layers& layers, const std::string& file, bool required, const platform::FileSystem& files) {
    const std::string path = file.starts_with('/') ? file : files.currentDirectory() + "/" + file;
    const platform::Result<std::string> text = files.readFile(path, platform::kTomlBytes);
    if (!text) {
        const int code = text.failure().code;
        const bool isMissing = code == static_cast<int>(std::errc::no_such_file_or_directory) ||
                               code == static_cast<int>(std::errc::not_a_directory);
        if (required || !isMissing) {
            layers.errors.push_back({file, 0, 0, "", text.failure().description});
        }
        return;
    }
    platform::TomlReading reading = platform::readTomlSettings(*text, file);
    std::ranges::move(reading.settings, std::back_inserter(layers.settings));
    std::ranges::move(reading.errors, std::back_inserter(layers.errors));
}

} // namespace

ReporterSettingsReading mergeReporterSettings(std::span<const RawSetting> given) {
    Merge merge;
    for (const RawSetting& setting : given) {
        merge.take(setting);
    }
    return std::move(merge).finish();
}

ReporterSettingsReading loadReporterSettings(const std::optional<std::string>& file,
                                             const std::vector<std::string>& options, const platform::FileSystem& files,
                                             const std::string& standardFile) {
    Layers layers;
    addFile(layers, file.value_or(standardFile), file.has_value(), files);
    for (const std::string& option : options) {
        if (platform::Result<RawSetting> setting = platform::readSettingOption(option)) {
            layers.settings.push_back(*std::move(setting));
        } else {
            layers.errors.push_back({"--set", 0, 0, "", setting.failure().description});
        }
    }
    ReporterSettingsReading reading = mergeReporterSettings(layers.settings);
    if (!layers.errors.empty()) {
        std::ranges::move(reading.errors, std::back_inserter(layers.errors));
        reading = {std::nullopt, std::move(layers.errors)};
    }
    return reading;
}

std::string exampleReporterSettings() {
    std::string file = "# Settings of vela-pipewire-reporter; see vela-pipewire-reporter(1). Every line below is a\n"
                       "# default: take the mark off to set another value.\n";
    std::string_view section;
    for (const Description& setting : kTable) {
        if (setting.section != section) {
            section = setting.section;
            file += "\n[" + std::string(section) + "]\n";
        }
        file += "# " + std::string(setting.description) + ".\n#" + std::string(setting.key) + " = " +
                std::string(setting.standard) + "\n";
    }
    return file;
}

} // namespace vela::reporter
