// velactl drivers
#include "cli/SettingsArguments.h"
#include "cli/Subcommand.h"
#include "cli/TextTable.h"
#include "cli/TimeArgument.h"
#include "common/CommandOptions.h"
#include "common/SettingValues.h"
#include "common/values/Dictionary.h"
#include "common/values/Json.h"
#include "platform/hwstats/LinuxHwStats.h"
#include "platform/linux/LinuxClock.h"

#include <array>
#include <charconv>
#include <chrono>
#include <iomanip>
#include <memory>
#include <optional>
#include <ostream>
#include <sstream>
#include <system_error>
#include <thread>
#include <utility>
#include <vector>

namespace vela {

namespace {

using platform::HwStatsChannel;
using platform::HwStatsFormat;
using platform::HwStatsGroup;
using platform::HwStatsSamples;
using platform::LinuxHwStats;

constexpr std::array<CommandOption, 5> kOptions{
    {{"--settings", true}, {"--set", true}, {"--json"}, {"--watch"}, {"--count", true}}};

constexpr std::chrono::seconds kWatchInterval{1};

constexpr std::array<std::string_view, 5> kFormatNames{"none", "counter", "state", "histogram", "array"};

std::string_view formatName(const HwStatsChannel& channel) {
    return channel.format < kFormatNames.size() ? kFormatNames[channel.format] : "unknown";
}

std::string cell(const std::optional<std::string>& text) { return text ? escapedText(*text) : "-"; }

std::string groupCell(const std::optional<std::string>& group, const std::optional<std::string>& subGroup) {
    return subGroup ? cell(group) + "/" + escapedText(*subGroup) : cell(group);
}

/// "7 values, 1 to 9 us: 0-10:3 10-20:4".
std::string histogramCell(const HwStatsChannel& channel) {
    std::int64_t values = 0;
    std::string buckets;
    for (const platform::HwStatsBucket& bucket : channel.buckets) {
        // What publishers say may be anything, so it is added without a sign.
        values =
            static_cast<std::int64_t>(static_cast<std::uint64_t>(values) + static_cast<std::uint64_t>(bucket.hits));
        if (bucket.hits != 0) {
            buckets += " " + std::to_string(bucket.lower) + "-" + std::to_string(bucket.upper) + ":" +
                       std::to_string(bucket.hits);
        }
    }
    if (buckets.empty()) {
        return "no values";
    }
    return std::to_string(values) + " values, " + std::to_string(channel.histogramMin) + " to " +
           std::to_string(channel.histogramMax) + (channel.unitLabel ? " " + escapedText(*channel.unitLabel) : "") +
           ":" + buckets;
}

/// "idle 2x 40.000 ms 25.0 %, running 1x 120.000 ms 75.0 %": the states that were ever entered.
std::string stateCell(const HwStatsChannel& channel) {
    constexpr double kNanosecondsPerMillisecond = 1e6;
    constexpr double kPerCent = 100;
    std::ostringstream text;
    text << std::fixed;
    for (const platform::HwStatsState& state : channel.states) {
        if (state.residency != 0 || state.inTransitions != 0) {
            text << (text.tellp() > 0 ? ", " : "") << escapedText(state.name) << ' ' << state.inTransitions << "x "
                 << std::setprecision(3) << static_cast<double>(state.residency) / kNanosecondsPerMillisecond << " ms "
                 << std::setprecision(1) << state.dutyCycle * kPerCent << " %";
        }
    }
    return text.tellp() > 0 ? text.str() : "no state";
}

std::string valueCell(const HwStatsChannel& channel) {
    switch (static_cast<HwStatsFormat>(channel.format)) {
    case HwStatsFormat::Histogram:
        return histogramCell(channel);
    case HwStatsFormat::State:
        return stateCell(channel);
    default:
        return std::to_string(channel.simpleValue);
    }
}

bool hasChanged(const HwStatsChannel& channel) {
    for (const platform::HwStatsBucket& bucket : channel.buckets) {
        if (bucket.hits != 0) {
            return true;
        }
    }
    for (const platform::HwStatsState& state : channel.states) {
        if (state.residency != 0 || state.inTransitions != 0) {
            return true;
        }
    }
    return channel.simpleValue != 0;
}

Array bucketsOf(const HwStatsChannel& channel) {
    ArrayBuilder buckets;
    for (const platform::HwStatsBucket& bucket : channel.buckets) {
        buckets.add(Dictionary{{"lower", bucket.lower}, {"upper", bucket.upper}, {"hits", bucket.hits}});
    }
    return buckets.build();
}

Array statesOf(const HwStatsChannel& channel) {
    ArrayBuilder states;
    for (const platform::HwStatsState& state : channel.states) {
        states.add(Dictionary{{"name", std::string_view(state.name)},
                              {"transitions", state.inTransitions},
                              {"residency", state.residency},
                              {"duty_cycle", state.dutyCycle}});
    }
    return states.build();
}

void printJson(const HwStatsChannel& channel, std::optional<double> time, std::ostream& out) {
    DictionaryBuilder line;
    const auto addText = [&line](std::string_view key, const std::optional<std::string>& text) {
        if (text) {
            line.add(key, std::string_view(*text));
        }
    };
    if (time) {
        line.add("time", *time);
    }
    addText("group", channel.group);
    addText("subgroup", channel.subGroup);
    addText("driver", channel.driverName);
    addText("channel", channel.channelName);
    addText("unit", channel.unitLabel);
    line.add("format", formatName(channel));
    switch (static_cast<HwStatsFormat>(channel.format)) {
    case HwStatsFormat::Histogram:
        line.add("least", channel.histogramMin);
        line.add("greatest", channel.histogramMax);
        line.add("buckets", bucketsOf(channel));
        break;
    case HwStatsFormat::State:
        line.add("states", statesOf(channel));
        break;
    default:
        line.add("value", channel.simpleValue);
        break;
    }
    out << jsonText(Value(line.build())) << '\n';
}

/// The service's groups, as a person watches them.
class Drivers {
public:
    Drivers(const Settings& settings, bool json, Console& console)
        : options_(optionsFor(settings)),
          hwStats_(options_, clock_),
          json_(json),
          console_(console) {
        for (const HwStatsGroup& group : options_.groups) {
            const auto channels = hwStats_.copyChannelsInGroup(group.name.group, group.name.subGroup);
            subscriptions_.push_back(hwStats_.createSubscription(*channels.thing));
        }
    }

    /// Whether something was left out, which standard error says.
    bool hasFaults() const { return hasFaults_; }

    /// Prints what there is.
    void list() {
        const std::vector<SamplesOfGroup> samples = sample();
        TextTable table = makeTable();
        for (std::size_t i = 0; i < samples.size(); ++i) {
            const HwStatsGroup& group = options_.groups[i];
            const std::size_t rows = addRows(samples[i], false, table);
            if (rows == 0) {
                table.add({groupCell(group.name.group, group.name.subGroup), "-", "-", "-",
                           group.sources.empty() ? "no source" : "no channels"},
                          true);
            }
        }
        print(table, samples.size());
    }

    /// Prints what changes in each interval, `count` times or without an end.
    void watch(std::optional<std::uint64_t> count) {
        std::vector<SamplesOfGroup> before = sample();
        auto next = std::chrono::steady_clock::now();
        for (std::uint64_t i = 0; (!count || i < *count) && console_.out; ++i) {
            next += kWatchInterval;
            std::this_thread::sleep_until(next);
            std::vector<SamplesOfGroup> now = sample();
            TextTable table = makeTable();
            std::size_t rows = 0;
            for (std::size_t group = 0; group < now.size(); ++group) {
                const auto changes = hwStats_.createSamplesDelta(before[group].get(), *now[group]);
                rows += changes.thing == nullptr ? 0 : addRows(changes.thing, true, table);
            }
            if (!json_) {
                console_.out << (i == 0 ? "" : "\n") << localTimeText(wallSeconds(), clock_)
                             << (rows == 0 ? "  no changes\n" : "\n");
            }
            print(table, rows);
            console_.out.flush();
            before = std::move(now);
        }
    }

private:
    using SamplesOfGroup = std::shared_ptr<const HwStatsSamples>;

    platform::LinuxHwStatsOptions optionsFor(const Settings& settings) {
        platform::LinuxHwStatsOptions options = platform::hwStatsOptionsOf(settings);
        options.complain = [this](const std::string& fault) { complain(fault); };
        return options;
    }

    void complain(const std::string& fault) {
        hasFaults_ = true;
        console_.error << "velactl: " << fault << '\n';
    }

    static TextTable makeTable() { return TextTable({"GROUP", "DRIVER", "CHANNEL", "FORMAT", "VALUE"}); }

    double wallSeconds() const { return std::chrono::duration<double>(clock_.now().time_since_epoch()).count(); }

    /// One for each group.
    std::vector<SamplesOfGroup> sample() {
        std::vector<SamplesOfGroup> samples;
        for (const auto& subscription : subscriptions_) {
            auto answer = hwStats_.createSamples(*subscription.subscription, *subscription.subscribed);
            if (answer.error && !std::exchange(isFolderTold_, true)) {
                const std::error_code reason(static_cast<int>(answer.error->code), std::system_category());
                complain(escapedText(options_.channelFolder) + ": cannot be read: " + reason.message());
            }
            samples.push_back(std::move(answer.thing));
        }
        return samples;
    }

    /// Prints JSON at once. Answers how many channels there were.
    std::size_t addRows(const SamplesOfGroup& samples, bool changesOnly, TextTable& table) {
        std::size_t rows = 0;
        hwStats_.iterate(*samples, [&](const HwStatsChannel& channel) {
            if (changesOnly && !hasChanged(channel)) {
                return 0;
            }
            ++rows;
            if (json_) {
                printJson(channel, changesOnly ? std::optional(wallSeconds()) : std::nullopt, console_.out);
            } else {
                table.add({groupCell(channel.group, channel.subGroup), cell(channel.driverName),
                           cell(channel.channelName), std::string(formatName(channel)), valueCell(channel)},
                          !hasChanged(channel));
            }
            return 0;
        });
        return rows;
    }

    void print(const TextTable& table, std::size_t rows) {
        if (!json_ && rows > 0) {
            table.print(console_.out, console_.colour);
        }
    }

    const platform::LinuxClock clock_;
    const platform::LinuxHwStatsOptions options_;
    LinuxHwStats hwStats_;
    const bool json_;
    Console& console_;
    std::vector<platform::HwStats::SubscriptionAnswer> subscriptions_; ///< one for each group
    bool isFolderTold_ = false;
    bool hasFaults_ = false;
};

/// The number of `--count`, none without one; a reason in `fault` where it cannot be.
std::optional<std::uint64_t> countOf(const CommandArguments& arguments, std::string& fault) {
    const std::vector<std::string> texts = arguments.valuesOf("--count");
    if (texts.empty()) {
        return std::nullopt;
    }
    std::uint64_t count = 0;
    const std::string& text = texts.back();
    const auto [end, error] = std::from_chars(text.data(), text.data() + text.size(), count);
    if (error != std::errc() || end != text.data() + text.size() || count == 0) {
        fault = quotedText(text) + " is no number of times";
    } else if (!arguments.has("--watch")) {
        fault = "--count goes with --watch";
    }
    return count;
}

} // namespace

int runDrivers(std::span<const std::string_view> arguments, Console& console) {
    const platform::Result<CommandArguments> read = readArguments(arguments, kOptions);
    if (!read) {
        return refuseUsage("drivers", read.failure().description, console);
    }
    std::string fault = read->operands.empty() ? "" : "it takes no operands";
    const std::optional<std::uint64_t> count = countOf(*read, fault);
    if (!fault.empty()) {
        return refuseUsage("drivers", fault, console);
    }
    const std::optional<platform::LoadedSettings> loaded = loadSettingsOf(*read, console);
    if (!loaded) {
        return kFailed;
    }
    Drivers drivers(*loaded->reading.settings, read->has("--json"), console);
    if (read->has("--watch")) {
        drivers.watch(count);
    } else {
        drivers.list();
    }
    return drivers.hasFaults() ? kFailed : kDone;
}

} // namespace vela
