#include "platform/dbus/PeerCredentials.h"

#include "platform/linux/FileDescriptor.h"

#include <algorithm>
#include <cerrno>
#include <sys/socket.h>
#include <sys/syscall.h>
#include <unistd.h>

namespace vela::platform::dbus {

namespace {

// Younger than the C library's headers on some systems.
constexpr int kPeerGroupsOption = 59;
constexpr int kPeerPidfdOption = 77;

/// None where the kernel does not tell.
std::optional<std::vector<std::uint32_t>> peerGroups(int socket) {
    std::vector<std::uint32_t> groups(16);
    while (true) {
        auto bytes = static_cast<socklen_t>(groups.size() * sizeof(std::uint32_t));
        if (getsockopt(socket, SOL_SOCKET, kPeerGroupsOption, groups.data(), &bytes) == 0) {
            groups.resize(bytes / sizeof(std::uint32_t));
            return groups;
        }
        const std::size_t needed = bytes / sizeof(std::uint32_t);
        if (errno != ERANGE || needed <= groups.size()) {
            return std::nullopt;
        }
        groups.resize(needed);
    }
}

} // namespace

bool PeerCredentials::isInGroup(std::uint32_t id) const {
    return group == id || std::find(groups.begin(), groups.end(), id) != groups.end();
}

std::optional<Identity> PeerCredentials::identity() const {
    return groupsKnown ? std::optional(Identity{user, group, groups}) : std::nullopt;
}

Result<PeerCredentials> peerCredentials(int socket) {
    ucred credentials{};
    socklen_t bytes = sizeof(credentials);
    if (getsockopt(socket, SOL_SOCKET, SO_PEERCRED, &credentials, &bytes) != 0) {
        return Failure{errno, "cannot tell who is connected"};
    }
    PeerCredentials peer;
    peer.processIdentifier = credentials.pid;
    peer.user = credentials.uid;
    peer.group = credentials.gid;
    if (auto groups = peerGroups(socket)) {
        peer.groups = *std::move(groups);
        peer.groupsKnown = true;
    }
    return peer;
}

bool peerIsGone(int socket) {
    int descriptor = -1;
    socklen_t bytes = sizeof(descriptor);
    if (getsockopt(socket, SOL_SOCKET, kPeerPidfdOption, &descriptor, &bytes) != 0) {
        return errno == ESRCH || errno == EINVAL; // by the kernel's version
    }
    const FileDescriptor process(descriptor);
    // No signal: only whether there is somebody to send one to.
    return syscall(SYS_pidfd_send_signal, process.get(), 0, nullptr, 0) != 0 && errno == ESRCH;
}

} // namespace vela::platform::dbus
