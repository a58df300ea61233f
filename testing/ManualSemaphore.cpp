#include "testing/ManualSemaphore.h"

#include <utility>

namespace vela::testing {

using platform::Nanoseconds;
using platform::SerialQueue;
using platform::UniqueFunction;

ManualSemaphore::~ManualSemaphore() {
    std::erase(queues_.semaphores_, this);
    while (!waiters_.empty()) {
        queues_.removeTimers(&waiters_.front());
        Waiter waiter = std::move(waiters_.front());
        waiters_.pop_front();
        if (waiter.queue == nullptr) {
            *waiter.outcome = Outcome::Abandoned;
            continue;
        }
        waiter.then.reset();
        waiter.queue->resume();
    }
}

void ManualSemaphore::signal() {
    if (waiters_.empty()) {
        ++count_;
    } else if (waiters_.front().queue == nullptr) {
        *waiters_.front().outcome = Outcome::Taken;
        waiters_.pop_front();
    } else {
        resume(waiters_.begin(), true);
    }
}

bool ManualSemaphore::wait(std::optional<Nanoseconds> timeout) {
    if (count_ > 0) {
        --count_;
        return true;
    }
    ManualWorkQueues& queues = queues_; // the semaphore may be destroyed while this waits
    const auto deadline = timeout ? std::optional(queues.deadlineAfter(*timeout)) : std::nullopt;
    Outcome outcome = Outcome::Waiting;
    const auto position = waiters_.insert(waiters_.end(), Waiter{nullptr, nullptr, &outcome});
    while (outcome == Outcome::Waiting) {
        if (deadline && queues.clock_.monotonicNow() >= *deadline) {
            waiters_.erase(position);
            return false;
        }
        if (!queues.makeProgress(deadline)) {
            ManualWorkQueues::failHopelessWait();
        }
    }
    return outcome == Outcome::Taken;
}

void ManualSemaphore::waitSuspending(SerialQueue& queue, Nanoseconds timeout, UniqueFunction<void(bool)> then) {
    queue.suspend();
    const auto position = waiters_.insert(waiters_.end(), Waiter{&queue, std::move(then), nullptr});
    if (count_ > 0) {
        --count_;
        resume(position, true);
    } else if (timeout <= Nanoseconds::zero()) {
        resume(position, false);
    } else {
        queues_.addTimer(timeout, &*position, [this, position] { resume(position, false); });
    }
}

void ManualSemaphore::forget(const SerialQueue& queue) {
    Waiters forgotten;
    for (auto position = waiters_.begin(); position != waiters_.end();) {
        const auto current = position++;
        if (current->queue == &queue) {
            queues_.removeTimers(&*current);
            forgotten.splice(forgotten.end(), waiters_, current);
        }
    }
}

void ManualSemaphore::resume(Waiters::iterator position, bool taken) {
    queues_.removeTimers(&*position);
    Waiter waiter = std::move(*position);
    waiters_.erase(position);
    waiter.queue->resumeWith([then = std::move(waiter.then), taken]() mutable { then(taken); });
}

} // namespace vela::testing
