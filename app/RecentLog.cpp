#include "app/RecentLog.h"

#include <array>

namespace vela {

namespace {

constexpr std::array<std::string_view, 4> kLevelNames{"debug", "info", "default", "error"};

} // namespace

void RecentLog::write(const platform::LogRecord& record) {
    next_->write(record);
    std::string line(kLevelNames[static_cast<std::size_t>(record.level)]);
    line.append(" ").append(record.category).append(" ").append(record.text);
    const MutexLock lock(mutex_);
    bytes_ += line.size();
    lines_.push_back(std::move(line));
    while (lines_.size() > kMostLines || (bytes_ > kMostBytes && lines_.size() > 1)) {
        bytes_ -= lines_.front().size();
        lines_.pop_front();
    }
}

std::vector<std::string> RecentLog::lines() const {
    const MutexLock lock(mutex_);
    return {lines_.begin(), lines_.end()};
}

} // namespace vela
