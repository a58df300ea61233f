#include "common/SettingsTable.h"

#include "common/SettingValues.h"

#include <algorithm>
#include <utility>

namespace vela {

namespace {

constexpr std::int64_t kKiB = 1024;
constexpr std::int64_t kMiB = 1024 * kKiB;
constexpr std::int64_t kGiB = 1024 * kMiB;
constexpr std::int64_t kTiB = 1024 * kGiB;

using S = Settings;
using Slot = SettingSlot (*)(Settings&);
using enum SettingKind;

struct Name {
    std::string_view section;
    std::string_view key;
    std::string_view description;
};

struct Range {
    std::int64_t least;
    std::int64_t most;
};

SettingDescription boolean(const Name& name, bool standard, Slot slot) {
    return {name.section, name.key, Boolean, standard, 0, 0, {}, name.description, slot};
}

SettingDescription number(const Name& name, SettingKind kind, std::int64_t standard, Range range, Slot slot) {
    return {name.section, name.key, kind, standard, range.least, range.most, {}, name.description, slot};
}

SettingDescription size(const Name& name, const char* standard, Range range, Slot slot) {
    return {name.section, name.key, ByteSize, standard, range.least, range.most, {}, name.description, slot};
}

SettingDescription path(const Name& name, const char* standard, Slot slot) {
    return {name.section, name.key, Path, standard, 0, 0, {}, name.description, slot};
}

SettingDescription choice(const Name& name, const char* standard, std::vector<std::string_view> choices, Slot slot) {
    return {name.section, name.key, Choice, standard, 0, 0, std::move(choices), name.description, slot};
}

/// Without choices any text may be in the list.
SettingDescription list(const Name& name, std::vector<std::string> standard, std::vector<std::string_view> choices,
                        Slot slot) {
    return {name.section, name.key, TextList, std::move(standard), 0, 0, std::move(choices), name.description, slot};
}

// The table is made in parts only because of its length.

std::vector<SettingDescription> placeSettings() {
    return {
        boolean(Name{"device", "InternalBuild", "Whether this device runs an internal build"}, false,
                [](S& s) -> SettingSlot { return &s.device.internalBuild; }),
        boolean(Name{"features", "AudioAnalytics/Tracing",
                     "A feature flag, \"Domain/Name\"; more may be added, those that are absent are off"},
                false, [](S& s) -> SettingSlot { return &s.features["AudioAnalytics/Tracing"]; }),
        path(Name{"paths", "root", "Folder below which the session files and trace results are written"}, "/",
             [](S& s) -> SettingSlot { return &s.paths.root; }),
        path(
            Name{"paths", "state",
                 "Folder of what outlives a restart; for an ordinary user $XDG_STATE_HOME/vela or ~/.local/state/vela"},
            "/var/lib/vela", [](S& s) -> SettingSlot { return &s.paths.state; }),
        path(Name{"paths", "runtime",
                  "Folder of the socket and the notifications; for an ordinary user $XDG_RUNTIME_DIR/vela"},
             "/run/vela", [](S& s) -> SettingSlot { return &s.paths.runtime; }),
        choice(Name{"log", "target", "Where log lines go; standard error when there is no journal"}, "journal",
               {"journal", "stderr"}, [](S& s) -> SettingSlot { return &s.log.target; }),
        choice(Name{"log", "level", "The least important level that is logged"}, "default",
               {"debug", "info", "default", "error"}, [](S& s) -> SettingSlot { return &s.log.level; }),
    };
}

std::vector<SettingDescription> deliverySettings() {
    return {
        path(Name{"store", "path", "File of the deliveries"}, "<state>/deliveries.db",
             [](S& s) -> SettingSlot { return &s.store.path; }),
        size(Name{"store", "max_bytes", "Size of the store above which the oldest deliveries are dropped"}, "256 MiB",
             {kMiB, kTiB}, [](S& s) -> SettingSlot { return &s.store.maxBytes; }),
        number(Name{"store", "commit_messages",
                    "Deliveries whose waiting begins a commit, and that may be lost with the power"},
               Integer, 64, {1, 65536}, [](S& s) -> SettingSlot { return &s.store.commitMessages; }),
        number(Name{"store", "commit_ms", "Milliseconds after which a delivery is committed at the latest"},
               Milliseconds, 250, {1, 60000}, [](S& s) -> SettingSlot { return &s.store.commitDelay; }),
        list(Name{"beacon", "backends", "Back ends of real-time reporting; without any, discovery finds none"},
             {"store"}, {"store"}, [](S& s) -> SettingSlot { return &s.beacon.backends; }),
        list(Name{"tally", "used", "Analytics events that have a consumer: shell patterns over event names"}, {"*"}, {},
             [](S& s) -> SettingSlot { return &s.tally.used; }),
        list(Name{"access", "users", "Users who may connect, beside root and the service's own"}, {}, {},
             [](S& s) -> SettingSlot { return &s.access.users; }),
        list(Name{"access", "groups", "Groups whose members may connect"}, {"audio"}, {},
             [](S& s) -> SettingSlot { return &s.access.groups; }),
    };
}

/// One setting for each group that the service asks for, by the group's own name.
std::vector<SettingDescription> driverSettings() {
    const auto group = [](std::string_view key, std::string_view description, std::vector<std::string> standard,
                          Slot slot) {
        return list(Name{"drivers", key, description}, std::move(standard),
                    {"channels", "alsa-playback", "alsa-capture", "cpuidle", "devfreq", "runtime-pm", "force-feedback"},
                    slot);
    };
    return {
        group("Tarn", "Sources of the driver statistics of group Tarn: power and residency",
              {"channels", "cpuidle", "devfreq", "runtime-pm"}, [](S& s) -> SettingSlot { return &s.drivers.tarn; }),
        group("Speaker", "Sources of group Speaker: loudspeakers and amplifiers", {"channels"},
              [](S& s) -> SettingSlot { return &s.drivers.speaker; }),
        group("MCA", "Sources of subgroup MCA of any group: the mixing cycle", {"channels"},
              [](S& s) -> SettingSlot { return &s.drivers.mca; }),
        group("Haptics", "Sources of group Haptics, subgroup Stats: force feedback", {"channels", "force-feedback"},
              [](S& s) -> SettingSlot { return &s.drivers.haptics; }),
        group("StateTransitionTimes_ms", "Sources of group StateTransitionTimes_ms: how long changes of state take",
              {"channels"}, [](S& s) -> SettingSlot { return &s.drivers.stateTransitionTimes; }),
        group("Rx", "Sources of group Rx: what comes from the devices", {"channels", "alsa-capture"},
              [](S& s) -> SettingSlot { return &s.drivers.rx; }),
        group("Tx", "Sources of group Tx: what goes to the devices", {"channels", "alsa-playback"},
              [](S& s) -> SettingSlot { return &s.drivers.tx; }),
        group("Brook", "Sources of subgroup Brook of any group: wireless and network streams", {"channels"},
              [](S& s) -> SettingSlot { return &s.drivers.brook; }),
    };
}

/// A message that is larger than the wire protocol's 128 MiB never arrives; a value deeper than 128 cannot be written
/// as a property list.
std::vector<SettingDescription> limitSettings() {
    return {
        size(Name{"limits", "message_bytes", "Size of one message"}, "1 MiB", {kKiB, 128 * kMiB},
             [](S& s) -> SettingSlot { return &s.limits.messageBytes; }),
        number(Name{"limits", "value_depth", "Containers inside each other in one message"}, Integer, 32, {1, 128},
               [](S& s) -> SettingSlot { return &s.limits.valueDepth; }),
        number(Name{"limits", "sessions_per_client", "Reporting sessions of one connection"}, Integer, 1024,
               {1, 1000000}, [](S& s) -> SettingSlot { return &s.limits.sessionsPerClient; }),
        number(Name{"limits", "clients_per_user", "Connections of one user"}, Integer, 256, {1, 65536},
               [](S& s) -> SettingSlot { return &s.limits.clientsPerUser; }),
        size(Name{"limits", "session_bytes", "Size of the messages and the configuration that one session keeps"},
             "64 MiB", {kKiB, 64 * kGiB}, [](S& s) -> SettingSlot { return &s.limits.sessionBytes; }),
        size(Name{"limits", "total_bytes", "Size of the messages and configurations that all sessions keep"}, "512 MiB",
             {kKiB, kTiB}, [](S& s) -> SettingSlot { return &s.limits.totalBytes; }),
        size(Name{"limits", "unsent_replies", "Size of the replies that wait for a client which does not read them"},
             "4 MiB", {kKiB, kGiB}, [](S& s) -> SettingSlot { return &s.limits.unsentReplies; }),
    };
}

std::vector<SettingDescription> makeTable() {
    std::vector<SettingDescription> table = placeSettings();
    for (const auto& more : {deliverySettings(), driverSettings(), limitSettings()}) {
        table.insert(table.end(), more.begin(), more.end());
    }
    return table;
}

std::string numberText(const SettingDescription& description, std::int64_t number) {
    return description.kind == SettingKind::ByteSize ? byteSizeText(number) : std::to_string(number);
}

} // namespace

std::string SettingDescription::name() const { return std::string(section) + "." + std::string(key); }

std::span<const SettingDescription> settingsTable() {
    static const std::vector<SettingDescription> table = makeTable();
    return table;
}

const SettingDescription* findSetting(std::string_view section, std::string_view key) {
    const auto table = settingsTable();
    const auto found = std::ranges::find_if(
        table, [&](const SettingDescription& known) { return known.section == section && known.key == key; });
    return found == table.end() ? nullptr : &*found;
}

bool isSettingSection(std::string_view section) {
    return std::ranges::any_of(settingsTable(),
                               [&](const SettingDescription& known) { return known.section == section; });
}

bool isOpenSection(std::string_view section) { return section == "features"; }

std::string settingText(SettingKind kind, const SettingValue& value) {
    const auto* number = std::get_if<std::int64_t>(&value);
    return kind == SettingKind::ByteSize && number != nullptr ? quotedText(byteSizeText(*number)) : valueText(value);
}

std::string choicesText(const SettingDescription& description) {
    std::string result;
    for (const std::string_view choice : description.choices) {
        result += (result.empty() ? "" : ", ") + std::string(choice);
    }
    return result;
}

std::string rangeText(const SettingDescription& description) {
    return numberText(description, description.least) + " to " + numberText(description, description.most);
}

std::string allowedText(const SettingDescription& description) {
    switch (description.kind) {
    case SettingKind::Boolean:
        return "true or false";
    case SettingKind::Integer:
        return "a whole number, " + rangeText(description);
    case SettingKind::Milliseconds:
        return "a whole number of milliseconds, " + rangeText(description);
    case SettingKind::ByteSize:
        return "a size, " + rangeText(description);
    case SettingKind::Choice:
        return "one of " + choicesText(description);
    case SettingKind::Path:
        return "an absolute path";
    case SettingKind::TextList:
        return description.choices.empty() ? "a list of texts" : "a list of " + choicesText(description);
    }
    return {};
}

std::string exampleSettingsFile() {
    std::string file =
        "# Settings of vela-reportingd; see vela-reporting.toml(5). Every line below is a default: take the mark\n"
        "# off to set another value. Sizes take the units B, KiB, MiB, GiB and TiB; paths may begin with <state>\n"
        "# or <runtime>.\n";
    std::string_view section;
    for (const SettingDescription& setting : settingsTable()) {
        if (setting.section != section) {
            section = setting.section;
            file += "\n[" + std::string(section) + "]\n";
        }
        const bool bare = !isOpenSection(setting.section);
        file += "# " + std::string(setting.description) + " (" + allowedText(setting) + ").\n";
        file += "#" + (bare ? std::string(setting.key) : quotedText(setting.key)) + " = " + valueText(setting.standard);
        file += "\n";
    }
    return file;
}

} // namespace vela
