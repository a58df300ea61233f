// Who is at the other end of a socket, by the operating system's word: those who called connect(), whatever became of
// them since. Immutable.
#pragma once

#include "platform/Identity.h"
#include "platform/Result.h"

#include <cstdint>
#include <optional>
#include <vector>

namespace vela::platform::dbus {

struct PeerCredentials {
    std::int32_t processIdentifier = 0; ///< 0 where the peer is outside this process's name space
    std::uint32_t user = 0;
    std::uint32_t group = 0;
    std::vector<std::uint32_t> groups; ///< supplementary ones
    bool groupsKnown = false;          ///< else some may be missing

    bool isInGroup(std::uint32_t id) const;
    /// None while groups may be missing: one that is not known could take rights away as well as give them.
    std::optional<Identity> identity() const;
};

Result<PeerCredentials> peerCredentials(int socket);

/// Whether the process that called connect() is gone for good, so that its identifier may be another one's. False where
/// the kernel cannot tell (before Linux 6.5).
bool peerIsGone(int socket);

} // namespace vela::platform::dbus
