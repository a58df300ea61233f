// Kernel trace events that mark a session's steps. They lie above the range that the service's own trace runs collect.
#pragma once

#include <cstdint>

namespace vela {

inline constexpr std::uint32_t kTraceInit = 0x21044828;
inline constexpr std::uint32_t kTraceStart = 0x2104482C;
inline constexpr std::uint32_t kTraceStop = 0x21044830;
inline constexpr std::uint32_t kTraceDealloc = 0x21044834;
/// A message, and once more a single message that is sent.
inline constexpr std::uint32_t kTraceSend = 0x21044838;

} // namespace vela
