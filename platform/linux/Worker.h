// One thread of a worker pool. Confined to it, save for what the pool's lock guards. Lives as long as its pool.
#pragma once

#include "platform/linux/Sleeper.h"
#include "platform/linux/ThreadAttributes.h"

#include <thread>

namespace vela::platform {

class QueueCore;
class WorkerPool;

struct Worker {
    // Guarded by the pool's lock:
    bool woken = false;
    std::thread thread;

    Sleeper sleeper;

    // The thread's own:
    WorkerPool* pool = nullptr;
    const QueueCore* queue = nullptr; // being served
    unsigned blockingDepth = 0;
    bool inItem = false; // of a serial queue
    /// An item made a queue ready: this thread serves it after its own one, or wakes another when it goes on for long.
    bool owesWake = false;
    unsigned itemsSince = 0; // of its own queue
    unsigned itemsInTurn = 0;
    ThreadAppearance appearance;
};

} // namespace vela::platform
