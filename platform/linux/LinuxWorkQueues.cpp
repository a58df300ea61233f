#include "platform/linux/LinuxWorkQueues.h"

#include "platform/linux/LinuxCondition.h"
#include "platform/linux/LinuxSemaphore.h"
#include "platform/linux/LinuxSerialQueue.h"

#include <algorithm>
#include <thread>

namespace vela::platform {

unsigned LinuxWorkQueues::defaultThreads() { return std::max(2U, std::thread::hardware_concurrency()); }

LinuxWorkQueues::LinuxWorkQueues(unsigned threads) : pool_(threads), background_(pool_) {}

LinuxWorkQueues::~LinuxWorkQueues() {
    // Both queues and semaphores are gone. A running background item may still post to the background: it finds it
    // closed.
    background_.core().close();
    pool_.stop();
}

std::unique_ptr<SerialQueue> LinuxWorkQueues::makeSerialQueue(std::string_view name, QualityOfService quality) {
    return std::make_unique<LinuxSerialQueue>(std::make_shared<SerialQueueCore>(pool_, name, quality));
}

std::unique_ptr<Semaphore> LinuxWorkQueues::makeSemaphore(std::uint32_t initial) {
    return std::make_unique<LinuxSemaphore>(pool_, initial);
}

std::unique_ptr<Condition> LinuxWorkQueues::makeCondition() { return std::make_unique<LinuxCondition>(pool_); }

void LinuxWorkQueues::beginBlocking() {
    PoolLock lock(pool_);
    pool_.beginBlocking(lock);
}

void LinuxWorkQueues::endBlocking() {
    PoolLock lock(pool_);
    pool_.endBlocking(lock);
}

} // namespace vela::platform
