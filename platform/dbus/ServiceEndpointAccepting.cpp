// How connections come to be: accepted, refused, or left waiting while no descriptor is left.
#include "platform/dbus/ServiceEndpoint.h"
#include "platform/linux/DescriptorLimit.h"

#include <cerrno>
#include <cstdint>
#include <sys/socket.h>
#include <utility>

namespace vela::platform {

namespace {

using namespace std::chrono_literals;

constexpr int kAcceptedPerTurn = 16;
/// Refused connections that may wait for their answer to AUTH; more are told and closed at once.
constexpr std::uint32_t kLingeringRefusals = 32;
/// How long to wait when no descriptor is left and no connection ends.
constexpr auto kWithoutDescriptors = 500ms;

/// What the service itself needs: files that sessions write, the store's, processes to ask for their name.
constexpr std::uint64_t kOwnDescriptors = 64;

bool isLackOfResources(int error) { return error == EMFILE || error == ENFILE || error == ENOBUFS || error == ENOMEM; }

} // namespace

void DbusServiceEndpoint::acceptConnections() {
    for (int count = 0; count < kAcceptedPerTurn; ++count) {
        FileDescriptor socket(accept4(socket_.descriptor(), nullptr, nullptr, SOCK_CLOEXEC | SOCK_NONBLOCK));
        if (!socket) {
            if (isLackOfResources(errno)) {
                return pauseAccepting();
            }
            if (errno != EINTR && errno != ECONNABORTED) {
                return; // none is waiting
            }
            continue;
        }
        admit(std::move(socket));
    }
}

void DbusServiceEndpoint::pauseAccepting() {
    // The clients stay in the listening socket's queue. Left watched, it would wake the loop again and again.
    loop_->modify(socket_.descriptor(), 0, kListenerToken);
    acceptingAgainAt_ = std::chrono::steady_clock::now() + kWithoutDescriptors;
}

void DbusServiceEndpoint::continueAccepting() {
    acceptingAgainAt_.reset();
    if (socket_.descriptor() >= 0) {
        loop_->modify(socket_.descriptor(), EPOLLIN, kListenerToken);
    }
}

std::string DbusServiceEndpoint::refusalOf(const dbus::PeerCredentials& peer) {
    if (!options_.access.allows(peer)) {
        return "access-denied";
    }
    const auto place = connectionsOfUser_.find(peer.user);
    if (place != connectionsOfUser_.end() && place->second >= options_.clientsPerUser) {
        return "limits.clients_per_user=" + std::to_string(options_.clientsPerUser);
    }
    return {};
}

void DbusServiceEndpoint::admit(FileDescriptor socket) {
    auto peer = dbus::peerCredentials(socket.get());
    if (!peer) {
        return;
    }
    // The system gives the lowest free number.
    const bool isLate = static_cast<std::uint64_t>(socket.get()) >= descriptorsForClients(kOwnDescriptors);
    std::string refusal = isLate ? "too-many-open-files" : refusalOf(*peer);
    if (!refusal.empty()) {
        ++refused_;
        if (lingering_ >= kLingeringRefusals) {
            const std::string answer = "REJECTED " + refusal + "\r\n";
            send(socket.get(), answer.data(), answer.size(), MSG_DONTWAIT | MSG_NOSIGNAL);
            return;
        }
    }
    addConnection(std::move(socket), *std::move(peer), std::move(refusal));
}

void DbusServiceEndpoint::addConnection(FileDescriptor socket, dbus::PeerCredentials peer, std::string refusal) {
    const bool refused = !refusal.empty();
    const std::uint32_t user = peer.user;
    dbus::ConnectionSetup setup;
    setup.number = nextNumber_;
    setup.peer = std::move(peer);
    setup.channel =
        std::make_shared<dbus::ConnectionChannel>(std::move(socket), loop_, nextNumber_,
                                                  dbus::ChannelLimits{static_cast<std::size_t>(options_.unsentReplies),
                                                                      options_.callsInFlight, options_.messageBytes});
    if (!setup.channel->registered()) {
        return;
    }
    setup.facts = &facts_;
    setup.messageBytes = options_.messageBytes;
    setup.serverId = serverId_;
    setup.refusal = std::move(refusal);
    connections_.emplace(nextNumber_, std::make_shared<dbus::ServiceConnection>(std::move(setup)));
    deadlines_.push_back({std::chrono::steady_clock::now() + options_.authentication, nextNumber_});
    ++nextNumber_;
    if (refused) {
        ++lingering_;
    } else {
        ++connectionsOfUser_[user];
    }
}

} // namespace vela::platform
