#include "client/Operations.h"

#include "platform/dbus/Protocol.h"

#include <array>
#include <cassert>

namespace vela::client {

namespace {

namespace dbus = platform::dbus;

// In the enumeration's order.
constexpr std::array<OperationForm, kOperations> kForms = {{
    {dbus::kCreateReportingSession, "x", "b"},
    {dbus::kSetServiceType, "qx", "b"},
    {dbus::kSetConfiguration, "a{sv}x", "b"},
    {dbus::kStartReportingSessionForID, "x", "b"},
    {dbus::kSendMessage, "a{sv}uqaax", ""},
    {dbus::kStopReportingSessionForID, "x", "b"},
    {dbus::kDestroyReportingSession, "x", "b"},
    {dbus::kGetServiceNameForReporterID, "x", "q"},
    {dbus::kReporterID, "x", "a{sv}"},
    {dbus::kGetAllReporters, "", "ax"},
    {dbus::kKillService, "", ""},
}};

Reply errorOf(const dbus::MessageHeader& header) {
    Reply reply;
    reply.status = VelaReportingStatusRefused;
    reply.errorName = header.errorName;
    if (header.signature.substr(0, 1) == "s") {
        reply.errorText = dbus::BodyReader(header).string();
    }
    return reply;
}

Reply protocolError(std::string text) {
    Reply reply;
    reply.status = VelaReportingStatusProtocolError;
    reply.errorText = std::move(text);
    return reply;
}

VelaReportingReporter reporterOf(const Dictionary& description) {
    VelaReportingReporter reporter{};
    reporter.reporterID = description.find(dbus::kReporterIDKey).integerValue();
    reporter.serviceType = static_cast<std::uint16_t>(description.find(dbus::kServiceTypeKey).integerValue(0xFFFF));
    return reporter;
}

} // namespace

const OperationForm& formOf(Operation operation) { return kForms[static_cast<std::size_t>(operation)]; }

Reply replyOf(Operation operation, const dbus::MessageHeader& header) {
    if (header.type == dbus::MessageType::Error) {
        return errorOf(header);
    }
    const OperationForm& form = formOf(operation);
    if (header.signature != form.reply) {
        return protocolError("the reply to " + std::string(form.member) + " has the signature \"" +
                             std::string(header.signature) + "\"");
    }
    Reply reply;
    dbus::BodyReader body(header);
    if (operation == Operation::GetServiceNameForReporterID) {
        reply.serviceType = body.uint16();
    } else if (operation == Operation::ReporterID) {
        reply.reporter = reporterOf(body.dictionary());
    } else if (operation == Operation::GetAllReporters) {
        reply.reporterIDs = body.int64s();
    } else if (form.reply == "b" && !body.boolean()) {
        reply.status = VelaReportingStatusRefused;
        reply.errorText = "the service answered false";
    }
    body.finish();
    return body.error() ? protocolError(body.error()->text) : reply;
}

} // namespace vela::client
