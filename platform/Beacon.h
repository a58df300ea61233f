// The real-time reporting framework: sessions that carry a reporting session's messages to its back ends as they come.
#pragma once

#include "common/values/Dictionary.h"
#include "platform/Result.h"
#include "platform/UniqueFunction.h"

#include <cstdint>
#include <memory>
#include <optional>
#include <string>

namespace vela::platform {

/// Thread-safe. Destroying the last reference ends the session.
class BeaconSession {
public:
    virtual ~BeaconSession() = default;

    /// Asks which back ends will take this session's messages. `completion` is called once, on a thread of the
    /// framework's choosing, with the list, or with none when there is no back end; or never.
    virtual void startBeaconBackendDiscovery(UniqueFunction<void(std::optional<Array> backends)> completion) = 0;

    /// ENOBUFS where the queue to the back ends is full, EMSGSIZE where the message is larger than all of it.
    virtual Result<Done> sendBeaconMessage(std::uint16_t category, std::uint16_t type, const Dictionary& payload) = 0;

    /// Sends what the session still holds.
    virtual void flushBeaconMessages() = 0;

    /// Text for log lines.
    virtual std::string description() const = 0;
};

/// Thread-safe.
class Beacon {
public:
    virtual ~Beacon() = default;

    /// A new secure token that names a place in the hierarchy of sessions, below `parent` (none for the top). Opaque.
    virtual Value newBeaconHierarchyToken(ValueRef parent) = 0;

    /// A session described by `sessionInfo`, for the user described by `userInfo`, with no frameworks to check.
    virtual std::shared_ptr<BeaconSession> createBeaconSession(const Dictionary& sessionInfo,
                                                               const Dictionary& userInfo) = 0;

    /// Sends one message without a session.
    virtual Result<Done> sendOneBeaconMessage(const Dictionary& sessionInfo, const Dictionary& userInfo,
                                              std::uint16_t category, std::uint16_t type,
                                              const Dictionary& payload) = 0;
};

} // namespace vela::platform
