// Emits trace events from a process to the service whose control page it finds: into the kernel's marker file where the
// service has one and this process may open it, else into a ring of the emitting thread's own.
//
// Thread-safe. While nobody collects, an emission is two loads and a branch. The first emission of a process, and of a
// thread that needs a ring, allocates, takes locks and makes system calls; later ones take no lock and allocate
// nothing. errno stays. An emission from a handler of a signal that interrupts the slow one of its own thread counts as
// lost. In a forked child, threads get rings of the child's own. The destructor is for a time when no thread emits any
// more.
#pragma once

#include "platform/Mutex.h"
#include "platform/linux/FileDescriptor.h"
#include "platform/spoor/ControlPage.h"
#include "platform/spoor/TracePaths.h"
#include "platform/spoor/TraceRing.h"

#include <atomic>
#include <cstddef>
#include <cstdint>
#include <memory>
#include <pthread.h>
#include <string>
#include <vector>

namespace vela::platform::spoor {

/// What became of an event.
enum class Emission : std::uint8_t {
    Emitted,
    NobodyCollects,
    OutOfRange, ///< sessions collect, but not this code
    NoService,  ///< there is no control page
    Lost        ///< neither the kernel nor a ring took it
};

class TraceEmitter {
public:
    /// Rings of one process. Further threads' events are lost, and counted in its first ring.
    static constexpr std::size_t kMostRings = 256;

    explicit TraceEmitter(std::vector<EmitterFolder> folders);
    ~TraceEmitter();
    TraceEmitter(const TraceEmitter&) = delete;
    TraceEmitter& operator=(const TraceEmitter&) = delete;

    void emit(std::uint32_t code, const TraceArguments& arguments) {
        if (load(*activeWord()) != 0) [[unlikely]] {
            static_cast<void>(emitNow(code, arguments));
        }
    }
    /// Without the short cut.
    Emission emitNow(std::uint32_t code, const TraceArguments& arguments);

    /// Does beforehand what the calling thread's first emission would do.
    void prepareThread();

    /// A word that is 0 while nobody collects. Another one once there is a control page; both live for ever.
    const std::uint32_t* activeWord() const { return active_.load(std::memory_order_acquire); }

    /// Whether the service whose page was found lives.
    bool hasLivingService();

    /// The process ends: while nobody collects, its rings go with it.
    void leave();

    /// Counts events that were never emitted here. Takes no lock.
    void countLost(std::uint64_t events);

private:
    friend class EmitterRegistry;

    struct Held {
        std::unique_ptr<TraceRing> ring;
        bool taken = false;
    };

    const ControlPage* attach();
    bool attachTo(const EmitterFolder& folder, bool living) VELA_REQUIRES(mutex_);
    int marker(const ControlPage& page);
    int openMarker(const ControlPage& page) VELA_EXCLUDES(mutex_);
    bool writeMarker(int marker, std::uint32_t code, const TraceArguments& arguments);
    Emission lose();
    Emission emitToRing(const ControlPage& page, std::uint32_t code, const TraceArguments& arguments);
    TraceRing* ring();
    TraceRing* takeRing();
    void giveBack(const TraceRing* ring);
    void forgetRings() VELA_REQUIRES(mutex_);

    const std::vector<EmitterFolder> folders_;
    pthread_key_t key_{}; ///< a thread's ring
    bool hasKey_ = false;
    std::atomic<std::uint32_t> pid_;
    std::atomic<const std::uint32_t*> active_;
    std::atomic<const ControlPage*> page_ = nullptr;
    std::atomic<std::uint64_t> nextAttach_ = 0;  ///< when to look for a page again, ns; 0: never looked
    std::atomic<std::uint64_t> nextRing_ = 0;    ///< when to try to make a ring again
    std::atomic<std::uint64_t> markerState_ = 0; ///< serial number of the marker's path, times 2, and 1 if it is open
    std::atomic<int> marker_ = -1;
    // Generations of the page; beyond 32 bits: none.
    std::atomic<std::uint64_t> deadGeneration_;      ///< in which the marker takes nothing
    std::atomic<std::uint64_t> abandonedGeneration_; ///< in which the service died
    std::atomic<std::uint64_t> lost_ = 0;            ///< before there was a ring to count them in
    std::atomic<TraceRing*> countingRing_ = nullptr; ///< the first one
    Mutex mutex_;
    FileDescriptor control_ VELA_GUARDED_BY(mutex_);
    std::string ringFolder_ VELA_GUARDED_BY(mutex_);
    std::vector<Held> rings_ VELA_GUARDED_BY(mutex_);
};

} // namespace vela::platform::spoor
