#include "session/VelaReportingSession.h"

#include "common/TextFormat.h"
#include "common/VelaReportingUtility.h"
#include "session/SessionLog.h"
#include "session/SessionTraceCode.h"
#include "shaping/VolumeMessages.h"

#include <utility>

namespace vela {

std::shared_ptr<VelaReportingSession>
VelaReportingSession::initWithID(std::int64_t reporterID, std::vector<std::int32_t> processIdentifiers,
                                 const VelaReportingSessionPlatform& sessionPlatform) {
    return std::make_shared<VelaReportingSession>(Private(), reporterID, std::move(processIdentifiers),
                                                  sessionPlatform);
}

VelaReportingSession::VelaReportingSession(Private, std::int64_t reporterID,
                                           std::vector<std::int32_t> processIdentifiers,
                                           const VelaReportingSessionPlatform& sessionPlatform)
    : reporterID_(reporterID),
      processIdentifiers_(std::move(processIdentifiers)),
      platform_(sessionPlatform),
      beaconreportingBackendSemaphore_(sessionPlatform.workQueues.makeSemaphore(0)) {
    const LogReporterScope scope(reporterID_);
    sessionLog().info("created reporting session for ID: %lli", reporterID_);
    platform_.spoor.emit(kTraceInit);
}

VelaReportingSession::~VelaReportingSession() {
    const LogReporterScope scope(reporterID_);
    platform_.spoor.emit(kTraceDealloc);
    sessionLog().info("deallocing this session %lli", reporterID_);
}

void VelaReportingSession::start() {
    const LogReporterScope scope(reporterID_);
    sessionLog().debug("starting session owned by %lli", reporterID_);
    if (started_) {
        sessionLog().info("%lli is already started", reporterID_);
        return;
    }
    started_ = true;
    {
        const MutexLock lock(nestedAggregatedPayloadData_.mutex());
        nestedAggregatedPayloadData_.begin();
    }
    platform_.spoor.emit(kTraceStart);
    const bool enabled = beaconReportingEnabled_;
    const std::uint64_t startNumber = transaction_.begin(enabled);
    if (enabled) {
        BeaconSetup setup{configuration(), startNumber, serviceType()};
        beaconReportingQueue().post(
            [self = shared_from_this(), setup = std::move(setup)] { self->setupBeaconReporting(setup); });
    }
}

void VelaReportingSession::stop() {
    const LogReporterScope scope(reporterID_);
    sessionLog().debug("ending session %lli", reporterID_);
    if (!started_) {
        return;
    }
    // Written twice, before and after the test: wanted.
    sessionLog().debug("ending session %lli", reporterID_);
    platform_.spoor.emit(kTraceStop);
    sendVolumeMessages();
    writeSummaryJson();
    sendSummaryEvent();
    if (beaconReportingEnabled_) {
        beaconReportingQueue().post([self = shared_from_this()] { self->endBeaconReporting(); });
    }
    {
        const MutexLock lock(nestedAggregatedPayloadData_.mutex());
        nestedAggregatedPayloadData_.clear();
    }
    started_ = false;
}

void VelaReportingSession::sendVolumeMessages() {
    std::vector<Dictionary> messages;
    {
        // The walk ends before its first result is sent into the list that it walks.
        const MutexLock lock(nestedAggregatedPayloadData_.mutex());
        messages = createVolumeMessages(nestedAggregatedPayloadData_.messages(), applicationName(),
                                        VelaReportingUtilityVolumeMinimumPlayingTime(serviceType()));
    }
    if (messages.empty()) {
        return;
    }
    sessionLog().standard("sending volume event for reporter %lli", reporterID_);
    for (const Dictionary& message : messages) {
        sendMessage(message, AudioEventCategoryVolume, AudioEventTypeSummary, true, {});
        platform_.analytics.handleEvent(message, AudioEventCategoryVolume, AudioEventTypeSummary, shared_from_this());
    }
}

void VelaReportingSession::sendSummaryEvent() {
    const std::optional<Dictionary> summary = createSummaryEventForSession();
    if (summary) {
        sessionLog().standard("sending summary event for reporter %lli", reporterID_);
        sendMessage(*summary, AudioEventCategoryAll, AudioEventTypeUnknown, true, {});
    }
}

void VelaReportingSession::sendMessage(const Dictionary& message, std::uint32_t category, std::uint16_t type,
                                       [[maybe_unused]] bool sync, ErrorReply reply) {
    const LogReporterScope scope(reporterID_);
    sessionLog().debug("sending message for session owned by %lli", reporterID_);
    const Dictionary tagged =
        VelaReportingUtilityAddAudioMessageTag(VelaReportingUtilityRemoveWhiteSpaceFromKeys(message), category, type);
    bool redundant = false;
    {
        const MutexLock lock(nestedAggregatedPayloadData_.mutex());
        redundant = nestedAggregatedPayloadData_.createMessageIdentifierWithCategory(category, type, tagged);
    }
    // The recorded message keeps its time: only what is forwarded loses it.
    Dictionary forwarded = VelaReportingUtilityRemoveEventEpochTime(tagged);
    platform_.spoor.emit(kTraceSend);
    const bool started = started_;
    if (beaconReportingEnabled_) {
        BeaconMessage queued{std::move(forwarded), message, category, type, started, redundant};
        beaconReportingQueue().post(
            [self = shared_from_this(), queued = std::move(queued)] { self->sendBeaconReportingMessage(queued); });
    }
    if (reply) {
        reply(std::nullopt);
    }
}

void VelaReportingSession::setServiceType(std::uint16_t serviceType) {
    const LogReporterScope scope(reporterID_);
    serviceType_ = serviceType;
    sessionLog().info("setting service type %@", serviceName());
}

std::string_view VelaReportingSession::serviceName() const {
    return VelaReportingUtilityGenerateServiceNameFromServiceType(serviceType());
}

Dictionary VelaReportingSession::configuration() const {
    const MutexLock lock(configurationMutex_);
    return configuration_;
}

void VelaReportingSession::setConfiguration(const std::optional<Dictionary>& configuration) {
    if (configuration) {
        updateConfigurationWithContentsOfConfiguration(*configuration);
    }
}

void VelaReportingSession::updateConfigurationWithContentsOfConfiguration(const Dictionary& configuration) {
    const MutexLock lock(configurationMutex_);
    configuration_ = configuration_.merging(configuration);
}

Value VelaReportingSession::applicationName() const { return VelaReportingUtilityRetrieveAppName(configuration()); }

std::string VelaReportingSession::description() const {
    return formatText("reporterID=%lli,serviceName=%@,ownerPid=%li,HostApplicationDisplayID=%@,started=%i", reporterID_,
                      serviceName(), processIdentifiers_.empty() ? 0 : processIdentifiers_.front(), applicationName(),
                      started());
}

platform::SerialQueue& VelaReportingSession::beaconReportingQueue() {
    std::call_once(beaconReportingQueueMade_, [this] {
        beaconReportingQueue_ = platform_.workQueues.makeSerialQueue("com.orvex.vela.session.beaconreporting",
                                                                     platform::QualityOfService::Utility);
    });
    return *beaconReportingQueue_;
}

void appendDescription(std::string& text, const VelaReportingSession& session) { text += session.description(); }

} // namespace vela
