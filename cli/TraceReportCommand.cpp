// velactl trace report
#include "cli/TextTable.h"
#include "cli/TraceCommand.h"
#include "cli/TraceReport.h"
#include "common/CommandOptions.h"
#include "common/SettingValues.h"
#include "common/values/Dictionary.h"
#include "common/values/Json.h"
#include "platform/Metricsheet.h"

#include <algorithm>
#include <array>
#include <cerrno>
#include <charconv>
#include <filesystem>
#include <fstream>
#include <istream>
#include <ostream>
#include <system_error>

namespace vela {

namespace {

constexpr std::array<CommandOption, 1> kReportOptions{{{"--json"}}};

std::string numberText(double number) {
    std::array<char, 40> digits{};
    return {digits.data(), std::to_chars(digits.data(), digits.data() + digits.size(), number).ptr};
}

/// A value of any unit: durations for a person, others as they are.
std::string valueText(double value, const std::string& unit) {
    return unit == platform::kMetricsheetUnitNanoseconds ? durationText(value)
                                                         : numberText(value) + " " + escapedText(unit);
}

void printTable(const TraceResultsFile& file, Console& console) {
    TextTable table({"INTERVAL", "COUNT", "MIN", "MEDIAN", "P99", "MAX"});
    for (const TraceValues& interval : file.intervals) {
        const TraceSummary summary = summarize(interval.values);
        std::vector<std::string> row{escapedText(interval.name), std::to_string(summary.count)};
        for (const double value : {summary.min, summary.median, summary.p99, summary.max}) {
            row.push_back(valueText(value, interval.unit));
        }
        table.add(std::move(row));
    }
    table.print(console.out, console.colour);
}

/// "       1 ns -   10 ns  ########## 12", a line for each bucket.
void printHistogram(const TraceValues& interval, Console& console) {
    constexpr std::size_t kBarColumns = 40;
    const std::vector<TraceBucket> buckets = histogramOf(interval.values);
    std::size_t most = 0;
    std::size_t fromColumns = 0;
    std::size_t toColumns = 0;
    for (const TraceBucket& bucket : buckets) {
        most = std::max(most, bucket.count);
        fromColumns = std::max(fromColumns, valueText(bucket.from, interval.unit).size());
        toColumns = std::max(toColumns, valueText(bucket.to, interval.unit).size());
    }
    console.out << '\n' << escapedText(interval.name) << '\n';
    for (const TraceBucket& bucket : buckets) {
        const std::string from = valueText(bucket.from, interval.unit);
        const std::string to = valueText(bucket.to, interval.unit);
        // A bucket that holds anything shows it.
        const std::size_t bar = (bucket.count * kBarColumns + most - 1) / most;
        console.out << "  " << std::string(fromColumns - from.size(), ' ') << from << " - "
                    << std::string(toColumns - to.size(), ' ') << to << "  " << std::string(bar, '#')
                    << (bar == 0 ? "" : " ") << bucket.count << '\n';
    }
}

void printReport(const TraceResultsFile& file, Console& console) {
    printTable(file, console);
    for (const TraceValues& interval : file.intervals) {
        printHistogram(interval, console);
    }
    if (file.lostEvents != 0) {
        console.out << '\n' << numberText(file.lostEvents) << " trace events were lost: intervals may be missing.\n";
    }
}

void printJson(const TraceResultsFile& file, std::ostream& out) {
    for (const TraceValues& interval : file.intervals) {
        const TraceSummary summary = summarize(interval.values);
        ArrayBuilder buckets;
        for (const TraceBucket& bucket : histogramOf(interval.values)) {
            buckets.add(Dictionary{{"from", bucket.from}, {"to", bucket.to}, {"count", bucket.count}});
        }
        out << jsonText(Value(Dictionary{{"name", std::string_view(interval.name)},
                                         {"unit", std::string_view(interval.unit)},
                                         {"count", summary.count},
                                         {"min", summary.min},
                                         {"median", summary.median},
                                         {"p99", summary.p99},
                                         {"max", summary.max},
                                         {"histogram", buckets.build()}}))
            << '\n';
    }
    if (file.lostEvents != 0) {
        out << jsonText(Value(Dictionary{{"lost_events", file.lostEvents}})) << '\n';
    }
}

/// Why the file cannot be opened, or 0. A folder could be, and not read.
int open(const std::string& name, std::ifstream& file) {
    std::error_code ignored;
    if (std::filesystem::is_directory(name, ignored)) {
        return EISDIR;
    }
    errno = 0;
    file.open(name);
    if (file) {
        return 0;
    }
    return errno != 0 ? errno : EIO;
}

} // namespace

int runTraceReport(std::span<const std::string_view> arguments, Console& console) {
    const platform::Result<CommandArguments> read = readArguments(arguments, kReportOptions);
    if (!read || read->operands.size() != 1) {
        return refuseUsage("trace", read ? "report takes one file" : read.failure().description, console);
    }
    const std::string& name = read->operands.front();
    std::ifstream opened;
    if (name != "-") {
        if (const int error = open(name, opened); error != 0) {
            console.error << "velactl: " << escapedText(name)
                          << " cannot be read: " << std::generic_category().message(error) << '\n';
            return kFailed;
        }
    }
    const platform::Result<TraceResultsFile> file = readTraceResults(name == "-" ? console.in : opened);
    if (!file) {
        console.error << "velactl: " << escapedText(name) << ':' << escapedText(file.failure().description) << '\n';
        return kFailed;
    }
    if (read->has("--json")) {
        printJson(*file, console.out);
    } else {
        printReport(*file, console);
    }
    return kDone;
}

} // namespace vela
