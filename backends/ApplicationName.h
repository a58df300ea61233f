// The application's name as the bridges report it. Thread-safe.
#pragma once

#include "common/VelaReportingUtility.h"
#include "session/VelaReportingSession.h"

#include <optional>

namespace vela {

/// The configuration's "HostApplicationDisplayID", as it stands, or "Unknown" where the configuration has none, an
/// empty one included. None without a session: there is no configuration then.
inline Value applicationNameOf(const VelaReportingSession* session) {
    return VelaReportingUtilityRetrieveAppName(session == nullptr ? std::nullopt
                                                                  : std::optional(session->configuration()));
}

} // namespace vela
