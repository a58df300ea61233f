#include "testing/ManualWorkQueues.h"

#include "testing/ManualCondition.h"
#include "testing/ManualSemaphore.h"
#include "testing/ManualSerialQueue.h"

#include <algorithm>
#include <cassert>
#include <cstdio>
#include <cstdlib>
#include <limits>

namespace vela::testing {

using platform::Condition;
using platform::MonotonicTime;
using platform::Nanoseconds;
using platform::QualityOfService;
using platform::Semaphore;
using platform::SerialQueue;
using platform::WorkItem;
using platform::WorkQueue;

ManualSerialQueue::~ManualSerialQueue() {
    for (ManualSemaphore* const semaphore : std::vector(queues().semaphores_)) {
        semaphore->forget(*this);
    }
}

ManualWorkQueues::ManualWorkQueues(ManualClock& clock) : clock_(clock) {
    background_ = std::make_unique<ManualQueueHandle<WorkQueue>>(*this, "com.orvex.vela.background", false);
}

ManualWorkQueues::~ManualWorkQueues() {
    background_.reset();
    assert(queues_.empty());
}

void ManualWorkQueues::runUntilIdle() {
    while (runNext()) {
    }
}

bool ManualWorkQueues::runNext() {
    fireDueTimers();
    std::shared_ptr<ManualQueue> chosen;
    std::uint64_t lowest = std::numeric_limits<std::uint64_t>::max();
    for (const auto& queue : queues_) {
        if (queue->mayBegin() && queue->waiting.front().order < lowest) {
            lowest = queue->waiting.front().order;
            chosen = queue;
        }
    }
    if (chosen == nullptr) {
        return false;
    }
    WorkItem item = std::move(chosen->waiting.front().item);
    chosen->waiting.pop_front();
    const bool wasRunning = std::exchange(chosen->running, true);
    running_.push_back(chosen.get());
    item();
    item.reset();
    running_.pop_back();
    chosen->running = wasRunning;
    return true;
}

void ManualWorkQueues::advance(Nanoseconds duration) {
    const MonotonicTime end = clock_.monotonicNow() + duration;
    runUntilIdle();
    while (clock_.monotonicNow() < end) {
        const MonotonicTime next = timers_.empty() ? end : std::min(end, timers_.begin()->first.first);
        clock_.advance(std::max(next - clock_.monotonicNow(), Nanoseconds::zero()));
        runUntilIdle();
    }
}

std::size_t ManualWorkQueues::pendingItems() const {
    std::size_t count = 0;
    for (const auto& queue : queues_) {
        count += queue->waiting.size();
    }
    return count;
}

std::size_t ManualWorkQueues::suspendedQueues() const {
    return static_cast<std::size_t>(
        std::count_if(queues_.begin(), queues_.end(), [](const auto& queue) { return queue->suspensions > 0; }));
}

std::size_t ManualWorkQueues::liveQueues() const {
    return static_cast<std::size_t>(
        std::count_if(queues_.begin(), queues_.end(), [](const auto& queue) { return queue->serial; }));
}

std::optional<QualityOfService> ManualWorkQueues::qualityOf(std::string_view name) const {
    const auto found = qualities_.find(name);
    return found == qualities_.end() ? std::nullopt : std::optional(found->second);
}

std::unique_ptr<SerialQueue> ManualWorkQueues::makeSerialQueue(std::string_view name, QualityOfService quality) {
    qualities_.insert_or_assign(std::string(name), quality);
    return std::make_unique<ManualSerialQueue>(*this, name);
}

std::unique_ptr<Semaphore> ManualWorkQueues::makeSemaphore(std::uint32_t initial) {
    return std::make_unique<ManualSemaphore>(*this, initial);
}

std::unique_ptr<Condition> ManualWorkQueues::makeCondition() { return std::make_unique<ManualCondition>(*this); }

void ManualWorkQueues::beginBlocking() {
    if (!running_.empty()) {
        ++blockingDepth_;
    }
}

void ManualWorkQueues::endBlocking() {
    if (!running_.empty()) {
        assert(blockingDepth_ > 0);
        --blockingDepth_;
    }
}

void ManualWorkQueues::removeQueue(const std::shared_ptr<ManualQueue>& queue) {
    queue->closed = true;
    std::erase(queues_, queue);
    removeTimers(queue.get());
    const auto dropped = std::exchange(queue->waiting, {});
}

void ManualWorkQueues::post(ManualQueue& queue, WorkItem item) {
    if (!queue.closed) {
        queue.waiting.push_back({nextOrder_++, std::move(item)});
    }
}

void ManualWorkQueues::postFirst(ManualQueue& queue, WorkItem item) {
    queue.waiting.push_front({nextOrder_++, std::move(item)});
}

void ManualWorkQueues::addTimer(Nanoseconds delay, const void* owner, WorkItem fire) {
    timers_.emplace(TimerKey{deadlineAfter(delay), nextOrder_++}, Timer{owner, std::move(fire)});
}

MonotonicTime ManualWorkQueues::deadlineAfter(Nanoseconds delay) const {
    const MonotonicTime now = clock_.monotonicNow();
    return delay < MonotonicTime::max() - now ? now + delay : MonotonicTime::max();
}

void ManualWorkQueues::removeTimers(const void* owner) {
    std::vector<WorkItem> removed; // their captures go when the map is whole again
    for (auto position = timers_.begin(); position != timers_.end();) {
        if (position->second.owner == owner) {
            removed.push_back(std::move(position->second.fire));
            position = timers_.erase(position);
        } else {
            ++position;
        }
    }
}

void ManualWorkQueues::fireDueTimers() {
    while (!timers_.empty() && timers_.begin()->first.first <= clock_.monotonicNow()) {
        auto timer = timers_.extract(timers_.begin());
        timer.mapped().fire();
    }
}

bool ManualWorkQueues::makeProgress(const std::optional<MonotonicTime>& deadline) {
    if (runNext()) {
        return true;
    }
    std::optional<MonotonicTime> next = deadline;
    if (!timers_.empty()) {
        const MonotonicTime first = timers_.begin()->first.first;
        next = next ? std::min(*next, first) : first;
    }
    if (!next || *next == MonotonicTime::max()) {
        return false;
    }
    clock_.advance(std::max(*next - clock_.monotonicNow(), Nanoseconds::zero()));
    return true;
}

void ManualWorkQueues::failHopelessWait() {
    static_cast<void>(std::fputs("ManualWorkQueues: a wait without a time limit that nothing can end\n", stderr));
    std::abort();
}

} // namespace vela::testing
