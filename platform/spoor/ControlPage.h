// The page by which a service tells every emitter what is collected, which docs/trace-emission.md draws. One writer,
// the service; any number of emitters, which map it for reading. Every field is read and written whole.
#pragma once

#include <array>
#include <bit>
#include <cstddef>
#include <cstdint>

namespace vela::platform::spoor {

inline constexpr std::array<char, 8> kControlMagic = {'v', 'e', 'l', 'a', 't', 'r', 'a', 'c'};
inline constexpr std::uint32_t kControlByteOrder = 0x01020304;
inline constexpr std::uint32_t kControlVersion = 1;

inline constexpr std::size_t kControlSlots = 32;
inline constexpr std::size_t kControlMarkerBytes = 256;

/// An emitter takes a service that has not been heard of for so long for a dead one.
inline constexpr std::uint64_t kControlSilence = 10'000'000'000;

struct ControlSlot {
    std::uint32_t low;
    std::uint32_t high;
};

struct ControlPage {
    std::array<char, 8> magic;
    std::uint32_t byteOrder;
    std::uint32_t version;
    std::uint32_t active;       ///< bit i: slot i collects
    std::uint32_t generation;   ///< counts the starts of collections, over all services that had this page
    std::uint32_t markerSerial; ///< another one whenever `marker` changes; 0: there is none
    std::uint32_t lastSerial;   ///< the greatest of `markerSerial` so far
    std::uint64_t heartbeat;    ///< when the service last collected, nanoseconds of the monotonic clock
    std::array<std::uint64_t, 3> spare;
    std::array<ControlSlot, kControlSlots> slots;
    std::array<char, kControlMarkerBytes> marker; ///< path of the kernel's marker file, ended by a NUL
};
static_assert(sizeof(ControlPage) == 576 && offsetof(ControlPage, slots) == 64 && offsetof(ControlPage, marker) == 320);

inline constexpr std::size_t kControlFileBytes = 4096;

template <class Word>
Word load(const Word& word, int order = __ATOMIC_RELAXED) {
    return __atomic_load_n(&word, order);
}
template <class Word>
void store(Word& word, Word value, int order = __ATOMIC_RELAXED) {
    __atomic_store_n(&word, value, order);
}

inline bool isControlPage(const ControlPage& page) {
    return page.magic == kControlMagic && page.byteOrder == kControlByteOrder && page.version == kControlVersion;
}

/// Whether one of the slots `active` collects `code`.
inline bool collects(const ControlPage& page, std::uint32_t active, std::uint32_t code) {
    for (; active != 0; active &= active - 1) {
        const ControlSlot& slot = page.slots[static_cast<std::size_t>(std::countr_zero(active))];
        if (load(slot.low) <= code && code <= load(slot.high)) {
            return true;
        }
    }
    return false;
}

} // namespace vela::platform::spoor
