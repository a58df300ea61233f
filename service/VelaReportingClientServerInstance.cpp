#include "service/VelaReportingClientServerInstance.h"

#include "common/VelaReportingUtility.h"
#include "service/ServiceLog.h"

#include <algorithm>
#include <cstdlib>

namespace vela {

namespace {

using platform::IpcReply;

/// At most so many sessions report in real time at once.
constexpr std::uint64_t kMostRealTimeSessions = 5;

const Key kProxyKeyReporterID("reporterID");
const Key kProxyKeyServiceType("serviceType");

constexpr int kKilledStatus = 2;

/// The unknown type of no session.
std::uint16_t serviceTypeOf(const std::shared_ptr<VelaReportingSession>& session) {
    return session == nullptr ? std::uint16_t{AudioServiceTypeUnknown} : session->serviceType();
}

} // namespace

std::shared_ptr<VelaReportingClientServerInstance> VelaReportingClientServerInstance::initWithPID(
    std::int32_t pid, std::weak_ptr<Delegate> delegate, std::shared_ptr<const VelaReportingServiceContext> context,
    std::optional<platform::Identity> identity, std::weak_ptr<platform::IpcConnection> peer) {
    return std::make_shared<VelaReportingClientServerInstance>(Private(), pid, std::move(delegate), std::move(context),
                                                               std::move(identity), std::move(peer));
}

VelaReportingClientServerInstance::VelaReportingClientServerInstance(
    Private, std::int32_t pid, std::weak_ptr<Delegate> delegate,
    std::shared_ptr<const VelaReportingServiceContext> context, std::optional<platform::Identity> identity,
    std::weak_ptr<platform::IpcConnection> peer)
    : processIdentifier_(pid),
      delegate_(std::move(delegate)),
      context_(std::move(context)),
      identity_(std::move(identity)),
      peer_(std::move(peer)) {
    serviceLog().standard("new client with pid %lu", pid);
}

VelaReportingClientServerInstance::~VelaReportingClientServerInstance() {
    serviceLog().standard("dealloc %i from the server client list", processIdentifier_);
}

void VelaReportingClientServerInstance::createReportingSession(std::int64_t reporterID, IpcReply<bool> reply) {
    enqueue([this, reporterID, reply = std::move(reply)](Delegate& delegate) mutable {
        const LogReporterScope scope(reporterID);
        serviceLog().debug("creating session for reporter %lli", reporterID);
        const std::shared_ptr<VelaReportingSession> session =
            VelaReportingSession::initWithID(reporterID, {processIdentifier_}, context_->sessionPlatform, identity_);
        // What it replaces is let go as it is, without a stop: wanted.
        storeSession(reporterID, session);
        // One more than at the start, where the session itself counts: wanted.
        session->setBeaconReportingEnabled(delegate.activeSessionCount() <= kMostRealTimeSessions);
        serviceLog().standard("session created for reporter %lli", reporterID);
        reply(std::nullopt, true);
    });
}

void VelaReportingClientServerInstance::setServiceType(std::uint16_t serviceType, std::int64_t reportingSession,
                                                       IpcReply<bool> reply) {
    enqueue([this, serviceType, reportingSession, reply = std::move(reply)](Delegate&) mutable {
        const LogReporterScope scope(reportingSession);
        serviceLog().debug("setting service type %i for reporter %lli", serviceType, reportingSession);
        if (const auto session = findReportingSessionForID(reportingSession, false);
            reportingSession != 0 && session != nullptr) {
            session->setServiceType(serviceType);
            // Two spaces: wanted, here and below.
            serviceLog().standard("service type %i set for reporter  %lli", serviceType, reportingSession);
        }
        reply(std::nullopt, true);
    });
}

void VelaReportingClientServerInstance::getServiceNameForReporterID(std::int64_t reporterID,
                                                                    IpcReply<std::uint16_t> reply) {
    enqueue([this, reporterID, reply = std::move(reply)](Delegate&) mutable {
        const LogReporterScope scope(reporterID);
        serviceLog().debug("fetching seviceType"); // the misspelt word is wanted
        if (reporterID == 0) {
            reply(std::nullopt, AudioServiceTypeUnknown);
            return;
        }
        const std::uint16_t serviceType = serviceTypeOf(findReportingSessionForID(reporterID, true));
        reply(std::nullopt, serviceType);
        serviceLog().standard("returning service type %i for reporter  %lli", serviceType, reporterID);
    });
}

void VelaReportingClientServerInstance::setConfiguration(Dictionary configuration, std::int64_t forReporterID,
                                                         IpcReply<bool> reply) {
    enqueue(
        [this, configuration = std::move(configuration), forReporterID, reply = std::move(reply)](Delegate&) mutable {
            const LogReporterScope scope(forReporterID);
            serviceLog().debug("setting configuration");
            if (const auto session = findReportingSessionForID(forReporterID, false)) {
                if (const auto refusal = session->updateConfigurationWithContentsOfConfiguration(configuration)) {
                    reply(platform::IpcError{{}, 0, refusal->description}, false);
                    return;
                }
            }
            reply(std::nullopt, true);
        });
}

void VelaReportingClientServerInstance::destroyReportingSession(std::int64_t reporterID, IpcReply<bool> reply) {
    enqueue([this, reporterID, reply = std::move(reply)](Delegate&) mutable {
        const LogReporterScope scope(reporterID);
        serviceLog().debug("destroying session for reporter %lli", reporterID);
        if (reporterID == 0) {
            reply(std::nullopt, true);
            return;
        }
        if (const auto session = findReportingSessionForID(reporterID, false)) {
            // It stays counted, and nobody samples the drivers: wanted.
            if (session->started()) {
                const platform::BlockingScope blocking(context_->platform.workQueues);
                session->stop();
            }
            removeSession(reporterID);
        }
        serviceLog().standard("destroying %lli", reporterID);
        reply(std::nullopt, true);
    });
}

void VelaReportingClientServerInstance::reporterID(std::int64_t reporterID, IpcReply<Dictionary> valid) {
    enqueue([this, reporterID, valid = std::move(valid)](Delegate&) mutable {
        const LogReporterScope scope(reporterID);
        serviceLog().debug("validating reporter %lli", reporterID);
        const auto session = findReportingSessionForID(reporterID, true);
        DictionaryBuilder description;
        description.add(kProxyKeyReporterID, session == nullptr ? std::int64_t{0} : reporterID);
        description.add(kProxyKeyServiceType, serviceTypeOf(session));
        serviceLog().standard("validating reporter %lli", reporterID);
        valid(std::nullopt, description.build());
    });
}

void VelaReportingClientServerInstance::getAllReporters(IpcReply<std::vector<std::int64_t>> reply) {
    enqueue([reply = std::move(reply)](Delegate& delegate) mutable {
        std::vector<std::int64_t> reporterIDs;
        for (const auto& client : delegate.getAllClients()) {
            for (const auto& session : client->clientReportingSessions()) {
                reporterIDs.push_back(session->reporterID());
            }
        }
        reply(std::nullopt, std::move(reporterIDs));
    });
}

void VelaReportingClientServerInstance::killService(IpcReply<bool>) {
    serviceLog().standard("DESTROYING SERVICE");
    // No exit handlers and no destructors: other threads are at work, the reporting queue may be blocked.
    std::_Exit(kKilledStatus);
}

void VelaReportingClientServerInstance::handleConnectionError() {
    enqueue([this](Delegate& delegate) { endConnection(delegate); });
}

std::shared_ptr<VelaReportingSession>
VelaReportingClientServerInstance::findReportingSessionForID(std::int64_t reporterID, bool acrossAllClients) const {
    {
        const MutexLock lock(mutex_);
        const auto found = clientReportingSessionMap_.find(reporterID);
        if (found != clientReportingSessionMap_.end()) {
            return found->second;
        }
    }
    if (!acrossAllClients) {
        return nullptr;
    }
    const std::shared_ptr<Delegate> delegate = delegate_.lock();
    return delegate == nullptr ? nullptr : delegate->findReportingSessionForID(reporterID);
}

VelaReportingClientServerInstance::Sessions VelaReportingClientServerInstance::clientReportingSessions() const {
    Sessions sessions;
    const MutexLock lock(mutex_);
    sessions.reserve(clientReportingSessionMap_.size());
    for (const auto& [reporterID, session] : clientReportingSessionMap_) {
        sessions.push_back(session);
    }
    return sessions;
}

std::shared_ptr<VelaReportingSession>
VelaReportingClientServerInstance::storeSession(std::int64_t reporterID,
                                                std::shared_ptr<VelaReportingSession> session) {
    const MutexLock lock(mutex_);
    return std::exchange(clientReportingSessionMap_[reporterID], std::move(session));
}

std::shared_ptr<VelaReportingSession> VelaReportingClientServerInstance::removeSession(std::int64_t reporterID) {
    const MutexLock lock(mutex_);
    const auto node = clientReportingSessionMap_.extract(reporterID);
    return node.empty() ? nullptr : node.mapped();
}

VelaReportingClientServerInstance::Sessions VelaReportingClientServerInstance::removeAllSessions() {
    Sessions sessions = clientReportingSessions();
    const MutexLock lock(mutex_);
    clientReportingSessionMap_.clear();
    return sessions;
}

std::optional<platform::WallTime> VelaReportingClientServerInstance::clientStartDate() const {
    const MutexLock lock(mutex_);
    return clientStartDate_;
}

void VelaReportingClientServerInstance::setClientStartDate(platform::WallTime startDate) {
    const MutexLock lock(mutex_);
    clientStartDate_ = startDate;
}

std::optional<std::string> VelaReportingClientServerInstance::clientProcessName() const {
    const MutexLock lock(mutex_);
    return clientProcessName_;
}

void VelaReportingClientServerInstance::setClientProcessName(std::optional<std::string> processName) {
    const MutexLock lock(mutex_);
    clientProcessName_ = std::move(processName);
}

} // namespace vela
