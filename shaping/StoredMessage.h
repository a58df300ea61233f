// A message as a session keeps it until its end. Sharing the message is copying a reference.
#pragma once

#include "common/values/Dictionary.h"

#include <cstdint>

namespace vela {

/// Sixteen bytes, as a session may keep a great many.
struct StoredMessage {
    /// Index of the message's identifier in the session's table of identifiers.
    std::uint32_t kind = 0;
    /// How many messages of that identifier the session had kept with this one. Files show the message under its
    /// identifier, "_" and this number. The shaping of messages looks at neither.
    std::uint32_t count = 0;
    Dictionary message;
};

} // namespace vela
