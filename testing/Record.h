// What tests of concurrent work note about it: numbers in order, and the destruction of captures. See each class for
// its threads.
#pragma once

#include "platform/Mutex.h"

#include <cstddef>
#include <functional>
#include <utility>
#include <vector>

namespace vela::testing {

/// Numbers in the order in which items noted them. Thread-safe.
class Record {
public:
    void add(int number) {
        const MutexLock lock(mutex_);
        numbers_.push_back(number);
    }

    std::vector<int> numbers() const {
        const MutexLock lock(mutex_);
        return numbers_;
    }

    std::size_t size() const { return numbers().size(); }

private:
    mutable Mutex mutex_;
    std::vector<int> numbers_ VELA_GUARDED_BY(mutex_);
};

/// A capture whose destruction can be seen. One owner at a time.
class Trace {
public:
    explicit Trace(std::function<void()> destroyed) : destroyed_(std::move(destroyed)) {}
    Trace(Trace&& other) noexcept : destroyed_(std::exchange(other.destroyed_, nullptr)) {}
    Trace& operator=(Trace&&) = delete;
    Trace(const Trace&) = delete;
    Trace& operator=(const Trace&) = delete;
    ~Trace() {
        if (destroyed_ != nullptr) {
            destroyed_();
        }
    }

private:
    std::function<void()> destroyed_;
};

} // namespace vela::testing
