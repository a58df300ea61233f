// Keeps the last lines of the log, for the snapshots that issue capture takes, and passes every line on. Thread-safe.
#pragma once

#include "platform/Log.h"
#include "platform/Mutex.h"

#include <cstddef>
#include <deque>
#include <memory>
#include <string>
#include <vector>

namespace vela {

class RecentLog final : public platform::LogSink {
public:
    static constexpr std::size_t kMostLines = 500;
    static constexpr std::size_t kMostBytes = 256 * 1024;

    explicit RecentLog(std::unique_ptr<platform::LogSink> next) : next_(std::move(next)) {}

    void write(const platform::LogRecord& record) override;
    std::uint64_t lost() const override { return next_->lost(); }

    /// Oldest first, each with its level and category before it.
    std::vector<std::string> lines() const;

private:
    const std::unique_ptr<platform::LogSink> next_;
    mutable Mutex mutex_;
    std::deque<std::string> lines_ VELA_GUARDED_BY(mutex_);
    std::size_t bytes_ VELA_GUARDED_BY(mutex_) = 0;
};

} // namespace vela
