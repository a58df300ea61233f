// What the operating system refused, as a failure for a person. A free function, thread-safe.
#pragma once

#include "platform/Result.h"

#include <string>
#include <system_error>

namespace vela::platform::spoor {

/// "open /run/vela/trace/control: Permission denied" of an operation and an error's number.
inline Failure systemFailure(const std::string& operation, int code) {
    return {code, operation + ": " + std::generic_category().message(code)};
}

} // namespace vela::platform::spoor
