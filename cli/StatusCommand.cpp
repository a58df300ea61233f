// velactl status
#include "cli/ServiceConnection.h"
#include "cli/Subcommand.h"
#include "common/CommandOptions.h"
#include "common/SettingValues.h"
#include "common/values/Dictionary.h"
#include "common/values/Json.h"

#include <algorithm>
#include <array>
#include <ostream>

namespace vela {

namespace {

constexpr std::array<CommandOption, 1> kOptions{{{"--json"}}};

struct Status {
    std::string version;
    std::size_t sessions = 0;
    std::size_t started = 0;
    Dictionary ledger;
};

platform::Result<Status> readStatus(platform::dbus::BlockingConnection& connection) {
    const platform::Result<std::string> version = readVersion(connection);
    if (!version) {
        return version.failure();
    }
    const platform::Result<Array> sessions = readSessions(connection);
    if (!sessions) {
        return sessions.failure();
    }
    const platform::Result<Dictionary> ledger = readLedger(connection);
    if (!ledger) {
        return ledger.failure();
    }
    const auto started = std::count_if(sessions->begin(), sessions->end(), [](ValueRef session) {
        return session.dictionary().find("started").booleanValue();
    });
    return Status{*version, sessions->size(), static_cast<std::size_t>(started), *ledger};
}

void printText(const Status& status, Console& console) {
    console.out << "vela-reportingd " << escapedText(status.version) << " is running\n"
                << status.sessions << (status.sessions == 1 ? " session, " : " sessions, ") << status.started
                << " started\n";
}

void printJson(const Status& status, Console& console) {
    DictionaryBuilder object;
    object.add("version", std::string_view(status.version));
    object.add("sessions", status.sessions);
    object.add("started", status.started);
    object.add("ledger", status.ledger);
    console.out << jsonText(Value(object.build())) << '\n';
}

} // namespace

int runStatus(std::span<const std::string_view> arguments, Console& console) {
    const platform::Result<CommandArguments> read = readArguments(arguments, kOptions);
    if (!read || !read->operands.empty()) {
        return refuseUsage("status", read ? "it takes no operands" : read.failure().description, console);
    }
    auto connection = connectToService(console);
    if (!connection) {
        return kNoService;
    }
    const platform::Result<Status> status = readStatus(*connection);
    if (!status) {
        console.error << "velactl: " << escapedText(status.failure().description) << '\n';
        return statusOf(status.failure());
    }
    (read->has("--json") ? printJson : printText)(*status, console);
    return kDone;
}

} // namespace vela
