#include "platform/spoor/EmitterRegistry.h"

#include "platform/spoor/SlowPath.h"
#include "platform/spoor/TraceEmitter.h"

#include <pthread.h>

namespace vela::platform::spoor {

EmitterRegistry& EmitterRegistry::instance() {
    static auto* const registry = new EmitterRegistry();
    return *registry;
}

EmitterRegistry::EmitterRegistry() {
    pthread_atfork([] { instance().beforeFork(); }, [] { instance().inParent(); }, [] { instance().inChild(); });
}

void EmitterRegistry::add(TraceEmitter& emitter) {
    const SlowPath slow;
    const MutexLock lock(mutex_);
    emitters_.push_back(&emitter);
}

void EmitterRegistry::remove(TraceEmitter& emitter) {
    const SlowPath slow;
    const MutexLock lock(mutex_);
    std::erase(emitters_, &emitter);
}

void EmitterRegistry::giveBack(const TraceRing* ring) {
    const SlowPath slow;
    const MutexLock lock(mutex_);
    for (TraceEmitter* const emitter : emitters_) {
        emitter->giveBack(ring);
    }
}

void EmitterRegistry::beforeFork() {
    SlowPath::begin();
    mutex_.lock();
    for (TraceEmitter* const emitter : emitters_) {
        emitter->mutex_.lock();
    }
}

void EmitterRegistry::inParent() {
    for (TraceEmitter* const emitter : emitters_) {
        emitter->mutex_.unlock();
    }
    mutex_.unlock();
    SlowPath::end();
}

void EmitterRegistry::inChild() {
    for (TraceEmitter* const emitter : emitters_) {
        emitter->forgetRings();
        emitter->mutex_.unlock();
    }
    mutex_.unlock();
    SlowPath::end();
}

} // namespace vela::platform::spoor
