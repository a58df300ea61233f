// Property lists: outside bytes into values, and back.
#pragma once

#include "common/values/Value.h"
#include "platform/Result.h"

#include <cstddef>
#include <cstdint>
#include <string>
#include <string_view>

namespace vela::platform {

enum class PropertyListFormat : std::uint8_t { Xml, Binary, Text };

/// What a reader takes before it refuses the input.
struct PropertyListLimits {
    std::size_t bytes = 256 * 1024; ///< length of the input
    std::size_t depth = 128;        ///< containers inside each other
    std::size_t values = 65536;     ///< values in all, each use of a shared one counted
};

/// Thread-safe and without state.
class PropertyListReading {
public:
    virtual ~PropertyListReading() = default;

    /// Reads a property list in any of the three formats, told apart by its first bytes. Strict: what does not follow
    /// the format to the letter is refused with the place and the reason, and a limit that was passed with its name and
    /// value.
    virtual Result<Value> read(std::string_view bytes, const PropertyListLimits& limits = {}) const = 0;

    /// Writes `value`. The text form writes every leaf as text.
    virtual Result<std::string> write(ValueRef value, PropertyListFormat format) const = 0;
};

} // namespace vela::platform
