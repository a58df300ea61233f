// Log lines to standard error or another descriptor. Thread-safe.
//
//     error velarr      VelaReportingSession:42    can't find session        words, for a person
//     <3>velarr      VelaReportingSession:42    can't find session           for a service manager that reads the
//     stream
//
// Lines never mix. A descriptor that blocks makes the writer wait for its reader; on a non-blocking one a line for
// which there is no room is lost and counted. The process must ignore SIGPIPE.
#pragma once

#include "platform/Log.h"
#include "platform/Mutex.h"

#include <atomic>
#include <cstdint>
#include <string_view>

namespace vela::platform {

class StandardErrorLog final : public LogSink {
public:
    enum class Style : std::uint8_t { Words, ServiceManager };

    /// Borrows `descriptor`, which must stay open.
    explicit StandardErrorLog(int descriptor = 2, Style style = Style::Words)
        : descriptor_(descriptor),
          style_(style) {}

    void write(const LogRecord& record) override;
    std::uint64_t lost() const override { return lost_.load(std::memory_order_relaxed); }

private:
    bool writeWhole(std::string_view line) VELA_REQUIRES(mutex_);

    const int descriptor_;
    const Style style_;
    std::atomic<std::uint64_t> lost_{0};
    Mutex mutex_;
    bool torn_ VELA_GUARDED_BY(mutex_) = false; ///< the last line ended in its middle
};

} // namespace vela::platform
