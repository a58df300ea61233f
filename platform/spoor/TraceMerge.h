// Puts the events of several sources, each in its own order, into one order by time. Confined to its owner's lock.
#pragma once

#include "platform/spoor/TraceRecord.h"

#include <cstddef>
#include <cstdint>
#include <span>
#include <vector>

namespace vela::platform::spoor {

class TraceMerge {
public:
    /// Where sources append; `merge` then takes them in. Events of equal times keep the order in which they came.
    std::vector<TraceRecord>& incoming() { return incoming_; }
    void merge();

    /// What is there, in order.
    std::span<const TraceRecord> all() const {
        return {records_.begin() + static_cast<std::ptrdiff_t>(begin_), records_.end()};
    }
    /// Those of all that are not after `time`.
    std::span<const TraceRecord> until(std::uint64_t time) const;

    /// The first `count` have been handed out.
    void drop(std::size_t count);
    /// Events that came when later ones had been handed out. They are handed out all the same.
    std::uint64_t late() const { return late_; }
    void clear();

private:
    std::vector<TraceRecord> incoming_;
    std::vector<TraceRecord> records_;
    std::size_t begin_ = 0;       ///< of those not yet handed out
    std::uint64_t handedOut_ = 0; ///< the latest time among those that were
    std::uint64_t late_ = 0;
};

} // namespace vela::platform::spoor
