// The logs of a session. Whatever file a line is written in, it carries the session's name.
#pragma once

#include "common/VelaReportingLogCategories.h"

namespace vela {

inline NamedLogCategory sessionLog() { return VelaReportingSessionCategory().as("VelaReportingSession"); }

/// Of the real-time reporting path: set-up, queued messages, single messages, end.
inline NamedLogCategory beaconLog() { return VelaReportingSessionBeaconReportingCategory().as("VelaReportingSession"); }

/// Of its performance trace.
inline NamedLogCategory traceLog() { return VelaReportingTraceCategory().as("VelaReportingSession"); }

} // namespace vela
