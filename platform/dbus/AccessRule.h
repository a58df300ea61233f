// Who may connect to the service: root, the service's own user, and the users and groups named. Immutable.
#pragma once

#include "platform/dbus/PeerCredentials.h"

#include <cstdint>
#include <string>
#include <utility>
#include <vector>

namespace vela::platform::dbus {

class AccessRule {
public:
    /// Root and the service's own user.
    AccessRule() = default;
    AccessRule(std::vector<std::uint32_t> users, std::vector<std::uint32_t> groups)
        : users_(std::move(users)),
          groups_(std::move(groups)) {}

    /// By names or numbers. Those that this system does not know are left out and named in `unknown` ("user x"). Asks
    /// the system's user database, which may block.
    static AccessRule ofNames(const std::vector<std::string>& users, const std::vector<std::string>& groups,
                              std::vector<std::string>& unknown);

    /// As they were named, those left out that are not known.
    const std::vector<std::uint32_t>& groups() const { return groups_; }

    bool allows(const PeerCredentials& peer) const;
    /// Root or the service's own user.
    static bool isOwner(const PeerCredentials& peer);

private:
    std::vector<std::uint32_t> users_;
    std::vector<std::uint32_t> groups_;
};

} // namespace vela::platform::dbus
