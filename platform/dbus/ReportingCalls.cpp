// The operations of the reporting interface: arguments in, reply object out.
#include "platform/dbus/AccessRule.h"
#include "platform/dbus/ServiceCalls.h"

#include <array>

namespace vela::platform::dbus {

namespace {

/// That one message is for: each that is not there costs an error line.
constexpr std::size_t kMostReporters = 1024;

using Run = void (*)(CallTarget&, const MessageHeader&, BodyReader&, PendingCall);

/// Whether there is an object to call; if not, `call` was answered so.
bool objectThere(const CallTarget& target, PendingCall& call) {
    if (target.object == nullptr) {
        call.answerError(kUnknownObjectError, "The service has no object for this connection");
        return false;
    }
    return true;
}

bool ready(const CallTarget& target, BodyReader& body, PendingCall& call) {
    return argumentsComplete(body, call) && objectThere(target, call);
}

void createReportingSession(CallTarget& target, const MessageHeader&, BodyReader& body, PendingCall call) {
    const std::int64_t reporterID = body.int64();
    if (!ready(target, body, call)) {
        return;
    }
    const std::uint32_t limit = target.facts->sessionsPerClient;
    if (target.sessions.size() >= limit && !target.sessions.contains(reporterID)) {
        return call.answerError(kLimitsExceededError, "limits.sessions_per_client is " + std::to_string(limit) +
                                                          ": this connection has as many sessions");
    }
    target.sessions.insert(reporterID);
    target.object->createReportingSession(reporterID, booleanReply(std::move(call)));
}

void setServiceType(CallTarget& target, const MessageHeader&, BodyReader& body, PendingCall call) {
    const std::uint16_t serviceType = body.uint16();
    const std::int64_t session = body.int64();
    if (ready(target, body, call)) {
        target.object->setServiceType(serviceType, session, booleanReply(std::move(call)));
    }
}

void getServiceNameForReporterID(CallTarget& target, const MessageHeader&, BodyReader& body, PendingCall call) {
    const std::int64_t reporterID = body.int64();
    if (ready(target, body, call)) {
        target.object->getServiceNameForReporterID(reporterID, uint16Reply(std::move(call)));
    }
}

void setConfiguration(CallTarget& target, const MessageHeader&, BodyReader& body, PendingCall call) {
    Dictionary configuration = body.dictionary();
    const std::int64_t reporterID = body.int64();
    if (ready(target, body, call)) {
        target.object->setConfiguration(std::move(configuration), reporterID, booleanReply(std::move(call)));
    }
}

void startReportingSessionForID(CallTarget& target, const MessageHeader&, BodyReader& body, PendingCall call) {
    const std::int64_t reporterID = body.int64();
    if (ready(target, body, call)) {
        // The reply may wait for back ends; what keeps the service busy is the operation alone.
        auto underWay = call.countByToken();
        target.object->startReportingSessionForID(reporterID, std::move(underWay), booleanReply(std::move(call)));
    }
}

void sendMessage(CallTarget& target, const MessageHeader&, BodyReader& body, PendingCall call) {
    Dictionary message = body.dictionary();
    const std::uint32_t category = body.uint32();
    const std::uint16_t type = body.uint16();
    auto reportingIDs = body.optionalInt64s();
    if (!ready(target, body, call)) {
        return;
    }
    if (reportingIDs && reportingIDs->size() > kMostReporters) {
        return call.answerError(kLimitsExceededError, "a message may name " + std::to_string(kMostReporters) +
                                                          " reporters: this one names " +
                                                          std::to_string(reportingIDs->size()));
    }
    target.object->sendMessage(std::move(message), category, type, std::move(reportingIDs),
                               emptyReply(std::move(call)));
}

void stopReportingSessionForID(CallTarget& target, const MessageHeader&, BodyReader& body, PendingCall call) {
    const std::int64_t reporterID = body.int64();
    if (ready(target, body, call)) {
        target.object->stopReportingSessionForID(reporterID, booleanReply(std::move(call)));
    }
}

void destroyReportingSession(CallTarget& target, const MessageHeader&, BodyReader& body, PendingCall call) {
    const std::int64_t reporterID = body.int64();
    if (ready(target, body, call)) {
        // The service never destroys a session with the ID 0, so that one stays counted.
        if (reporterID != 0) {
            target.sessions.erase(reporterID);
        }
        target.object->destroyReportingSession(reporterID, booleanReply(std::move(call)));
    }
}

void reporterID(CallTarget& target, const MessageHeader&, BodyReader& body, PendingCall call) {
    const std::int64_t reporterID = body.int64();
    if (ready(target, body, call)) {
        target.object->reporterID(reporterID, reporterReply(std::move(call)));
    }
}

void getAllReporters(CallTarget& target, const MessageHeader&, BodyReader& body, PendingCall call) {
    if (ready(target, body, call)) {
        target.object->getAllReporters(reporterIDsReply(std::move(call)));
    }
}

void killService(CallTarget& target, const MessageHeader&, BodyReader& body, PendingCall call) {
    if (!ready(target, body, call)) {
        return;
    }
    if (!AccessRule::isOwner(target.peer)) {
        return call.answerError(kAccessDeniedError, "Only root and the service's own user may end the service");
    }
    target.object->killService(booleanReply(std::move(call)));
}

constexpr ServiceMember member(std::string_view name, std::string_view in, std::string_view out,
                               std::string_view arguments, Run run) {
    return {kReportingInterface, name, in, out, arguments, false, run};
}

constexpr std::array kMembers = {
    // The most frequent one first: it is found soonest.
    member(kSendMessage, "a{sv}uqaax", "", "message withCategory andType forReportingIDs", sendMessage),
    member(kCreateReportingSession, "x", "b", "reporterID created", createReportingSession),
    member(kSetServiceType, "qx", "b", "serviceType reportingSession set", setServiceType),
    member(kGetServiceNameForReporterID, "x", "q", "reporterID serviceType", getServiceNameForReporterID),
    member(kSetConfiguration, "a{sv}x", "b", "configuration forReporterID set", setConfiguration),
    member(kStartReportingSessionForID, "x", "b", "reporterID started", startReportingSessionForID),
    member(kStopReportingSessionForID, "x", "b", "reporterID stopped", stopReportingSessionForID),
    member(kDestroyReportingSession, "x", "b", "reporterID destroyed", destroyReportingSession),
    member(kReporterID, "x", "a{sv}", "reporterID valid", reporterID),
    member(kGetAllReporters, "", "ax", "reporterIDs", getAllReporters),
    member(kKillService, "", "b", "killed", killService),
};

} // namespace

std::span<const ServiceMember> reportingMembers() { return kMembers; }

} // namespace vela::platform::dbus
