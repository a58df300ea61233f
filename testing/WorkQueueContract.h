// What platform/WorkQueue.h promises, as a test suite for every binding. A test program instantiates
// `WorkQueueContract` with functions that make a `WorkQueueBackend`. One file of the program includes this.
#pragma once

#include "platform/WorkQueue.h"
#include "testing/Record.h"

#include <algorithm>
#include <atomic>
#include <chrono>
#include <cstddef>
#include <functional>
#include <gtest/gtest.h>
#include <memory>
#include <mutex>
#include <numeric>
#include <optional>
#include <string_view>
#include <utility>
#include <vector>

namespace vela::testing {

using platform::Nanoseconds;
using platform::SerialQueue;
using platform::WorkQueue;
using std::chrono_literals::operator""ms;
using std::chrono_literals::operator""s;

class WorkQueueBackend {
public:
    virtual ~WorkQueueBackend() = default;

    virtual platform::WorkQueues& queues() = 0;
    virtual platform::MonotonicTime monotonicNow() = 0;

    /// Lets work run and time pass until `done` answers true. False when that takes unreasonably long.
    virtual bool runUntil(const std::function<bool()>& done) = 0;

    /// Lets run what may run.
    virtual void settle() = 0;

    /// Lets `duration` pass and what becomes due run.
    virtual void pass(platform::Nanoseconds duration) = 0;
};

using MakeWorkQueueBackend = std::function<std::unique_ptr<WorkQueueBackend>()>;

class WorkQueueContract : public ::testing::TestWithParam<MakeWorkQueueBackend> {
protected:
    platform::WorkQueues& queues() { return backend_->queues(); }
    std::unique_ptr<platform::SerialQueue> makeQueue(std::string_view name = "com.orvex.vela.test") {
        return queues().makeSerialQueue(name, platform::QualityOfService::Default);
    }
    bool runUntil(const std::function<bool()>& done) { return backend_->runUntil(done); }
    bool runUntilSize(const Record& record, std::size_t size) {
        return runUntil([&record, size] { return record.size() >= size; });
    }
    void settle() { backend_->settle(); }
    void pass(platform::Nanoseconds duration) { backend_->pass(duration); }
    platform::MonotonicTime monotonicNow() { return backend_->monotonicNow(); }

private:
    const std::unique_ptr<WorkQueueBackend> backend_ = GetParam()();
};

} // namespace vela::testing

// The tests themselves, by subject.
#include "testing/WorkQueueContractDestruction.h" // IWYU pragma: export
#include "testing/WorkQueueContractQueues.h"      // IWYU pragma: export
#include "testing/WorkQueueContractSemaphores.h"  // IWYU pragma: export
