// Traces with `perf record`, one after the other. Thread-safe; destruction kills what runs and waits for that. Each
// trace that was started tells, in this order: that it started or did not; where it started, that it stopped or broke
// off; its completion. Also when the session is destroyed meanwhile, as an error.
//
//     idle -- start --> starting -- answered --> running -- stop --> stopping -- answered --> ending --> idle
//                           \------------------------ any failure, or the end of perf -------------------^
//
// A start in another state than idle, and a stop in idle, do nothing; a stop while starting is done afterwards.
#pragma once

#include "platform/Mutex.h"
#include "platform/Probe.h"
#include "platform/perf/DelegateCalls.h"
#include "platform/perf/PerfProbe.h"
#include "platform/perf/PerfProcess.h"
#include "platform/perf/TraceFiles.h"
#include "platform/perf/TracePlaces.h"

#include <chrono>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <thread>

namespace vela::platform::perf {

class PerfTraceSession final : public ProbeTraceSession {
public:
    /// `queue` and `clock` outlive the session.
    PerfTraceSession(const PerfProbe::Options& options, std::shared_ptr<TracePlaces> places, const Clock& clock,
                     WorkQueue& queue);
    ~PerfTraceSession() override;
    PerfTraceSession(const PerfTraceSession&) = delete;
    PerfTraceSession& operator=(const PerfTraceSession&) = delete;

    void setDelegate(std::weak_ptr<ProbeTraceDelegate> delegate) override;
    void startProbeTrace() override;
    void stopProbeTrace() override;

private:
    using MaybeFailure = std::optional<Failure>;
    using Limit = std::chrono::milliseconds;

    // For the callers' threads.
    MaybeFailure takePlace() VELA_REQUIRES(mutex_);
    MaybeFailure makeThread() VELA_REQUIRES(mutex_);
    void wake() const;

    // On the thread.
    void work();
    bool awaitStart();
    void trace();
    MaybeFailure begin(PerfProcess& perf, const TraceFile& file);
    MaybeFailure halt(PerfProcess& perf);
    MaybeFailure finish(PerfProcess& perf);
    MaybeFailure ask(PerfProcess& perf, std::string_view command, Limit limit);
    MaybeFailure awaitStop(PerfProcess& perf);
    void complete(const std::string& url, MaybeFailure failure);
    bool isStopWanted();
    bool isAbandoned();

    const PerfProbe::Options options_;
    const std::shared_ptr<TracePlaces> places_; ///< one of them is this session's while it traces
    const TraceFiles files_;
    const std::shared_ptr<DelegateCalls> calls_;
    const FileDescriptor wakeUp_;

    Mutex mutex_;
    bool isTracing_ VELA_GUARDED_BY(mutex_) = false; ///< from the start until just before the completion is told
    bool isStartWanted_ VELA_GUARDED_BY(mutex_) = false;
    bool isStopWanted_ VELA_GUARDED_BY(mutex_) = false;
    bool isAbandoned_ VELA_GUARDED_BY(mutex_) = false;
    std::thread thread_; ///< made under the mutex at the first start, joined at destruction
};

} // namespace vela::platform::perf
