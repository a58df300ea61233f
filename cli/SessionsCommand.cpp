// velactl sessions
#include "cli/ServiceConnection.h"
#include "cli/Subcommand.h"
#include "cli/TextTable.h"
#include "common/CommandOptions.h"
#include "common/SettingValues.h"
#include "common/values/Dictionary.h"
#include "common/values/Json.h"
#include "common/values/TextualForm.h"
#include "platform/dbus/Protocol.h"

#include <array>
#include <ostream>

namespace vela {

namespace {

constexpr std::array<CommandOption, 1> kOptions{{{"--json"}}};

std::string cell(ValueRef value) { return value ? escapedText(textualForm(value)) : "-"; }

void printTable(const Array& sessions, Console& console) {
    if (sessions.empty()) {
        console.out << "No sessions\n";
        return;
    }
    TextTable table({"REPORTER", "SERVICE", "OWNER", "PROCESS", "APPLICATION", "STARTED", "MESSAGES"});
    for (const ValueRef session : sessions) {
        const Dictionary entry = session.dictionary();
        const bool started = entry.find("started").booleanValue();
        table.add({cell(entry.find("reporterID")), cell(entry.find("serviceName")), cell(entry.find("owner")),
                   cell(entry.find("process")), cell(entry.find("application")), started ? "yes" : "no",
                   cell(entry.find("messages"))},
                  !started);
    }
    table.print(console.out, console.colour);
}

} // namespace

int runSessions(std::span<const std::string_view> arguments, Console& console) {
    const platform::Result<CommandArguments> read = readArguments(arguments, kOptions);
    if (!read || !read->operands.empty()) {
        return refuseUsage("sessions", read ? "it takes no operands" : read.failure().description, console);
    }
    auto connection = connectToService(console);
    if (!connection) {
        return kNoService;
    }
    const platform::Result<Array> sessions = readSessions(*connection);
    if (!sessions) {
        console.error << "velactl: " << escapedText(sessions.failure().description) << '\n';
        return statusOf(sessions.failure());
    }
    if (!read->has("--json")) {
        printTable(*sessions, console);
        return kDone;
    }
    for (const ValueRef session : *sessions) {
        console.out << jsonText(session) << '\n';
    }
    return kDone;
}

} // namespace vela
