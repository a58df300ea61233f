// Kernel trace events that mark a session's steps. They lie above the range that the service's own trace runs collect.
#pragma once

#include <cstdint>

namespace vela {

enum SessionTraceCode : std::uint32_t {
    kTraceInit = 0x21044828,
    kTraceStart = 0x2104482C,
    kTraceStop = 0x21044830,
    kTraceDealloc = 0x21044834,
    kTraceSend = 0x21044838, ///< a message, and once more a single message that is sent
};

} // namespace vela
