// A client's messages on their way to its sessions, the bridges and issue capture.
#include "common/VelaReportingUtility.h"
#include "service/ServiceLog.h"
#include "service/VelaReportingClientServerInstance.h"

namespace vela {

namespace {

const char* const kErrorDomain = "com.orvex.audio.reporting";
constexpr std::int32_t kReportingDisabled = 1;

/// The session of a message that no session was there for.
constexpr std::int64_t kStandaloneReporterID = 1;
constexpr std::string_view kUnknownApplication = "Unknown";

} // namespace

void VelaReportingClientServerInstance::sendMessage(Dictionary message, std::uint32_t withCategory,
                                                    std::uint16_t andType,
                                                    std::optional<std::vector<std::int64_t>> forReportingIDs,
                                                    platform::IpcReply<> reply) {
    // Asked now, while the client is likely to live, and only where issue capture reads it.
    std::optional<std::string> processName;
    if (andType == AudioEventTypeJoule && VelaReportingUtilityIsInternalBuild()) {
        processName = senderName();
    }
    enqueue([this, message = std::move(message), withCategory, andType, reporterIDs = std::move(forReportingIDs),
             processName = std::move(processName), reply = std::move(reply)](Delegate& delegate) mutable {
        serviceLog().debug("sending message for reporter %@", VelaReportingReporterListText{reporterIDs});
        if (!delegate.isReportingEnabled()) {
            reply(platform::IpcError{kErrorDomain, kReportingDisabled});
            return;
        }
        Delivery delivery{message, withCategory, andType, processName};
        if (reporterIDs) {
            sendToReporters(delegate, delivery, *reporterIDs);
        } else {
            sendToActiveSessions(delegate, delivery);
        }
        reply(delivery.passedLimit.empty() ? std::nullopt
                                           : std::optional(platform::IpcError{{}, 0, delivery.passedLimit}));
    });
}

/// None when the client's process is gone: its number may be another one's by now.
std::optional<std::string> VelaReportingClientServerInstance::senderName() const {
    auto name = VelaReportingUtilityProcessNameForPID(context_->platform.processInformation, processIdentifier_);
    const std::shared_ptr<platform::IpcConnection> peer = peer_.lock();
    return peer == nullptr || peer->confirmProcess() ? std::move(name) : std::nullopt;
}

void VelaReportingClientServerInstance::sendToReporters(Delegate& delegate, Delivery& delivery,
                                                        const std::vector<std::int64_t>& reporterIDs) {
    for (const std::int64_t reporterID : reporterIDs) {
        const auto session = reporterID == 0 ? nullptr : findReportingSessionForID(reporterID, true);
        if (session != nullptr) {
            handleEvent(delegate, delivery, session);
            send(delivery, *session);
        }
    }
}

void VelaReportingClientServerInstance::sendToActiveSessions(Delegate& delegate, Delivery& delivery) {
    const Sessions active = delegate.getAllActiveReportingSessions();
    serviceLog().standard("active reporting sessions %lu : %@", active.size(), VelaReportingSessionListText{active});
    if (active.empty()) {
        sendStandalone(delegate, delivery);
    }
    for (const auto& session : active) {
        // The session first here, and last everywhere else: wanted.
        send(delivery, *session);
        handleEvent(delegate, delivery, session);
    }
}

void VelaReportingClientServerInstance::sendStandalone(Delegate& delegate, Delivery& delivery) {
    const auto session = VelaReportingSession::initWithID(
        kStandaloneReporterID, {context_->platform.processInformation.ownPid()}, context_->sessionPlatform);
    session->setServiceType(AudioServiceTypeStandalone);
    DictionaryBuilder configuration;
    configuration.add(VelaReportingApplicationName, kUnknownApplication);
    session->updateConfigurationWithContentsOfConfiguration(configuration.build());
    session->updateConfigurationWithContentsOfConfiguration(delegate.getDefaults());
    session->setBeaconReportingEnabled(true);
    handleEvent(delegate, delivery, session);
    send(delivery, *session);
}

void VelaReportingClientServerInstance::send(Delivery& delivery, VelaReportingSession& session) {
    // Called before this returns.
    session.sendMessage(delivery.message, delivery.category, delivery.type,
                        [&delivery](const std::optional<platform::Failure>& refusal) {
                            if (refusal && delivery.passedLimit.empty()) {
                                delivery.passedLimit = refusal->description;
                            }
                        });
}

void VelaReportingClientServerInstance::handleEvent(Delegate& delegate, const Delivery& delivery,
                                                    const std::shared_ptr<VelaReportingSession>& session) {
    const LedgerScope ledgerScope(session->ledgerEntry());
    context_->tallyBridge->handleEvent(delivery.message, delivery.category, delivery.type, session);
    context_->jouleUtility->handleEvent(delivery.message, delivery.category, delivery.type, session);
    context_->telemBridge->handleEvent(delivery.message, delivery.category, delivery.type, session);
    delegate.handleEventForSnag(delivery.message, delivery.category, delivery.type, session, delivery.processName);
}

} // namespace vela
