#include "common/SettingsTable.h"

#include "common/SettingValues.h"

#include <algorithm>

namespace vela {

namespace {

constexpr std::int64_t kKiB = 1024;
constexpr std::int64_t kMiB = 1024 * kKiB;
constexpr std::int64_t kGiB = 1024 * kMiB;
constexpr std::int64_t kTiB = 1024 * kGiB;

std::vector<std::string> texts(std::initializer_list<const char*> list) { return {list.begin(), list.end()}; }

std::vector<SettingDescription> makeTable() {
    using enum SettingKind;
    using S = Settings;
    // A message that is larger than the wire protocol's 128 MiB never arrives; a value deeper than 128 cannot be
    // written as a property list.
    return {
        {"device",
         "InternalBuild",
         Boolean,
         false,
         0,
         0,
         {},
         "Whether this device runs an internal build",
         [](S& s) -> SettingSlot { return &s.device.internalBuild; }},
        {"features",
         "AudioAnalytics/Tracing",
         Boolean,
         false,
         0,
         0,
         {},
         "A feature flag, \"Domain/Name\"; more may be added, those that are absent are off",
         [](S& s) -> SettingSlot { return &s.features["AudioAnalytics/Tracing"]; }},
        {"paths",
         "root",
         Path,
         "/",
         0,
         0,
         {},
         "Folder below which the session files and trace results are written",
         [](S& s) -> SettingSlot { return &s.paths.root; }},
        {"paths",
         "state",
         Path,
         "/var/lib/vela",
         0,
         0,
         {},
         "Folder of what outlives a restart; for an ordinary user $XDG_STATE_HOME/vela or ~/.local/state/vela",
         [](S& s) -> SettingSlot { return &s.paths.state; }},
        {"paths",
         "runtime",
         Path,
         "/run/vela",
         0,
         0,
         {},
         "Folder of the socket and the notifications; for an ordinary user $XDG_RUNTIME_DIR/vela",
         [](S& s) -> SettingSlot { return &s.paths.runtime; }},
        {"log",
         "target",
         Choice,
         "journal",
         0,
         0,
         {"journal", "stderr"},
         "Where log lines go; standard error when there is no journal",
         [](S& s) -> SettingSlot { return &s.log.target; }},
        {"log",
         "level",
         Choice,
         "default",
         0,
         0,
         {"debug", "info", "default", "error"},
         "The least important level that is logged",
         [](S& s) -> SettingSlot { return &s.log.level; }},
        {"store",
         "path",
         Path,
         "<state>/deliveries.db",
         0,
         0,
         {},
         "File of the deliveries",
         [](S& s) -> SettingSlot { return &s.store.path; }},
        {"store",
         "max_bytes",
         ByteSize,
         "256 MiB",
         kMiB,
         kTiB,
         {},
         "Size of the store above which the oldest deliveries are dropped",
         [](S& s) -> SettingSlot { return &s.store.maxBytes; }},
        {"store",
         "commit_messages",
         Integer,
         64,
         1,
         65536,
         {},
         "Deliveries that are committed together at the most, and may be lost with the power",
         [](S& s) -> SettingSlot { return &s.store.commitMessages; }},
        {"store",
         "commit_ms",
         Milliseconds,
         250,
         1,
         60000,
         {},
         "Milliseconds after which a delivery is committed at the latest",
         [](S& s) -> SettingSlot { return &s.store.commitDelay; }},
        {"beacon",
         "backends",
         TextList,
         texts({"store"}),
         0,
         0,
         {"store"},
         "Back ends of real-time reporting; without any, discovery finds none",
         [](S& s) -> SettingSlot { return &s.beacon.backends; }},
        {"tally",
         "used",
         TextList,
         texts({"*"}),
         0,
         0,
         {},
         "Analytics events that have a consumer: shell patterns over event names",
         [](S& s) -> SettingSlot { return &s.tally.used; }},
        {"access",
         "users",
         TextList,
         texts({}),
         0,
         0,
         {},
         "Users who may connect, beside root and the service's own",
         [](S& s) -> SettingSlot { return &s.access.users; }},
        {"access",
         "groups",
         TextList,
         texts({"audio"}),
         0,
         0,
         {},
         "Groups whose members may connect",
         [](S& s) -> SettingSlot { return &s.access.groups; }},
        {"limits",
         "message_bytes",
         ByteSize,
         "1 MiB",
         kKiB,
         128 * kMiB,
         {},
         "Size of one message",
         [](S& s) -> SettingSlot { return &s.limits.messageBytes; }},
        {"limits",
         "value_depth",
         Integer,
         32,
         1,
         128,
         {},
         "Containers inside each other in one message",
         [](S& s) -> SettingSlot { return &s.limits.valueDepth; }},
        {"limits",
         "sessions_per_client",
         Integer,
         1024,
         1,
         1000000,
         {},
         "Reporting sessions of one connection",
         [](S& s) -> SettingSlot { return &s.limits.sessionsPerClient; }},
        {"limits",
         "clients_per_user",
         Integer,
         256,
         1,
         65536,
         {},
         "Connections of one user",
         [](S& s) -> SettingSlot { return &s.limits.clientsPerUser; }},
        {"limits",
         "session_bytes",
         ByteSize,
         "64 MiB",
         kKiB,
         64 * kGiB,
         {},
         "Size of the messages that one session keeps",
         [](S& s) -> SettingSlot { return &s.limits.sessionBytes; }},
        {"limits",
         "total_bytes",
         ByteSize,
         "512 MiB",
         kKiB,
         kTiB,
         {},
         "Size of the messages that all sessions keep",
         [](S& s) -> SettingSlot { return &s.limits.totalBytes; }},
        {"limits",
         "unsent_replies",
         ByteSize,
         "4 MiB",
         kKiB,
         kGiB,
         {},
         "Size of the replies that wait for a client which does not read them",
         [](S& s) -> SettingSlot { return &s.limits.unsentReplies; }},
    };
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
