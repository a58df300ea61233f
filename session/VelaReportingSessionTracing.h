// A session's performance trace: decides which kind runs, starts it with the session and waits for its end.
//
//     not tracing -> kernel trace (the service's trace runner) or platform trace (the platform's service) -> ending
//                                                                                                -> not tracing
//
// Only for sessions of type "test" while the feature "AudioAnalytics/Tracing" is on. The wait for the end of a platform
// trace has no time limit; its completion must come from another thread. A start that fails leaves `startedTracing` as
// it is: the stop then waits for the completion all the same.
//
// Owned by its session, and by the platform's service while that calls it. Starting, stopping and `setupTracing` come
// from one thread at a time, the session's; the delegate's operations and all properties but the runner's are of any
// thread.
#pragma once

#include "common/values/Dictionary.h"
#include "platform/DeviceProperties.h"
#include "platform/Identity.h"
#include "platform/Mutex.h"
#include "platform/Probe.h"
#include "platform/PropertyListReading.h"
#include "platform/WorkQueue.h"
#include "tracing/TraceParams.h"
#include "tracing/TraceRunner.h"

#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <string_view>

namespace vela {

/// What traces of sessions take from outside; all of it outlives every session.
struct VelaReportingTracePlatform {
    const platform::DeviceProperties& deviceProperties;
    platform::Probe& probe;
    const platform::PropertyListReading& propertyListReading;
    TraceRunnerPlatform runner;
};

class VelaReportingSessionTracing final : public platform::ProbeTraceDelegate,
                                          public std::enable_shared_from_this<VelaReportingSessionTracing> {
    struct Private {
        explicit Private() = default;
    };

public:
    /// What the session is when its trace is decided about.
    struct Subject {
        std::uint16_t serviceType;
        std::string_view serviceName;
        Dictionary configuration;
    };

    /// `client`: whose rights trace parameters files are read with; without one none is read.
    static std::shared_ptr<VelaReportingSessionTracing> init(std::int64_t reporterID,
                                                             std::optional<platform::Identity> client,
                                                             const VelaReportingTracePlatform& tracePlatform);
    VelaReportingSessionTracing(Private, std::int64_t reporterID, std::optional<platform::Identity> client,
                                const VelaReportingTracePlatform& tracePlatform);
    /// A trace that runs is let go: nobody is told of its end any more.
    ~VelaReportingSessionTracing() override = default;
    VelaReportingSessionTracing(const VelaReportingSessionTracing&) = delete;
    VelaReportingSessionTracing& operator=(const VelaReportingSessionTracing&) = delete;

    /// Decides, and starts what was decided. Reads the parameters file on this thread.
    void start(const Subject& subject);
    /// Ends what runs; blocks until its results are there.
    void stop(const Subject& subject);

    /// Prepares a kernel trace after the file at `path`. Without a path nothing changes.
    void setupTracing(const std::optional<std::string>& path, std::string_view serviceName);

    // The platform trace's delegate.
    void performanceTraceDidStart(const std::optional<platform::Failure>& error) override;
    void performanceTraceDidStop(const std::optional<platform::Failure>& error) override;
    void performanceTraceDidComplete(const std::string& url, const std::string& token,
                                     const std::optional<platform::Failure>& error) override;

    // Properties.

    bool startedTracing() const;
    /// Stays when the trace has ended. Like the runner and its parameters for the thread that starts and stops.
    const std::optional<std::string>& tracingFileName() const { return tracingFileName_; }
    const TraceRunner* traceRunner() const { return traceRunner_.get(); }
    const TraceParams* traceParams() const { return traceParams_.get(); }
    std::shared_ptr<platform::ProbeTraceConfig> traceConfig() const;
    std::shared_ptr<platform::ProbeTraceSession> traceSession() const;
    /// File URL of the last platform trace that completed without an error.
    std::optional<std::string> finalTraceURL() const;

private:
    bool isWanted(std::uint16_t serviceType) const;
    void setStartedTracing(bool started);
    void startKernelTrace(ValueRef path, std::string_view serviceName);
    void startPlatformTrace();
    void endPlatformTrace();

    // Constant after construction.
    const std::int64_t reporterID_;
    const std::optional<platform::Identity> client_;
    const VelaReportingTracePlatform& platform_;
    const std::unique_ptr<platform::Semaphore> mTraceDispatchSemaphore_;

    // Confined to the thread that starts and stops the session.
    std::optional<std::string> tracingFileName_;
    std::unique_ptr<TraceParams> traceParams_; ///< outlives the runner, which refers to it
    std::unique_ptr<TraceRunner> traceRunner_;

    mutable Mutex mutex_;
    bool startedTracing_ VELA_GUARDED_BY(mutex_) = false;
    std::shared_ptr<platform::ProbeTraceConfig> traceConfig_ VELA_GUARDED_BY(mutex_);
    std::shared_ptr<platform::ProbeTraceSession> traceSession_ VELA_GUARDED_BY(mutex_);
    std::optional<std::string> finalTraceURL_ VELA_GUARDED_BY(mutex_);
};

} // namespace vela
