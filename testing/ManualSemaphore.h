// The semaphores of testing/ManualWorkQueues.h. Not thread-safe.
#pragma once

#include "testing/ManualWorkQueues.h"

#include <cstdint>
#include <list>
#include <optional>

namespace vela::testing {

class ManualSemaphore final : public platform::Semaphore {
public:
    ManualSemaphore(ManualWorkQueues& queues, std::uint32_t initial) : queues_(queues), count_(initial) {
        queues_.semaphores_.push_back(this);
    }
    ~ManualSemaphore() override;

    void signal() override;
    bool wait(std::optional<platform::Nanoseconds> timeout) override;
    void waitSuspending(platform::SerialQueue& queue, platform::Nanoseconds timeout,
                        platform::UniqueFunction<void(bool)> then) override;

    /// `queue` is being destroyed: its waits go.
    void forget(const platform::SerialQueue& queue);

private:
    enum class Outcome : std::uint8_t { Waiting, Taken, Abandoned };

    /// A blocked item (no queue) or a suspended queue.
    struct Waiter {
        platform::SerialQueue* queue = nullptr;
        platform::UniqueFunction<void(bool)> then;
        Outcome* outcome = nullptr;
    };
    using Waiters = std::list<Waiter>;

    void resume(Waiters::iterator position, bool taken);

    ManualWorkQueues& queues_;
    std::uint32_t count_;
    Waiters waiters_; // longest wait first
};

} // namespace vela::testing
