#include "platform/spoor/TraceMerge.h"

#include <algorithm>

namespace vela::platform::spoor {

namespace {

bool isEarlier(const TraceRecord& one, const TraceRecord& other) { return one.time < other.time; }

} // namespace

void TraceMerge::merge() {
    if (incoming_.empty()) {
        return;
    }
    std::ranges::stable_sort(incoming_, isEarlier);
    for (const TraceRecord& record : incoming_) {
        if (record.time >= handedOut_) {
            break;
        }
        ++late_;
    }
    records_.erase(records_.begin(), records_.begin() + static_cast<std::ptrdiff_t>(begin_));
    begin_ = 0;
    const auto before = static_cast<std::ptrdiff_t>(records_.size());
    records_.insert(records_.end(), incoming_.begin(), incoming_.end());
    std::inplace_merge(records_.begin(), records_.begin() + before, records_.end(), isEarlier);
    incoming_.clear();
}

std::span<const TraceRecord> TraceMerge::until(std::uint64_t time) const {
    const auto records = all();
    const auto end = std::ranges::upper_bound(records, time, {}, &TraceRecord::time);
    return records.first(static_cast<std::size_t>(end - records.begin()));
}

void TraceMerge::drop(std::size_t count) {
    if (count != 0) {
        begin_ += count;
        handedOut_ = std::max(handedOut_, records_[begin_ - 1].time);
    }
}

void TraceMerge::clear() { *this = TraceMerge(); }

} // namespace vela::platform::spoor
