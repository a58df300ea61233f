#include "platform/linux/LinuxMetricsheet.h"

#include "common/values/Dictionary.h"
#include "common/values/Json.h"

#include <cstddef>
#include <utility>

namespace vela::platform {

namespace {

constexpr std::uint32_t kSheetPermissions = 0644;
constexpr std::size_t kSheetPieceBytes = std::size_t{1} << 20U;

class LinuxMetricsheetWriter final : public MetricsheetWriter {
public:
    LinuxMetricsheetWriter(std::unique_ptr<PendingFile> file, std::string_view writerName, std::uint32_t version)
        : file_(std::move(file)) {
        addLine({{"format", "metricsheet"}, {"writer", writerName}, {"version", version}});
    }

    void newValue(std::string_view name, double value, std::string_view unit) override {
        addLine({{"name", name}, {"value", value}, {"unit", unit}});
    }

    Result<Done> close() override {
        file_->append(piece_);
        piece_.clear();
        return file_->commit();
    }

private:
    void addLine(const Dictionary& line) {
        appendJson(piece_, Value(line));
        piece_ += '\n';
        if (piece_.size() >= kSheetPieceBytes) {
            file_->append(piece_);
            piece_.clear();
        }
    }

    const std::unique_ptr<PendingFile> file_;
    std::string piece_; ///< not yet in the file
};

} // namespace

std::unique_ptr<MetricsheetWriter> LinuxMetricsheet::openWriter(const std::string& path, std::string_view writerName,
                                                                std::uint32_t version) {
    std::unique_ptr<PendingFile> file = fileSystem_.createFile(path, kSheetPermissions);
    if (file->failure() != nullptr) {
        return nullptr;
    }
    return std::make_unique<LinuxMetricsheetWriter>(std::move(file), writerName, version);
}

} // namespace vela::platform
