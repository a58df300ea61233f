#include "platform/spoor/TraceEmitter.h"

#include "platform/spoor/EmitterRegistry.h"
#include "platform/spoor/FtracePage.h"
#include "platform/spoor/OwnerLock.h"
#include "platform/spoor/SlowPath.h"

#include <algorithm>
#include <array>
#include <cerrno>
#include <cstring>
#include <fcntl.h>
#include <linux/magic.h>
#include <sys/mman.h>
#include <sys/stat.h>
#include <sys/vfs.h>
#include <unistd.h>
#include <utility>

namespace vela::platform::spoor {

namespace {

/// Where there is nothing, looking again takes a system call: once in a while.
constexpr std::uint64_t kRetryInterval = 1'000'000'000;
constexpr std::uint64_t kNoGeneration = std::uint64_t{1} << 32U;

/// What the short cut of an emitter without a control page reads: look closer.
const std::uint32_t kUnknown = 1;

/// Emission must not change what its caller finds in errno.
class KeptErrno {
public:
    KeptErrno() = default;
    ~KeptErrno() { errno = error_; }
    KeptErrno(const KeptErrno&) = delete;
    KeptErrno& operator=(const KeptErrno&) = delete;

private:
    const int error_ = errno;
};

/// The path in the page; empty when it changed meanwhile, or is none.
std::string copyMarkerPath(const ControlPage& page, std::uint32_t serial) {
    std::string path;
    for (const char& letter : page.marker) {
        const char copied = load(letter);
        if (copied == '\0') {
            break;
        }
        path += copied;
    }
    __atomic_thread_fence(__ATOMIC_ACQUIRE);
    return load(page.markerSerial) == serial && path.size() < kControlMarkerBytes ? path : std::string();
}

/// A marker file, and nothing else that a page might name.
FileDescriptor openMarkerFile(const std::string& path) {
    FileDescriptor file(open(path.c_str(), O_WRONLY | O_CLOEXEC | O_NOFOLLOW | O_NOCTTY | O_NONBLOCK));
    struct statfs system {};
    return file && fstatfs(file.get(), &system) == 0 && system.f_type == TRACEFS_MAGIC &&
                   path.ends_with("/trace_marker_raw")
               ? std::move(file)
               : FileDescriptor();
}

} // namespace

TraceEmitter::TraceEmitter(std::vector<EmitterFolder> folders)
    : folders_(std::move(folders)),
      hasKey_(pthread_key_create(
                  &key_,
                  [](void* ring) { EmitterRegistry::instance().giveBack(static_cast<const TraceRing*>(ring)); }) == 0),
      pid_(static_cast<std::uint32_t>(getpid())),
      active_(&kUnknown),
      deadGeneration_(kNoGeneration),
      abandonedGeneration_(kNoGeneration) {
    EmitterRegistry::instance().add(*this);
}

TraceEmitter::~TraceEmitter() {
    leave();
    EmitterRegistry::instance().remove(*this);
    if (hasKey_) {
        pthread_key_delete(key_);
    }
    if (const int marker = marker_; marker >= 0) {
        close(marker);
    }
    // The page stays mapped: its word was given away for ever.
}

const ControlPage* TraceEmitter::attach() {
    if (SlowPath::isUnderWay()) {
        return page_.load(std::memory_order_acquire);
    }
    const SlowPath slow;
    const std::uint64_t now = nanosecondsOf(CLOCK_MONOTONIC_COARSE);
    std::uint64_t next = nextAttach_.load(std::memory_order_acquire);
    // The first time every thread waits for the one that looks; later they go on without.
    if (next != 0 && (now < next || !nextAttach_.compare_exchange_strong(next, now + kRetryInterval))) {
        return page_.load(std::memory_order_acquire);
    }
    const MutexLock lock(mutex_);
    const ControlPage* const page = page_.load(std::memory_order_acquire);
    if (page != nullptr || (next == 0 && nextAttach_.load(std::memory_order_relaxed) != 0)) {
        return page;
    }
    for (const bool living : {true, false}) {
        for (const EmitterFolder& folder : folders_) {
            if (attachTo(folder, living)) {
                return page_.load(std::memory_order_relaxed);
            }
        }
    }
    nextAttach_.store(now + kRetryInterval, std::memory_order_release);
    return nullptr;
}

bool TraceEmitter::attachTo(const EmitterFolder& folder, bool living) {
    FileDescriptor file(
        open(controlFile(folder.runtime).c_str(), O_RDONLY | O_CLOEXEC | O_NOFOLLOW | O_NOCTTY | O_NONBLOCK));
    struct stat status {};
    if (!file || fstat(file.get(), &status) != 0 || !S_ISREG(status.st_mode) ||
        status.st_size < static_cast<off_t>(kControlFileBytes) ||
        (!folder.anyOwner && status.st_uid != 0 && status.st_uid != geteuid()) ||
        (living && !hasLivingOwner(file.get()))) {
        return false;
    }
    void* const begin = mmap(nullptr, kControlFileBytes, PROT_READ, MAP_SHARED | MAP_POPULATE, file.get(), 0);
    if (begin == MAP_FAILED) {
        return false;
    }
    const auto* const page = static_cast<const ControlPage*>(begin);
    if (!isControlPage(*page)) {
        munmap(begin, kControlFileBytes);
        return false;
    }
    control_ = std::move(file);
    ringFolder_ = ringFolder(folder.runtime);
    page_.store(page, std::memory_order_release);
    active_.store(&page->active, std::memory_order_release);
    return true;
}

bool TraceEmitter::hasLivingService() {
    const SlowPath slow;
    const MutexLock lock(mutex_);
    return control_ && hasLivingOwner(control_.get());
}

void TraceEmitter::leave() {
    const ControlPage* const page = page_.load(std::memory_order_acquire);
    if (page != nullptr && load(page->active) == 0) {
        const SlowPath slow;
        const MutexLock lock(mutex_);
        for (const Held& held : rings_) {
            held.ring->remove();
        }
    }
}

Emission TraceEmitter::emitNow(std::uint32_t code, const TraceArguments& arguments) {
    const KeptErrno kept;
    const bool interruptsSlowPath = SlowPath::isUnderWay();
    const ControlPage* page = page_.load(std::memory_order_acquire);
    if (page == nullptr && (page = attach()) == nullptr) {
        return interruptsSlowPath ? lose() : Emission::NoService; // nobody knows yet who collects
    }
    const std::uint32_t active = load(page->active, __ATOMIC_ACQUIRE);
    if (active == 0) {
        return Emission::NobodyCollects;
    }
    if (!collects(*page, active, code)) {
        return Emission::OutOfRange;
    }
    const std::uint32_t generation = load(page->generation);
    if (abandonedGeneration_.load(std::memory_order_relaxed) == generation) {
        return Emission::NobodyCollects;
    }
    if (deadGeneration_.load(std::memory_order_relaxed) != generation) {
        if (const int open = marker(*page); open >= 0) {
            if (writeMarker(open, code, arguments)) {
                return Emission::Emitted;
            }
            if (load(page->active) == 0 || load(page->generation) != generation) {
                return Emission::NobodyCollects; // the last session ended, after which the kernel takes nothing
            }
            if (interruptsSlowPath) {
                return lose();
            }
            if (!hasLivingService()) {
                abandonedGeneration_ = generation;
                return Emission::NobodyCollects;
            }
            deadGeneration_ = generation;
        }
    }
    return emitToRing(*page, code, arguments);
}

int TraceEmitter::marker(const ControlPage& page) {
    const std::uint32_t serial = load(page.markerSerial, __ATOMIC_ACQUIRE);
    if (serial == 0) {
        return -1;
    }
    const std::uint64_t state = markerState_.load(std::memory_order_acquire);
    if (state >> 1U == serial) {
        return (state & 1U) != 0 ? marker_.load(std::memory_order_relaxed) : -1;
    }
    return openMarker(page);
}

int TraceEmitter::openMarker(const ControlPage& page) {
    if (SlowPath::isUnderWay()) {
        return -1;
    }
    const SlowPath slow;
    const MutexLock lock(mutex_);
    const std::uint32_t serial = load(page.markerSerial, __ATOMIC_ACQUIRE);
    const std::uint64_t state = markerState_.load(std::memory_order_relaxed);
    if (state >> 1U == serial) {
        return (state & 1U) != 0 ? marker_.load(std::memory_order_relaxed) : -1;
    }
    const std::string path = copyMarkerPath(page, serial);
    if (serial == 0 || path.empty()) {
        return -1;
    }
    FileDescriptor file = openMarkerFile(path);
    const bool isOpen = static_cast<bool>(file);
    if (const int old = marker_.load(std::memory_order_relaxed); isOpen && old >= 0) {
        // Other threads may be about to write to the number, which therefore stays.
        dup3(file.get(), old, O_CLOEXEC);
    } else if (isOpen) {
        marker_ = file.release();
    }
    markerState_.store((std::uint64_t{serial} << 1U) | static_cast<unsigned>(isOpen), std::memory_order_release);
    return isOpen ? marker_.load(std::memory_order_relaxed) : -1;
}

bool TraceEmitter::writeMarker(int marker, std::uint32_t code, const TraceArguments& arguments) {
    constexpr std::uint32_t kCount = std::tuple_size_v<TraceArguments>;
    const MarkerEvent event{code, kCount | (pid_.load(std::memory_order_relaxed) << kBitsOfCount), arguments};
    return write(marker, &event, sizeof(event)) == static_cast<ssize_t>(sizeof(event));
}

Emission TraceEmitter::lose() {
    countLost(1);
    return Emission::Lost;
}

void TraceEmitter::countLost(std::uint64_t events) {
    lost_ += events;
    // The first ring may come at any time: whoever is later, this or its maker, sees the other's.
    if (TraceRing* const ring = countingRing_; ring != nullptr) {
        ring->addLost(lost_.exchange(0));
    }
}

Emission TraceEmitter::emitToRing(const ControlPage& page, std::uint32_t code, const TraceArguments& arguments) {
    const std::uint64_t now = traceNow();
    const std::uint64_t heard = load(page.heartbeat);
    if (now > heard && now - heard > kControlSilence) {
        return Emission::NobodyCollects;
    }
    TraceRing* const own = ring();
    if (own == nullptr) {
        return lose();
    }
    return own->write(now, code, arguments) ? Emission::Emitted : Emission::Lost;
}

TraceRing* TraceEmitter::ring() {
    if (!hasKey_) {
        return nullptr;
    }
    auto* const own = static_cast<TraceRing*>(pthread_getspecific(key_));
    return own != nullptr ? own : takeRing();
}

TraceRing* TraceEmitter::takeRing() {
    if (SlowPath::isUnderWay()) {
        return nullptr;
    }
    const SlowPath slow;
    const std::uint64_t now = nanosecondsOf(CLOCK_MONOTONIC_COARSE);
    if (now < nextRing_.load(std::memory_order_relaxed)) {
        return nullptr;
    }
    const MutexLock lock(mutex_);
    auto free = std::ranges::find(rings_, false, &Held::taken);
    if (free == rings_.end() && rings_.size() < kMostRings) {
        if (auto made = TraceRing::create(ringFolder_)) {
            free = rings_.insert(rings_.end(), {*std::move(made), false});
            countingRing_ = rings_.front().ring.get();
            countLost(0);
        }
    }
    if (free == rings_.end() || pthread_setspecific(key_, free->ring.get()) != 0) {
        nextRing_ = now + kRetryInterval;
        return nullptr;
    }
    free->taken = true;
    free->ring->adopt();
    return free->ring.get();
}

void TraceEmitter::prepareThread() {
    const KeptErrno kept;
    const ControlPage* page = page_.load(std::memory_order_acquire);
    if (page == nullptr) {
        nextAttach_ = 0;
        page = attach();
    }
    if (page != nullptr && marker(*page) < 0) {
        ring();
    }
}

void TraceEmitter::giveBack(const TraceRing* ring) {
    const SlowPath slow;
    const MutexLock lock(mutex_);
    const auto found = std::ranges::find_if(rings_, [&](const Held& held) { return held.ring.get() == ring; });
    if (found != rings_.end()) {
        found->taken = false;
    }
}

void TraceEmitter::forgetRings() {
    countingRing_ = nullptr;
    rings_.clear();
    lost_ = 0;
    nextRing_ = 0;
    pid_ = static_cast<std::uint32_t>(getpid());
    if (hasKey_) {
        pthread_setspecific(key_, nullptr);
    }
}

} // namespace vela::platform::spoor
