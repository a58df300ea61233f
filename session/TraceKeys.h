// What a session's configuration says about its performance trace.
#pragma once

#include "common/values/Key.h"
#include "common/values/Value.h"

namespace vela {

/// Kind of trace. Without it, or with `VelaReportingTraceTypeSpoor` itself: the service's own kernel trace, if there is
/// a parameters file. Else the platform's.
inline const Key kTraceType("VelaReportingTraceType");
/// Path of the trace parameters file, a string.
inline const Key kTraceParamsFile("VelaReportingKilnPlistFilePath");

/// This very object means the kernel trace: it is told by its identity and not by its text, so that no string that came
/// from a client is taken for it. Wanted.
inline const String VelaReportingTraceTypeSpoor("spoor");

} // namespace vela
