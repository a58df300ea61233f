#include "platform/spoor/RingReader.h"

#include <algorithm>
#include <atomic>
#include <utility>

namespace vela::platform::spoor {

namespace {

/// The first event whose place has not been taken when `head` events are written.
std::uint64_t oldestOf(std::uint64_t head) { return head < kRingRecords ? 0 : head - kRingRecords; }

} // namespace

bool RingReader::readHeader(RingBytes& ring) {
    const bool isThere = ring.readAt({reinterpret_cast<char*>(&header_), sizeof(header_)}, 0);
    // The readings of the count and of the events are system calls; nothing else orders them.
    std::atomic_thread_fence(std::memory_order_seq_cst);
    return isThere;
}

Result<Done> RingReader::learn(RingBytes& ring, std::uint64_t fileBytes) {
    if (!readHeader(ring)) {
        return Failure{EINVAL, "it is shorter than a header"};
    }
    return checkRing(header_, fileBytes);
}

Result<Done> RingReader::begin(RingBytes& ring, std::uint64_t fileBytes) {
    Result<Done> learnt = learn(ring, fileBytes);
    tail_ = header_.head;
    lost_ = header_.lost;
    return learnt;
}

Result<Done> RingReader::beginNew(RingBytes& ring, std::uint64_t fileBytes) {
    tail_ = 0;
    lost_ = 0;
    return learn(ring, fileBytes);
}

bool RingReader::readRange(RingBytes& ring, std::uint64_t begin, std::uint64_t end) {
    copies_.resize(static_cast<std::size_t>(end - begin));
    const std::uint64_t wrap = begin + std::min(end - begin, kRingRecords - begin % kRingRecords);
    auto* const bytes = reinterpret_cast<char*>(copies_.data());
    const auto first = static_cast<std::size_t>(wrap - begin) * kRingRecordBytes;
    const auto second = static_cast<std::size_t>(end - wrap) * kRingRecordBytes;
    const bool isThere = ring.readAt({bytes, first}, ringOffset(begin)) &&
                         (second == 0 || ring.readAt({bytes + first, second}, ringOffset(wrap)));
    std::atomic_thread_fence(std::memory_order_seq_cst);
    return isThere;
}

bool RingReader::stillHolds(RingBytes& ring, std::uint64_t index) {
    // The next event takes this one's place, and its writing may have begun: by marking the record.
    std::uint64_t found = 0;
    return ring.readAt({reinterpret_cast<char*>(&found), sizeof(found)},
                       ringOffset(index) + offsetof(RingRecord, index)) &&
           found == index;
}

void RingReader::take(std::uint64_t begin, std::uint64_t end, std::uint64_t whole, std::uint64_t now,
                      Progress& progress, std::vector<TraceRecord>& records) {
    for (std::uint64_t index = begin; index < end; ++index) {
        const RingRecord& copy = copies_[static_cast<std::size_t>(index - begin)];
        if (index < whole || copy.index > index) {
            progress.lost = saturatingSum(progress.lost, 1);
        } else if (copy.index < index) {
            return; // counted and not there: the count was read in the midst of its change, or is a lie
        } else {
            time_ = std::max(time_, std::min(copy.time, now));
            records.push_back({time_, copy.code, copy.cpu, copy.thread, copy.arguments, header_.pid});
            ++progress.records;
        }
        tail_ = index + 1;
    }
}

std::uint64_t RingReader::takeLost() {
    const std::uint64_t before = std::exchange(lost_, std::max(lost_, header_.lost));
    return lost_ - before;
}

std::uint64_t RingReader::pass(RingBytes& ring) {
    if (!readHeader(ring)) {
        return 0;
    }
    const std::uint64_t before = std::exchange(tail_, std::max(tail_, header_.head));
    return saturatingSum(tail_ - before, takeLost());
}

RingReader::Progress RingReader::read(RingBytes& ring, std::uint64_t now, std::vector<TraceRecord>& records) {
    Progress progress;
    if (!readHeader(ring)) {
        return {false, 0, 0};
    }
    progress.lost = takeLost();
    const std::uint64_t head = header_.head;
    if (head <= tail_) {
        return progress;
    }
    if (head - tail_ > kRingRecords) {
        progress.lost = saturatingSum(progress.lost, head - kRingRecords - tail_);
        tail_ = head - kRingRecords;
    }
    if (!readRange(ring, tail_, head) || !readHeader(ring)) {
        progress.readable = false;
        return progress;
    }
    std::uint64_t whole = header_.head >= head ? oldestOf(header_.head) : tail_;
    if (whole >= tail_ && header_.head - whole == kRingRecords && !stillHolds(ring, whole)) {
        ++whole;
    }
    take(tail_, head, whole, now, progress, records);
    return progress;
}

} // namespace vela::platform::spoor
