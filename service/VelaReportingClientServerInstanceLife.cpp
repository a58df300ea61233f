// Start and stop of a client's sessions, and the end of its connection. Only the start counts a session as active and
// only the stop takes it off again: one that is destroyed, replaced or lost with its connection stays counted, and
// after five of those no session that starts reports in real time. Wanted.
#include "common/VelaReportingUtility.h"
#include "service/ServiceLog.h"
#include "service/VelaReportingClientServerInstance.h"

#include <algorithm>

namespace vela {

namespace {

using platform::IpcReply;

/// From this count on a session starts without real-time reporting.
constexpr std::uint64_t kTooManyRealTimeSessions = 6;

constexpr std::string_view kFeatureFlagDomain = "AudioAnalytics";
constexpr std::string_view kTracingFeature = "Tracing";

/// A reply that two may call, on whatever threads.
class VelaReportingSharedReply {
public:
    explicit VelaReportingSharedReply(IpcReply<bool> reply) : reply_(std::move(reply)) {}

    void operator()(const std::optional<platform::IpcError>& error, bool answer) {
        const MutexLock lock(mutex_);
        reply_(error, answer);
    }

private:
    Mutex mutex_;
    IpcReply<bool> reply_ VELA_GUARDED_BY(mutex_);
};

void logActiveSessions(const VelaReportingServiceDelegateProtocol& delegate) {
    if (serviceLog().isEnabled(platform::LogLevel::Default)) {
        const auto active = delegate.getAllActiveReportingSessions();
        serviceLog().standard("%ld active reporting session(s) %@", delegate.activeSessionCount(),
                              VelaReportingSessionListText{active});
    }
}

} // namespace

void VelaReportingClientServerInstance::startReportingSessionForID(std::int64_t reporterID,
                                                                   std::shared_ptr<void> underWay,
                                                                   IpcReply<bool> reply) {
    enqueue([this, reporterID, underWay = std::move(underWay), reply = std::move(reply)](Delegate& delegate) mutable {
        startSession(delegate, reporterID, std::move(reply));
        // The reply may be seconds away; the client's next calls are not to wait for it.
        underWay.reset();
    });
}

void VelaReportingClientServerInstance::startSession(Delegate& delegate, std::int64_t reporterID,
                                                     IpcReply<bool> reply) {
    const LogReporterScope scope(reporterID);
    serviceLog().debug("starting session for reporter %lli", reporterID);
    const auto session = findReportingSessionForID(reporterID, false);
    if (reporterID == 0 || session == nullptr || session->started()) {
        reply(std::nullopt, true);
        return;
    }
    delegate.setActiveSessionCount(delegate.activeSessionCount() + 1);
    session->setBeaconReportingEnabled(delegate.activeSessionCount() < kTooManyRealTimeSessions);
    session->start();
    {
        // Drivers are sampled.
        const platform::BlockingScope blocking(context_->platform.workQueues);
        session->setDriverSnapShot(delegate.getSnapShot());
    }
    session->completeTransaction();
    const auto shared = std::make_shared<VelaReportingSharedReply>(std::move(reply));
    session->setTransactionCompleteBlock(
        [shared](const std::optional<platform::IpcError>& error, bool answer) { (*shared)(error, answer); });
    if (const std::optional<Dictionary> state = delegate.getFeaturesState()) {
        session->sendMessage(*state, AudioEventCategorySetup, AudioEventTypeSetup, {});
    }
    if (context_->platform.deviceProperties.featureEnabled(kFeatureFlagDomain, kTracingFeature) &&
        session->serviceType() == AudioServiceTypeTest) {
        // The session may call it again; only the first call is answered.
        (*shared)(std::nullopt, true);
    }
    logActiveSessions(delegate);
}

void VelaReportingClientServerInstance::stopReportingSessionForID(std::int64_t reporterID, IpcReply<bool> reply) {
    enqueue([this, reporterID, reply = std::move(reply)](Delegate& delegate) mutable {
        const LogReporterScope scope(reporterID);
        serviceLog().debug("stopping session for reporter %lli", reporterID);
        if (reporterID == 0) {
            reply(std::nullopt, true);
            return;
        }
        stopSession(delegate, reporterID);
        serviceLog().standard("stopping %lli", reporterID);
        reply(std::nullopt, true);
    });
}

void VelaReportingClientServerInstance::stopSession(Delegate& delegate, std::int64_t reporterID) {
    const auto session = findReportingSessionForID(reporterID, false);
    if (session == nullptr || !session->started()) {
        return;
    }
    {
        // Drivers are sampled and a file may be written.
        const platform::BlockingScope blocking(context_->platform.workQueues);
        delegate.sendDriverLogsForSession(session);
        session->setDriverSnapShot(std::nullopt);
        session->stop();
    }
    delegate.setActiveSessionCount(delegate.activeSessionCount() - 1);
    session->completeTransaction();
    logActiveSessions(delegate);
}

void VelaReportingClientServerInstance::endConnection(Delegate& delegate) {
    const auto& clients = delegate.getAllClients();
    const bool isRegistered =
        std::any_of(clients.begin(), clients.end(), [this](const auto& client) { return client.get() == this; });
    if (!isRegistered) {
        return;
    }
    {
        const platform::BlockingScope blocking(context_->platform.workQueues);
        for (const auto& session : clientReportingSessions()) {
            if (session->started()) {
                session->stop();
            }
        }
    }
    removeAllSessions();
    delegate.removeClient(*this);
    serviceLog().standard("removing %i from the server client list", processIdentifier_);
}

} // namespace vela
