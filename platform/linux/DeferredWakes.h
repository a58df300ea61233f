// For a thread that posts many items in a row: the threads that are to serve them are woken when it is done, so that
// they find the items together instead of going to sleep between one and the next. Confined to its thread, which must
// not wait for anything while the object lives.
#pragma once

#include "platform/linux/Sleeper.h"

#include <array>
#include <cstddef>

namespace vela::platform {

class DeferredWakes {
public:
    DeferredWakes() : outer_(current_) { current_ = this; }
    /// Wakes them.
    ~DeferredWakes() {
        current_ = outer_;
        for (std::size_t index = 0; index < count_; ++index) {
            sleepers_[index]->wake();
        }
    }
    DeferredWakes(const DeferredWakes&) = delete;
    DeferredWakes& operator=(const DeferredWakes&) = delete;

    /// Wakes `sleeper`, which must live on: at once, or when the calling thread is done.
    static void wake(Sleeper& sleeper) {
        if (current_ == nullptr || current_->count_ == current_->sleepers_.size()) {
            sleeper.wake();
        } else {
            current_->sleepers_[current_->count_++] = &sleeper;
        }
    }

private:
    // NOLINTNEXTLINE(readability-identifier-naming): a member
    static inline constinit thread_local DeferredWakes* current_ = nullptr;

    DeferredWakes* const outer_;
    std::array<Sleeper*, 8> sleepers_{};
    std::size_t count_ = 0;
};

} // namespace vela::platform
