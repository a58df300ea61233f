// What a trace parameters file is written with: its keys, and the words that some of their values may be.
//
//     { Children = (                                                       traces
//         { Name = Start; TraceType = spoor; Children = (                  their points
//             { Name = open; Type = Interval; SpoorCodeBegin = 0x21040010; SpoorCodeEnd = 0x21040014;
//               EventsMatchedBy = Thread; } ); } ); }
//
// The names are also what programs that write such files know.
#pragma once

#include "common/values/Key.h"

#include <string_view>

namespace vela {

/// Of the file.
inline const Key TraceParamChildrenNodes("Children");

// Of a trace.
inline const Key TraceDataDescription("Name");
inline const Key TraceDataType("TraceType");
inline constexpr std::string_view TraceDataTypeMilestone = "Milestone"; ///< signposts
inline constexpr std::string_view TraceDataTypeSpoor = "spoor";         ///< kernel trace; so is every other word
/// Allowed, and read by nobody.
inline const Key TraceDataIsCritical("IsCritical");
inline const Key TraceDataChildrenNodes("Children");

// Of a trace point.
inline const Key TracePointDescription("Name");
inline const Key TracePointType("Type");
inline constexpr std::string_view TracePointTypeInterval = "Interval";
inline constexpr std::string_view TracePointTypeImpulse = "Impulse";
inline constexpr std::string_view TracePointTypeLevel = "Level";
/// Codes of kernel trace events, as texts of hexadecimal digits. Only an interval has an end.
inline const Key TracePointBeginCode("SpoorCodeBegin");
inline const Key TracePointEndCode("SpoorCodeEnd");
inline const Key TracePointEventsMatchedBy("EventsMatchedBy");
inline constexpr std::string_view TracePointEventsMatchedByThread = "Thread";
inline constexpr std::string_view TracePointEventsMatchedByProcess = "Process"; ///< so is every other word

} // namespace vela
