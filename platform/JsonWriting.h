// JSON text of values.
#pragma once

#include "common/values/Json.h"
#include "common/values/Value.h"
#include "platform/Result.h"

#include <cstddef>
#include <string>

namespace vela::platform {

/// Thread-safe and without state.
class JsonWriting {
public:
    virtual ~JsonWriting() = default;

    /// Appends the UTF-8 JSON text of `value`: data as base64, dates as ISO 8601 UTC, what is no number or infinite as
    /// null. `depth`: how many containers it stands in. After a failure the text ends anywhere.
    virtual Result<Done> append(std::string& text, ValueRef value, JsonLayout layout, std::size_t depth) const = 0;

    Result<std::string> write(ValueRef value, JsonLayout layout) const {
        std::string text;
        const Result<Done> done = append(text, value, layout, 0);
        return done ? Result<std::string>(std::move(text)) : Result<std::string>(done.failure());
    }
};

} // namespace vela::platform
