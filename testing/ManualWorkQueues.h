// Work queues whose items run when a test says so, in one order that repeats: of all items that may begin, the one
// posted first. An item may run others while it waits for a semaphore, as other threads would. Not thread-safe:
// everything, items included, runs on the test's thread. Outlives what it made.
#pragma once

#include "platform/WorkQueue.h"
#include "testing/ManualClock.h"

#include <cstddef>
#include <cstdint>
#include <deque>
#include <functional>
#include <map>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

namespace vela::testing {

class ManualSemaphore;

/// Either kind of queue. A queue that is destroyed leaves at once; an item of it that runs goes on to its end.
class ManualQueue {
public:
    struct Entry {
        std::uint64_t order = 0;
        platform::WorkItem item;
    };

    std::deque<Entry> waiting; // as they will run
    std::uint32_t suspensions = 0;
    bool serial = true;
    bool running = false;
    bool closed = false; // its handle is being destroyed: what is posted now is dropped

    bool mayBegin() const { return !waiting.empty() && suspensions == 0 && !(serial && running); }
};

class ManualWorkQueues final : public platform::WorkQueues {
public:
    using ConditionStep = platform::UniqueFunction<void(platform::Condition&)>;

    explicit ManualWorkQueues(ManualClock& clock);
    ~ManualWorkQueues() override;
    ManualWorkQueues(const ManualWorkQueues&) = delete;
    ManualWorkQueues& operator=(const ManualWorkQueues&) = delete;

    /// Runs everything that is due, and what that makes due, at the clock's present time.
    void runUntilIdle();

    /// Runs one item. False when none may begin.
    bool runNext();

    /// Runs what is due, then moves the clock on by `duration`, stopping at each timer on the way to run what becomes
    /// due.
    void advance(platform::Nanoseconds duration);

    /// What happens during the next wait on a condition made here that has no step yet; the lock is free while it
    /// happens. The wait then answers false when the clock has reached the deadline and the step did not signal.
    /// Without a step a wait lasts until its deadline.
    void addConditionStep(ConditionStep step) { conditionSteps_.push_back(std::move(step)); }

    /// Items that were posted and have not begun; those of a delay that has not passed do not count.
    std::size_t pendingItems() const;
    /// Delays and time limits that have not passed.
    std::size_t pendingTimers() const { return timers_.size(); }
    std::size_t suspendedQueues() const;
    /// Serial queues that exist.
    std::size_t liveQueues() const;
    /// With which quality the serial queue of this name was made last; none when there was none.
    std::optional<platform::QualityOfService> qualityOf(std::string_view name) const;
    /// Calls of `beginBlocking` without their `endBlocking`.
    unsigned blockingDepth() const { return blockingDepth_; }

    std::unique_ptr<platform::SerialQueue> makeSerialQueue(std::string_view name,
                                                           platform::QualityOfService quality) override;
    platform::WorkQueue& background() override { return *background_; }
    std::unique_ptr<platform::Semaphore> makeSemaphore(std::uint32_t initial) override;
    std::unique_ptr<platform::Condition> makeCondition() override;
    void beginBlocking() override;
    void endBlocking() override;

private:
    friend class ManualSemaphore;
    friend class ManualCondition;
    template <class Interface>
    friend class ManualQueueHandle;
    friend class ManualSerialQueue;

    using TimerKey = std::pair<platform::MonotonicTime, std::uint64_t>;
    struct Timer {
        const void* owner = nullptr; // a queue or a wait; its timers go with it
        platform::WorkItem fire;
    };

    void addQueue(const std::shared_ptr<ManualQueue>& queue) { queues_.push_back(queue); }
    void removeQueue(const std::shared_ptr<ManualQueue>& queue);
    void post(ManualQueue& queue, platform::WorkItem item);
    void postFirst(ManualQueue& queue, platform::WorkItem item);
    void addTimer(platform::Nanoseconds delay, const void* owner, platform::WorkItem fire);
    void removeTimers(const void* owner);
    platform::MonotonicTime deadlineAfter(platform::Nanoseconds delay) const;
    void fireDueTimers();
    bool isRunning(const ManualQueue& queue) const { return !running_.empty() && running_.back() == &queue; }
    /// Something happens before `deadline`, by running an item or else moving the clock. False when nothing does.
    bool makeProgress(const std::optional<platform::MonotonicTime>& deadline);
    [[noreturn]] static void failHopelessWait();

    ManualClock& clock_;
    std::vector<std::shared_ptr<ManualQueue>> queues_; // as they were made
    std::map<TimerKey, Timer> timers_;
    std::vector<const ManualQueue*> running_; // the innermost item's queue last
    std::vector<ManualSemaphore*> semaphores_;
    std::deque<ConditionStep> conditionSteps_;
    std::unique_ptr<platform::WorkQueue> background_;
    std::uint64_t nextOrder_ = 0;
    unsigned blockingDepth_ = 0;
    std::map<std::string, platform::QualityOfService, std::less<>> qualities_; // of serial queues, by name
};

} // namespace vela::testing
