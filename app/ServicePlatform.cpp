#include "app/ServicePlatform.h"

#include "common/VelaReportingLogCategories.h"
#include "platform/host/HostFacts.h"
#include "platform/journal/JournalLog.h"
#include "platform/linux/StandardErrorLog.h"

namespace vela {

namespace {

/// The log's sink by the settings; where there is no journal, standard error, and `failure` says why.
std::unique_ptr<platform::LogSink> makeLog(const Settings& settings, std::string& failure) {
    if (settings.log.target == LogTarget::Journal) {
        auto journal = platform::JournalLog::open("vela-reportingd");
        if (journal) {
            return *std::move(journal);
        }
        failure = journal.failure().description;
    }
    using Style = platform::StandardErrorLog::Style;
    constexpr int kStandardError = 2;
    return std::make_unique<platform::StandardErrorLog>(
        kStandardError, platform::isStandardErrorJournal() ? Style::ServiceManager : Style::Words);
}

/// Where issues are captured, the log's last lines are kept: in `recent`.
std::unique_ptr<platform::LogSink> keepRecent(const Settings& settings, std::unique_ptr<platform::LogSink> log,
                                              RecentLog*& recent) {
    if (!settings.device.internalBuild) {
        return log;
    }
    auto keeping = std::make_unique<RecentLog>(std::move(log));
    recent = keeping.get();
    return keeping;
}

} // namespace

ServicePlatform::ServicePlatform(const Settings& settings)
    : log_(keepRecent(settings, makeLog(settings, logFailure_), recentLog_)),
      deviceProperties_(settings),
      preferences_(settings.paths.state, fileSystem_, propertyLists_),
      notifications_(settings.paths.runtime) {
    setLogDestination(log_.get(), settings.log.level);
}

ServicePlatform::~ServicePlatform() { setLogDestination(nullptr, platform::LogLevel::Error); }

std::vector<std::string> ServicePlatform::recentLog() const {
    return recentLog_ == nullptr ? std::vector<std::string>() : recentLog_->lines();
}

CheckedFacts ServicePlatform::facts(const Settings& settings) const {
    CheckedFacts facts;
    facts.logFailure = logFailure_;
    facts.threadPriorities = queues_.appliesThreadPriorities();
    facts.state = platform::folderState(settings.paths.state);
    facts.runtime = platform::folderState(settings.paths.runtime);
    facts.traceFolder = platform::traceFolder();
    facts.traceInstances = facts.traceFolder && platform::canMakeTraceInstances(*facts.traceFolder);
    facts.performanceTool = platform::findProgram("perf");
    return facts;
}

} // namespace vela
