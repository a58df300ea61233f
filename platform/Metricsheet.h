// The writer of performance-data files.
#pragma once

#include "platform/Result.h"

#include <cstdint>
#include <memory>
#include <string>
#include <string_view>

namespace vela::platform {

inline constexpr std::string_view kMetricsheetUnitNanoseconds = "nanoseconds";

/// One open file; it is complete, and seen by others, when the writer was closed. Used by one thread at a time.
class MetricsheetWriter {
public:
    virtual ~MetricsheetWriter() = default;

    virtual void newValue(std::string_view name, double value, std::string_view unit) = 0;
    virtual Result<Done> close() = 0;
};

/// Thread-safe.
class Metricsheet {
public:
    virtual ~Metricsheet() = default;

    /// Null when the file cannot be written.
    virtual std::unique_ptr<MetricsheetWriter> openWriter(const std::string& path, std::string_view writerName,
                                                          std::uint32_t version) = 0;
};

} // namespace vela::platform
