// The emitters of a process, for what happens to threads and processes as a whole: a thread's end gives its ring back,
// a fork leaves the rings to the parent. One for the process, never destroyed. Thread-safe.
#pragma once

#include "platform/Mutex.h"

#include <vector>

namespace vela::platform::spoor {

class TraceEmitter;
class TraceRing;

class EmitterRegistry {
public:
    static EmitterRegistry& instance();

    void add(TraceEmitter& emitter);
    void remove(TraceEmitter& emitter);
    /// A thread that had `ring` has ended. The ring's emitter may be gone.
    void giveBack(const TraceRing* ring);

private:
    EmitterRegistry();

    // The three sides of a fork: all locks are held meanwhile, so that the child finds whole objects.
    void beforeFork() VELA_NO_THREAD_SAFETY_ANALYSIS;
    void inParent() VELA_NO_THREAD_SAFETY_ANALYSIS;
    void inChild() VELA_NO_THREAD_SAFETY_ANALYSIS;

    Mutex mutex_;
    std::vector<TraceEmitter*> emitters_ VELA_GUARDED_BY(mutex_);
};

} // namespace vela::platform::spoor
