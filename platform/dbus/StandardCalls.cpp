// What every D-Bus object answers, what a bus would answer, and the service's read-only inspection.
#include "platform/dbus/Introspection.h"
#include "platform/dbus/ServiceCalls.h"

#include <array>
#include <cerrno>
#include <fcntl.h>

namespace vela::platform::dbus {

namespace {

void answerString(PendingCall& call, std::string_view text) {
    call.answer("s", [text](MessageWriter& writer) { writer.string(text); });
}

// Inspection.

void getLedger(CallTarget& target, const MessageHeader&, BodyReader& body, PendingCall call) {
    if (argumentsComplete(body, call)) {
        const ServiceInspection* inspection = target.facts->inspection;
        const Dictionary ledger = inspection == nullptr ? Dictionary() : inspection->ledger();
        call.answer("a{sv}", [&ledger](MessageWriter& writer) { writer.dictionary(ledger); });
    }
}

void getSessions(CallTarget& target, const MessageHeader&, BodyReader& body, PendingCall call) {
    if (argumentsComplete(body, call)) {
        const ServiceInspection* inspection = target.facts->inspection;
        const Array sessions = inspection == nullptr ? Array() : inspection->sessions();
        call.answer("aa{sv}", [&sessions](MessageWriter& writer) {
            const auto open = writer.openArray(4);
            for (const ValueRef session : sessions) {
                if (session.isDictionary()) {
                    writer.dictionary(session.dictionary());
                }
            }
            writer.closeArray(open);
        });
    }
}

void getVersion(CallTarget& target, const MessageHeader&, BodyReader& body, PendingCall call) {
    if (argumentsComplete(body, call)) {
        answerString(call, target.facts->version);
    }
}

// Peer.

/// The machine's identity, 32 hex digits; empty where it has none.
std::string machineId() {
    constexpr std::size_t kDigits = 32;
    for (const char* path : {"/etc/machine-id", "/var/lib/dbus/machine-id"}) {
        const FileDescriptor file(open(path, O_RDONLY | O_CLOEXEC));
        std::string text;
        if (file && readToEnd(file, text, kDigits) && text.size() >= kDigits) {
            return text.substr(0, kDigits);
        }
    }
    return {};
}

void ping(CallTarget&, const MessageHeader&, BodyReader& body, PendingCall call) {
    if (argumentsComplete(body, call)) {
        call.answerEmpty();
    }
}

void getMachineId(CallTarget&, const MessageHeader&, BodyReader& body, PendingCall call) {
    if (!argumentsComplete(body, call)) {
        return;
    }
    static const std::string id = machineId();
    if (id.empty()) {
        return call.answerError(kFailedError, "This machine has no identity");
    }
    answerString(call, id);
}

// Introspectable and Properties.

void introspect(CallTarget&, const MessageHeader& header, BodyReader& body, PendingCall call) {
    if (!argumentsComplete(body, call)) {
        return;
    }
    const std::string text = introspectionText(header.path);
    if (text.empty()) {
        return call.answerError(kUnknownObjectError, "There is no object " + quoted(header.path));
    }
    answerString(call, text);
}

bool isInterfaceOfObject(std::string_view name) {
    for (const auto members : {reportingMembers(), inspectionMembers(), standardMembers()}) {
        for (const ServiceMember& member : members) {
            if (member.interface == name) {
                return true;
            }
        }
    }
    return false;
}

void refuseProperty(std::string_view interface, std::string_view property, PendingCall& call) {
    if (isInterfaceOfObject(interface)) {
        return call.answerError(kUnknownPropertyError, "The interface " + quoted(interface) + " has no property " +
                                                           quoted(property) + ", nor any other");
    }
    call.answerError(kUnknownInterfaceError, "There is no interface " + quoted(interface));
}

void getProperty(CallTarget&, const MessageHeader&, BodyReader& body, PendingCall call) {
    const std::string_view interface = body.string();
    const std::string_view property = body.string();
    if (argumentsComplete(body, call)) {
        refuseProperty(interface, property, call);
    }
}

void setProperty(CallTarget&, const MessageHeader&, BodyReader& body, PendingCall call) {
    const std::string_view interface = body.string();
    const std::string_view property = body.string();
    body.skipVariant();
    if (argumentsComplete(body, call)) {
        refuseProperty(interface, property, call);
    }
}

void getAllProperties(CallTarget&, const MessageHeader&, BodyReader& body, PendingCall call) {
    const std::string_view interface = body.string();
    if (!argumentsComplete(body, call)) {
        return;
    }
    if (!interface.empty() && !isInterfaceOfObject(interface)) {
        return call.answerError(kUnknownInterfaceError, "There is no interface " + quoted(interface));
    }
    call.answer("a{sv}", [](MessageWriter& writer) { writer.dictionary({}); });
}

// The bus.

void hello(CallTarget& target, const MessageHeader&, BodyReader& body, PendingCall call) {
    if (argumentsComplete(body, call)) {
        answerString(call, ":1." + std::to_string(target.connection));
    }
}

/// There are no signals, so every rule is taken and none is kept.
void matchRule(CallTarget&, const MessageHeader&, BodyReader& body, PendingCall call) {
    body.string();
    if (argumentsComplete(body, call)) {
        call.answerEmpty();
    }
}

constexpr std::array kInspectionMembers = {
    ServiceMember{kInspectionInterface, kGetLedger, "", "a{sv}", "ledger", false, getLedger},
    ServiceMember{kInspectionInterface, kGetSessions, "", "aa{sv}", "sessions", false, getSessions},
    ServiceMember{kInspectionInterface, kGetVersion, "", "s", "version", false, getVersion},
};

constexpr std::array kStandardMembers = {
    ServiceMember{kIntrospectableInterface, "Introspect", "", "s", "xml_data", true, introspect},
    ServiceMember{kPeerInterface, "Ping", "", "", "", true, ping},
    ServiceMember{kPeerInterface, "GetMachineId", "", "s", "machine_uuid", true, getMachineId},
    ServiceMember{kPropertiesInterface, "Get", "ss", "v", "interface_name property_name value", false, getProperty},
    ServiceMember{kPropertiesInterface, "GetAll", "s", "a{sv}", "interface_name properties", false, getAllProperties},
    ServiceMember{kPropertiesInterface, "Set", "ssv", "", "interface_name property_name value", false, setProperty},
};

constexpr std::array kBusMembers = {
    ServiceMember{kBusInterface, "Hello", "", "s", "unique_name", true, hello},
    ServiceMember{kBusInterface, "AddMatch", "s", "", "rule", true, matchRule},
    ServiceMember{kBusInterface, "RemoveMatch", "s", "", "rule", true, matchRule},
};

} // namespace

std::span<const ServiceMember> inspectionMembers() { return kInspectionMembers; }
std::span<const ServiceMember> standardMembers() { return kStandardMembers; }
std::span<const ServiceMember> busMembers() { return kBusMembers; }

} // namespace vela::platform::dbus
