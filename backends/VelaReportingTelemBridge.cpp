#include "backends/VelaReportingTelemBridge.h"

#include "backends/AudioIssueDetected.h"
#include "common/VelaReportingLogCategories.h"
#include "common/VelaReportingVocabulary.h"

#include <algorithm>
#include <charconv>
#include <limits>
#include <string>
#include <string_view>
#include <system_error>

namespace vela {

namespace {

using telemmetrics::AudioIssueDetected;
using telemmetrics::RecordDictionaryFormatter;
using telemmetrics::RecordWriter;

constexpr std::uint32_t kMetricIdentifier = 0x5B0003;

const Key kIssueType("issue_type");
const Key kRtaidClient("rtaid_client");
const Key kNode("node");
const Key kSilenceSeconds("any_channel_silence_seconds");

/// The whole number at the start of a text, behind white space and a sign; 0 where there is none, the end of the range
/// beyond it.
std::int64_t leadingInteger(std::string_view text) {
    text.remove_prefix(std::min(text.find_first_not_of(" \t\n\v\f\r"), text.size()));
    const bool negative = text.starts_with('-');
    if (text.starts_with('+') && !text.starts_with("+-")) {
        text.remove_prefix(1);
    }
    std::int64_t number = 0;
    const std::errc error = std::from_chars(text.data(), text.data() + text.size(), number).ec;
    if (error == std::errc::result_out_of_range) {
        return negative ? std::numeric_limits<std::int64_t>::min() : std::numeric_limits<std::int64_t>::max();
    }
    return error == std::errc() ? number : 0;
}

/// The value of a key that a record wants; its absence is logged.
ValueRef wanted(const Dictionary& message, const Key& key) {
    const ValueRef value = message.find(key);
    if (!value) {
        VelaReportingTelemLogCategory().error("Failed to get %@ for AudioIssueDetected", key);
    }
    return value;
}

void storeText(const Dictionary& message, const Key& key, std::string& field) {
    if (const ValueRef value = wanted(message, key)) {
        field = textualForm(value);
    }
}

void storeInteger(const Dictionary& message, const Key& key, std::int32_t& field) {
    if (const ValueRef value = wanted(message, key)) {
        const std::int64_t number = value.isString() ? leadingInteger(value.text()) : value.integerValue();
        field = static_cast<std::int32_t>(static_cast<std::uint32_t>(number)); // the lower half
    }
}

} // namespace

void VelaReportingTelemBridge::handleEvent(const Dictionary& message, std::uint32_t /*category*/, std::uint32_t type,
                                           const std::shared_ptr<VelaReportingSession>& /*session*/) {
    if (type != AudioEventTypeIssueDetector) {
        return;
    }
    AudioIssueDetected record;
    storeText(message, kIssueType, record.issuetype);
    storeText(message, kRtaidClient, record.rtaidclient);
    storeText(message, kNode, record.node);
    storeInteger(message, kSilenceSeconds, record.duration);

    RecordWriter writer;
    record.writeTo(writer);
    RecordDictionaryFormatter formatter;
    record.formatText(formatter, "AudioIssueDetected");
    telem_.telemPostMetric(kMetricIdentifier, writer.bytes(), formatter.fields());
}

} // namespace vela
