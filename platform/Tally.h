// The analytics service.
#pragma once

#include "common/values/Dictionary.h"
#include "platform/UniqueFunction.h"

#include <string_view>

namespace vela::platform {

/// Thread-safe.
class Tally {
public:
    virtual ~Tally() = default;

    /// Whether anybody consumes events of this name. Asked before a payload is built.
    virtual bool tallyIsEventUsed(std::string_view eventName) = 0;

    /// Queues an event. `payload` is called at most once, at a time and on a thread of the service's choosing, possibly
    /// after this returned, and is destroyed afterwards.
    virtual void tallySendEventLazy(std::string_view eventName, UniqueFunction<Dictionary()> payload) = 0;
};

} // namespace vela::platform
