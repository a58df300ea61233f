// JSON text of values. Without state, so thread-safe.
#pragma once

#include "platform/JsonWriting.h"

namespace vela::platform {

class LinuxJsonWriting final : public JsonWriting {
public:
    Result<Done> append(std::string& text, ValueRef value, JsonLayout layout, std::size_t depth) const override {
        appendJson(text, value, layout, depth);
        return Done{};
    }
};

} // namespace vela::platform
