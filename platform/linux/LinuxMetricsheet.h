// Performance-data files as JSON Lines:
//
//     {"format":"metricsheet","writer":"VelaReporting","version":4}
//     {"name":"open","value":123.0,"unit":"nanoseconds"}
//     ...
//
// one line for each value, in the order written. Thread-safe; a writer is its owner's.
#pragma once

#include "platform/FileSystem.h"
#include "platform/Metricsheet.h"

#include <cstdint>
#include <memory>
#include <string>
#include <string_view>

namespace vela::platform {

class LinuxMetricsheet final : public Metricsheet {
public:
    /// Files are written through `fileSystem`, which outlives this and its writers.
    explicit LinuxMetricsheet(FileSystem& fileSystem) : fileSystem_(fileSystem) {}

    /// Null where no file can be made in the folder. The file, which everybody may read, stands at `path` when the
    /// writer was closed; a writer that is destroyed before leaves what was there.
    std::unique_ptr<MetricsheetWriter> openWriter(const std::string& path, std::string_view writerName,
                                                  std::uint32_t version) override;

private:
    FileSystem& fileSystem_;
};

} // namespace vela::platform
