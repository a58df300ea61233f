#include "tracing/TraceRunner.h"

#include "common/VelaReportingLogCategories.h"
#include "tracing/ChromeTrace.h"
#include "tracing/TracePointList.h"

#include <algorithm>
#include <cassert>
#include <optional>
#include <utility>

namespace vela {

namespace {

constexpr std::string_view kResultsFileName = "tracing_results.msj";
constexpr std::string_view kTimelineFileName = "tracing_results.json";
constexpr std::string_view kWriterName = "VelaReporting";
constexpr std::int32_t kResultsVersion = 4;
constexpr std::uint32_t kFolderPermissions = 0777;
constexpr std::uint32_t kFilePermissions = 0644;

/// Codes that traces collect, both included. The service's own steps lie above them.
constexpr std::uint32_t kFirstCode = 0x21040000;
constexpr std::uint32_t kLastCode = 0x2104408A;

/// The line of the results that is no duration.
constexpr std::string_view kLostEventsName = "lost events";
constexpr std::string_view kLostEventsUnit = "events";

} // namespace

struct TraceRunner::Run {
    Run(const TraceParams& params, const std::shared_ptr<TracePointBudget>& budget)
        : trace(params.name, params.type == kTraceTypeSpoor),
          points(budget) {
        for (const auto& point : params.dataParams) {
            trace.addTraceDataToCollect(
                std::make_unique<TraceInterval>(point->name, point->beginCode, point->endCode, point->matchedByThread));
        }
    }

    Trace trace;
    std::unique_ptr<platform::SpoorSession> session; ///< from the set-up to the completion
    TracePointList points;                           ///< empty again when they were matched
    std::uint64_t lostEvents = 0;                    ///< by the facility, or beyond a limit here
    const TraceResults* results = nullptr;           ///< the trace's own, once it is critical and was stopped
};

TraceRunner::TraceRunner(TraceRunnerPlatform runnerPlatform)
    : platform_(std::move(runnerPlatform)),
      completion_(platform_.workQueues.makeSemaphore(0)),
      tracingQueue_(platform_.workQueues.makeSerialQueue("Tracing Queue", platform::QualityOfService::Default)) {}

TraceRunner::~TraceRunner() {
    // Sessions that were never stopped are destroyed where they deliver, so that no event is in the midst of it.
    if (std::ranges::any_of(runs_, [](const auto& run) { return run->session != nullptr; })) {
        tracingQueue_->post([this] {
            for (const auto& run : runs_) {
                run->session.reset();
            }
            completion_->signal();
        });
        completion_->wait(std::nullopt);
    }
}

std::int32_t TraceRunner::getResultsVersion() const { return kResultsVersion; }

void TraceRunner::createTraceFromTraceParams(const TraceParams* params) {
    if (params == nullptr) {
        VelaReportingTraceCategory().standard("Attempted to add nullptr to trace runner");
        return;
    }
    runs_.push_back(std::make_unique<Run>(*params, platform_.pointBudget));
}

void TraceRunner::runTraces() {
    const LogCategory& log = VelaReportingTraceCategory();
    log.info("Number of traces to perform: %lu", runs_.size());
    for (const auto& run : runs_) {
        log.info("Performing trace : %s", run->trace.name());
        if (run->trace.isCritical()) {
            log.info("Setting up tracing: %s", run->trace.name());
            setupTracing(*run);
            log.info("Starting tracing: %s", run->trace.name());
            startTracing(*run);
        }
    }
}

void TraceRunner::setupTracing(Run& run) {
    run.session = platform_.spoor.createSession();
    run.session->setCompletionHandler([this, &run] { tracingCompletionHandler(run); });
    run.session->setWallTimesEnabled(true);
}

void TraceRunner::startTracing(Run& run) {
    const LogCategory& log = VelaReportingTraceCategory();
    const int rangeError =
        run.session->eventsRange(kFirstCode, kLastCode, [&run](const trace_point& event) { run.points.add(event); });
    if (rangeError != 0) {
        log.error("Could not set up spoor range, error: %d", rangeError);
    }
    if (const int error = run.session->start(*tracingQueue_); error != 0) {
        log.error("Could not start spoor session, error: %d", error);
    }
}

void TraceRunner::tracingCompletionHandler(Run& run) {
    assert(tracingQueue_->isCurrent());
    if (run.trace.isCritical() && run.session != nullptr) {
        run.trace.processTracepoints(*run.session, run.points.points());
        run.points.clear();
        run.lostEvents = run.session->lostEvents() + run.points.lost() + run.trace.unmatchedEvents();
        tearDownTracing(run);
    }
    ++completedCount_;
    completion_->signal();
}

void TraceRunner::stopTracing(Run& run) {
    assert(tracingQueue_->isCurrent());
    if (run.session == nullptr) {
        tracingCompletionHandler(run); // it was never run
        return;
    }
    if (const int error = run.session->end(); error != 0) {
        VelaReportingTraceCategory().error("Could not end spoor session, error: %d", error);
        tracingCompletionHandler(run);
    }
}

void TraceRunner::tearDownTracing(Run& run) { run.session.reset(); }

void TraceRunner::stopTracingandProcessResults() {
    const LogCategory& log = VelaReportingTraceCategory();
    for (const auto& run : runs_) {
        log.info("Tearing down trace :  %s", run->trace.name());
        tracingQueue_->post([this, &run = *run] {
            if (run.trace.isCritical()) {
                stopTracing(run);
            } else {
                tracingCompletionHandler(run);
            }
        });
        completion_->wait(std::nullopt);
        if (run->trace.isCritical()) {
            run->results = &run->trace.getResults();
        }
        log.info("Completed trace.... %d,   %lu", completedCount_, runs_.size());
    }
    if (writeMetricsheet()) {
        writeTimeline();
    }
}

void TraceRunner::forgetResults() {
    for (const auto& run : runs_) {
        run->results = nullptr;
        run->trace.forgetResults();
    }
}

std::uint64_t TraceRunner::lostEvents() const {
    std::uint64_t lost = 0;
    for (const auto& run : runs_) {
        lost += run->lostEvents;
    }
    return lost;
}

bool TraceRunner::writeMetricsheet() {
    const LogCategory& log = VelaReportingTraceCategory();
    log.info("Completed trace....In write perf data.... %lu",
             std::ranges::count_if(runs_, [](const auto& run) { return run->results != nullptr; }));
    const std::string folder = resultsFolder();
    if (const auto made = platform_.fileSystem.createDirectories(folder, kFolderPermissions); !made) {
        log.error("can't create logging directory at %@: %@", folder, made.failure().description);
    }
    const std::string path = folder + "/" + std::string(kResultsFileName);
    const std::unique_ptr<platform::MetricsheetWriter> writer =
        platform_.metricsheet.openWriter(path, kWriterName, kResultsVersion);
    if (writer == nullptr) {
        // Wanted: a service that cannot leave its results ends, and its manager starts another one.
        log.info("Failed to open metricsheet writer");
        platform_.processControl.exitWithStatus(1);
        return false;
    }
    for (const auto& run : runs_) {
        if (run->results != nullptr) {
            printTraceResults(run->trace, *run->results);
            for (const auto& [name, values] : *run->results) {
                for (const std::uint64_t value : values) {
                    writer->newValue(name, static_cast<double>(value), platform::kMetricsheetUnitNanoseconds);
                }
            }
        }
    }
    if (const std::uint64_t lost = lostEvents(); lost != 0) {
        log.info("%llu trace events were lost", lost);
        writer->newValue(kLostEventsName, static_cast<double>(lost), kLostEventsUnit);
    }
    if (const auto closed = writer->close(); !closed) {
        log.error("can't write trace results at %@: %@", path, closed.failure().description);
    }
    return true;
}

void TraceRunner::printTraceResults(const Trace&, const TraceResults& results) const {
    for (const auto& [name, values] : results) {
        const auto [least, greatest] = std::ranges::minmax_element(values);
        VelaReportingTraceCategory().info("Writing out %d result for %s, min: %llu, max: %llu", values.size(), name,
                                          *least, *greatest);
    }
}

void TraceRunner::writeTimeline() const {
    const std::string path = resultsFolder() + "/" + std::string(kTimelineFileName);
    const std::unique_ptr<platform::PendingFile> file = platform_.fileSystem.createFile(path, kFilePermissions);
    ChromeTraceFacts facts{kWriterName, kResultsVersion, 0, lostEvents()};
    for (const auto& run : runs_) {
        facts.intervalsLeftOut += run->trace.timeline().leftOut();
    }
    ChromeTrace picture(*file, facts);
    for (const auto& run : runs_) {
        picture.add(run->trace);
    }
    picture.finish();
    if (const auto written = file->commit(); !written) {
        VelaReportingTraceCategory().error("can't write trace timeline at %@: %@", path, written.failure().description);
    }
}

std::string TraceRunner::resultsFolder() const {
    return platform_.pathRoot + std::string(VelaReportingTracingLogsDirectory);
}

} // namespace vela
