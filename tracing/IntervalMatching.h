// Finds the pairs of begin and end events of any number of intervals in one walk over the events. A pure function.
//
// For each interval, as if it were alone:
//
//     by thread       begin: a start is pending for the event's thread, in place of an earlier one, which is dropped
//                     end:   with a pending start a pair is found and nothing is pending; without one the stop is
//                     dropped
//     process-wide    the same for all threads together; a start at time 0 is none
//
// The begin is asked for first: where both codes are the same there is never a pair. Starts that are pending after the
// last event are neither pairs nor dropped.
#pragma once

#include "tracing/TraceData.h"
#include "tracing/TraceTimeline.h"

#include <cstddef>
#include <cstdint>
#include <span>
#include <vector>

namespace vela {

struct IntervalCodes {
    std::uint32_t begin = 0;
    std::uint32_t end = 0;
    bool matchedByThread = false;
};

/// What was found for one interval.
struct IntervalMatches {
    /// Nanoseconds, in the order of the ends: each time is converted, then they are subtracted, modulo 2^64.
    std::vector<std::uint64_t> durations;
    std::uint32_t droppedStarts = 0;
    std::uint32_t droppedStops = 0;
};

/// Bounds of time and memory, far beyond what is measured in earnest: intervals and events come from outside, and a
/// thousand intervals may share their codes.
struct MatchingLimits {
    std::uint64_t steps = std::uint64_t{1} << 25U; ///< events, each as often as there are intervals that know its code
    std::size_t pendingStarts = std::size_t{1} << 21U; ///< of intervals that are matched by thread
};

struct MatchedIntervals {
    std::vector<IntervalMatches> intervals; ///< one for each of those given
    std::uint64_t unmatchedEvents = 0;      ///< events with a known code that come after a limit was passed
};

/// Pairs go to `timeline` too, which may be null.
MatchedIntervals matchIntervals(const platform::SpoorSession& session, std::span<const trace_point> points,
                                std::span<const IntervalCodes> intervals, TraceTimeline* timeline,
                                const MatchingLimits& limits = {});

} // namespace vela
