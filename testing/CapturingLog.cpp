#include "testing/CapturingLog.h"

#include "common/VelaReportingLogCategories.h"

#include <algorithm>
#include <iterator>
#include <ostream>

namespace vela::testing {

namespace {

std::string_view nameOf(platform::LogLevel level) {
    switch (level) {
    case platform::LogLevel::Debug:
        return "debug";
    case platform::LogLevel::Info:
        return "info";
    case platform::LogLevel::Default:
        return "default";
    case platform::LogLevel::Error:
        return "error";
    }
    return "?";
}

} // namespace

std::ostream& operator<<(std::ostream& stream, const CapturedLine& line) {
    return stream << nameOf(line.level) << ' ' << line.category << ' ' << line.sourceName << " \"" << line.message
                  << '"';
}

CapturingLog::CapturingLog(platform::LogLevel minimum) { setLogDestination(this, minimum); }

CapturingLog::~CapturingLog() { setLogDestination(nullptr, platform::LogLevel::Error); }

std::vector<CapturedLine> CapturingLog::lines() const {
    const MutexLock lock(mutex_);
    std::vector<CapturedLine> lines;
    std::transform(records_.begin(), records_.end(), std::back_inserter(lines),
                   [](const CapturedRecord& record) { return record.line; });
    return lines;
}

std::vector<CapturedLine> CapturingLog::linesOf(std::string_view category) const {
    std::vector<CapturedLine> lines = this->lines();
    std::erase_if(lines, [category](const CapturedLine& line) { return line.category != category; });
    return lines;
}

std::vector<CapturedRecord> CapturingLog::records() const {
    const MutexLock lock(mutex_);
    return records_;
}

void CapturingLog::clear() {
    const MutexLock lock(mutex_);
    records_.clear();
}

void CapturingLog::write(const platform::LogRecord& record) {
    CapturedRecord owned{.line = {.level = record.level,
                                  .category = std::string(record.category),
                                  .sourceName = std::string(record.sourceName),
                                  .message = std::string(record.message)},
                         .subsystem = std::string(record.subsystem),
                         .sourceFile = std::string(record.sourceFile),
                         .lineNumber = record.line,
                         .text = std::string(record.text),
                         .reporter = record.reporter};
    const MutexLock lock(mutex_);
    records_.push_back(std::move(owned));
}

} // namespace vela::testing
