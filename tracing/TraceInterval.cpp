#include "tracing/TraceInterval.h"

#include "common/VelaReportingLogCategories.h"

#include <utility>

namespace vela {

TraceInterval::TraceInterval(std::string name, std::uint32_t beginCode, std::uint32_t endCode, bool matchedByThread)
    : TraceData(std::move(name)),
      codes_{beginCode, endCode, matchedByThread} {}

void TraceInterval::processTracepoints(const platform::SpoorSession& session, std::span<const trace_point> points) {
    if (codes_.matchedByThread) {
        processTracepointsSingleThread(session, points);
    } else {
        processTracepointsAnyThread(session, points);
    }
}

void TraceInterval::processTracepointsSingleThread(const platform::SpoorSession& session,
                                                   std::span<const trace_point> points) {
    process(session, points, true);
}

void TraceInterval::processTracepointsAnyThread(const platform::SpoorSession& session,
                                                std::span<const trace_point> points) {
    process(session, points, false);
}

void TraceInterval::process(const platform::SpoorSession& session, std::span<const trace_point> points, bool byThread) {
    const IntervalCodes codes{codes_.begin, codes_.end, byThread};
    MatchedIntervals matched = matchIntervals(session, points, {&codes, 1}, nullptr);
    take(std::move(matched.intervals.front()), byThread);
}

void TraceInterval::take(IntervalMatches matches, bool byThread) {
    numTimesTraced_ += static_cast<std::uint32_t>(matches.durations.size());
    if (results_.empty()) {
        results_ = std::move(matches.durations);
    } else {
        results_.insert(results_.end(), matches.durations.begin(), matches.durations.end());
    }
    logDropped(matches, byThread);
}

void TraceInterval::logDropped(const IntervalMatches& matches, bool byThread) const {
    static constexpr const char* kStarts =
        "DISCARDED %u trace Start points for interval %s because no stop points found";
    static constexpr const char* kStops =
        "DISCARDED %u trace Stop points for interval %s because no start points found";
    const LogCategory& log = VelaReportingTraceCategory();
    if (matches.droppedStarts != 0) {
        if (byThread) {
            log.debug(kStarts, matches.droppedStarts, name());
        } else {
            log.standard(kStarts, matches.droppedStarts, name());
        }
    }
    // The line about stops gives the number of dropped starts as well, on purpose: its readers know it so.
    if (matches.droppedStops != 0) {
        if (byThread) {
            log.debug(kStops, matches.droppedStarts, name());
        } else {
            log.standard(kStops, matches.droppedStarts, name());
        }
    }
}

} // namespace vela
