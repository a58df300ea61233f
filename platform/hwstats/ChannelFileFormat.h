// The layout of a channel file, which docs/channel-files.md draws: its header, its description of the channels, and
// where the values of each stand. Pure functions.
#pragma once

#include "platform/Result.h"
#include "platform/hwstats/ChannelTable.h"

#include <array>
#include <cstddef>
#include <cstdint>
#include <memory>
#include <string>
#include <string_view>

namespace vela::platform::hwstats {

inline constexpr std::string_view kChannelFileSuffix = ".channels";
inline constexpr std::array<char, 8> kChannelFileMagic = {'v', 'e', 'l', 'a', 'c', 'h', 'a', 'n'};
inline constexpr std::uint32_t kChannelFileByteOrder = 0x01020304;
inline constexpr std::uint32_t kChannelFileVersion = 1;

// Beyond any of these a file is refused.
inline constexpr std::size_t kMostFileBytes = std::size_t{4} * 1024 * 1024;
inline constexpr std::size_t kMostFileChannels = 4096;
inline constexpr std::size_t kMostParts = 512;     ///< buckets or states of a channel
inline constexpr std::size_t kMostTextBytes = 256; ///< of any name or unit

/// At offset 0. Written before the file gets its name; only `closed` changes afterwards.
struct ChannelFileHeader {
    std::array<char, 8> magic = kChannelFileMagic;
    std::uint32_t byteOrder = kChannelFileByteOrder;
    std::uint32_t version = kChannelFileVersion;
    std::uint64_t fileBytes = 0;
    std::uint64_t generation = 0;   ///< differs from that of every earlier file of this name
    std::uint64_t processStart = 0; ///< of the publisher, in clock ticks since the system's start
    std::int32_t pid = 0;
    std::uint32_t channelCount = 0;
    std::uint32_t descriptionBytes = 0;
    std::uint32_t closed = 0;  ///< not 0 once the publisher has ended in order
    std::uint64_t created = 0; ///< nanoseconds of the monotonic clock
};
static_assert(sizeof(ChannelFileHeader) == 64);

/// Values begin, and the blocks of channels follow each other, at multiples of it, so that no two channels share a line
/// of the processor's cache.
inline constexpr std::size_t kBlockAlignment = 64;

/// Bytes before the first copy of a channel's values: the sequence number and 8 bytes of zeros.
inline constexpr std::size_t kBlockHeadBytes = 16;

/// No state: where a state channel has not entered any, or its publisher has ended in order.
inline constexpr std::uint64_t kNoState = ~std::uint64_t{0};

/// Words of one copy of a channel's values in the file. A state channel has two more than in a sample, in front: the
/// number of the state that it is in, and when it entered it (nanoseconds of the monotonic clock).
inline std::size_t fileWords(const ChannelDescription& channel) {
    return channel.words() + (channel.format == HwStatsFormat::State ? 2 : 0);
}

inline std::size_t blockBytes(const ChannelDescription& channel) {
    const std::size_t bytes = kBlockHeadBytes + 2 * sizeof(std::uint64_t) * fileWords(channel);
    return (bytes + kBlockAlignment - 1) / kBlockAlignment * kBlockAlignment;
}

inline std::size_t valuesOffset(std::size_t descriptionBytes) {
    const std::size_t bytes = sizeof(ChannelFileHeader) + descriptionBytes;
    return (bytes + kBlockAlignment - 1) / kBlockAlignment * kBlockAlignment;
}

/// Bytes of the blocks of all channels.
std::size_t valuesBytes(const ChannelTable& table);

/// The description of `table`, or why it cannot be published.
Result<std::string> encodeDescription(const ChannelTable& table);

/// The table that `description` holds, or why it is refused. Takes time and memory in proportion to its size.
Result<std::shared_ptr<const ChannelTable>> decodeDescription(std::string_view description, std::uint32_t channelCount);

/// Why a header that was read from a file of `fileBytes` bytes is refused, or nothing.
Result<Done> checkHeader(const ChannelFileHeader& header, std::uint64_t fileBytes);

} // namespace vela::platform::hwstats
