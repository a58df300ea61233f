// What the tests of the Linux work queues share. Thread-safe.
#pragma once

#include "platform/WorkQueue.h"

#include <atomic>
#include <chrono>
#include <functional>
#include <thread>

namespace vela::platform {

/// Polls; the limit only ends a test that hangs.
inline bool waitFor(const std::function<bool()>& done) {
    const auto end = std::chrono::steady_clock::now() + std::chrono::seconds(60);
    while (!done()) {
        if (std::chrono::steady_clock::now() > end) {
            return false;
        }
        std::this_thread::sleep_for(std::chrono::microseconds(200));
    }
    return true;
}

/// Holds the threads that run its items until it is opened.
class Gate {
public:
    /// An item that waits at the gate. The pool knows nothing of it.
    WorkItem item() {
        return [this] {
            ++waiting_;
            open_.wait(false);
            --waiting_;
        };
    }
    void open() {
        open_ = true;
        open_.notify_all();
    }
    bool isReachedBy(int items) const {
        return waitFor([this, items] { return waiting_ == items; });
    }

private:
    std::atomic<bool> open_ = false;
    std::atomic<int> waiting_ = 0;
};

} // namespace vela::platform
