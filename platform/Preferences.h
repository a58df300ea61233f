// The preferences store: property-list values by domain and key.
#pragma once

#include "common/values/Value.h"

#include <string_view>

namespace vela::platform {

/// Thread-safe. Reads see the store as it is at that moment.
class Preferences {
public:
    virtual ~Preferences() = default;

    /// The value of `key` in `domain`, or none.
    virtual Value copyValue(std::string_view domain, std::string_view key) const = 0;
};

} // namespace vela::platform
