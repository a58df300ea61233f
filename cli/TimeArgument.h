// Times as a person types and reads them.
#pragma once

#include "platform/Clock.h"

#include <optional>
#include <string>
#include <string_view>

namespace vela {

/// Seconds since 1970 of "90s", "10m", "2h" or "3d" (before now), "2026-11-21", "2026-11-21T09:30" or
/// "2026-11-21 09:30:15" (local time) or "1700000000.5"; none for anything else.
std::optional<double> readTime(std::string_view text, const platform::Clock& clock);

/// "2026-11-21 09:30:15.123" in local time.
std::string localTimeText(double seconds, const platform::Clock& clock);

} // namespace vela
