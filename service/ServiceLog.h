// The log of this room, and how lists of unbounded length stand in its lines. Whatever file a line is written in, it
// carries the delegate's name.
#pragma once

#include "common/VelaReportingLogCategories.h"
#include "session/VelaReportingSession.h"

#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <vector>

namespace vela {

inline NamedLogCategory serviceLog() {
    return VelaReportingServiceDelegateCategory().as("VelaReportingServiceDelegate");
}

/// "%@" of sessions. What would make a line of more than some 16 KiB is counted instead: `("...", "and 988 more")`.
/// Borrows them.
struct VelaReportingSessionListText {
    const std::vector<std::shared_ptr<VelaReportingSession>>& sessions;
};
void appendDescription(std::string& text, const VelaReportingSessionListText& list);

/// "%@" of the reporter IDs of a message: `(7, 8)`, at most 1,000 of them, or "(null)" without a list. Borrows them.
struct VelaReportingReporterListText {
    const std::optional<std::vector<std::int64_t>>& reporterIDs;
};
void appendDescription(std::string& text, const VelaReportingReporterListText& list);

} // namespace vela
