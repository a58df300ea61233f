#include "platform/linux/PoolLock.h"

#include "platform/linux/DeferredWakes.h"
#include "platform/linux/Worker.h"
#include "platform/linux/WorkerPool.h"

namespace vela::platform {

PoolLock::PoolLock(WorkerPool& pool) : lock_(pool.mutex_) {}

void PoolLock::unlock() {
    if (lock_.owns_lock()) {
        lock_.unlock();
    }
    wakeNow();
}

bool PoolLock::wait(std::condition_variable& condition, const std::optional<MonotonicTime>& deadline) {
    wakeNow();
    if (!deadline || *deadline == MonotonicTime::max()) {
        condition.wait(lock_);
        return true;
    }
    return condition.wait_until(lock_, *deadline) == std::cv_status::no_timeout;
}

bool PoolLock::sleep(Sleeper& sleeper, const std::optional<MonotonicTime>& deadline) {
    unlock();
    const bool woken = sleeper.sleepUntil(deadline.value_or(MonotonicTime::max()));
    relock();
    return woken;
}

void PoolLock::wakeOnUnlock(Worker& worker) {
    if (wakeCount_ == wakes_.size()) {
        worker.sleeper.wake();
        return;
    }
    wakes_[wakeCount_++] = &worker;
}

void PoolLock::wakeNow() {
    for (; wakeCount_ > 0; --wakeCount_) {
        DeferredWakes::wake(wakes_[wakeCount_ - 1]->sleeper);
    }
}

} // namespace vela::platform
