// The layout of a ring: the file into which one thread at a time of an emitter writes its events, which
// docs/trace-emission.md draws. Pure functions.
#pragma once

#include "platform/Result.h"
#include "platform/spoor/TraceRecord.h"

#include <array>
#include <bit>
#include <cerrno>
#include <cstddef>
#include <cstdint>
#include <string_view>

namespace vela::platform::spoor {

inline constexpr std::string_view kRingSuffix = ".ring";
inline constexpr std::array<char, 8> kRingMagic = {'v', 'e', 'l', 'a', 'r', 'i', 'n', 'g'};
inline constexpr std::uint32_t kRingByteOrder = 0x01020304;
inline constexpr std::uint32_t kRingVersion = 1;

inline constexpr std::uint64_t kRingRecords = 16'384;
inline constexpr std::size_t kRingRecordBytes = 64;
inline constexpr std::size_t kRingDataOffset = 4096;
inline constexpr std::size_t kRingFileBytes = kRingDataOffset + kRingRecords * kRingRecordBytes;
static_assert(std::has_single_bit(kRingRecords));

/// At offset 0. All but the counts is written before the file gets its name.
struct RingHeader {
    std::array<char, 8> magic = kRingMagic;
    std::uint32_t byteOrder = kRingByteOrder;
    std::uint32_t version = kRingVersion;
    std::uint32_t records = kRingRecords;
    std::uint32_t recordBytes = kRingRecordBytes;
    std::int32_t pid = 0; ///< of the emitter, in its own namespace
    std::uint32_t reserved = 0;
    std::array<std::uint64_t, 4> spare{};
    std::uint64_t head = 0; ///< events written so far; event i stands in record i modulo the number of records
    std::uint64_t lost = 0; ///< events that could not be written
};
static_assert(sizeof(RingHeader) == 80 && offsetof(RingHeader, head) == 64);

/// One record as it stands in a ring.
struct RingRecord {
    std::uint64_t time;
    std::uint32_t code;
    std::uint32_t cpu;
    std::uint64_t thread; ///< in the emitter's namespace
    TraceArguments arguments;
    std::uint64_t index; ///< of the event, or kRingIndexOfNone while the record is being written
};
inline constexpr std::uint64_t kRingIndexOfNone = ~std::uint64_t{0};
static_assert(sizeof(RingRecord) == kRingRecordBytes);

inline std::size_t ringOffset(std::uint64_t index) {
    return kRingDataOffset + static_cast<std::size_t>(index % kRingRecords) * kRingRecordBytes;
}

inline Result<Done> checkRing(const RingHeader& header, std::uint64_t fileBytes) {
    if (header.magic != kRingMagic || header.byteOrder != kRingByteOrder || header.version != kRingVersion) {
        return Failure{EINVAL, "it is no ring of this version and byte order"};
    }
    if (header.records != kRingRecords || header.recordBytes != kRingRecordBytes || fileBytes != kRingFileBytes) {
        return Failure{EINVAL, "its size is not that of a ring"};
    }
    return Done{};
}

} // namespace vela::platform::spoor
