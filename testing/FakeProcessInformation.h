// Processes that a test makes up. Thread-safe.
#pragma once

#include "platform/Mutex.h"
#include "platform/ProcessInformation.h"

#include <cstdint>
#include <map>
#include <string>
#include <utility>

namespace vela::testing {

class FakeProcessInformation final : public platform::ProcessInformation {
public:
    explicit FakeProcessInformation(std::int32_t ownPid = 100, std::string ownName = "vela-reportingd")
        : ownPid_(ownPid),
          ownName_(std::move(ownName)) {
        add({.pid = ownPid_, .parent = 1, .commandName = ownName_.substr(0, 15), .startTimeTicks = 1});
    }

    /// A process begins, or is replaced.
    void add(platform::ProcessRecord record) {
        const MutexLock lock(mutex_);
        records_[record.pid] = std::move(record);
    }
    /// A process ends, or its record can only be read in part.
    void remove(std::int32_t pid) {
        const MutexLock lock(mutex_);
        records_.erase(pid);
    }
    /// How often `read` was asked.
    std::uint64_t reads() const {
        const MutexLock lock(mutex_);
        return reads_;
    }

    std::int32_t ownPid() const override { return ownPid_; }
    std::string ownName() const override { return ownName_; }
    bool read(std::int32_t pid, platform::ProcessRecord& record) const override {
        const MutexLock lock(mutex_);
        ++reads_;
        const auto found = records_.find(pid);
        if (pid < 1 || found == records_.end()) {
            return false;
        }
        record = found->second;
        return true;
    }

private:
    const std::int32_t ownPid_;
    const std::string ownName_;
    mutable Mutex mutex_;
    std::map<std::int32_t, platform::ProcessRecord> records_ VELA_GUARDED_BY(mutex_);
    mutable std::uint64_t reads_ VELA_GUARDED_BY(mutex_) = 0;
};

} // namespace vela::testing
