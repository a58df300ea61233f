// A writer of performance-data files that keeps what it was given, with faults on demand. Thread-safe.
#pragma once

#include "platform/Metricsheet.h"
#include "platform/Mutex.h"

#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

namespace vela::testing {

class FakeMetricsheet final : public platform::Metricsheet {
public:
    struct Value {
        std::string name;
        double value;
        std::string unit;

        friend bool operator==(const Value&, const Value&) = default;
    };
    struct File {
        std::string path;
        std::string writerName;
        std::uint32_t version = 0;
        std::vector<Value> values;
        bool closed = false;
    };

    // What a test arranges.
    /// Whether files can be opened.
    void setOpens(bool opens) {
        const MutexLock lock(mutex_);
        opens_ = opens;
    }
    /// Every later close fails; none ends it.
    void failClose(std::optional<platform::Failure> failure) {
        const MutexLock lock(mutex_);
        closeFailure_ = std::move(failure);
    }

    // What a test looks at.
    /// In the order in which they were opened.
    std::vector<File> files() const {
        const MutexLock lock(mutex_);
        return files_;
    }

    std::unique_ptr<platform::MetricsheetWriter> openWriter(const std::string& path, std::string_view writerName,
                                                            std::uint32_t version) override {
        const MutexLock lock(mutex_);
        if (!opens_) {
            return nullptr;
        }
        files_.push_back({path, std::string(writerName), version, {}, false});
        return std::make_unique<Writer>(*this, files_.size() - 1);
    }

private:
    class Writer final : public platform::MetricsheetWriter {
    public:
        Writer(FakeMetricsheet& owner, std::size_t index) : owner_(owner), index_(index) {}

        void newValue(std::string_view name, double value, std::string_view unit) override {
            const MutexLock lock(owner_.mutex_);
            owner_.files_[index_].values.push_back({std::string(name), value, std::string(unit)});
        }
        platform::Result<platform::Done> close() override {
            const MutexLock lock(owner_.mutex_);
            owner_.files_[index_].closed = true;
            if (owner_.closeFailure_) {
                return *owner_.closeFailure_;
            }
            return platform::Done();
        }

    private:
        FakeMetricsheet& owner_;
        const std::size_t index_;
    };

    mutable Mutex mutex_;
    std::vector<File> files_ VELA_GUARDED_BY(mutex_);
    std::optional<platform::Failure> closeFailure_ VELA_GUARDED_BY(mutex_);
    bool opens_ VELA_GUARDED_BY(mutex_) = true;
};

} // namespace vela::testing
