// The C API of trace emission over the emitter of the process, which is made at its first use and never destroyed. No
// exception leaves it.
#include "client/include/vela/trace.h"

#include "platform/spoor/SlowPath.h"
#include "platform/spoor/TraceEmitter.h"

#include <atomic>
#include <cstdint>
#include <cstdlib>
#include <string>

using vela::platform::spoor::emitterFolders;
using vela::platform::spoor::SlowPath;
using vela::platform::spoor::TraceEmitter;

namespace {

/// What the word is before the emitter is made: there may be somebody who collects.
const uint32_t kUnknown = 1;

std::atomic<TraceEmitter*> madeEmitter = nullptr;

/// Programs with more rights than their users emit to the system's service only.
std::string traceVariable(const char* name) {
    const char* const value = secure_getenv(name); // NOLINT(concurrency-mt-unsafe): as every library
    return value != nullptr ? value : "";
}

/// Events of handlers of signals that interrupted the emitter's making.
std::atomic<std::uint64_t> lostBefore = 0;

/// Null for a handler of a signal that interrupts the making on its own thread.
TraceEmitter* emitter() {
    if (TraceEmitter* const made = madeEmitter; made != nullptr) {
        return made;
    }
    if (SlowPath::isUnderWay()) {
        return nullptr;
    }
    const SlowPath making;
    static TraceEmitter& made = *[] {
        vela::platform::spoor::EmitterEnvironment environment;
        environment.velaRuntime = traceVariable("VELA_RUNTIME");
        environment.runtimeHome = traceVariable("XDG_RUNTIME_DIR");
        auto* const emitter = new TraceEmitter(emitterFolders(environment));
        madeEmitter = emitter;
        return emitter;
    }();
    made.countLost(lostBefore.exchange(0));
    return &made;
}

void shareWord(const TraceEmitter& emitter) {
    __atomic_store_n(&VelaReportingTraceActiveWord, emitter.activeWord(), __ATOMIC_RELEASE);
}

/// At the process's end, when there may be threads that still emit.
[[gnu::destructor]] void leaveAtEnd() {
    if (TraceEmitter* const made = madeEmitter; made != nullptr) {
        made->leave();
    }
}

} // namespace

extern "C" {

const uint32_t* VelaReportingTraceActiveWord = &kUnknown;

void VelaReportingTraceEmit(uint32_t code, uint64_t first, uint64_t second, uint64_t third, uint64_t fourth) noexcept
    try {
    TraceEmitter* const own = emitter();
    if (own == nullptr) {
        ++lostBefore;
        return;
    }
    static_cast<void>(own->emitNow(code, {first, second, third, fourth}));
    if (__atomic_load_n(&VelaReportingTraceActiveWord, __ATOMIC_RELAXED) != own->activeWord()) {
        shareWord(*own);
    }
} catch (...) {
    // Without memory for the first one there is no event.
}

void VelaReportingTracePrepareThread() noexcept try {
    if (TraceEmitter* const own = emitter(); own != nullptr) {
        own->prepareThread();
        shareWord(*own);
    }
} catch (...) {
    // The first event tries again.
}

} // extern "C"
