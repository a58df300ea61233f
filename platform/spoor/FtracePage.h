// Takes apart what the kernel's trace buffer gives out: pages of a processor's buffer with events in them, and the
// texts that tell how they are laid out. Nothing in them is believed: whatever the bytes are, reading ends and stays
// within them. Pure functions.
#pragma once

#include "platform/spoor/TraceRecord.h"

#include <cstddef>
#include <cstdint>
#include <optional>
#include <span>
#include <string_view>
#include <vector>

namespace vela::platform::spoor {

/// Where the fields of a page and of a raw marker's event stand, in bytes.
struct FtraceLayout {
    std::size_t commitOffset = 8; ///< of the page's size and flags
    std::size_t commitBytes = 8;
    std::size_t dataOffset = 16; ///< of the page's first event
    std::uint16_t eventID = 0;   ///< what raw markers are among all events
    std::size_t threadOffset = 4;
    std::size_t codeOffset = 8;
    std::size_t payloadOffset = 12;

    friend bool operator==(const FtraceLayout&, const FtraceLayout&) = default;
};

/// From the kernel's texts "events/header_page" and "events/ftrace/raw_data/format". None where one of them lacks what
/// is needed, or says what cannot be.
std::optional<FtraceLayout> parseFtraceLayout(std::string_view headerPage, std::string_view rawDataFormat);

/// What an emitter writes into the kernel's marker file: one event.
struct MarkerEvent {
    std::uint32_t code;
    std::uint32_t wordsAndPid; ///< number of arguments, and the emitter's process ID above kBitsOfCount
    TraceArguments arguments;
};
inline constexpr unsigned kBitsOfCount = 8;
static_assert(sizeof(MarkerEvent) == 40);

/// Appends the markers of `page`, of processor `cpu`. Answers the events that the kernel lost before them; where it
/// does not say how many, one.
std::uint64_t parseFtracePage(std::span<const char> page, const FtraceLayout& layout, std::uint32_t cpu,
                              std::vector<TraceRecord>& records);

} // namespace vela::platform::spoor
