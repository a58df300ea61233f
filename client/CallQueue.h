// The bounded queue between the threads that call and the thread that passes the calls on: a ring of bytes with any
// number of producers and one consumer. Thread-safe; the functions below "Consumer" belong to one thread.
//
// Positions count bytes since the beginning and never wrap; a position's place in the ring is its remainder.
//
//     tail (released)        cursor (read)           head (reserved)
//      | record | record | pad | record | record | being written |        free, all zero        |
//
// A record is one header and a body, in one piece: where it would not fit before the ring's end, a pad fills the rest.
// A producer moves the head on by compare-and-swap, writes, and commits by storing the header's first word. Free memory
// is zero, so a header that is not committed reads 0. A producer that is interrupted between the two holds up what
// stands behind its record, but no other producer.
#pragma once

#include <atomic>
#include <cstddef>
#include <cstdint>
#include <memory>

namespace vela::client {

/// What stands before a record's body. Producers fill in everything but `state`.
struct CallRecord {
    std::uint32_t state = 0; ///< 0, or all bytes of the record and in the lowest bit whether it is a pad
    std::uint32_t bodyBytes = 0;
    std::uint16_t operation = 0;
    std::uint16_t serviceType = 0; ///< of setServiceType
    std::uint32_t unused = 0;
    std::int64_t reporterID = 0; ///< of calls about one session
    std::uint64_t ticket = 0;    ///< of the caller that waits, or 0

    std::byte* body() { return reinterpret_cast<std::byte*>(this + 1); }
    const std::byte* body() const { return reinterpret_cast<const std::byte*>(this + 1); }
};
static_assert(sizeof(CallRecord) == 32 && std::atomic_ref<std::uint32_t>::is_always_lock_free &&
              std::atomic<std::uint64_t>::is_always_lock_free);

class CallQueue {
public:
    static constexpr std::size_t kLeastBytes = std::size_t{64} * 1024;
    static constexpr std::size_t kMostBytes = std::size_t{1024} * 1024 * 1024;

    /// `bytes`: a power of two between the two above; asserted. All memory is touched here, so that no producer meets a
    /// page fault. Throws std::bad_alloc.
    explicit CallQueue(std::size_t bytes);

    // Producers. Lock-free; neither allocates nor makes a system call.

    /// Room for a record with a body of so many bytes, its fields at their defaults; null when there is none. `spare`
    /// bytes must stay free besides. The body is at most `mostBodyBytes()` and begins at a multiple of 8.
    CallRecord* reserve(std::size_t bodyBytes, std::size_t spare);
    /// Hands the record over; it must not be touched afterwards. Sequentially consistent with the consumer's
    /// `hasCommitted`.
    static void commit(CallRecord* record);

    /// A quarter of the ring, so that a pad never makes a record impossible.
    std::size_t mostBodyBytes() const { return capacity_ / 4; }
    std::size_t capacity() const { return capacity_; }
    std::size_t used() const;
    std::size_t highestUsed() const { return highestUsed_.load(std::memory_order_relaxed); }
    bool isHalfFull() const { return used() > capacity_ / 2; }

    // Consumer.

    struct Read {
        const CallRecord* record = nullptr; ///< null when nothing is committed
        std::uint64_t end = 0;              ///< what to release once the record has served
    };
    /// The record at the cursor, which moves behind it.
    Read next();
    /// Whether `next` would give a record, or a pad before one.
    bool hasCommitted() const;
    /// Frees everything before `end`.
    void release(std::uint64_t end);
    /// Moves the cursor back to the first record that is not released.
    void rewind() { cursor_ = tail_.load(std::memory_order_relaxed); }
    /// Whether nothing is reserved that is not released.
    bool empty() const { return used() == 0; }

private:
    struct Free {
        void operator()(std::byte* memory) const;
    };

    CallRecord* at(std::uint64_t position) const {
        return reinterpret_cast<CallRecord*>(memory_.get() + (position & (capacity_ - 1)));
    }
    void noteUse(std::size_t used);

    // Constant after construction.
    std::size_t capacity_;
    std::unique_ptr<std::byte, Free> memory_;

    alignas(64) std::atomic<std::uint64_t> head_ = 0;
    std::atomic<std::size_t> highestUsed_ = 0;
    alignas(64) std::atomic<std::uint64_t> tail_ = 0;
    alignas(64) std::uint64_t cursor_ = 0; ///< the consumer's own
};

} // namespace vela::client
