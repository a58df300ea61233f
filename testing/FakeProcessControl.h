// Keeps the statuses with which the process would have ended, and goes on. Thread-safe.
#pragma once

#include "platform/Mutex.h"
#include "platform/ProcessControl.h"

#include <vector>

namespace vela::testing {

class FakeProcessControl final : public platform::ProcessControl {
public:
    /// In the order asked for.
    std::vector<int> statuses() const {
        const MutexLock lock(mutex_);
        return statuses_;
    }

    void exitWithStatus(int status) override {
        const MutexLock lock(mutex_);
        statuses_.push_back(status);
    }

private:
    mutable Mutex mutex_;
    std::vector<int> statuses_ VELA_GUARDED_BY(mutex_);
};

} // namespace vela::testing
