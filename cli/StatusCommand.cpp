// velactl status
#include "cli/ServiceConnection.h"
#include "cli/Subcommand.h"
#include "cli/TextTable.h"
#include "common/CommandOptions.h"
#include "common/DeliveryLedger.h"
#include "common/SettingValues.h"
#include "common/values/Dictionary.h"
#include "common/values/Json.h"

#include <algorithm>
#include <array>
#include <ostream>
#include <string>
#include <vector>

namespace vela {

namespace {

constexpr std::array<CommandOption, 2> kOptions{{{"--json"}, {"--ledger"}}};

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

std::string count(const Dictionary& account, std::string_view key) {
    return std::to_string(account.find(key).integerValue());
}

/// "3 (no_consumer 2, limit 1)"
std::string droppedCell(const Dictionary& account) {
    const ValueRef dropped = account.find("dropped");
    std::int64_t sum = 0;
    std::string reasons;
    if (dropped.isDictionary()) {
        const Dictionary numbers = dropped.dictionary();
        for (const auto& reason : numbers) {
            sum += reason.value.integerValue();
            reasons += (reasons.empty() ? " (" : ", ") + escapedText(std::string(reason.key.text())) + " " +
                       std::to_string(reason.value.integerValue());
        }
    }
    return std::to_string(sum) + (reasons.empty() ? "" : reasons + ")");
}

/// Rows of the back ends in `accounts`, each behind the cells `first`.
void addAccounts(TextTable& table, const std::vector<std::string>& first, const Dictionary& accounts) {
    for (const auto& backend : accounts) {
        if (!backend.value.isDictionary()) {
            continue;
        }
        const Dictionary account = backend.value.dictionary();
        std::vector<std::string> cells = first;
        cells.insert(cells.end(), {escapedText(std::string(backend.key.text())), count(account, "received"),
                                   count(account, "delivered"), count(account, "queued"), count(account, "redundant"),
                                   droppedCell(account)});
        table.add(std::move(cells));
    }
}

const std::vector<std::string> kAccountHeadings{"BACKEND", "RECEIVED", "DELIVERED", "QUEUED", "REDUNDANT", "DROPPED"};

void printTotals(const Dictionary& ledger, Console& console) {
    const ValueRef totals = ledger.find("totals");
    if (!totals.isDictionary() || totals.dictionary().empty()) {
        console.out << "Nothing was received for delivery yet\n";
        return;
    }
    TextTable table(kAccountHeadings);
    addAccounts(table, {}, totals.dictionary());
    console.out << '\n';
    table.print(console.out, console.colour);
}

void printEntries(const Dictionary& ledger, Console& console) {
    std::vector<std::string> headings{"CLIENT", "SESSION"};
    headings.insert(headings.end(), kAccountHeadings.begin(), kAccountHeadings.end());
    TextTable table(headings);
    const ValueRef entries = ledger.find("entries");
    if (!entries.isArray()) {
        return;
    }
    const Array list = entries.array();
    for (const ValueRef entry : list) {
        const Dictionary accounts = entry.dictionary();
        const bool earlier = accounts.find("client").integerValue() == kEarlierClient;
        addAccounts(table,
                    {earlier ? "earlier" : count(accounts, "client"), earlier ? "-" : count(accounts, "session")},
                    accounts);
    }
    console.out << '\n';
    table.print(console.out, console.colour);
}

void printText(const Status& status, bool entries, Console& console) {
    console.out << "vela-reportingd " << escapedText(status.version) << " is running\n"
                << status.sessions << (status.sessions == 1 ? " session, " : " sessions, ") << status.started
                << " started\n";
    printTotals(status.ledger, console);
    if (entries) {
        printEntries(status.ledger, console);
    }
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
    if (read->has("--json")) {
        printJson(*status, console);
    } else {
        printText(*status, read->has("--ledger"), console);
    }
    return kDone;
}

} // namespace vela
