#include "platform/linux/LinuxCondition.h"

namespace vela::platform {

bool LinuxCondition::waitUntil(MonotonicTime deadline) {
    {
        PoolLock poolLock(pool_);
        pool_.beginBlocking(poolLock);
    }
    std::unique_lock<std::mutex> lock(mutex_, std::adopt_lock);
    bool signalled = true;
    if (deadline == MonotonicTime::max()) {
        condition_.wait(lock);
    } else {
        signalled = condition_.wait_until(lock, deadline) == std::cv_status::no_timeout;
    }
    lock.release(); // stays locked, as the caller expects
    PoolLock poolLock(pool_);
    pool_.endBlocking(poolLock);
    return signalled;
}

} // namespace vela::platform
