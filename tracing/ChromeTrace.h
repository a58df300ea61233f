// Writes the pairs of a run as Chrome trace JSON, which common trace viewers open:
//
//     {"displayTimeUnit":"ns",
//      "otherData":{"writer":"VelaReporting","version":4,"intervalsLeftOut":0,"lostEvents":0},
//      "traceEvents":[
//     {"ph":"X","name":"open","cat":"Start","ts":12.345,"dur":0.5,"pid":7,"tid":8},
//     ...
//     ]}
//
// "ts" and "dur" are microseconds with their fractions, "cat" is the trace. A pair is drawn in the thread of its begin;
// "args":{"endThread":9} tells where it ended elsewhere. Not thread-safe.
#pragma once

#include "platform/FileSystem.h"
#include "tracing/Trace.h"

#include <cstdint>
#include <string>
#include <string_view>

namespace vela {

struct ChromeTraceFacts {
    std::string_view writer;
    std::int32_t version = 0;
    std::uint64_t intervalsLeftOut = 0; ///< pairs that there was no room for
    std::uint64_t lostEvents = 0;
};

class ChromeTrace {
public:
    /// Begins to write to `file`, which outlives it. Failures are the file's to tell.
    ChromeTrace(platform::PendingFile& file, const ChromeTraceFacts& facts);

    /// Adds the pairs of `trace`.
    void add(const Trace& trace);

    /// Writes the end. The last call of all.
    void finish();

private:
    void add(const TraceSpan& span, const std::string& category, const std::string& name);

    platform::PendingFile& file_;
    std::string piece_; ///< not yet in the file
    bool first_ = true;
};

} // namespace vela
