// A metrics service that keeps the records it is posted. Thread-safe.
#pragma once

#include "platform/Mutex.h"
#include "platform/Telem.h"

#include <cstdint>
#include <functional>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

namespace vela::testing {

class FakeTelem final : public platform::Telem {
public:
    struct Metric {
        std::uint32_t identifier;
        std::string record; ///< bytes in the wire format
        Dictionary fields;
    };

    /// Called at the start of every call with the metric's identifier, outside the lock.
    void setObserver(std::function<void(std::uint32_t metricIdentifier)> observer) {
        const MutexLock lock(mutex_);
        observer_ = std::move(observer);
    }
    std::vector<Metric> metrics() const {
        const MutexLock lock(mutex_);
        return metrics_;
    }

    void telemPostMetric(std::uint32_t metricIdentifier, std::string_view record, const Dictionary& fields) override {
        std::function<void(std::uint32_t)> observer;
        {
            const MutexLock lock(mutex_);
            metrics_.push_back({metricIdentifier, std::string(record), fields});
            observer = observer_;
        }
        if (observer) {
            observer(metricIdentifier);
        }
    }

private:
    mutable Mutex mutex_;
    std::vector<Metric> metrics_ VELA_GUARDED_BY(mutex_);
    std::function<void(std::uint32_t)> observer_ VELA_GUARDED_BY(mutex_);
};

} // namespace vela::testing
