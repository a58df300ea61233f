// The calls of one connection: which members there are, their signatures, and what each does. Confined to the
// endpoint's thread.
#pragma once

#include "platform/Ipc.h"
#include "platform/dbus/ConnectionChannel.h"
#include "platform/dbus/MessageReader.h"
#include "platform/dbus/PeerCredentials.h"
#include "platform/dbus/PendingCall.h"

#include <cstdint>
#include <memory>
#include <span>
#include <string>
#include <string_view>
#include <unordered_set>

namespace vela::platform::dbus {

/// What the calls of all connections share.
struct ServiceFacts {
    std::string version;
    std::uint32_t valueDepth = 32;
    std::uint32_t sessionsPerClient = 1024;
    const ServiceInspection* inspection = nullptr; ///< outlives the endpoint; may be none
};

/// What the calls of one connection work on.
struct CallTarget {
    const ServiceFacts* facts = nullptr;
    std::shared_ptr<ReportingServiceProtocol> object; ///< none: the reporting interface has no object
    PeerCredentials peer;
    std::uint64_t connection = 0;              ///< its number, for its unique name
    std::unordered_set<std::int64_t> sessions; ///< created and not destroyed by this connection
};

/// A member of an interface of the service's object.
struct ServiceMember {
    std::string_view interface;
    std::string_view name;
    std::string_view in;        ///< signature
    std::string_view out;       ///< signature
    std::string_view arguments; ///< names of those that go in, then of those that come out, with spaces between
    bool everywhere = false;    ///< at every object path, not only the service's object
    void (*run)(CallTarget& target, const MessageHeader& header, BodyReader& body, PendingCall call) = nullptr;
};

/// Members of the service's object, by interface in the order of introspection.
std::span<const ServiceMember> reportingMembers();
std::span<const ServiceMember> inspectionMembers();
std::span<const ServiceMember> standardMembers();
/// What a bus would answer, so that clients which expect one are content.
std::span<const ServiceMember> busMembers();

/// Ends reading the arguments: true when they are complete, else `call` was answered with what is wrong.
bool argumentsComplete(BodyReader& body, PendingCall& call);

/// Runs a call or answers what is wrong with it. False when its bytes are no message, and the connection is to be
/// closed.
bool dispatchCall(const MessageHeader& header, CallTarget& target, const std::shared_ptr<ConnectionChannel>& channel);

} // namespace vela::platform::dbus
