#include "common/Settings.h"

#include "common/SettingCheck.h"
#include "common/SettingSuggestion.h"
#include "common/SettingValues.h"
#include "common/SettingsTable.h"

#include <algorithm>
#include <array>
#include <cassert>
#include <set>

namespace vela {

namespace {

constexpr std::size_t kErrorsShown = 100;

/// The socket's address holds 107 bytes of path.
constexpr std::size_t kSocketPathBytes = 107;
constexpr std::string_view kSocketName = "/com.orvex.vela.reporting.server";

struct Chosen {
    SettingValue value;
    SettingOrigin origin;
};

/// Fits what one merge needs to hand around; lives for one call.
class Merge {
public:
    explicit Merge(const SettingsEnvironment& environment) : environment_(environment) {}

    void chooseDefaults();
    void take(const RawSetting& given);
    void expandPaths();
    void compareSettings();
    SettingsReading finish() &&;

private:
    using Name = std::pair<std::string, std::string>;

    void add(const SettingOrigin& origin, std::string key, std::string reason);
    std::optional<std::string> userFolder(std::string_view key);
    void takeUnknown(const RawSetting& given);
    void takeSection(const RawSetting& given);
    void expand(std::string_view section, std::string_view key, bool placeholders);
    std::optional<std::string> expanded(const std::string& path, bool placeholders, std::string& reason) const;
    void requireAtMost(std::string_view section, std::string_view key, std::string_view otherSection,
                       std::string_view otherKey);
    Chosen& chosen(std::string_view section, std::string_view key) {
        return chosen_[{std::string(section), std::string(key)}];
    }
    const std::string& path(std::string_view key) const {
        return std::get<std::string>(chosen_.at({"paths", std::string(key)}).value);
    }

    const SettingsEnvironment& environment_;
    std::map<Name, Chosen> chosen_; ///< every setting of the table, and further features
    std::set<std::string, std::less<>> unknownSections_;
    std::set<std::string, std::less<>> faulty_; ///< names of settings whose given value was refused
    std::vector<SettingError> errors_;
    std::size_t uncounted_ = 0; ///< errors beyond those shown
};

void Merge::add(const SettingOrigin& origin, std::string key, std::string reason) {
    if (errors_.size() == kErrorsShown) {
        ++uncounted_;
        return;
    }
    const bool fromDefault = origin.kind == SettingOrigin::Kind::Default;
    errors_.push_back({fromDefault                                       ? ""
                       : origin.kind == SettingOrigin::Kind::CommandLine ? "--set"
                                                                         : origin.file,
                       origin.line, 0, std::move(key), std::move(reason)});
}

void Merge::chooseDefaults() {
    for (const SettingDescription& setting : settingsTable()) {
        const platform::Result<SettingValue> checked = checkSetting(setting, setting.standard);
        assert(checked && "the table's defaults are allowed by the table");
        if (checked) {
            chosen(setting.section, setting.key) = {*checked, {}};
        }
    }
    if (environment_.ordinaryUser) {
        for (const std::string_view key : {"state", "runtime"}) {
            chosen("paths", key).value = userFolder(key).value_or("");
        }
    }
}

/// The default of an ordinary user's folder; none where the environment names no absolute folder for it.
std::optional<std::string> Merge::userFolder(std::string_view key) {
    const auto absolute = [](const std::string& folder) { return folder.starts_with('/'); };
    if (key == "runtime") {
        return absolute(environment_.runtimeHome) ? std::optional(environment_.runtimeHome + "/vela") : std::nullopt;
    }
    if (absolute(environment_.stateHome)) {
        return environment_.stateHome + "/vela";
    }
    return absolute(environment_.home) ? std::optional(environment_.home + "/.local/state/vela") : std::nullopt;
}

void Merge::takeSection(const RawSetting& given) {
    if (isSettingSection(given.section) || !unknownSections_.insert(given.section).second) {
        return;
    }
    add(given.origin, displayedName(given.section), "there is no such section" + sectionSuggestion(given.section));
}

void Merge::takeUnknown(const RawSetting& given) {
    const std::string name = displayedName(given.section + "." + given.key);
    if (!isOpenSection(given.section)) {
        const bool worthIt = errors_.size() < kErrorsShown;
        add(given.origin, name,
            "there is no such setting" + (worthIt ? settingSuggestion(given.section, given.key) : std::string()));
        return;
    }
    const std::size_t slash = given.key.find('/');
    if (slash == std::string::npos || slash == 0 || slash + 1 == given.key.size()) {
        add(given.origin, name, "a feature is named \"Domain/Name\"");
    } else if (!std::holds_alternative<bool>(given.value)) {
        add(given.origin, name, shownValue(given.value) + " is not true or false");
    } else {
        chosen(given.section, given.key) = {given.value, given.origin};
    }
}

void Merge::take(const RawSetting& given) {
    takeSection(given);
    if (std::holds_alternative<std::monostate>(given.value) || !isSettingSection(given.section)) {
        return;
    }
    const SettingDescription* setting = findSetting(given.section, given.key);
    if (setting == nullptr) {
        takeUnknown(given);
        return;
    }
    const platform::Result<SettingValue> checked = checkSetting(*setting, given.value);
    if (!checked) {
        add(given.origin, setting->name(), checked.failure().description);
        faulty_.insert(setting->name());
        return;
    }
    chosen(given.section, given.key) = {*checked, given.origin};
}

std::optional<std::string> Merge::expanded(const std::string& path, bool placeholders, std::string& reason) const {
    std::string result = path;
    if (placeholders) {
        constexpr std::string_view kState = "<state>";
        constexpr std::string_view kRuntime = "<runtime>";
        if (path.starts_with(kState)) {
            result = this->path("state") + path.substr(kState.size());
        } else if (path.starts_with(kRuntime)) {
            result = this->path("runtime") + path.substr(kRuntime.size());
        }
    }
    if (result.starts_with('/')) {
        return result;
    }
    reason = shownValue(path) + (placeholders ? " is no absolute path and begins with neither <state> nor <runtime>"
                                              : " is no absolute path");
    return std::nullopt;
}

void Merge::expand(std::string_view section, std::string_view key, bool placeholders) {
    Chosen& setting = chosen(section, key);
    auto& path = std::get<std::string>(setting.value);
    std::string reason;
    if (std::optional<std::string> absolute = expanded(path, placeholders, reason)) {
        path = std::move(*absolute);
        return;
    }
    add(setting.origin, std::string(section) + "." + std::string(key), std::move(reason));
}

void Merge::expandPaths() {
    constexpr std::array<std::pair<std::string_view, std::string_view>, 2> kFolders{
        {{"state", "neither XDG_STATE_HOME nor HOME names a folder"}, {"runtime", "XDG_RUNTIME_DIR names no folder"}}};
    for (const auto& [key, cause] : kFolders) {
        if (path(key).empty()) {
            add({}, "paths." + std::string(key), "has no default, because " + std::string(cause) + ": set it");
        } else {
            expand("paths", key, false);
        }
    }
    if (!path("state").starts_with('/') || !path("runtime").starts_with('/')) {
        return; // what is made of them would be blamed for their faults
    }
    for (const SettingDescription& setting : settingsTable()) {
        if (setting.kind == SettingKind::Path && setting.key != "state" && setting.key != "runtime") {
            expand(setting.section, setting.key, true);
        }
    }
    if (path("runtime").size() + kSocketName.size() > kSocketPathBytes) {
        add(chosen("paths", "runtime").origin, "paths.runtime",
            shownValue(path("runtime")) + " is too long for a socket's address: at most " +
                std::to_string(kSocketPathBytes - kSocketName.size()) + " bytes");
    }
}

/// Two sizes of which the second must hold the first. Blames the one that somebody wrote, the first where both are.
void Merge::requireAtMost(std::string_view section, std::string_view key, std::string_view otherSection,
                          std::string_view otherKey) {
    const Chosen& small = chosen(section, key);
    const Chosen& large = chosen(otherSection, otherKey);
    const auto smallBytes = std::get<std::int64_t>(small.value);
    const auto largeBytes = std::get<std::int64_t>(large.value);
    const std::string smallName = std::string(section) + "." + std::string(key);
    const std::string largeName = std::string(otherSection) + "." + std::string(otherKey);
    if (smallBytes <= largeBytes || faulty_.contains(smallName) || faulty_.contains(largeName)) {
        return;
    }
    const bool blameSmall = small.origin.kind != SettingOrigin::Kind::Default;
    if (blameSmall) {
        add(small.origin, smallName,
            byteSizeText(smallBytes) + " is more than " + largeName + " (" + byteSizeText(largeBytes) + ", " +
                escapedText(large.origin.text()) + ")");
    } else {
        add(large.origin, largeName,
            byteSizeText(largeBytes) + " is less than " + smallName + " (" + byteSizeText(smallBytes) + ", " +
                escapedText(small.origin.text()) + ")");
    }
}

void Merge::compareSettings() {
    requireAtMost("limits", "message_bytes", "limits", "session_bytes");
    requireAtMost("limits", "session_bytes", "limits", "total_bytes");
    requireAtMost("limits", "message_bytes", "store", "max_bytes");
}

void put(const SettingSlot& slot, const SettingDescription& setting, const SettingValue& value) {
    const auto choice = [&] {
        const auto at = std::ranges::find(setting.choices, std::get<std::string>(value));
        return static_cast<std::uint8_t>(at - setting.choices.begin());
    };
    std::visit(
        [&](auto* target) {
            using Target = std::remove_pointer_t<decltype(target)>;
            if constexpr (std::is_enum_v<Target>) {
                *target = static_cast<Target>(choice());
            } else if constexpr (std::is_same_v<Target, std::chrono::milliseconds>) {
                *target = std::chrono::milliseconds(std::get<std::int64_t>(value));
            } else if constexpr (std::is_integral_v<Target> && !std::is_same_v<Target, bool>) {
                *target = static_cast<Target>(std::get<std::int64_t>(value));
            } else {
                *target = std::get<Target>(value);
            }
        },
        slot);
}

SettingsReading Merge::finish() && {
    SettingsReading reading;
    if (!errors_.empty()) {
        if (uncounted_ > 0) {
            errors_.push_back({"", 0, 0, "", "and " + std::to_string(uncounted_) + " more"});
        }
        reading.errors = std::move(errors_);
        return reading;
    }
    reading.settings.emplace();
    for (const SettingDescription& setting : settingsTable()) {
        const Chosen& held = chosen(setting.section, setting.key);
        put(setting.slot(*reading.settings), setting, held.value);
        reading.inForce.push_back({std::string(setting.section), std::string(setting.key), held.value,
                                   settingText(setting.kind, held.value), held.origin});
    }
    for (const auto& [name, held] : chosen_) {
        if (findSetting(name.first, name.second) == nullptr) { // a further feature
            reading.settings->features[name.second] = std::get<bool>(held.value);
            reading.inForce.push_back({name.first, name.second, held.value, valueText(held.value), held.origin});
        }
    }
    return reading;
}

} // namespace

bool Settings::featureEnabled(std::string_view domain, std::string_view name) const {
    const auto found = features.find(std::string(domain) + "/" + std::string(name));
    return found != features.end() && found->second;
}

std::string SettingOrigin::text() const {
    switch (kind) {
    case Kind::Default:
        return "default";
    case Kind::File:
        return line == 0 ? file : file + ":" + std::to_string(line);
    case Kind::CommandLine:
        return "--set";
    }
    return {};
}

std::string SettingError::text() const {
    std::string result = escapedText(file);
    for (const int number : {line, column}) {
        if (number != 0) {
            result += (result.empty() ? "" : ":") + std::to_string(number);
        }
    }
    result += result.empty() ? "" : ": ";
    return result + (key.empty() ? "" : key + ": ") + reason;
}

SettingsReading mergeSettings(std::span<const RawSetting> given, const SettingsEnvironment& environment) {
    Merge merge(environment);
    merge.chooseDefaults();
    for (const RawSetting& setting : given) {
        merge.take(setting);
    }
    merge.expandPaths();
    merge.compareSettings();
    return std::move(merge).finish();
}

} // namespace vela
