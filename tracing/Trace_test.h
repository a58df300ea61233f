// What the tests of traces share: events, a session that converts their times, and log lines.
#pragma once

#include "testing/CapturingLog.h"
#include "testing/FakeSpoor.h"
#include "tracing/TraceData.h"

#include <cstdint>
#include <memory>
#include <string>
#include <utility>
#include <vector>

namespace vela {

using platform::LogLevel;
using testing::CapturedLine;

// Codes of an interval.
inline constexpr std::uint32_t kBegin = 0x21040010;
inline constexpr std::uint32_t kEnd = 0x21040014;

inline trace_point eventAt(std::uint64_t timestamp, std::uint32_t code, std::uint64_t thread = 1) {
    trace_point event;
    event.timestamp = timestamp;
    event.eventCode = code;
    event.threadID = thread;
    return event;
}

/// Lines of the trace category.
inline CapturedLine traceLine(LogLevel level, std::string source, std::string message) {
    return {level, "velart", std::move(source), std::move(message)};
}
inline CapturedLine intervalLine(LogLevel level, std::string message) {
    return traceLine(level, "TraceInterval", std::move(message));
}

/// A session whose time unit is a nanosecond unless `spoor` is told otherwise.
struct TraceClock {
    testing::FakeSpoor spoor;
    std::unique_ptr<platform::SpoorSession> session = spoor.createSession();
};

} // namespace vela
