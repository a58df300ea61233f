// Reads the events of one ring. What is read is copied out of the file in pieces of a checked size, and never mapped: a
// file that shrinks, changes or lies gives fewer or wrong events, not a fault or a stall. One user at a time.
#pragma once

#include "platform/Result.h"
#include "platform/spoor/RingFormat.h"

#include <cstddef>
#include <cstdint>
#include <span>
#include <vector>

namespace vela::platform::spoor {

/// Bytes that an emitter may be changing.
class RingBytes {
public:
    virtual ~RingBytes() = default;

    /// Fills `bytes` with what stands from `offset` on. False when there are fewer.
    virtual bool readAt(std::span<char> bytes, std::size_t offset) = 0;
};

class RingReader {
public:
    /// Passes over what the ring holds already. Answers why it is no ring.
    Result<Done> begin(RingBytes& ring, std::uint64_t fileBytes);
    /// As `begin`, for a ring that was made meanwhile: none of its events is passed over.
    Result<Done> beginNew(RingBytes& ring, std::uint64_t fileBytes);

    struct Progress {
        bool readable = true;    ///< false: the file became shorter
        std::uint64_t lost = 0;  ///< events that were overwritten, or that the emitter could not write
        std::size_t records = 0; ///< appended
    };
    /// Appends the events since the last time, in their order and with times that do not fall. A time beyond `now` is
    /// a lie and becomes `now`. At most all of the ring at a time.
    Progress read(RingBytes& ring, std::uint64_t now, std::vector<TraceRecord>& records);

    /// Passes over the events since the last time and answers how many they are, with those that the emitter could not
    /// write.
    std::uint64_t pass(RingBytes& ring);

private:
    Result<Done> learn(RingBytes& ring, std::uint64_t fileBytes);
    bool readHeader(RingBytes& ring);
    std::uint64_t takeLost();
    bool readRange(RingBytes& ring, std::uint64_t begin, std::uint64_t end);
    static bool stillHolds(RingBytes& ring, std::uint64_t index);
    void take(std::uint64_t begin, std::uint64_t end, std::uint64_t whole, std::uint64_t now, Progress& progress,
              std::vector<TraceRecord>& records);

    RingHeader header_;
    std::vector<RingRecord> copies_;
    std::uint64_t tail_ = 0; ///< the next event
    std::uint64_t lost_ = 0; ///< the emitter's count when it was last read
    std::uint64_t time_ = 0; ///< of the last event
};

} // namespace vela::platform::spoor
