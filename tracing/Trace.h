// A trace: its intervals, what they found, and where that lies in time. Not thread-safe: built before it runs, it
// belongs to the tracing queue until it was matched, then to whoever reads it.
#pragma once

#include "tracing/TraceData.h"
#include "tracing/TraceInterval.h"
#include "tracing/TraceTimeline.h"

#include <cstdint>
#include <map>
#include <memory>
#include <span>
#include <string>
#include <vector>

namespace vela {

/// Values by the name of their item: names in byte order, the values of one name in the order in which they were added.
using TraceResults = std::map<std::string, std::vector<std::uint64_t>, std::less<>>;

class Trace {
public:
    /// Only a critical trace is collected.
    Trace(std::string name, bool critical) : name_(std::move(name)), critical_(critical) {}

    void addTraceDataToCollect(std::unique_ptr<TraceInterval> interval) { intervals_.push_back(std::move(interval)); }

    /// Matches every interval in one walk over `points`. Results and log lines are those of each interval's own
    /// `processTracepoints`, in their order.
    void processTracepoints(const platform::SpoorSession& session, std::span<const trace_point> points);

    /// Adds what every interval has to the results and answers them. It adds again each time it is asked: the second
    /// time they hold every value twice.
    const TraceResults& getResults();

    /// Gives the memory of results and timeline back.
    void forgetResults();

    const std::string& name() const { return name_; }
    bool isCritical() const { return critical_; }
    const std::vector<std::unique_ptr<TraceInterval>>& intervals() const { return intervals_; }
    /// Of the pairs that `processTracepoints` found.
    const TraceTimeline& timeline() const { return timeline_; }
    /// Events that `processTracepoints` had to leave out, so as not to take too long.
    std::uint64_t unmatchedEvents() const { return unmatchedEvents_; }

private:
    const std::string name_;
    const bool critical_;
    std::vector<std::unique_ptr<TraceInterval>> intervals_;
    TraceResults results_;
    TraceTimeline timeline_;
    std::uint64_t unmatchedEvents_ = 0;
};

} // namespace vela
