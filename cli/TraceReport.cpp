#include "cli/TraceReport.h"

#include "cli/JsonReading.h"
#include "common/SettingValues.h"
#include "common/values/Dictionary.h"

#include <algorithm>
#include <array>
#include <charconv>
#include <cmath>
#include <istream>
#include <map>
#include <numeric>
#include <utility>

namespace vela {

namespace {

constexpr std::uint64_t kVersion = 4;
constexpr std::string_view kLostEventsName = "lost events";
constexpr std::string_view kLostEventsUnit = "events";

using platform::Failure;
using platform::Result;

/// One line as a dictionary.
Result<Dictionary> readLine(const std::string& text) {
    const Result<Value> value = readJson(text);
    if (!value) {
        return value.failure();
    }
    if (!value->ref().isDictionary()) {
        return Failure{0, "a line is one JSON object"};
    }
    return value->ref().dictionary();
}

Result<platform::Done> checkHeading(const Dictionary& line) {
    const ValueRef format = line.find("format");
    const ValueRef version = line.find("version");
    if (!format.isString() || format.text() != "metricsheet" || !version.isNumber()) {
        return Failure{0, "no trace results: the first line must name the format metricsheet and its version"};
    }
    if (version.doubleValue() != static_cast<double>(kVersion)) {
        return Failure{0, "its version is not " + std::to_string(kVersion)};
    }
    return platform::Done();
}

class Reader {
public:
    Result<platform::Done> addValue(const Dictionary& line) {
        const ValueRef name = line.find("name");
        const ValueRef value = line.find("value");
        const ValueRef unit = line.find("unit");
        if (!name.isString() || !value.isNumber() || !unit.isString()) {
            return Failure{0, "a value is an object with a name, a number as its value, and a unit"};
        }
        if (name.text() == kLostEventsName && unit.text() == kLostEventsUnit) {
            file_.lostEvents += value.doubleValue();
            return platform::Done();
        }
        const auto [place, isNew] =
            places_.try_emplace({std::string(name.text()), std::string(unit.text())}, file_.intervals.size());
        if (isNew) {
            file_.intervals.push_back({place->first.first, place->first.second, {}});
        }
        file_.intervals[place->second].values.push_back(value.doubleValue());
        return platform::Done();
    }

    TraceResultsFile take() { return std::move(file_); }

private:
    TraceResultsFile file_;
    std::map<std::pair<std::string, std::string>, std::size_t> places_; ///< of name and unit
};

Failure at(std::size_t line, const Failure& failure) {
    return Failure{failure.code, std::to_string(line) + ": " + failure.description};
}

} // namespace

Result<TraceResultsFile> readTraceResults(std::istream& in) {
    Reader reader;
    std::string text;
    std::size_t number = 0;
    while (std::getline(in, text)) {
        ++number;
        const Result<Dictionary> line = readLine(text);
        if (!line) {
            return at(number, line.failure());
        }
        const Result<platform::Done> taken = number == 1 ? checkHeading(*line) : reader.addValue(*line);
        if (!taken) {
            return at(number, taken.failure());
        }
    }
    if (in.bad() || number == 0) {
        return at(number + 1, Failure{0, in.bad() ? "cannot be read" : "it is empty"});
    }
    return reader.take();
}

TraceSummary summarize(std::vector<double> values) {
    std::ranges::sort(values);
    const std::size_t count = values.size();
    const double middle = values[count / 2];
    const double median = count % 2 == 1 ? middle : std::midpoint(values[count / 2 - 1], middle);
    // The 99th of 100, the last of fewer.
    const std::size_t rank = (99 * count + 99) / 100;
    return {count, values.front(), median, values[rank - 1], values.back()};
}

std::vector<TraceBucket> histogramOf(const std::vector<double>& values) {
    constexpr std::size_t kBuckets = 10;
    constexpr double kRatio = 10;
    const auto [least, greatest] = std::ranges::minmax(values);
    if (least == greatest) {
        return {{least, greatest, values.size()}};
    }
    const double ratio = least > 0 ? greatest / least : 0;
    const bool byRatio = ratio >= kRatio && std::isfinite(ratio);
    std::vector<TraceBucket> buckets(kBuckets);
    for (std::size_t i = 0; i < kBuckets; ++i) {
        const double part = static_cast<double>(i + 1) / kBuckets;
        buckets[i].from = i == 0 ? least : buckets[i - 1].to;
        buckets[i].to = byRatio ? least * std::pow(ratio, part) : std::lerp(least, greatest, part);
    }
    buckets.back().to = greatest;
    for (const double value : values) {
        const auto found = std::ranges::upper_bound(buckets, value, {}, &TraceBucket::to);
        ++(found == buckets.end() ? buckets.back() : *found).count;
    }
    return buckets;
}

std::string durationText(double nanoseconds) {
    struct Unit {
        double nanoseconds;
        const char* name;
    };
    constexpr std::array<Unit, 4> kUnits{{{1e9, " s"}, {1e6, " ms"}, {1e3, " us"}, {1, " ns"}}};
    const double size = std::abs(nanoseconds);
    // What would be rounded up to 1000 of a unit is 1 of the next.
    constexpr double kAlmost = 0.9995;
    const Unit* const unit =
        std::ranges::find_if(kUnits, [size](const Unit& candidate) { return size >= candidate.nanoseconds * kAlmost; });
    const Unit& chosen = unit == kUnits.end() ? kUnits.back() : *unit;
    const double number = nanoseconds / chosen.nanoseconds;
    const double whole = std::abs(number);
    const int decimals = whole < 10 ? 2 : (whole < 100 ? 1 : 0);
    std::array<char, 400> text{}; // the greatest double has 309 digits
    std::string digits(
        text.data(),
        std::to_chars(text.data(), text.data() + text.size(), number, std::chars_format::fixed, decimals).ptr);
    if (digits.find('.') != std::string::npos) {
        digits.erase(digits.find_last_not_of('0') + 1);
        if (digits.ends_with('.')) {
            digits.pop_back();
        }
    }
    return digits + chosen.name;
}

} // namespace vela
