// The energy log.
#pragma once

#include "common/values/Dictionary.h"

#include <cstdint>
#include <string_view>

namespace vela::platform {

/// Thread-safe.
class Joule {
public:
    virtual ~Joule() = default;

    /// Writes an event of the client numbered `clientIdentifier`. `options` has no meaning yet and is always empty.
    virtual void jouleLogRegisteredEvent(std::uint32_t clientIdentifier, std::string_view eventName,
                                         const Dictionary& payload, const Dictionary& options) = 0;
};

} // namespace vela::platform
