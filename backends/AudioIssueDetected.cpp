#include "backends/AudioIssueDetected.h"

#include <functional>
#include <utility>

namespace vela::telemmetrics {

namespace {

enum Field : std::uint32_t { FieldTimestamp = 1, FieldDuration, FieldIssuetype, FieldNode, FieldRtaidclient };

bool readText(RecordReader& reader, std::string& text) {
    const std::optional<std::string_view> bytes = reader.readBytes();
    if (bytes) {
        text = *bytes;
    }
    return bytes.has_value();
}

} // namespace

bool AudioIssueDetected::readFrom(RecordReader& reader) {
    while (reader.hasMore()) {
        const std::optional<Tag> tag = reader.readTag();
        if (!tag || tag->wireType == WireType::EndGroup) {
            break;
        }
        if (!readField(reader, *tag)) {
            return false;
        }
    }
    return !reader.hasError();
}

bool AudioIssueDetected::readField(RecordReader& reader, const Tag& tag) {
    switch (tag.field) {
    case FieldTimestamp:
        if (const std::optional<std::uint64_t> number = reader.readVarint()) {
            timestamp = *number;
            presence |= kTimestampPresent;
            return true;
        }
        return false;
    case FieldDuration:
        if (const std::optional<std::uint64_t> number = reader.readVarint()) {
            duration = static_cast<std::int32_t>(static_cast<std::uint32_t>(*number));
            return true;
        }
        return false;
    case FieldIssuetype:
        return readText(reader, issuetype);
    case FieldNode:
        return readText(reader, node);
    case FieldRtaidclient:
        return readText(reader, rtaidclient);
    default:
        return reader.skip(tag.wireType);
    }
}

void AudioIssueDetected::writeTo(RecordWriter& writer) const {
    if (hasTimestamp()) {
        writer.writeUnsigned(FieldTimestamp, timestamp);
    }
    writer.writeSigned(FieldDuration, duration);
    writer.writeBytes(FieldIssuetype, issuetype);
    writer.writeBytes(FieldNode, node);
    writer.writeBytes(FieldRtaidclient, rtaidclient);
}

void AudioIssueDetected::formatText(RecordTextFormatter& formatter, std::string_view name) const {
    formatter.beginObject(name);
    formatter.format("duration", duration);
    formatter.format("issuetype", std::string_view(issuetype));
    formatter.format("node", std::string_view(node));
    formatter.format("rtaidclient", std::string_view(rtaidclient));
    if (hasTimestamp()) {
        formatter.format("timestamp", timestamp);
    }
    formatter.endObject();
}

bool operator==(const AudioIssueDetected& left, const AudioIssueDetected& right) {
    if (left.hasTimestamp() != right.hasTimestamp()) {
        return false;
    }
    if (left.hasTimestamp() && left.timestamp != right.timestamp) {
        return false;
    }
    return left.duration == right.duration && left.issuetype == right.issuetype && left.node == right.node &&
           left.rtaidclient == right.rtaidclient;
}

void swap(AudioIssueDetected& left, AudioIssueDetected& right) noexcept {
    using std::swap;
    swap(left.issuetype, right.issuetype);
    swap(left.node, right.node);
    swap(left.rtaidclient, right.rtaidclient);
    swap(left.timestamp, right.timestamp);
    swap(left.duration, right.duration);
    swap(left.presence, right.presence);
}

std::size_t hash_value(const AudioIssueDetected& record) {
    constexpr std::hash<std::string> kHash;
    const std::uint64_t timestamp = record.hasTimestamp() ? record.timestamp : 0;
    const auto duration = static_cast<std::uint64_t>(std::int64_t{record.duration});
    return static_cast<std::size_t>(timestamp ^ duration) ^ kHash(record.issuetype) ^ kHash(record.node) ^
           kHash(record.rtaidclient);
}

} // namespace vela::telemmetrics
