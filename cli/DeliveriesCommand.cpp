// velactl deliveries
#include "cli/SettingsArguments.h"
#include "cli/Subcommand.h"
#include "cli/TextTable.h"
#include "cli/TimeArgument.h"
#include "common/CommandOptions.h"
#include "common/SettingValues.h"
#include "common/VelaReportingUtility.h"
#include "common/values/Dictionary.h"
#include "common/values/Json.h"
#include "platform/linux/LinuxClock.h"
#include "platform/sqlite/StoreReader.h"

#include <array>
#include <cerrno>
#include <charconv>
#include <filesystem>
#include <optional>
#include <ostream>
#include <system_error>

namespace vela {

namespace {

using platform::StoredDelivery;
using platform::StoreFilter;
using platform::StoreReader;

constexpr std::array<CommandOption, 7> kOptions{{{"--backend", true},
                                                 {"--session", true},
                                                 {"--since", true},
                                                 {"--follow"},
                                                 {"--json"},
                                                 {"--settings", true},
                                                 {"--set", true}}};

/// A payload in the table; --json prints it whole.
constexpr std::size_t kShownPayload = 80;
/// How long the output's reader may be gone unseen while nothing is committed.
constexpr std::chrono::milliseconds kFollowWait{200};

std::string numberCell(const std::optional<std::int64_t>& number) { return number ? std::to_string(*number) : "-"; }

/// JSON has no bytes that could break a line or a terminal.
std::string payloadCell(const std::string& payload) {
    if (payload.size() <= kShownPayload) {
        return payload;
    }
    std::size_t end = kShownPayload;
    while (end > 0 && (static_cast<unsigned char>(payload[end]) & 0xC0U) == 0x80U) {
        --end; // not inside a character
    }
    return payload.substr(0, end) + "...";
}

/// "Playback/Start": what the message is about.
std::string kindCell(const StoredDelivery& delivery) {
    if (!delivery.category || !delivery.type) {
        return "-";
    }
    return VelaReportingUtilityCategoryString(static_cast<std::uint32_t>(*delivery.category)) + "/" +
           std::string(VelaReportingUtilityTypeString(static_cast<std::uint32_t>(*delivery.type)));
}

TextTable makeTable() {
    return TextTable({"SEQ", "TIME", "BACKEND", "OPERATION", "SESSION", "KIND", "NAME", "PAYLOAD"});
}

void addRow(const StoredDelivery& delivery, TextTable& table) {
    const bool mark = delivery.backend == "beacon" && delivery.operation != "send" && delivery.operation != "send_one";
    table.add({std::to_string(delivery.seq), localTimeText(delivery.time, platform::LinuxClock()), delivery.backend,
               delivery.operation, numberCell(delivery.session), kindCell(delivery),
               delivery.name ? escapedText(*delivery.name) : "-", payloadCell(delivery.payload)},
              mark);
}

void printJson(const StoredDelivery& delivery, std::ostream& out) {
    DictionaryBuilder line;
    const auto addNumber = [&line](std::string_view key, const std::optional<std::int64_t>& number) {
        if (number) {
            line.add(key, *number);
        }
    };
    line.add("seq", delivery.seq);
    line.add("time", delivery.time);
    line.add("backend", std::string_view(delivery.backend));
    line.add("operation", std::string_view(delivery.operation));
    if (delivery.name) {
        line.add("name", std::string_view(*delivery.name));
    }
    addNumber("session_id", delivery.session);
    addNumber("category", delivery.category);
    addNumber("type", delivery.type);
    addNumber("metric_id", delivery.metricID);
    if (delivery.record) {
        line.add("record", Data(*delivery.record));
    }
    std::string text = jsonText(Value(line.build()));
    // The payload is JSON already.
    text.pop_back();
    out << text << ",\"payload\":" << delivery.payload << "}\n";
}

std::optional<std::string> readFilter(const CommandArguments& arguments, StoreFilter& filter) {
    for (const std::string& text : arguments.valuesOf("--backend")) {
        filter.backend = backendNamed(text);
        if (!filter.backend) {
            return "there is no back end " + quotedText(text) + ", but beacon, tally, joule, telem and malady";
        }
    }
    for (const std::string& text : arguments.valuesOf("--session")) {
        std::int64_t number = 0;
        const auto [end, error] = std::from_chars(text.data(), text.data() + text.size(), number);
        if (error != std::errc() || end != text.data() + text.size()) {
            return quotedText(text) + " is no reporter ID";
        }
        filter.session = number;
    }
    for (const std::string& text : arguments.valuesOf("--since")) {
        filter.since = readTime(text, platform::LinuxClock());
        if (!filter.since) {
            return quotedText(text) +
                   " is no time: 90s, 10m, 2h, 3d (ago), 2026-11-21, 2026-11-21T09:30 or seconds since 1970";
        }
    }
    return std::nullopt;
}

int fail(const platform::Failure& failure, Console& console) {
    console.error << "velactl: " << escapedText(failure.description) << '\n';
    return kFailed;
}

/// The deliveries on the console, page by page.
class DeliveryPrinter {
public:
    DeliveryPrinter(bool json, Console& console) : json_(json), console_(console) {}

    /// False when the output cannot be written.
    bool print(const std::vector<StoredDelivery>& page) {
        for (const StoredDelivery& delivery : page) {
            if (json_) {
                printJson(delivery, console_.out);
            } else {
                addRow(delivery, table_);
            }
        }
        if (!json_) {
            table_.printPage(console_.out, console_.colour);
        }
        hasPrinted_ = true;
        console_.out.flush();
        return static_cast<bool>(console_.out);
    }
    void finish() {
        if (!hasPrinted_ && !json_) {
            console_.out << "No deliveries\n";
        }
    }

private:
    const bool json_;
    Console& console_;
    TextTable table_ = makeTable();
    bool hasPrinted_ = false;
};

/// Waits until something is committed. False when nobody reads the output any more.
platform::Result<bool> waitForMore(StoreReader& reader, const Console& console) {
    while (!console.isReaderGone || !console.isReaderGone()) {
        platform::Result<bool> changed = reader.waitForChange(kFollowWait);
        if (!changed || *changed) {
            return changed;
        }
    }
    return false;
}

/// Prints all that is there, and with `follow` what comes, until the reader of the output is gone.
int print(StoreReader& reader, StoreFilter filter, const CommandArguments& arguments, Console& console) {
    const bool follow = arguments.has("--follow");
    DeliveryPrinter printer(arguments.has("--json"), console);
    for (;;) {
        const auto page = reader.read(filter);
        if (!page) {
            return fail(page.failure(), console);
        }
        if (!page->empty()) {
            filter.after = page->back().seq;
            if (!printer.print(*page)) {
                return kFailed;
            }
            continue;
        }
        if (!follow) {
            printer.finish();
            return kDone;
        }
        const platform::Result<bool> more = waitForMore(reader, console);
        if (!more) {
            return fail(more.failure(), console);
        }
        if (!*more) {
            return kDone;
        }
    }
}

} // namespace

int runDeliveries(std::span<const std::string_view> arguments, Console& console) {
    const platform::Result<CommandArguments> given = readArguments(arguments, kOptions);
    if (!given || !given->operands.empty()) {
        return refuseUsage("deliveries", given ? "it takes no operands" : given.failure().description, console);
    }
    StoreFilter filter;
    if (const auto fault = readFilter(*given, filter)) {
        return refuseUsage("deliveries", *fault, console);
    }
    const auto loaded = loadSettingsOf(*given, console);
    if (!loaded) {
        return kFailed;
    }
    const std::string& path = loaded->reading.settings->store.path;
    std::error_code ignored;
    if (std::filesystem::is_directory(path, ignored)) {
        return fail({EISDIR, path + " is a folder and no store"}, console);
    }
    auto opened = StoreReader::open(path);
    if (!opened) {
        return fail(opened.failure(), console);
    }
    StoreReader reader = *std::move(opened);
    return print(reader, filter, *given, console);
}

} // namespace vela
