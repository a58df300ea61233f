#include "tracing/TracePoint.h"

#include <cstddef>

namespace vela {

void TracePoint::processTracepoints(const platform::SpoorSession&, std::span<const trace_point> points) {
    if (argIndex_ < 1 || argIndex_ > 4) {
        return;
    }
    for (const trace_point& point : points) {
        if (point.eventCode == eventCode_) {
            results_.push_back(point.arguments[static_cast<std::size_t>(argIndex_) - 1]);
        }
    }
}

} // namespace vela
