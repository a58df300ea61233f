// A kernel trace facility that keeps the codes of the events emitted. It collects nothing: there are no trace sessions.
// Thread-safe.
#pragma once

#include "platform/Mutex.h"
#include "platform/Spoor.h"

#include <cstdint>
#include <functional>
#include <memory>
#include <utility>
#include <vector>

namespace vela::testing {

class FakeSpoor final : public platform::Spoor {
public:
    using platform::Spoor::emit;

    std::vector<std::uint32_t> codes() const {
        const MutexLock lock(mutex_);
        return codes_;
    }
    void clear() {
        const MutexLock lock(mutex_);
        codes_.clear();
    }
    /// Called after every event, outside the lock.
    void setObserver(std::function<void(std::uint32_t eventCode)> observer) {
        const MutexLock lock(mutex_);
        observer_ = std::move(observer);
    }

    std::unique_ptr<platform::SpoorSession> createSession() override { return nullptr; }
    void emit(std::uint32_t eventCode, const std::array<std::uint64_t, 4>&) override {
        std::function<void(std::uint32_t)> observer;
        {
            const MutexLock lock(mutex_);
            codes_.push_back(eventCode);
            observer = observer_;
        }
        if (observer) {
            observer(eventCode);
        }
    }

private:
    mutable Mutex mutex_;
    std::vector<std::uint32_t> codes_ VELA_GUARDED_BY(mutex_);
    std::function<void(std::uint32_t)> observer_ VELA_GUARDED_BY(mutex_);
};

} // namespace vela::testing
