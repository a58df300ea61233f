#include "reporters/pipewire/LibraryCalls.h"

#include "common/VelaReportingVocabulary.h"

#include <vector>

namespace vela::reporter {

namespace {

using reporting::Field;
using reporting::Status;

/// Room in the queue comes by itself. What the library will never take must not be tried for ever.
bool isTaken(Status status) {
    return status != VelaReportingStatusQueueFull && status != VelaReportingStatusNoResources;
}

/// Views of the fields, for as long as these live.
std::vector<Field> viewOf(const std::vector<ReportField>& fields) {
    std::vector<Field> view;
    view.reserve(fields.size() + 2);
    for (const ReportField& field : fields) {
        std::visit(
            [&](const auto& value) {
                if constexpr (std::is_same_v<std::decay_t<decltype(value)>, std::string>) {
                    view.emplace_back(field.key, std::string_view(value));
                } else {
                    view.emplace_back(field.key, value);
                }
            },
            field.value);
    }
    return view;
}

reporting::Options optionsFor(const std::string& address) {
    reporting::Options options;
    options.address = address.empty() ? nullptr : address.c_str();
    return options;
}

} // namespace

LibraryCalls::LibraryCalls(const std::string& address) : client_(optionsFor(address)) {}

bool LibraryCalls::createSession(const SessionDescription& session) {
    std::vector<Field> configuration = viewOf(session.details);
    if (session.application) {
        configuration.emplace_back(VelaReportingApplicationName.text(), std::string_view(*session.application));
    }
    return isTaken(client_.createReportingSession(session.reporterID)) &&
           isTaken(client_.setServiceType(session.serviceType, session.reporterID)) &&
           isTaken(client_.setConfiguration(std::span<const Field>(configuration), session.reporterID));
}

bool LibraryCalls::startSession(std::int64_t reporterID) {
    return isTaken(client_.startReportingSessionForID(reporterID));
}

bool LibraryCalls::send(std::int64_t reporterID, const Report& report) {
    std::vector<Field> message = viewOf(report.fields);
    message.emplace_back(VelaReportingMessageKeyVelaTimestamp.text(), report.epoch);
    return isTaken(client_.sendMessage(std::span<const Field>(message), report.category, report.type, {reporterID}));
}

bool LibraryCalls::destroySession(std::int64_t reporterID) {
    return isTaken(client_.destroyReportingSession(reporterID));
}

bool LibraryCalls::stopSession(std::int64_t reporterID, std::chrono::milliseconds timeout) {
    const Status status = client_.stopReportingSessionForID(reporterID, timeout);
    // Whatever it answered, in whatever form.
    return status == VelaReportingStatusOk || status == VelaReportingStatusRefused ||
           status == VelaReportingStatusProtocolError;
}

} // namespace vela::reporter
