// The analytics service.
#pragma once

#include "common/values/Dictionary.h"
#include "platform/UniqueFunction.h"

#include <cstddef>
#include <string_view>
#include <utility>

namespace vela::platform {

/// Thread-safe.
class Tally {
public:
    virtual ~Tally() = default;

    /// Whether anybody consumes events of this name. Asked before a payload is built.
    virtual bool tallyIsEventUsed(std::string_view eventName) = 0;

    /// Queues an event. `payload` is called at most once, at a time and on a thread of the service's choosing, possibly
    /// after this returned, and is destroyed afterwards. `payloadBytes`: about what it holds until then, for bounds.
    virtual void tallySendEventLazy(std::string_view eventName, UniqueFunction<Dictionary()> payload,
                                    std::size_t payloadBytes) = 0;
    /// For a payload of a few values.
    void tallySendEventLazy(std::string_view eventName, UniqueFunction<Dictionary()> payload) {
        constexpr std::size_t kFewValues = 512;
        tallySendEventLazy(eventName, std::move(payload), kFewValues);
    }
};

} // namespace vela::platform
