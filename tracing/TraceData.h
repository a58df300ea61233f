// One measured item of a trace and the values that it found in the collected events. Not thread-safe: an item is built
// before its trace runs and belongs to the tracing queue from then on.
#pragma once

#include "platform/Spoor.h"

#include <cstdint>
#include <span>
#include <string>
#include <utility>
#include <vector>

namespace vela {

/// One collected event: the facility's own record, whole.
using trace_point = platform::SpoorEvent; // NOLINT(readability-identifier-naming): the facility's name for it

class TraceData {
public:
    explicit TraceData(std::string name) : name_(std::move(name)) {}
    virtual ~TraceData() = default;
    TraceData(const TraceData&) = delete;
    TraceData& operator=(const TraceData&) = delete;

    /// Adds what it finds in `points` to its results. `session` only converts times.
    virtual void processTracepoints(const platform::SpoorSession& session, std::span<const trace_point> points) = 0;

    bool hasResults() const { return !results_.empty(); }
    /// In the order found: an interval's are nanoseconds. A copy.
    std::vector<std::uint64_t> getResults() const { return results_; }
    /// Gives their memory back. The number of pairs stays.
    void forgetResults() { std::vector<std::uint64_t>().swap(results_); }
    /// Sum of the results, added in their order as 32-bit floats, over the number of matched pairs: not a number where
    /// there is nothing.
    float getAverageResult() const;
    /// Matched pairs.
    std::uint32_t getNumTimesTraced() const { return numTimesTraced_; }

    const std::string& name() const { return name_; }
    const std::vector<std::uint64_t>& results() const { return results_; }

protected:
    std::vector<std::uint64_t> results_;
    std::uint32_t numTimesTraced_ = 0;

private:
    const std::string name_;
};

} // namespace vela
