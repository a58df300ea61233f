// Collects kernel trace events while a session runs and writes the durations of its intervals when it stops.
//
// Used by one thread at a time, its owner's. Events, completions and the ends of kernel trace sessions happen on a
// queue of its own; destroyed at any time, it waits for what runs there and completes nothing more. Everything in
// TraceRunnerPlatform outlives it.
#pragma once

#include "platform/FileSystem.h"
#include "platform/Metricsheet.h"
#include "platform/ProcessControl.h"
#include "platform/Spoor.h"
#include "platform/WorkQueue.h"
#include "tracing/Trace.h"
#include "tracing/TraceParams.h"
#include "tracing/TracePointBudget.h"

#include <cstddef>
#include <cstdint>
#include <memory>
#include <string>
#include <string_view>
#include <vector>

namespace vela {

/// Of the results, under the path root.
inline constexpr std::string_view VelaReportingTracingLogsDirectory =
    "/private/var/mobile/Library/Logs/Wreckage/DiagnosticLogs/Audio/Traces";

struct TraceRunnerPlatform {
    platform::FileSystem& fileSystem;
    platform::Metricsheet& metricsheet;
    platform::ProcessControl& processControl;
    platform::Spoor& spoor;
    platform::WorkQueues& workQueues;
    std::string pathRoot; ///< what absolute paths stand under; empty for "/"
    /// Shared by all runners that are made of copies of this.
    std::shared_ptr<TracePointBudget> pointBudget = std::make_shared<TracePointBudget>();
};

class TraceRunner {
public:
    explicit TraceRunner(TraceRunnerPlatform runnerPlatform);
    virtual ~TraceRunner();
    TraceRunner(const TraceRunner&) = delete;
    TraceRunner& operator=(const TraceRunner&) = delete;

    /// Adds one trace with an interval for each point; `params` is only read. Null adds nothing.
    void createTraceFromTraceParams(const TraceParams* params);

    /// Begins to collect for every critical trace. Does not wait.
    void runTraces();

    /// Ends every trace, waits without a limit until each is matched, and writes the results. Ends the process where
    /// their file cannot be opened.
    void stopTracingandProcessResults();

    /// Gives the memory of results and pictures back. A further stop writes only what it finds itself.
    void forgetResults();

    std::size_t getNumTraces() const { return runs_.size(); }
    std::int32_t getResultsVersion() const;

private:
    /// A trace and what is collected for it.
    struct Run;

    // On the owner's thread.
    void setupTracing(Run& run);
    void startTracing(Run& run);
    bool writeMetricsheet();
    void printTraceResults(const Trace& trace, const TraceResults& results) const;
    void writeTimeline() const;
    std::uint64_t lostEvents() const;
    std::string resultsFolder() const;

    // On the tracing queue.
    void stopTracing(Run& run);
    void tracingCompletionHandler(Run& run);
    void tearDownTracing(Run& run);

    const TraceRunnerPlatform platform_;
    const std::unique_ptr<platform::Semaphore> completion_;

    // The list belongs to the owner's thread. What is in a run belongs to the queue from its start to its completion.
    std::vector<std::unique_ptr<Run>> runs_;
    std::int32_t completedCount_ = 0; ///< as `runs_`: read after the completion was waited for

    // Destroyed first: what runs on it refers to the members above.
    std::unique_ptr<platform::SerialQueue> tracingQueue_;
};

} // namespace vela
