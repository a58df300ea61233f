// Where log lines go: the journal, standard error, or a test's memory.
#pragma once

#include <cstdint>
#include <optional>
#include <string_view>

namespace vela::platform {

/// Least important first.
enum class LogLevel : std::uint8_t { Debug, Info, Default, Error };

/// One finished line. The views are valid for the call only.
struct LogRecord {
    LogLevel level;
    std::string_view subsystem;           ///< "com.orvex.vela"
    std::string_view category;            ///< "velarr", say
    std::string_view sourceName;          ///< name that the line carries: the file's name without folder and extension
    std::string_view sourceFile;          ///< path as the compiler was given it
    int line;                             ///< line number in that file
    std::string_view text;                ///< the whole line, prefix included, without a line end
    std::string_view message;             ///< the line without its prefix
    std::optional<std::int64_t> reporter; ///< reporter ID that the line is about, where known
};

/// Thread-safe. Never blocks for long and never fails its caller: what cannot be written is counted.
class LogSink {
public:
    virtual ~LogSink() = default;

    virtual void write(const LogRecord& record) = 0;

    /// Lines that could not be written.
    virtual std::uint64_t lost() const = 0;
};

} // namespace vela::platform
