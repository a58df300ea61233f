#include "session/VelaReportingSession.h"

#include "common/SettingValues.h"
#include "common/TextFormat.h"
#include "common/VelaReportingUtility.h"
#include "session/SessionLog.h"
#include "session/SessionTraceCode.h"
#include "shaping/VolumeMessages.h"

#include <utility>

namespace vela {

std::shared_ptr<VelaReportingSession>
VelaReportingSession::initWithID(std::int64_t reporterID, std::vector<std::int32_t> processIdentifiers,
                                 const VelaReportingSessionPlatform& sessionPlatform,
                                 std::optional<platform::Identity> client) {
    return std::make_shared<VelaReportingSession>(Private(), reporterID, std::move(processIdentifiers), sessionPlatform,
                                                  std::move(client));
}

VelaReportingSession::VelaReportingSession(Private, std::int64_t reporterID,
                                           std::vector<std::int32_t> processIdentifiers,
                                           const VelaReportingSessionPlatform& sessionPlatform,
                                           std::optional<platform::Identity> client)
    : reporterID_(reporterID),
      processIdentifiers_(std::move(processIdentifiers)),
      platform_(sessionPlatform),
      beaconreportingBackendSemaphore_(sessionPlatform.workQueues.makeSemaphore(0)),
      budget_(sessionPlatform.memory == nullptr
                  ? nullptr
                  : std::make_shared<VelaReportingSessionBudget>(*sessionPlatform.memory)),
      ledgerEntry_(sessionPlatform.ledger == nullptr
                       ? nullptr
                       : sessionPlatform.ledger->open(processIdentifiers_.empty() ? 0 : processIdentifiers_.front(),
                                                      reporterID)),
      tracing_(sessionPlatform.tracing == nullptr
                   ? nullptr
                   : VelaReportingSessionTracing::init(reporterID, std::move(client), *sessionPlatform.tracing)) {
    const LogReporterScope scope(reporterID_);
    sessionLog().info("created reporting session for ID: %lli", reporterID_);
    platform_.spoor.emit(kTraceInit);
}

VelaReportingSession::~VelaReportingSession() {
    const LogReporterScope scope(reporterID_);
    platform_.spoor.emit(kTraceDealloc);
    endList();
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
    refusalTold_ = false;
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
    if (tracing_ != nullptr) {
        tracing_->start(traceSubject());
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
    if (tracing_ != nullptr) {
        tracing_->stop(traceSubject());
    }
    endList();
    started_ = false;
}

void VelaReportingSession::endList() {
    const MutexLock lock(nestedAggregatedPayloadData_.mutex());
    nestedAggregatedPayloadData_.clear();
    if (budget_ != nullptr) {
        budget_->give(std::exchange(listBytes_, 0));
    }
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
    const LedgerScope ledgerScope(ledgerEntry_);
    for (const Dictionary& message : messages) {
        shapeAndSend(message, AudioEventCategoryVolume, AudioEventTypeSummary, Limits::Lifted);
        platform_.analytics.handleEvent(message, AudioEventCategoryVolume, AudioEventTypeSummary, shared_from_this());
    }
}

void VelaReportingSession::sendSummaryEvent() {
    const std::optional<Dictionary> summary = createSummaryEventForSession();
    if (summary) {
        sessionLog().standard("sending summary event for reporter %lli", reporterID_);
        shapeAndSend(*summary, AudioEventCategoryAll, AudioEventTypeUnknown, Limits::Lifted);
    }
}

void VelaReportingSession::sendMessage(const Dictionary& message, std::uint32_t category, std::uint16_t type,
                                       [[maybe_unused]] bool sync, ErrorReply reply) {
    const std::optional<platform::Failure> refused = shapeAndSend(message, category, type, Limits::Hold);
    if (reply) {
        reply(refused);
    }
}

// Answers why the message was refused, or none.
std::optional<platform::Failure> VelaReportingSession::shapeAndSend(const Dictionary& message, std::uint32_t category,
                                                                    std::uint16_t type, Limits limits) {
    const LogReporterScope scope(reporterID_);
    sessionLog().debug("sending message for session owned by %lli", reporterID_);
    const Dictionary tagged =
        VelaReportingUtilityAddAudioMessageTag(VelaReportingUtilityRemoveWhiteSpaceFromKeys(message), category, type);
    const bool isForwarded = beaconReportingEnabled_;
    LedgerItem item(ledgerEntry_, DeliveryBackend::Beacon);
    // Once for the list, and once for the way to Beacon, where the message may have to wait.
    VelaReportingSessionShare listShare;
    VelaReportingSessionShare beaconShare;
    if (budget_ != nullptr) {
        const std::uint64_t bytes = memoryOf(tagged);
        if (const auto limit = budget_->take(isForwarded ? 2 * bytes : bytes, limits == Limits::Lifted)) {
            item.drop(DropReason::Limit);
            return refuse(*limit);
        }
        listShare = {budget_, bytes};
        beaconShare = {budget_, isForwarded ? bytes : 0};
    }
    bool redundant = false;
    {
        const MutexLock lock(nestedAggregatedPayloadData_.mutex());
        redundant = nestedAggregatedPayloadData_.createMessageIdentifierWithCategory(category, type, tagged);
        if (nestedAggregatedPayloadData_.exists() && !redundant) {
            listBytes_ += listShare.keep();
        }
    }
    // The recorded message keeps its time: only what is forwarded loses it.
    Dictionary forwarded = VelaReportingUtilityRemoveEventEpochTime(tagged);
    platform_.spoor.emit(kTraceSend);
    const bool started = started_;
    if (isForwarded) {
        BeaconMessage queued{
            std::move(forwarded), message, std::move(beaconShare), std::move(item), category, type, started, redundant};
        beaconReportingQueue().post([self = shared_from_this(), queued = std::move(queued)]() mutable {
            self->sendBeaconReportingMessage(std::move(queued));
        });
    } else {
        item.drop(DropReason::NotReported);
    }
    return std::nullopt;
}

std::string VelaReportingSession::textOf(VelaReportingMemoryLimit limit) const {
    const VelaReportingSessionLimits& all = budget_->memory().limits();
    const bool own = limit == VelaReportingMemoryLimit::SessionBytes;
    return formatText("limits.%s is %@", own ? "session_bytes" : "total_bytes",
                      byteSizeText(static_cast<std::int64_t>(own ? all.sessionBytes : all.totalBytes)));
}

platform::Failure VelaReportingSession::refuse(VelaReportingMemoryLimit limit) {
    const std::string text = textOf(limit);
    if (!refusalTold_.exchange(true)) {
        sessionLog().error("reporter %lli keeps no more messages: %@", reporterID_, text);
    }
    return {0, text};
}

void VelaReportingSession::setServiceType(std::uint16_t serviceType) {
    const LogReporterScope scope(reporterID_);
    serviceType_ = serviceType;
    sessionLog().info("setting service type %@", serviceName());
}

std::string_view VelaReportingSession::serviceName() const {
    return VelaReportingUtilityGenerateServiceNameFromServiceType(serviceType());
}

VelaReportingSessionTracing::Subject VelaReportingSession::traceSubject() const {
    return {serviceType(), serviceName(), configuration()};
}

std::optional<std::string> VelaReportingSession::getProbeTraceFileURL() const {
    return tracing_ == nullptr ? std::nullopt : tracing_->finalTraceURL();
}

Dictionary VelaReportingSession::configuration() const {
    const MutexLock lock(configurationMutex_);
    return configuration_;
}

std::optional<platform::Failure>
VelaReportingSession::setConfiguration(const std::optional<Dictionary>& configuration) {
    return configuration ? updateConfigurationWithContentsOfConfiguration(*configuration) : std::nullopt;
}

std::optional<platform::Failure>
VelaReportingSession::updateConfigurationWithContentsOfConfiguration(const Dictionary& configuration) {
    const MutexLock lock(configurationMutex_);
    Dictionary merged = configuration_.merging(configuration);
    if (budget_ != nullptr) {
        if (const auto limit = configurationShare_.resize(memoryOf(merged))) {
            const std::string text = textOf(*limit);
            if (!std::exchange(configurationRefusalTold_, true)) {
                sessionLog().error("reporter %lli keeps its configuration as it is: %@", reporterID_, text);
            }
            return platform::Failure{0, text};
        }
    }
    configuration_ = std::move(merged);
    return std::nullopt;
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
