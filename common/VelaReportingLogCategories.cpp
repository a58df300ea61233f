#include "common/VelaReportingLogCategories.h"

#include "common/values/Utf8.h"

#include <string>

namespace vela {

namespace {

constinit std::atomic<platform::LogSink*> destination{nullptr};
constinit std::atomic<std::size_t> handlesCreated{0};
// Trivially destroyed, so that lines of a thread that is ending may still read it.
constinit thread_local std::optional<std::int64_t> currentReporter;

constexpr char kClient[] = "velarc";
constexpr char kServiceDelegate[] = "velars";
constexpr char kSession[] = "velarr";
constexpr char kSessionBeaconReporting[] = "velari";
constexpr char kDriverUtility[] = "velard";
constexpr char kTrace[] = "velart";
constexpr char kJoule[] = "velarp";
constexpr char kTelem[] = "velara";
constexpr char kSnag[] = "velarb";

/// Cuts `line`, whose message begins at `start`, to the longest message.
void cutMessage(std::string& line, std::size_t start) {
    constexpr std::string_view kMark = "...";
    if (line.size() - start <= kLongestLogMessage) {
        return;
    }
    std::size_t end = start + kLongestLogMessage - kMark.size();
    // A character has at most three bytes behind its first; more of them in a row begin none anyway.
    for (int step = 0; step < 3 && (static_cast<unsigned char>(line[end]) & 0xC0U) == 0x80U; ++step) {
        --end;
    }
    line.resize(end);
    line += kMark;
}

} // namespace

/// Makes the handles. A function-local static is what the language itself creates once: the first caller makes it,
/// callers that come meanwhile wait for it, and later ones pay one check. Each handle is a static of its own, so that
/// an area which never logs has none. Nothing destroys them: objects that die at the end of the process may still log.
struct LogCategoryHandles {
    template <const char* kName>
    static const LogCategory& once() {
        static_assert(std::is_trivially_destructible_v<LogCategory>);
        static const LogCategory handle(kName);
        return handle;
    }
};

const LogCategory& VelaReportingClientCategory() { return LogCategoryHandles::once<kClient>(); }
const LogCategory& VelaReportingServiceDelegateCategory() { return LogCategoryHandles::once<kServiceDelegate>(); }
const LogCategory& VelaReportingSessionCategory() { return LogCategoryHandles::once<kSession>(); }
const LogCategory& VelaReportingSessionBeaconReportingCategory() {
    return LogCategoryHandles::once<kSessionBeaconReporting>();
}
const LogCategory& VelaReportingDriverUtilityCategory() { return LogCategoryHandles::once<kDriverUtility>(); }
const LogCategory& VelaReportingTraceCategory() { return LogCategoryHandles::once<kTrace>(); }
const LogCategory& VelaReportingJouleCategory() { return LogCategoryHandles::once<kJoule>(); }
const LogCategory& VelaReportingTelemLogCategory() { return LogCategoryHandles::once<kTelem>(); }
const LogCategory& VelaReportingSnagLogCategory() { return LogCategoryHandles::once<kSnag>(); }

LogCategory::LogCategory(std::string_view name) : name_(name) {
    handlesCreated.fetch_add(1, std::memory_order_relaxed);
}

std::size_t LogCategory::created() { return handlesCreated.load(std::memory_order_relaxed); }

LogReporterScope::LogReporterScope(std::int64_t reporterID) : outer_(currentReporter) { currentReporter = reporterID; }

LogReporterScope::~LogReporterScope() { currentReporter = outer_; }

void setLogDestination(platform::LogSink* sink, platform::LogLevel minimum) {
    if (sink == nullptr) {
        detail::minimumLogLevel.store(detail::kNoLogLevel, std::memory_order_relaxed);
        destination.store(nullptr, std::memory_order_release);
        return;
    }
    destination.store(sink, std::memory_order_release);
    detail::minimumLogLevel.store(static_cast<std::uint8_t>(minimum), std::memory_order_relaxed);
}

void detail::writeLogLine(const LogCategory& category, platform::LogLevel level, const LogPlace& place,
                          std::string_view format, std::span<const FormatArgument> arguments) {
    platform::LogSink* const sink = destination.load(std::memory_order_acquire);
    if (sink == nullptr) {
        return;
    }
    std::string line;
    line.reserve(256);
    appendFormatted(line, "%25s:%-5d ", place.sourceName, place.line);
    const std::size_t start = line.size();
    appendFormattedArguments(line, format, arguments, ArgumentBytes::Escaped);
    cutMessage(line, start);
    const std::string_view text = line;
    sink->write({.level = level,
                 .subsystem = LogCategory::subsystem(),
                 .category = category.name(),
                 .sourceName = place.sourceName,
                 .sourceFile = place.sourceFile,
                 .line = place.line,
                 .text = text,
                 .message = text.substr(start),
                 .reporter = currentReporter});
}

} // namespace vela
