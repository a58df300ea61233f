#include "platform/dbus/ServiceCalls.h"

#include "platform/dbus/Introspection.h"

#include <array>
#include <initializer_list>

namespace vela::platform::dbus {

namespace {

/// Which tables a call may mean, and whether its path is the service's object.
struct Place {
    bool object = false; ///< kObjectPath
    bool known = false;  ///< the object, or a node above it
};

Place placeOf(std::string_view path) {
    Place place;
    place.object = path == kObjectPath;
    place.known = place.object || !childOfNode(path).empty();
    return place;
}

/// The result of a search through all tables.
struct Found {
    const ServiceMember* member = nullptr;
    bool interfaceKnown = false;
    bool wrongPlace = false; ///< there is such a member, at another path
};

Found find(const MessageHeader& header, const Place& place) {
    Found found;
    const auto search = [&](std::span<const ServiceMember> members) {
        for (const ServiceMember& member : members) {
            const bool interface = header.interface.empty() || member.interface == header.interface;
            found.interfaceKnown = found.interfaceKnown || interface;
            if (!interface || member.name != header.member) {
                continue;
            }
            if (place.object || member.everywhere) {
                found.member = &member;
                return;
            }
            found.wrongPlace = true;
        }
    };
    for (const auto members : {reportingMembers(), inspectionMembers(), standardMembers(), busMembers()}) {
        if (search(members); found.member != nullptr) {
            break;
        }
    }
    return found;
}

/// Answers why there is no such member.
void refuse(const MessageHeader& header, const Place& place, const Found& found, PendingCall call) {
    const std::string where = " at the object " + quoted(header.path);
    if (!place.known || found.wrongPlace) {
        call.answerError(place.known ? kUnknownMethodError : kUnknownObjectError, "There is nothing to call" + where +
                                                                                      "; the service is at \"" +
                                                                                      std::string(kObjectPath) + "\"");
    } else if (!found.interfaceKnown) {
        call.answerError(kUnknownInterfaceError, "There is no interface " + quoted(header.interface) + where);
    } else {
        call.answerError(
            kUnknownMethodError,
            "There is no member " + quoted(header.member) +
                (header.interface.empty() ? " in any interface" : " in the interface " + quoted(header.interface)) +
                where);
    }
}

} // namespace

bool argumentsComplete(BodyReader& body, PendingCall& call) {
    body.finish();
    if (!body.error()) {
        return true;
    }
    if (body.error()->name == kInconsistentMessageError) {
        call.drop(); // the connection will be closed
    } else {
        call.answerError(*body.error());
    }
    return false;
}

bool dispatchCall(const MessageHeader& header, CallTarget& target, const std::shared_ptr<ConnectionChannel>& channel) {
    PendingCall call(channel, header);
    const Place place = placeOf(header.path);
    const Found found = find(header, place);
    if (found.member == nullptr) {
        refuse(header, place, found, std::move(call));
        return true;
    }
    const ServiceMember& member = *found.member;
    if (header.signature != member.in) {
        call.answerError(kInvalidArgsError, std::string(member.name) + " takes arguments of the signature \"" +
                                                std::string(member.in) + "\", not " + quoted(header.signature));
        return true;
    }
    BodyReader body(header, target.facts->valueDepth);
    member.run(target, header, body, std::move(call));
    return !body.error() || body.error()->name != kInconsistentMessageError;
}

} // namespace vela::platform::dbus
