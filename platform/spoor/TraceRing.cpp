#include "platform/spoor/TraceRing.h"

#include "platform/spoor/OwnerLock.h"
#include "platform/spoor/SystemFailure.h"

#include <cerrno>
#include <fcntl.h>
#include <sched.h>
#include <sys/mman.h>
#include <sys/random.h>
#include <sys/resource.h>
#include <sys/stat.h>
#include <unistd.h>
#include <utility>

namespace vela::platform::spoor {

namespace {

constexpr mode_t kRingPermissions = 0644;

/// "PID-TID-RANDOM": nobody else's, whatever namespaces emitters are in.
std::string newName() {
    std::uint64_t number = 0;
    if (getrandom(&number, sizeof(number), GRND_NONBLOCK) != static_cast<ssize_t>(sizeof(number))) {
        number = traceNow(); // only right after the system's start
    }
    return std::to_string(getpid()) + "-" + std::to_string(gettid()) + "-" + std::to_string(number);
}

/// Of rings, in this process.
std::atomic<std::uint64_t> lockedBytes = 0;

/// A program may lock memory of its own, so that half of its allowance stays its own.
bool lockMemory(void* begin) {
    rlimit allowed{};
    if (getrlimit(RLIMIT_MEMLOCK, &allowed) != 0) {
        return false;
    }
    const std::uint64_t locked = lockedBytes += kRingFileBytes;
    if ((allowed.rlim_cur == RLIM_INFINITY || locked < allowed.rlim_cur / 2) && mlock(begin, kRingFileBytes) == 0) {
        return true;
    }
    lockedBytes -= kRingFileBytes;
    return false;
}

template <class Word>
void put(Word& place, Word word) {
    std::atomic_ref<Word>(place).store(word, std::memory_order_relaxed);
}

} // namespace

Result<std::unique_ptr<TraceRing>> TraceRing::create(const std::string& folder) {
    const FileDescriptor parent(open(folder.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
    if (!parent) {
        return systemFailure("open " + folder, errno);
    }
    std::unique_ptr<TraceRing> ring(new TraceRing());
    const std::string name = newName();
    const std::string temporary = "." + name;
    ring->file_ = FileDescriptor(
        openat(parent.get(), temporary.c_str(), O_RDWR | O_CREAT | O_EXCL | O_NOFOLLOW | O_CLOEXEC, kRingPermissions));
    if (!ring->file_) {
        return systemFailure("write in " + folder, errno);
    }
    // All of its blocks now: a full file system must not be met by an event.
    int error = posix_fallocate(ring->file_.get(), 0, kRingFileBytes);
    if (error == 0 && (fchmod(ring->file_.get(), kRingPermissions) != 0 || !lockAsOwner(ring->file_.get()))) {
        error = errno;
    }
    if (error == 0) {
        void* const begin =
            mmap(nullptr, kRingFileBytes, PROT_READ | PROT_WRITE, MAP_SHARED | MAP_POPULATE, ring->file_.get(), 0);
        error = begin == MAP_FAILED ? errno : 0;
        ring->header_ = begin == MAP_FAILED ? nullptr : static_cast<RingHeader*>(begin);
    }
    if (error == 0) {
        // A real-time thread should meet no page that is not there. Where the limit of locked memory is low, it may.
        ring->locked_ = lockMemory(ring->header_);
        *ring->header_ = RingHeader();
        ring->header_->pid = getpid();
        ring->path_ = folder + "/" + name + std::string(kRingSuffix);
        error = renameat(parent.get(), temporary.c_str(), AT_FDCWD, ring->path_.c_str()) == 0 ? 0 : errno;
    }
    if (error != 0) {
        unlinkat(parent.get(), temporary.c_str(), 0);
        return systemFailure("write in " + folder, error);
    }
    return ring;
}

TraceRing::~TraceRing() {
    if (header_ != nullptr) {
        munmap(header_, kRingFileBytes);
    }
    if (locked_) {
        lockedBytes -= kRingFileBytes;
    }
}

void TraceRing::adopt() { thread_ = static_cast<std::uint64_t>(gettid()); }

bool TraceRing::write(std::uint64_t time, std::uint32_t code, const TraceArguments& arguments) {
    if (writing_) {
        addLost(1);
        return false;
    }
    writing_ = true;
    std::atomic_signal_fence(std::memory_order_seq_cst);
    const std::uint64_t index = head_;
    void* const place = reinterpret_cast<char*>(header_) + ringOffset(index);
    auto& record = *static_cast<RingRecord*>(place);
    put(record.index, kRingIndexOfNone);
    std::atomic_thread_fence(std::memory_order_release); // marked before it changes
    put(record.time, time);
    put(record.code, code);
    put(record.cpu, static_cast<std::uint32_t>(sched_getcpu()));
    put(record.thread, thread_);
    for (std::size_t i = 0; i < arguments.size(); ++i) {
        put(record.arguments[i], arguments[i]);
    }
    put(record.index, index);
    head_ = index + 1;
    // The event is whole before readers count it, and counted before the next record is marked: the count that a
    // reader finds after it copied records tells which of them stood still.
    std::atomic_ref(header_->head).store(head_, std::memory_order_release);
    std::atomic_thread_fence(std::memory_order_release);
    std::atomic_signal_fence(std::memory_order_seq_cst);
    writing_ = false;
    return true;
}

void TraceRing::remove() const { unlink(path_.c_str()); }

} // namespace vela::platform::spoor
