// A measured item that finds the durations between two event codes. Not thread-safe, as its base says.
#pragma once

#include "tracing/IntervalMatching.h"
#include "tracing/TraceData.h"

#include <cstdint>
#include <span>
#include <string>
#include <utility>

namespace vela {

class TraceInterval final : public TraceData {
public:
    /// Equal codes (an impulse) never give a duration.
    TraceInterval(std::string name, std::uint32_t beginCode, std::uint32_t endCode, bool matchedByThread);

    /// By thread or process-wide, as it was constructed. What is dropped on the way is logged.
    void processTracepoints(const platform::SpoorSession& session, std::span<const trace_point> points) override;
    virtual void processTracepointsSingleThread(const platform::SpoorSession& session,
                                                std::span<const trace_point> points);
    virtual void processTracepointsAnyThread(const platform::SpoorSession& session,
                                             std::span<const trace_point> points);

    /// For whoever matches many intervals together.
    const IntervalCodes& codes() const { return codes_; }
    /// Takes and logs what was found for `codes()`, as `processTracepoints` does.
    void take(IntervalMatches matches) { take(std::move(matches), codes_.matchedByThread); }

private:
    void process(const platform::SpoorSession& session, std::span<const trace_point> points, bool byThread);
    void take(IntervalMatches matches, bool byThread);
    void logDropped(const IntervalMatches& matches, bool byThread) const;

    const IntervalCodes codes_;
};

} // namespace vela
