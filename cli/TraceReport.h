// What a trace results file says about each of its intervals. Pure functions.
#pragma once

#include "platform/Result.h"

#include <cstddef>
#include <cstdint>
#include <iosfwd>
#include <string>
#include <vector>

namespace vela {

/// Values of one name and unit.
struct TraceValues {
    std::string name;
    std::string unit;
    std::vector<double> values; ///< as the file gives them; at least one
};

struct TraceResultsFile {
    std::vector<TraceValues> intervals; ///< in the order in which the file first names them
    double lostEvents = 0;
};

/// Reads a results file of version 4. A failure begins with the number of the line: "3: ...".
platform::Result<TraceResultsFile> readTraceResults(std::istream& in);

struct TraceSummary {
    std::size_t count = 0;
    double min = 0;
    double median = 0; ///< of an even number of values, half way between the middle two
    double p99 = 0;    ///< the least value that is not below 99 % of them
    double max = 0;
};

/// Of at least one value.
TraceSummary summarize(std::vector<double> values);

/// Values from `from` to below `to`; the last bucket holds `to` as well.
struct TraceBucket {
    double from = 0;
    double to = 0;
    std::size_t count = 0;
};

/// At most ten buckets from the least to the greatest value: of equal width, or of equal ratio where the greatest is at
/// least ten times the least. One where all values are the same.
std::vector<TraceBucket> histogramOf(const std::vector<double>& values);

/// "250 ns", "1.25 us", "12.3 ms", "1.5 s": three digits at least.
std::string durationText(double nanoseconds);

} // namespace vela
