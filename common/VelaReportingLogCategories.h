// The log: one category per area, and where its lines go.
//
//     VelaReportingSessionCategory().info("starting session owned by %lli", reporterID);
//
// writes "     VelaReportingSession:42    starting session owned by 7": the name of the source file right-aligned in 25
// columns, the line left-aligned in 5, neither ever cut. Format texts are checked at compile time
// (common/TextFormat.h). What arguments bring from outside is escaped so that it cannot forge a line; the format text
// itself stays as it is. A disabled level costs one relaxed load and a branch. Everything here is thread-safe.
#pragma once

#include "common/TextFormat.h"
#include "platform/Log.h"

#include <array>
#include <atomic>
#include <cstddef>
#include <cstdint>
#include <optional>
#include <span>
#include <string_view>

namespace vela {

class LogCategory;

/// Longest message of a line, without its prefix, in bytes. A longer one is cut between two characters and ends in
/// "...".
constexpr std::size_t kLongestLogMessage = 32 * 1024;

/// Sends the lines of `minimum` and above to `sink`; null ends logging. The composition root sets it before it starts
/// threads and clears it after they ended: the sink outlives every line. Calling it again with the same sink, to change
/// the level, is allowed at any time. A sink must not log.
void setLogDestination(platform::LogSink* sink, platform::LogLevel minimum);

namespace detail {

struct LogPlace {
    std::string_view sourceName;
    std::string_view sourceFile;
    int line;
};

constexpr std::uint8_t kNoLogLevel = 0xFF;
/// Least important level that is written.
inline constinit std::atomic<std::uint8_t> minimumLogLevel{kNoLogLevel};

void writeLogLine(const LogCategory& category, platform::LogLevel level, const LogPlace& place, std::string_view format,
                  std::span<const FormatArgument> arguments);

/// The four levels' operations, in terms of the category and the source name that `Derived` gives.
template <class Derived>
class LogOperations {
public:
    template <class... Types>
    [[gnu::always_inline]] void debug(FormatText<std::type_identity_t<Types>...> format,
                                      const Types&... arguments) const {
        log(platform::LogLevel::Debug, format, arguments...);
    }
    template <class... Types>
    [[gnu::always_inline]] void info(FormatText<std::type_identity_t<Types>...> format,
                                     const Types&... arguments) const {
        log(platform::LogLevel::Info, format, arguments...);
    }
    /// Level "default".
    template <class... Types>
    [[gnu::always_inline]] void standard(FormatText<std::type_identity_t<Types>...> format,
                                         const Types&... arguments) const {
        log(platform::LogLevel::Default, format, arguments...);
    }
    template <class... Types>
    [[gnu::always_inline]] void error(FormatText<std::type_identity_t<Types>...> format,
                                      const Types&... arguments) const {
        log(platform::LogLevel::Error, format, arguments...);
    }

    /// Whether lines of `level` are written, where preparing the arguments is work.
    bool isEnabled(platform::LogLevel level) const {
        return static_cast<std::uint8_t>(level) >= minimumLogLevel.load(std::memory_order_relaxed);
    }

private:
    // In the caller's code there is only the check of the level: everything else, the format text's place included, is
    // set up behind the branch.
    template <class... Types>
    [[gnu::always_inline]] void log(platform::LogLevel level, const FormatText<Types...>& format,
                                    const Types&... arguments) const {
        if (isEnabled(level)) [[unlikely]] {
            const auto& self = static_cast<const Derived&>(*this);
            const std::string_view ownName = self.sourceName();
            logEnabled(self.category(), level,
                       {ownName.empty() ? format.sourceName() : ownName, format.sourceFile(), format.line()},
                       format.text(), arguments...);
        }
    }

    template <class... Types>
    [[gnu::noinline]] static void logEnabled(const LogCategory& category, platform::LogLevel level,
                                             const LogPlace& place, std::string_view format,
                                             const Types&... arguments) {
        const std::array<FormatArgument, sizeof...(Types)> list{ArgumentTraits<Types>::make(arguments)...};
        writeLogLine(category, level, place, format, list);
    }
};

} // namespace detail

/// A category whose lines carry a name of one's own in place of the source file's. Immutable.
class NamedLogCategory : public detail::LogOperations<NamedLogCategory> {
public:
    NamedLogCategory(const LogCategory& category, std::string_view sourceName)
        : category_(&category),
          sourceName_(sourceName) {}

    const LogCategory& category() const { return *category_; }
    std::string_view sourceName() const { return sourceName_; }

private:
    const LogCategory* category_;
    std::string_view sourceName_;
};

/// The handle of one category. Immutable; lives as long as the process.
class LogCategory : public detail::LogOperations<LogCategory> {
public:
    LogCategory(const LogCategory&) = delete;
    LogCategory& operator=(const LogCategory&) = delete;

    std::string_view name() const { return name_; }
    static constexpr std::string_view subsystem() { return "com.orvex.vela"; }

    /// This category under the source name `sourceName`, which must outlive the result:
    /// `category.as("VelaReportingServiceDelegate").info(...)`.
    NamedLogCategory as(std::string_view sourceName) const { return {*this, sourceName}; }

    const LogCategory& category() const { return *this; }
    /// None: lines carry the source file's name.
    static constexpr std::string_view sourceName() { return {}; }

    /// How many handles the process has made so far.
    static std::size_t created();

private:
    friend struct LogCategoryHandles;
    explicit LogCategory(std::string_view name);

    std::string_view name_;
};

/// While it lives, the calling thread's lines are about this reporter. Scopes nest; the inner one holds.
class LogReporterScope {
public:
    explicit LogReporterScope(std::int64_t reporterID);
    ~LogReporterScope();
    LogReporterScope(const LogReporterScope&) = delete;
    LogReporterScope& operator=(const LogReporterScope&) = delete;

private:
    std::optional<std::int64_t> outer_;
};

// Each makes its handle when it is first called, once however many threads call it.
const LogCategory& VelaReportingClientCategory(); ///< for the client side of the protocol only
const LogCategory& VelaReportingServiceDelegateCategory();
const LogCategory& VelaReportingSessionCategory();
const LogCategory& VelaReportingSessionBeaconReportingCategory();
const LogCategory& VelaReportingDriverUtilityCategory();
const LogCategory& VelaReportingTraceCategory();
const LogCategory& VelaReportingJouleCategory();
const LogCategory& VelaReportingTelemLogCategory();
const LogCategory& VelaReportingSnagLogCategory();

} // namespace vela
