// The work queues on a small pool of threads. Thread-safe; see platform/WorkQueue.h for lifetimes. It is destroyed
// last, not from an item: background items that have not begun are destroyed without being run, and the threads are
// joined.
#pragma once

#include "platform/WorkQueue.h"
#include "platform/linux/BackgroundQueue.h"
#include "platform/linux/WorkerPool.h"

#include <cstddef>

namespace vela::platform {

class LinuxWorkQueues final : public WorkQueues {
public:
    /// As many threads as the machine has, but at least two: one long item never holds up everything else.
    static unsigned defaultThreads();

    /// At most `threads` run at a time; blocked ones do not count.
    explicit LinuxWorkQueues(unsigned threads = defaultThreads());
    ~LinuxWorkQueues() override;
    LinuxWorkQueues(const LinuxWorkQueues&) = delete;
    LinuxWorkQueues& operator=(const LinuxWorkQueues&) = delete;

    std::unique_ptr<SerialQueue> makeSerialQueue(std::string_view name, QualityOfService quality) override;
    WorkQueue& background() override { return background_; }
    std::unique_ptr<Semaphore> makeSemaphore(std::uint32_t initial) override;
    std::unique_ptr<Condition> makeCondition() override;
    void beginBlocking() override;
    void endBlocking() override;

    /// Pool threads that exist, blocked ones included.
    std::size_t threadCount() { return pool_.threadCount(); }

    /// Whether a thread takes on a nice value by the quality of the queue that it serves. Only where the system lets it
    /// come back from there.
    bool appliesThreadPriorities() const { return pool_.appliesPriorities(); }

private:
    WorkerPool pool_;
    BackgroundQueue background_;
};

} // namespace vela::platform
