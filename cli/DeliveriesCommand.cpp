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
#include <charconv>
#include <optional>
#include <ostream>

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
/// How long a change may go unseen while nothing is committed: the end of the wait only looks again.
constexpr std::chrono::milliseconds kFollowWait{1000};

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

void printTable(const std::vector<StoredDelivery>& deliveries, Console& console) {
    const platform::LinuxClock clock;
    TextTable table({"SEQ", "TIME", "BACKEND", "OPERATION", "SESSION", "KIND", "NAME", "PAYLOAD"});
    for (const StoredDelivery& delivery : deliveries) {
        const bool mark =
            delivery.backend == "beacon" && delivery.operation != "send" && delivery.operation != "send_one";
        table.add({std::to_string(delivery.seq), localTimeText(delivery.time, clock), delivery.backend,
                   delivery.operation, numberCell(delivery.session), kindCell(delivery),
                   delivery.name ? escapedText(*delivery.name) : "-", payloadCell(delivery.payload)},
                  mark);
    }
    table.print(console.out, console.colour);
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

/// Prints all that is there, and with `follow` what comes, until the reader of the output is gone.
int print(StoreReader& reader, StoreFilter filter, const CommandArguments& arguments, Console& console) {
    const bool json = arguments.has("--json");
    const bool follow = arguments.has("--follow");
    bool printed = false;
    for (;;) {
        const auto page = reader.read(filter);
        if (!page) {
            return fail(page.failure(), console);
        }
        if (!page->empty()) {
            printed = true;
            filter.after = page->back().seq;
            if (json) {
                for (const StoredDelivery& delivery : *page) {
                    printJson(delivery, console.out);
                }
            } else {
                printTable(*page, console);
            }
            console.out.flush();
            if (!console.out) {
                return kFailed;
            }
            continue;
        }
        if (!follow) {
            if (!printed && !json) {
                console.out << "No deliveries\n";
            }
            return kDone;
        }
        if (const auto changed = reader.waitForChange(kFollowWait); !changed) {
            return fail(changed.failure(), console);
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
    auto opened = StoreReader::open(loaded->reading.settings->store.path);
    if (!opened) {
        return fail(opened.failure(), console);
    }
    StoreReader reader = *std::move(opened);
    return print(reader, filter, *given, console);
}

} // namespace vela
