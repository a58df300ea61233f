#include "client/CallQueue.h"

#include <algorithm>
#include <bit>
#include <cassert>
#include <cstring>
#include <new>

namespace vela::client {

namespace {

constexpr std::uint32_t kPad = 1;
constexpr std::size_t kCacheLine = 64;

constexpr std::size_t recordBytes(std::size_t bodyBytes) {
    return (sizeof(CallRecord) + bodyBytes + 7) & ~std::size_t{7};
}

} // namespace

void CallQueue::Free::operator()(std::byte* memory) const { operator delete (memory, std::align_val_t{kCacheLine}); }

CallQueue::CallQueue(std::size_t bytes)
    : capacity_(bytes),
      memory_(static_cast<std::byte*>(operator new (bytes, std::align_val_t{kCacheLine}))) {
    assert(std::has_single_bit(bytes) && bytes >= kLeastBytes && bytes <= kMostBytes);
    std::memset(memory_.get(), 0, bytes);
}

CallRecord* CallQueue::reserve(std::size_t bodyBytes, std::size_t spare) {
    assert(bodyBytes <= mostBodyBytes());
    const std::size_t bytes = recordBytes(bodyBytes);
    std::uint64_t head = head_.load(std::memory_order_relaxed);
    std::size_t pad = 0;
    std::size_t used = 0;
    do {
        const std::size_t toEnd = capacity_ - (head & (capacity_ - 1));
        pad = bytes <= toEnd ? 0 : toEnd;
        // The consumer cleared what it released before it moved the tail. The tail may have passed a head that is
        // stale; then the exchange fails and this is looked at again.
        const std::uint64_t tail = tail_.load(std::memory_order_acquire);
        used = head >= tail ? static_cast<std::size_t>(head - tail) + pad + bytes : 0;
        if (used + spare > capacity_) {
            return nullptr;
        }
    } while (!head_.compare_exchange_weak(head, head + pad + bytes, std::memory_order_relaxed));
    noteUse(used);
    if (pad != 0) {
        std::atomic_ref(at(head)->state).store(static_cast<std::uint32_t>(pad) | kPad, std::memory_order_seq_cst);
    }
    CallRecord* const record = at(head + pad);
    record->bodyBytes = static_cast<std::uint32_t>(bodyBytes);
    return record;
}

void CallQueue::noteUse(std::size_t used) {
    std::size_t highest = highestUsed_.load(std::memory_order_relaxed);
    while (used > highest && !highestUsed_.compare_exchange_weak(highest, used, std::memory_order_relaxed)) {
    }
}

void CallQueue::commit(CallRecord* record) {
    const auto bytes = static_cast<std::uint32_t>(recordBytes(record->bodyBytes));
    std::atomic_ref(record->state).store(bytes, std::memory_order_seq_cst);
}

std::size_t CallQueue::used() const {
    // The tail first: what is released in between makes the answer too large, never negative.
    const std::uint64_t tail = tail_.load(std::memory_order_acquire);
    const std::uint64_t head = head_.load(std::memory_order_relaxed);
    return head >= tail ? static_cast<std::size_t>(std::min<std::uint64_t>(head - tail, capacity_)) : 0;
}

bool CallQueue::hasCommitted() const {
    // A ring that is full and read to its end shows the oldest record at the cursor's place.
    return cursor_ - tail_.load(std::memory_order_relaxed) < capacity_ &&
           std::atomic_ref(at(cursor_)->state).load(std::memory_order_seq_cst) != 0;
}

CallQueue::Read CallQueue::next() {
    while (hasCommitted()) {
        CallRecord* const record = at(cursor_);
        const std::uint32_t state = std::atomic_ref(record->state).load(std::memory_order_acquire);
        cursor_ += state & ~kPad;
        if ((state & kPad) == 0) {
            return {record, cursor_};
        }
    }
    return {};
}

void CallQueue::release(std::uint64_t end) {
    std::uint64_t tail = tail_.load(std::memory_order_relaxed);
    assert(end >= tail && end <= cursor_);
    while (tail < end) {
        const std::size_t place = tail & (capacity_ - 1);
        const std::size_t bytes = std::min(static_cast<std::size_t>(end - tail), capacity_ - place);
        std::memset(memory_.get() + place, 0, bytes);
        tail += bytes;
    }
    tail_.store(end, std::memory_order_release);
}

} // namespace vela::client
