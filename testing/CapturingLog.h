// Keeps log lines in memory, for tests. While it lives it is where the process's lines go, so there is one at a time.
// Thread-safe; threads that log end before it does.
#pragma once

#include "platform/Log.h"
#include "platform/Mutex.h"

#include <cstdint>
#include <iosfwd>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

namespace vela::testing {

/// What most tests compare: `{LogLevel::Info, "velarr", "VelaReportingSession", "starting session owned by 7"}`.
struct CapturedLine {
    platform::LogLevel level;
    std::string category;
    std::string sourceName;
    std::string message; ///< without the prefix

    friend bool operator==(const CapturedLine&, const CapturedLine&) = default;
};
std::ostream& operator<<(std::ostream& stream, const CapturedLine& line);

/// A whole record.
struct CapturedRecord {
    CapturedLine line;
    std::string subsystem;
    std::string sourceFile;
    int lineNumber;
    std::string text; ///< with the prefix
    std::optional<std::int64_t> reporter;
};

class CapturingLog final : public platform::LogSink {
public:
    explicit CapturingLog(platform::LogLevel minimum = platform::LogLevel::Debug);
    ~CapturingLog() override;
    CapturingLog(const CapturingLog&) = delete;
    CapturingLog& operator=(const CapturingLog&) = delete;

    // In the order written.
    std::vector<CapturedLine> lines() const;
    std::vector<CapturedLine> linesOf(std::string_view category) const;
    std::vector<CapturedRecord> records() const;
    void clear();

    void write(const platform::LogRecord& record) override;
    std::uint64_t lost() const override { return 0; }

private:
    mutable Mutex mutex_;
    std::vector<CapturedRecord> records_ VELA_GUARDED_BY(mutex_);
};

} // namespace vela::testing
