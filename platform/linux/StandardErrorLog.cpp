#include "platform/linux/StandardErrorLog.h"

#include <cerrno>
#include <cstddef>
#include <string>
#include <unistd.h>

namespace vela::platform {

namespace {

std::string_view beginningOf(LogLevel level, StandardErrorLog::Style style) {
    const bool words = style == StandardErrorLog::Style::Words;
    switch (level) {
    case LogLevel::Debug:
        return words ? "debug " : "<7>";
    case LogLevel::Info:
        return words ? "info " : "<6>";
    case LogLevel::Default:
        return words ? "default " : "<5>";
    case LogLevel::Error:
        return words ? "error " : "<3>";
    }
    return {};
}

/// The record as it is written. A message may hold line breaks of the program's own; a service manager takes every line
/// by itself, so there each begins with the level.
std::string lineOf(const LogRecord& record, StandardErrorLog::Style style) {
    const std::string_view beginning = beginningOf(record.level, style);
    std::string line;
    line.reserve(beginning.size() + record.category.size() + record.text.size() + 2);
    line += beginning;
    line += record.category;
    line += ' ';
    for (const char character : record.text) {
        line += character;
        if (character == '\n' && style == StandardErrorLog::Style::ServiceManager) {
            line += beginning;
        }
    }
    line += '\n';
    return line;
}

} // namespace

void StandardErrorLog::write(const LogRecord& record) {
    std::string line = lineOf(record, style_);
    const MutexLock lock(mutex_);
    if (torn_) {
        line.insert(0, 1, '\n');
    }
    if (!writeWhole(line)) {
        lost_.fetch_add(1, std::memory_order_relaxed);
    }
}

bool StandardErrorLog::writeWhole(std::string_view line) {
    // Usually one call; only a large line into a pipe, or a signal, takes more.
    bool begun = false;
    while (!line.empty()) {
        const ssize_t written = ::write(descriptor_, line.data(), line.size());
        if (written < 0 && errno == EINTR) {
            continue;
        }
        if (written <= 0) {
            torn_ = torn_ || begun;
            return false;
        }
        begun = true;
        line.remove_prefix(static_cast<std::size_t>(written));
    }
    torn_ = false;
    return true;
}

} // namespace vela::platform
