// A measured item that collects one argument of every event with its code. Not thread-safe, as its base says.
#pragma once

#include "tracing/TraceData.h"

#include <cstdint>
#include <span>
#include <string>

namespace vela {

class TracePoint final : public TraceData {
public:
    /// `argIndex`: 1 to 4; any other collects nothing.
    TracePoint(std::string name, std::uint32_t eventCode, int argIndex)
        : TraceData(std::move(name)),
          eventCode_(eventCode),
          argIndex_(argIndex) {}

    /// Its values are no pairs: `getNumTimesTraced` stays 0.
    void processTracepoints(const platform::SpoorSession& session, std::span<const trace_point> points) override;

private:
    const std::uint32_t eventCode_;
    const int argIndex_;
};

} // namespace vela
