// Where the matched pairs of a trace lie in time, for a picture of the run. Bounded. Not thread-safe.
#pragma once

#include <cstddef>
#include <cstdint>
#include <vector>

namespace vela {

/// One matched pair.
struct TraceSpan {
    std::uint64_t begin = 0; ///< nanoseconds
    std::uint64_t end = 0;   ///< nanoseconds, not before `begin`
    std::uint64_t beginThread = 0;
    std::uint64_t endThread = 0; ///< another one where pairs are matched process-wide
    std::int32_t process = 0;    ///< of the begin; 0 where it is unknown
    std::uint32_t interval = 0;  ///< which of the trace's intervals, in their order
};

class TraceTimeline {
public:
    /// 10 MiB. Viewers grow slow long before.
    static constexpr std::size_t kMostSpans = 262'144;

    explicit TraceTimeline(std::size_t mostSpans = kMostSpans) : mostSpans_(mostSpans) {}

    /// Keeps `span`, or counts it where there is no room or it ends before it begins.
    void add(const TraceSpan& span) {
        if (spans_.size() < mostSpans_ && span.end >= span.begin) {
            spans_.push_back(span);
        } else {
            ++leftOut_;
        }
    }

    /// In the order in which they ended.
    const std::vector<TraceSpan>& spans() const { return spans_; }
    std::uint64_t leftOut() const { return leftOut_; }

private:
    std::size_t mostSpans_;
    std::vector<TraceSpan> spans_;
    std::uint64_t leftOut_ = 0;
};

} // namespace vela
