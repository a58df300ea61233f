#include "driverstats/VelaReportingDriverStatistics.h"

#include <algorithm>
#include <charconv>
#include <cstddef>
#include <cstdint>
#include <iterator>
#include <limits>
#include <optional>
#include <vector>

namespace vela {

namespace {

using platform::HwStatsBucket;
using platform::HwStatsChannel;
using platform::HwStatsFormat;
using platform::HwStatsState;

// Made without the format texts of common/: a stop of a session formats thousands of these.

template <class Integer>
void appendInteger(std::string& text, Integer integer) {
    char digits[std::numeric_limits<Integer>::digits10 + 2];
    text.append(digits, std::to_chars(digits, digits + sizeof(digits), integer).ptr);
}

/// With six decimals and a point, whatever the locale.
void appendReal(std::string& text, double number) {
    constexpr int kDecimals = 6;
    // Sign, the digits of the greatest number, point, decimals.
    char digits[1 + std::numeric_limits<double>::max_exponent10 + 1 + 1 + kDecimals];
    text.append(digits,
                std::to_chars(digits, digits + sizeof(digits), number, std::chars_format::fixed, kDecimals).ptr);
}

void appendWithoutUnderscoresAndSpaces(std::string& text, std::string_view part) {
    std::copy_if(part.begin(), part.end(), std::back_inserter(text),
                 [](char character) { return character != '_' && character != ' '; });
}

void appendPart(std::string& key, const std::optional<std::string>& part) {
    if (part) {
        appendWithoutUnderscoresAndSpaces(key, *part);
        key += '_';
    }
}

void appendBucket(std::string& text, std::int64_t lower, std::int64_t upper, std::int64_t hits) {
    appendInteger(text, lower);
    text += '-';
    appendInteger(text, upper);
    text += ':';
    appendInteger(text, hits);
    text += ';';
}

struct Bounds {
    std::int64_t lower = 0;
    std::int64_t upper = 0;
};

/// Appends the buckets with hits, each with a ";" behind it. The answer spans all buckets, those without hits too, and
/// 0: it begins there, which is wanted.
Bounds appendBuckets(std::string& text, const std::vector<HwStatsBucket>& buckets) {
    Bounds all;
    Bounds own; // kept from the bucket before where a bucket does not know its own
    for (const HwStatsBucket& bucket : buckets) {
        if (bucket.boundsFailure == 0) {
            own = {bucket.lower, bucket.upper};
        } else {
            driverLog().info("Error in getting the bucket bounds : %d", bucket.boundsFailure);
        }
        all = {std::min(all.lower, own.lower), std::max(all.upper, own.upper)};
        if (bucket.hits != 0) {
            appendBucket(text, own.lower, own.upper, bucket.hits);
        }
    }
    return all;
}

std::string histogramHead(const HwStatsChannel& channel, Bounds bounds) {
    std::string text = "count=";
    appendInteger(text, static_cast<std::int32_t>(channel.buckets.size()));
    text += ",lower=";
    appendInteger(text, bounds.lower);
    text += ",upper=";
    appendInteger(text, bounds.upper);
    text += ",min=";
    appendInteger(text, channel.histogramMin);
    text += ",max=";
    appendInteger(text, channel.histogramMax);
    text += ",unit=";
    text += channel.unitLabel ? std::string_view(*channel.unitLabel) : "(null)";
    text += "::";
    return text;
}

void appendState(std::string& text, const HwStatsState& state) {
    text += "name:";
    text += state.name;
    text += ",transition:";
    appendInteger(text, state.inTransitions);
    text += ",residency:";
    appendInteger(text, state.residency);
    text += ",duty_cycle:";
    appendReal(text, state.dutyCycle);
    text += ';';
}

} // namespace

void processChannel(const HwStatsChannel& channel, VelaReportingDriverStatistics& statistics) {
    switch (static_cast<HwStatsFormat>(channel.format)) {
    case HwStatsFormat::Simple:
        processSimpleData(channel, statistics.simple);
        break;
    case HwStatsFormat::State:
        processStateData(channel, statistics.state);
        break;
    case HwStatsFormat::Histogram:
        processHistogramData(channel, statistics.histogram);
        break;
    case HwStatsFormat::None:
    case HwStatsFormat::SimpleArray:
        driverLog().debug("Dropping sample of type : %hhu for group : %@ subgroup : %@", channel.format, channel.group,
                          channel.subGroup);
        break;
    default:
        driverLog().error("The HwStatsingFormat %hhu is not supported group : %@ subgroup : %@", channel.format,
                          channel.group, channel.subGroup);
        break;
    }
}

void processSimpleData(const HwStatsChannel& channel, DictionaryBuilder& driverStats) {
    if (channel.simpleValue >= 1) {
        driverStats.add(getDriverStatsKey(channel, "Simple"), channel.simpleValue);
    }
}

void processHistogramData(const HwStatsChannel& channel, DictionaryBuilder& driverStats) {
    std::string buckets;
    const Bounds bounds = appendBuckets(buckets, channel.buckets);
    if (buckets.empty()) {
        return;
    }
    buckets.pop_back();
    driverStats.add(getDriverStatsKey(channel, "Histogram"),
                    std::string_view(histogramHead(channel, bounds).append(buckets)));
}

void processStateData(const HwStatsChannel& channel, DictionaryBuilder& driverStats) {
    std::string text;
    for (const HwStatsState& state : channel.states) {
        if (state.residency != 0) {
            appendState(text, state);
        }
    }
    driverLog().debug("the current reported data is : %@", text);
    // Unlike a histogram's text this one keeps its last ";" and is added when it is empty. Both are wanted.
    driverStats.add(getDriverStatsKey(channel, "State"), std::string_view(text));
}

std::string getDriverStatsKey(const HwStatsChannel& channel, std::string_view type) {
    std::string key;
    if (channel.driverName) {
        appendWithoutUnderscoresAndSpaces(
            key, std::string_view(*channel.driverName).substr(0, channel.driverName->find('<')));
        key += '_';
    }
    appendPart(key, channel.group);
    appendPart(key, channel.subGroup);
    key.append(type) += '_';
    if (channel.channelName) {
        appendWithoutUnderscoresAndSpaces(key, *channel.channelName);
    }
    return key;
}

} // namespace vela
