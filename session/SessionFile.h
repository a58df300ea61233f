// Name and place of the file that a session leaves on internal builds. Pure functions.
#pragma once

#include "platform/Clock.h"

#include <chrono>
#include <string>
#include <string_view>

namespace vela {

inline constexpr std::string_view kSessionFileDirectory =
    "/private/var/mobile/Library/Logs/Wreckage/DiagnosticLogs/Audio/Reporting";

/// "20261121-024325+0000": local time and how far it lies ahead of UTC.
std::string sessionFileDate(platform::WallTime time, std::chrono::seconds localOffset);

/// A client's text as part of a file name: "_" for "/", NUL and a leading ".", at most 128 bytes, cut between two
/// characters.
std::string safeFileNamePart(std::string_view text);

} // namespace vela
