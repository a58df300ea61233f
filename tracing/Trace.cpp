#include "tracing/Trace.h"

#include <cstddef>
#include <utility>

namespace vela {

void Trace::processTracepoints(const platform::SpoorSession& session, std::span<const trace_point> points) {
    std::vector<IntervalCodes> codes;
    codes.reserve(intervals_.size());
    for (const auto& interval : intervals_) {
        codes.push_back(interval->codes());
    }
    MatchedIntervals matched = matchIntervals(session, points, codes, &timeline_);
    unmatchedEvents_ += matched.unmatchedEvents;
    for (std::size_t i = 0; i < intervals_.size(); ++i) {
        intervals_[i]->take(std::move(matched.intervals[i]));
    }
}

const TraceResults& Trace::getResults() {
    for (const auto& interval : intervals_) {
        if (interval->hasResults()) {
            std::vector<std::uint64_t>& values = results_[interval->name()];
            values.insert(values.end(), interval->results().begin(), interval->results().end());
        }
    }
    return results_;
}

void Trace::forgetResults() {
    for (const auto& interval : intervals_) {
        interval->forgetResults();
    }
    results_.clear();
    timeline_ = TraceTimeline();
}

} // namespace vela
