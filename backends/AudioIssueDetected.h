// The metrics service's record of a detected audio issue. A plain value: one thread at a time.
//
//     field  wire type  name         written
//     1      0          timestamp    when present
//     2      0          duration     always; int32, so that a negative one takes ten bytes
//     3      2          issuetype    always
//     4      2          node         always
//     5      2          rtaidclient  always
#pragma once

#include "backends/TelemRecord.h"

#include <cstddef>
#include <cstdint>
#include <string>
#include <string_view>

namespace vela::telemmetrics {

class AudioIssueDetected final : public Record {
public:
    // Texts are UTF-8 when the service writes them; a reader takes any bytes.
    std::string issuetype;
    std::string node;
    std::string rtaidclient;
    std::uint64_t timestamp = 0; ///< counts only while it is marked as present
    std::int32_t duration = 0;   ///< seconds of silence

    static constexpr std::uint32_t kTimestampPresent = 1U << 0U;
    std::uint32_t presence = 0;

    bool hasTimestamp() const { return (presence & kTimestampPresent) != 0; }

    /// Takes a known field by its number alone, whatever the wire type; the tag of a group's end ends the record.
    bool readFrom(RecordReader& reader) override;
    void writeTo(RecordWriter& writer) const override;
    void formatText(RecordTextFormatter& formatter, std::string_view name) const override;

    friend bool operator==(const AudioIssueDetected& left, const AudioIssueDetected& right);

private:
    bool readField(RecordReader& reader, const Tag& tag);
};

void swap(AudioIssueDetected& left, AudioIssueDetected& right) noexcept;

// NOLINTNEXTLINE(readability-identifier-naming): the name under which generic code looks for it
std::size_t hash_value(const AudioIssueDetected& record);

} // namespace vela::telemmetrics
