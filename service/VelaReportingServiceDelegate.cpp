#include "service/VelaReportingServiceDelegate.h"

#include "backends/VelaReportingJouleUtility.h"
#include "backends/VelaReportingTallyBridge.h"
#include "backends/VelaReportingTelemBridge.h"
#include "common/VelaReportingUtility.h"
#include "service/FeatureKeys.h"
#include "service/ServiceLog.h"
#include "service/VelaReportingClientServerInstance.h"
#include "service/VelaReportingClientUptime.h"
#include "service/VelaReportingDefaults.h"

#include <algorithm>
#include <cassert>
#include <utility>

namespace vela {

namespace {

constexpr std::string_view kReportingQueueName = "com.orvex.vela.reporting.server";

std::shared_ptr<const VelaReportingServiceContext> makeContext(const VelaReportingServicePlatform& servicePlatform) {
    const platform::Platform& platform = servicePlatform.platform;
    return std::make_shared<const VelaReportingServiceContext>(
        servicePlatform, std::make_unique<VelaReportingTallyBridge>(platform.tally),
        std::make_unique<VelaReportingJouleUtility>(platform.joule),
        std::make_unique<VelaReportingTelemBridge>(platform.telem));
}

std::vector<Dictionary> newFeatureTable() {
    const auto entry = [](std::string_view domain, std::string_view feature, std::string_view notification) {
        DictionaryBuilder builder;
        if (!domain.empty()) {
            builder.add(kFeatureDefaultsDomain, domain);
        }
        builder.add(kFeatureDomain, feature);
        builder.add(kFeatureNotification, notification);
        return builder.build();
    };
    return {entry(kLobbyDomain, kSpatialAudioAccessoryFeature, kSpatialAudioChanged),
            entry(kVelaDomain, kDeviceName, kDeviceNameChanged), entry({}, kRingerState, kRingerStateChanged)};
}

} // namespace

std::shared_ptr<VelaReportingServiceDelegate>
VelaReportingServiceDelegate::init(const VelaReportingServicePlatform& servicePlatform) {
    auto delegate = std::make_shared<VelaReportingServiceDelegate>(Private(), servicePlatform);
    delegate->initialise();
    return delegate;
}

VelaReportingServiceDelegate::VelaReportingServiceDelegate(Private, const VelaReportingServicePlatform& servicePlatform)
    : context_(makeContext(servicePlatform)),
      reportingQueue_(context_->platform.workQueues.makeSerialQueue(kReportingQueueName,
                                                                    platform::QualityOfService::UserInteractive)) {}

// Apart from the constructor: a notification may come while this still runs, and holds the delegate weakly.
void VelaReportingServiceDelegate::initialise() {
    setReportingEnabled(true);
    defaults_ = VelaReportingDefaults(context_->platform.preferences);
    {
        const MutexLock lock(featuresMutex_);
        features_ = newFeatureTable();
    }
    listenForFeatureStateChanges();
    driverUtility_ = std::make_unique<VelaReportingDriverUtility>(context_->platform.hwStats, *context_->tallyBridge);
    if (VelaReportingUtilityIsInternalBuild()) {
        snagStateManager_ = std::make_unique<VelaReportingUtilitySnagStateManager>(context_->platform.malady);
    }
}

VelaReportingServiceDelegate::~VelaReportingServiceDelegate() {
    for (const std::int32_t token : notifyTokens_) {
        context_->platform.notifications.cancel(token);
    }
}

bool VelaReportingServiceDelegate::shouldAcceptNewConnection(
    const std::shared_ptr<platform::IpcConnection>& connection) {
    const std::int32_t pid = connection->processIdentifier();
    serviceLog().standard("newConnection: %@", connection->description());
    std::shared_ptr<VelaReportingClientServerInstance> client;
    {
        const RecursiveMutexLock lock(lock_);
        client = VelaReportingClientServerInstance::initWithPID(pid, weak_from_this(), context_,
                                                                connection->peerIdentity(), connection);
        connection->setExportedObject(client);
    }
    // Before the connection is resumed, so that it runs ahead of every call.
    reportingQueue_->post([weak = weak_from_this(), client, peer = std::weak_ptr(connection)] {
        if (const auto self = weak.lock()) {
            self->registerClient(client, peer.lock());
        }
    });
    installHandlers(connection, client, context_);
    connection->resume();
    return true;
}

void VelaReportingServiceDelegate::registerClient(const std::shared_ptr<VelaReportingClientServerInstance>& client,
                                                  const std::shared_ptr<platform::IpcConnection>& connection) {
    assert(reportingQueue_->isCurrent());
    {
        const RecursiveMutexLock lock(lock_);
        clients_.push_back(client);
    }
    client->setClientStartDate(context_->platform.clock.now());
    auto name =
        VelaReportingUtilityProcessNameForPID(context_->platform.processInformation, client->processIdentifier());
    if (connection == nullptr || connection->confirmProcess()) {
        client->setClientProcessName(std::move(name));
    }
}

// The handlers hold the client weakly: the connection, which holds the handlers, owns it.
void VelaReportingServiceDelegate::installHandlers(const std::shared_ptr<platform::IpcConnection>& connection,
                                                   const std::shared_ptr<VelaReportingClientServerInstance>& client,
                                                   const std::shared_ptr<const VelaReportingServiceContext>& context) {
    const std::weak_ptr<VelaReportingClientServerInstance> weak = client;
    connection->setInterruptionHandler([weak] {
        serviceLog().standard("interruptionHandler: connection exited");
        if (const auto alive = weak.lock()) {
            alive->handleConnectionError();
        }
    });
    connection->setInvalidationHandler([weak, context, pid = client->processIdentifier()] {
        std::optional<platform::WallTime> startDate;
        std::optional<std::string> processName;
        if (const auto alive = weak.lock()) {
            alive->handleConnectionError();
            startDate = alive->clientStartDate();
            processName = alive->clientProcessName();
        }
        VelaReportingSendClientUptime(*context, pid, startDate, processName);
    });
}

VelaReportingServiceDelegate::Sessions VelaReportingServiceDelegate::getAllActiveReportingSessions() const {
    Sessions active;
    for (const auto& client : clients()) {
        Sessions all = client->clientReportingSessions();
        serviceLog().standard("sessions for client %i : %@", client->processIdentifier(),
                              VelaReportingSessionListText{all});
        std::copy_if(std::make_move_iterator(all.begin()), std::make_move_iterator(all.end()),
                     std::back_inserter(active), [](const auto& session) { return session->started(); });
    }
    return active;
}

std::shared_ptr<VelaReportingSession>
VelaReportingServiceDelegate::findReportingSessionForID(std::int64_t reporterID) const {
    if (reporterID == 0 || !isReportingEnabled()) {
        return nullptr;
    }
    std::shared_ptr<VelaReportingSession> session;
    std::int32_t holder = 0;
    {
        const RecursiveMutexLock lock(lock_);
        for (auto client = clients_.begin(); client != clients_.end() && session == nullptr; ++client) {
            session = (*client)->findReportingSessionForID(reporterID, false);
            holder = (*client)->processIdentifier();
        }
    }
    if (session != nullptr) {
        serviceLog().info("found reporting session %lli for client %i", reporterID, holder);
    } else {
        serviceLog().error("failed to find reporting session %lli", reporterID);
    }
    return session;
}

// Read without the lock: only this queue changes it.
const VelaReportingServiceDelegate::Clients&
VelaReportingServiceDelegate::getAllClients() const VELA_NO_THREAD_SAFETY_ANALYSIS {
    assert(reportingQueue_->isCurrent());
    return clients_;
}

VelaReportingServiceDelegate::Clients VelaReportingServiceDelegate::clients() const {
    const RecursiveMutexLock lock(lock_);
    return clients_;
}

void VelaReportingServiceDelegate::removeClient(const VelaReportingClientServerInstance& client) {
    assert(reportingQueue_->isCurrent());
    std::shared_ptr<VelaReportingClientServerInstance> removed; // let go outside the lock
    const RecursiveMutexLock lock(lock_);
    const auto found =
        std::find_if(clients_.begin(), clients_.end(), [&](const auto& held) { return held.get() == &client; });
    if (found != clients_.end()) {
        removed = std::move(*found);
        clients_.erase(found);
    }
}

std::uint64_t VelaReportingServiceDelegate::activeSessionCount() const {
    assert(reportingQueue_->isCurrent());
    return activeSessionCount_;
}

void VelaReportingServiceDelegate::setActiveSessionCount(std::uint64_t count) {
    assert(reportingQueue_->isCurrent());
    activeSessionCount_ = count;
}

VelaReportingDriverSnapShot VelaReportingServiceDelegate::getSnapShot() const { return driverUtility_->getSnapShot(); }

void VelaReportingServiceDelegate::sendDriverLogsForSession(
    const std::shared_ptr<VelaReportingSession>& session) const {
    const LedgerScope ledgerScope(session->ledgerEntry());
    driverUtility_->sendDriverLogsForSession(session);
}

void VelaReportingServiceDelegate::handleEventForSnag(const Dictionary& message, std::uint32_t category,
                                                      std::uint32_t type,
                                                      const std::shared_ptr<VelaReportingSession>& session,
                                                      const std::optional<std::string>& processName) {
    assert(reportingQueue_->isCurrent());
    if (snagStateManager_ != nullptr && VelaReportingUtilityIsInternalBuild()) {
        snagStateManager_->handleEvent(message, category, type, session, processName);
    }
}

} // namespace vela
