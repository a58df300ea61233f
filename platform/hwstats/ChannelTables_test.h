// Tables and bytes of channel files as the tests need them.
#pragma once

#include "platform/hwstats/ChannelFileFormat.h"

#include <cstring>
#include <string>

namespace vela::platform::hwstats {

/// A counter, a histogram of two buckets and a state channel of two states.
inline ChannelTable exampleTable() {
    return {"Driver",
            "Speaker",
            "Stats",
            {{HwStatsFormat::Simple, "frames", std::nullopt, {}, {}},
             {HwStatsFormat::Histogram, "busy", "us", {0, 10, 20}, {}},
             {HwStatsFormat::State, "stream", std::nullopt, {}, {"idle", "running"}}}};
}

template <class Number>
void putAt(std::string& bytes, std::size_t offset, Number number) {
    std::memcpy(bytes.data() + offset, &number, sizeof(number));
}

/// The bytes of a file with these channels, all values 0.
inline std::string fileOf(const ChannelTable& table) {
    const std::string description = *encodeDescription(table);
    ChannelFileHeader header;
    header.fileBytes = valuesOffset(description.size()) + valuesBytes(table);
    header.generation = 77;
    header.pid = 12;
    header.channelCount = static_cast<std::uint32_t>(table.channels.size());
    header.descriptionBytes = static_cast<std::uint32_t>(description.size());
    std::string bytes(header.fileBytes, '\0');
    std::memcpy(bytes.data(), &header, sizeof(header));
    std::memcpy(bytes.data() + sizeof(header), description.data(), description.size());
    return bytes;
}

} // namespace vela::platform::hwstats
