// The session's real-time reporting: all but `sendSingleMessage` runs on its serial queue.
#include "common/TextFormat.h"
#include "common/VelaReportingUtility.h"
#include "session/BeaconKeys.h"
#include "session/SessionLog.h"
#include "session/SessionTraceCode.h"
#include "session/VelaReportingSession.h"

#include <cerrno>
#include <chrono>
#include <random>
#include <utility>

namespace vela {

namespace {

std::int64_t randomBelow(std::int64_t limit) {
    std::random_device device;
    return std::uniform_int_distribution<std::int64_t>(0, limit - 1)(device);
}

// Prints as the signed number that the log has always shown: -1 for a summary.
std::int32_t shownCategory(std::uint32_t category) { return static_cast<std::int32_t>(category); }

Dictionary singleMessageSessionInfo() {
    DictionaryBuilder info;
    info.add(kBeaconClientType, kBeaconClientTypeValue);
    info.add(kBeaconClientVersion, kBeaconClientVersionValue);
    info.add(kBeaconSessionID, kBeaconSingleMessageSessionID);
    return info.build();
}

Dictionary singleMessageUserInfo(std::uint16_t serviceType) {
    DictionaryBuilder info;
    info.add(kBeaconClientName, kBeaconClientNameValue);
    info.add(kBeaconServiceName, VelaReportingUtilityGenerateServiceNameFromServiceType(serviceType));
    return info.build();
}

void sendSingleMessageNow(const VelaReportingSessionPlatform& sessionPlatform, const Dictionary& message,
                          std::uint32_t category, std::uint16_t type, std::uint16_t serviceType,
                          VelaReportingSession::ErrorReply reply) {
    sessionPlatform.spoor.emit(kTraceSend);
    beaconLog().debug("sending single message");
    const Dictionary payload = VelaReportingUtilityRemoveWhiteSpaceFromKeys(message);
    if (!VelaReportingUtilityShouldSendMessage()) {
        beaconLog().info("event sampled %@", payload);
        return;
    }
    const platform::Result<platform::Done> sent = sessionPlatform.beacon.sendOneBeaconMessage(
        singleMessageSessionInfo(), singleMessageUserInfo(serviceType),
        VelaReportingUtilityRetrieveBeaconReportingCategoryFromCategory(category), type, payload);
    if (sent) {
        beaconLog().debug("message %@ : category %i : type %i", payload, shownCategory(category), type);
    } else {
        beaconLog().error("sendOneMessageWithSessionInfo %@", sent.failure().description);
    }
    if (reply) {
        reply(sent ? std::nullopt : std::optional(sent.failure()));
    }
}

// What Beacon took is counted by Beacon.
void endDelivery(LedgerItem& item, const std::optional<platform::Failure>& error) {
    if (!error) {
        item.handOver();
    } else if (error->code == ENOBUFS) {
        item.drop(DropReason::QueueFull);
    } else {
        item.drop(error->code == EMSGSIZE ? DropReason::Limit : DropReason::Failed);
    }
}

Dictionary sessionInfo(std::int64_t reporterID, std::uint16_t serviceType, const Value& token,
                       const Dictionary& configuration) {
    const bool batches = VelaReportingUtilityShouldBatchBeaconReportingEventsForServiceType(serviceType);
    DictionaryBuilder info;
    info.add(kBeaconClientType, kBeaconClientTypeValue);
    info.add(kBeaconClientVersion, kBeaconClientVersionValue);
    info.add(kBeaconSessionID, VelaReportingUtilityExtractSessionIDFromReporterID(reporterID));
    info.add(kBeaconBatchEvents, batches);
    info.add(kBeaconHierarchyToken, token);
    info.add(kBeaconContainsRealTimeEvents, !batches);
    if (const ValueRef application = configuration.find(VelaReportingApplicationName)) {
        info.add(kBeaconClientBundleID, Value(application));
    }
    return info.build();
}

Dictionary userInfo(std::uint16_t serviceType, const Dictionary& configuration) {
    const std::string_view serviceName = VelaReportingUtilityGenerateServiceNameFromServiceType(serviceType);
    DictionaryBuilder info;
    info.add(kBeaconClientName, kBeaconClientNameValue);
    info.add(kBeaconServiceName, std::string_view(formatText("%@%@", serviceName, kBeaconServiceNameSuffix)));
    return info.build().merging(configuration);
}

} // namespace

void VelaReportingSession::setupBeaconReporting(const BeaconSetup& setup) {
    const LogReporterScope scope(reporterID_);
    beaconLog().debug("entering beaconreporting %s", __func__);
    if (!VelaReportingUtilityAllowSessionTransactions() || setup.serviceType == AudioServiceTypeTest) {
        transaction_.end(setup.startNumber);
        return;
    }
    beaconReportingAgentToken_ = platform_.beacon.newBeaconHierarchyToken(ValueRef());
    beaconReportingSession_ = platform_.beacon.createBeaconSession(
        sessionInfo(reporterID_, setup.serviceType, beaconReportingAgentToken_, setup.configuration),
        userInfo(setup.serviceType, setup.configuration));
    startBeaconBackendDiscovery();
    waitForBeaconBackends(setup.startNumber);
}

void VelaReportingSession::startBeaconBackendDiscovery() {
    // An answer that never comes must not keep the session.
    beaconReportingSession_->startBeaconBackendDiscovery([weak = weak_from_this()](std::optional<Array> backends) {
        const std::shared_ptr<VelaReportingSession> self = weak.lock();
        if (self == nullptr) {
            return;
        }
        const LogReporterScope scope(self->reporterID_);
        if (backends) {
            beaconLog().standard("list of backends %@", *backends);
        } else {
            beaconLog().error("no backends found, this session won't get sent to the server");
        }
        self->beaconReportingSessionStarted_ = backends.has_value();
        self->beaconreportingBackendSemaphore_->signal();
    });
}

void VelaReportingSession::waitForBeaconBackends(std::uint64_t startNumber) {
    beaconLog().standard("waiting to find backends");
    beaconreportingBackendSemaphore_->waitSuspending(beaconReportingQueue(),
                                                     std::chrono::seconds(kBeaconBackendTimeoutSeconds),
                                                     [self = shared_from_this(), startNumber](bool signalled) {
                                                         const LogReporterScope scope(self->reporterID_);
                                                         self->finishBeaconSetup(signalled);
                                                         self->transaction_.end(startNumber);
                                                     });
}

void VelaReportingSession::finishBeaconSetup(bool signalled) {
    if (!signalled) {
        beaconLog().standard("timed out waiting for backends");
        dropBeaconReportingSession();
    } else if (!beaconReportingSessionStarted_) {
        beaconLog().standard("failed to find backend");
        dropBeaconReportingSession();
    } else {
        beaconLog().standard("continuing with backends!");
    }
}

void VelaReportingSession::dropBeaconReportingSession() {
    beaconReportingSession_ = nullptr;
    beaconReportingAgentToken_ = Value();
}

void VelaReportingSession::sendBeaconReportingMessage(BeaconMessage message) {
    const LogReporterScope scope(reporterID_);
    const LedgerScope ledgerScope(ledgerEntry_);
    beaconLog().debug("entering beaconreporting %s", __func__);
    if (!message.started) {
        beaconLog().debug("session not started, will send as a single message");
        sendSingleMessage(platform_, message.forwarded, message.category, message.type, serviceType(), configuration(),
                          [share = std::move(message.share), item = std::move(message.item)](
                              const std::optional<platform::Failure>& error) mutable { endDelivery(item, error); });
        return;
    }
    if (message.redundant) {
        message.item.repeat();
        return;
    }
    if (!VelaReportingUtilityAllowSessionTransactions() || serviceType() == AudioServiceTypeTest) {
        message.item.drop(DropReason::NotReported);
        return;
    }
    if (beaconReportingSession_ == nullptr || !beaconReportingSessionStarted_) {
        message.item.drop(DropReason::NoBackends);
        return;
    }
    const platform::Result<platform::Done> sent = beaconReportingSession_->sendBeaconMessage(
        VelaReportingUtilityRetrieveBeaconReportingCategoryFromCategory(message.category), message.type,
        message.forwarded);
    endDelivery(message.item, sent ? std::nullopt : std::optional(sent.failure()));
    // A message that could not be sent is passed over without a line: wanted.
    if (sent) {
        beaconLog().debug("BeaconReportingAgent %@ : message %@ : category %i : type %i",
                          beaconReportingSession_->description(), message.original, shownCategory(message.category),
                          message.type);
    }
}

void VelaReportingSession::endBeaconReporting() {
    const LogReporterScope scope(reporterID_);
    beaconLog().debug("entering beaconreporting %s", __func__);
    if (!VelaReportingUtilityAllowSessionTransactions() || serviceType() == AudioServiceTypeTest) {
        return;
    }
    if (beaconReportingSession_ != nullptr) {
        beaconReportingSession_->flushBeaconMessages();
    }
    dropBeaconReportingSession();
    beaconReportingSessionStarted_ = false;
    beaconLog().debug("stopping and setting session to nil");
}

void VelaReportingSession::sendSingleMessage(const VelaReportingSessionPlatform& sessionPlatform,
                                             const Dictionary& message, std::uint32_t category, std::uint16_t type,
                                             std::uint16_t serviceType, [[maybe_unused]] const Dictionary& userInfo,
                                             ErrorReply reply) {
    constexpr std::int64_t kAlarmSpreadSeconds = 60;
    const std::int64_t delta = serviceType == AudioServiceTypeAlarms ? randomBelow(kAlarmSpreadSeconds) : 0;
    beaconLog().debug("sending single message after delta %lli for service %i", delta, serviceType);
    // Always one second: that the delta of alarms is only logged is wanted.
    sessionPlatform.workQueues.background().postAfter(
        std::chrono::seconds(1), [&sessionPlatform, message, category, type, serviceType,
                                  entry = LedgerScope::current(), reply = std::move(reply)]() mutable {
            const LedgerScope ledgerScope(std::move(entry));
            sendSingleMessageNow(sessionPlatform, message, category, type, serviceType, std::move(reply));
        });
}

} // namespace vela
