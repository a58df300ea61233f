// The system notification service: named notifications, each with a 64-bit state.
#pragma once

#include "platform/UniqueFunction.h"
#include "platform/WorkQueue.h"

#include <cstdint>
#include <optional>
#include <string_view>

namespace vela::platform {

/// What a registration came to.
struct NotificationRegistration {
    std::int32_t status = 0; ///< 0 when it worked
    std::int32_t token = -1;
};

/// Thread-safe.
class Notifications {
public:
    virtual ~Notifications() = default;

    /// Calls `handler(token)` on `queue` when `name` is posted, until the token is cancelled. Posts that come close
    /// behind each other may be one call; a call begins after the last of them. Calls of one token do not overlap.
    /// `queue` outlives the registration.
    virtual NotificationRegistration registerForNotification(std::string_view name, WorkQueue& queue,
                                                             UniqueFunction<void(std::int32_t token)> handler) = 0;

    /// The state of a registered notification, or none when it cannot be read.
    virtual std::optional<std::uint64_t> state(std::int32_t token) const = 0;

    /// When this returns the handler is not called any more, but for a call that runs at this moment.
    virtual void cancel(std::int32_t token) = 0;
};

} // namespace vela::platform
