// What the tests of the parser share: points as one line of text, and the lines that it logs.
#pragma once

#include "testing/CapturingLog.h"
#include "tracing/TraceParams.h"
#include "tracing/TraceParamsParser.h"

#include <string>
#include <utility>
#include <vector>

namespace vela {

using platform::LogLevel;

inline testing::CapturedLine traceParamsLine(LogLevel level, std::string message) {
    return {level, "velart", "TraceParamsParser", std::move(message)};
}

/// "open interval 16 20 thread": name, kind, the two codes, "thread" or "process".
inline std::vector<std::string> pointsOf(const TraceParams& params) {
    std::vector<std::string> points;
    for (const auto& point : params.dataParams) {
        static const std::vector<std::string> kKinds{"impulse", "interval", "level"};
        points.push_back(point->name + " " + kKinds.at(point->kind) + " " + std::to_string(point->beginCode) + " " +
                         std::to_string(point->endCode) + (point->matchedByThread ? " thread" : " process"));
    }
    return points;
}

} // namespace vela
