#include "session/VelaReportingSessionTracing.h"

#include "common/VelaReportingVocabulary.h"
#include "session/SessionLog.h"
#include "session/TraceFileURL.h"
#include "session/TraceKeys.h"
#include "tracing/TraceParamsParser.h"

#include <utility>

namespace vela {

namespace {

constexpr std::string_view kFeatureFlagDomain = "AudioAnalytics";
constexpr std::string_view kTracingFeature = "Tracing";

/// The platform's template of traces that every session uses.
constexpr int kTraceTemplate = 1;

/// Whether a configuration asks for the kernel trace.
bool isKernelTrace(const Dictionary& configuration) {
    const ValueRef type = configuration.find(kTraceType);
    return !type || type.isSameObject(Value(VelaReportingTraceTypeSpoor));
}

} // namespace

std::shared_ptr<VelaReportingSessionTracing>
VelaReportingSessionTracing::init(std::int64_t reporterID, std::optional<platform::Identity> client,
                                  const VelaReportingTracePlatform& tracePlatform) {
    return std::make_shared<VelaReportingSessionTracing>(Private(), reporterID, std::move(client), tracePlatform);
}

VelaReportingSessionTracing::VelaReportingSessionTracing(Private, std::int64_t reporterID,
                                                         std::optional<platform::Identity> client,
                                                         const VelaReportingTracePlatform& tracePlatform)
    : reporterID_(reporterID),
      client_(std::move(client)),
      platform_(tracePlatform),
      mTraceDispatchSemaphore_(tracePlatform.runner.workQueues.makeSemaphore(0)) {}

bool VelaReportingSessionTracing::isWanted(std::uint16_t serviceType) const {
    return serviceType == AudioServiceTypeTest &&
           platform_.deviceProperties.featureEnabled(kFeatureFlagDomain, kTracingFeature);
}

void VelaReportingSessionTracing::start(const Subject& subject) {
    if (!isWanted(subject.serviceType) || startedTracing()) {
        return;
    }
    const platform::BlockingScope blocking(platform_.runner.workQueues);
    const ValueRef path = subject.configuration.find(kTraceParamsFile);
    if (isKernelTrace(subject.configuration) && path) {
        startKernelTrace(path, subject.serviceName);
    } else {
        startPlatformTrace();
    }
}

void VelaReportingSessionTracing::startKernelTrace(ValueRef path, std::string_view serviceName) {
    sessionLog().debug("Got the tracefile %@, setting up trace", path);
    if (!path.isString()) {
        setupTracing(std::nullopt, serviceName); // it names no file, and an earlier run's is not this one's
        return;
    }
    setupTracing(std::string(path.text()), serviceName);
    setStartedTracing(true);
    traceRunner_->runTraces();
}

void VelaReportingSessionTracing::setupTracing(const std::optional<std::string>& path, std::string_view serviceName) {
    if (!path) {
        sessionLog().error("TracefileName empty. Failed to setup tracing");
        return;
    }
    tracingFileName_ = path;
    auto params = TraceParamsParser::initWithFileName(*path, client_,
                                                      {platform_.runner.fileSystem, platform_.propertyListReading})
                      .loadTraceParams();
    auto runner = std::make_unique<TraceRunner>(platform_.runner);
    runner->createTraceFromTraceParams(params.get());
    // The former runner goes before its parameters do.
    traceRunner_ = std::move(runner);
    traceParams_ = std::move(params);
    setStartedTracing(false);
    sessionLog().info("Setting up tracing for %@", serviceName);
}

void VelaReportingSessionTracing::startPlatformTrace() {
    const auto config = platform_.probe.makeProbeTraceConfig(kTraceTemplate);
    const auto session = platform_.probe.createProbeTraceSession(*config);
    {
        const MutexLock lock(mutex_);
        traceConfig_ = config;
        traceSession_ = session;
    }
    session->setDelegate(weak_from_this());
    setStartedTracing(true);
    session->startProbeTrace();
}

// Which kind ends is decided anew: what the configuration says may have changed since the start. Wanted.
void VelaReportingSessionTracing::stop(const Subject& subject) {
    if (!isWanted(subject.serviceType) || !startedTracing()) {
        return;
    }
    const platform::BlockingScope blocking(platform_.runner.workQueues);
    setStartedTracing(false);
    if (isKernelTrace(subject.configuration) && tracingFileName_) {
        traceRunner_->stopTracingandProcessResults();
        traceRunner_->forgetResults(); // a stopped session may stay for long
    } else {
        endPlatformTrace();
    }
}

void VelaReportingSessionTracing::endPlatformTrace() {
    if (const auto session = traceSession()) {
        session->stopProbeTrace();
    }
    mTraceDispatchSemaphore_->wait(std::nullopt);
}

void VelaReportingSessionTracing::performanceTraceDidStart(const std::optional<platform::Failure>& error) {
    const LogReporterScope scope(reporterID_);
    // For whoever reads the system's log: at a level that is always kept.
    traceLog().standard("started performance trace.");
    if (!error) {
        traceLog().info("Performance Trace Started");
        return;
    }
    std::shared_ptr<platform::ProbeTraceConfig> config; // let go outside the lock
    std::shared_ptr<platform::ProbeTraceSession> session;
    {
        const MutexLock lock(mutex_);
        std::swap(session, traceSession_);
        std::swap(config, traceConfig_);
    }
    traceLog().error("performanceTraceDidStart %@", error->description);
}

void VelaReportingSessionTracing::performanceTraceDidStop(const std::optional<platform::Failure>& error) {
    const LogReporterScope scope(reporterID_);
    if (!error) {
        traceLog().info("Performance Trace Stopped");
        return;
    }
    std::shared_ptr<platform::ProbeTraceSession> session;
    {
        const MutexLock lock(mutex_);
        std::swap(session, traceSession_);
    }
    traceLog().error("performanceTraceDidStop %@", error->description);
}

void VelaReportingSessionTracing::performanceTraceDidComplete(const std::string& url,
                                                              [[maybe_unused]] const std::string& token,
                                                              const std::optional<platform::Failure>& error) {
    // From the signal on the session may be released.
    const auto self = shared_from_this();
    const LogReporterScope scope(reporterID_);
    const std::shared_ptr<platform::ProbeTraceSession> session = traceSession();
    if (session != nullptr) {
        session->setDelegate({});
        const MutexLock lock(mutex_);
        if (traceSession_ == session) {
            traceSession_ = nullptr; // not the last reference
        }
    }
    // Ahead of the URL: who waited may not see it yet. Wanted.
    mTraceDispatchSemaphore_->signal();
    if (error) {
        traceLog().error("performanceTraceDidComplete %@", error->description);
        return;
    }
    {
        const MutexLock lock(mutex_);
        finalTraceURL_ = url;
    }
    traceLog().info("Performance Trace Completed: %@", pathOfFileURL(url));
}

bool VelaReportingSessionTracing::startedTracing() const {
    const MutexLock lock(mutex_);
    return startedTracing_;
}

void VelaReportingSessionTracing::setStartedTracing(bool started) {
    const MutexLock lock(mutex_);
    startedTracing_ = started;
}

std::shared_ptr<platform::ProbeTraceConfig> VelaReportingSessionTracing::traceConfig() const {
    const MutexLock lock(mutex_);
    return traceConfig_;
}

std::shared_ptr<platform::ProbeTraceSession> VelaReportingSessionTracing::traceSession() const {
    const MutexLock lock(mutex_);
    return traceSession_;
}

std::optional<std::string> VelaReportingSessionTracing::finalTraceURL() const {
    const MutexLock lock(mutex_);
    return finalTraceURL_;
}

} // namespace vela
