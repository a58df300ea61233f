#include "platform/spoor/TraceControl.h"

#include "platform/linux/LinuxFileSystem.h"
#include "platform/spoor/OwnerLock.h"
#include "platform/spoor/SystemFailure.h"
#include "platform/spoor/TracePaths.h"
#include "platform/spoor/TraceRecord.h"

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <fcntl.h>
#include <sys/mman.h>
#include <sys/stat.h>
#include <unistd.h>

namespace vela::platform::spoor {

namespace {

constexpr std::uint32_t kFolderPermissions = 0755;
constexpr mode_t kSharedFolderPermissions = 01775;
constexpr mode_t kControlPermissions = 0644;

/// A folder that is there keeps its owner and its permissions: an administrator may have chosen them.
Result<Done> makeRingFolder(const std::string& folder, std::optional<gid_t> group) {
    const bool isThere = access(folder.c_str(), F_OK) == 0;
    if (Result<Done> made = LinuxFileSystem().createDirectories(folder, kFolderPermissions); !made || isThere) {
        return made;
    }
    if (group && geteuid() == 0 &&
        (chown(folder.c_str(), static_cast<uid_t>(-1), *group) != 0 ||
         chmod(folder.c_str(), kSharedFolderPermissions) != 0)) {
        return systemFailure("share " + folder, errno);
    }
    return Done{};
}

/// Opens, sizes and locks the page's file.
Result<FileDescriptor> takeFile(const std::string& path) {
    FileDescriptor file(
        open(path.c_str(), O_RDWR | O_CREAT | O_NOFOLLOW | O_NONBLOCK | O_NOCTTY | O_CLOEXEC, kControlPermissions));
    struct stat status {};
    if (!file || fstat(file.get(), &status) != 0) {
        return systemFailure("open " + path, errno);
    }
    if (!S_ISREG(status.st_mode)) {
        return systemFailure("open " + path, EINVAL);
    }
    if (!lockAsOwner(file.get())) {
        return Failure{EBUSY, "lock " + path + ": another service collects there"};
    }
    // All of it now: a full file system must not be met by a store. It never becomes shorter, as emitters map it.
    const int full = posix_fallocate(file.get(), 0, kControlFileBytes);
    if (full != 0 || (status.st_uid == geteuid() && fchmod(file.get(), kControlPermissions) != 0)) {
        return systemFailure("write " + path, full != 0 ? full : errno);
    }
    return file;
}

} // namespace

Result<std::unique_ptr<TraceControl>> TraceControl::open(const std::string& runtimeFolder,
                                                         std::optional<gid_t> emitterGroup) {
    if (const Result<Done> made = LinuxFileSystem().createDirectories(traceFolder(runtimeFolder), kFolderPermissions);
        !made) {
        return made.failure();
    }
    if (const Result<Done> made = makeRingFolder(ringFolder(runtimeFolder), emitterGroup); !made) {
        return made.failure();
    }
    Result<FileDescriptor> file = takeFile(controlFile(runtimeFolder));
    if (!file) {
        return file.failure();
    }
    void* const begin = mmap(nullptr, kControlFileBytes, PROT_READ | PROT_WRITE, MAP_SHARED, file->get(), 0);
    if (begin == MAP_FAILED) {
        return systemFailure("map " + controlFile(runtimeFolder), errno);
    }
    auto* const page = static_cast<ControlPage*>(begin);
    std::unique_ptr<TraceControl> control(new TraceControl(*std::move(file), page));
    if (!isControlPage(*page)) {
        std::memset(begin, 0, kControlFileBytes);
        page->byteOrder = kControlByteOrder;
        page->version = kControlVersion;
        // Last: who finds it finds the rest.
        std::uint64_t magic = 0;
        std::memcpy(&magic, kControlMagic.data(), sizeof(magic));
        __atomic_store_n(reinterpret_cast<std::uint64_t*>(begin), magic, __ATOMIC_RELEASE);
    }
    store(page->active, 0U, __ATOMIC_RELEASE);
    control->setMarker({});
    return control;
}

TraceControl::~TraceControl() {
    store(page_->active, 0U, __ATOMIC_RELEASE);
    munmap(page_, kControlFileBytes);
}

void TraceControl::setMarker(const std::string& path) {
    // Emitters copy the path between two readings of one serial number.
    const std::uint32_t last = load(page_->lastSerial);
    const std::uint32_t serial = last + 1 == 0 ? 1 : last + 1;
    store(page_->markerSerial, 0U);
    __atomic_thread_fence(__ATOMIC_RELEASE);
    const bool fits = path.size() < kControlMarkerBytes;
    for (std::size_t i = 0; i < kControlMarkerBytes; ++i) {
        store(page_->marker[i], fits && i < path.size() ? path[i] : '\0');
    }
    if (fits && !path.empty()) {
        store(page_->lastSerial, serial);
        store(page_->markerSerial, serial, __ATOMIC_RELEASE);
    }
}

void TraceControl::show(std::size_t slot) {
    const std::uint32_t bit = std::uint32_t{1} << slot;
    ControlSlot hull{~std::uint32_t{0}, 0};
    bool used = false;
    const std::size_t end = slot == kControlSlots - 1 ? ranges_.size() : std::min(slot + 1, ranges_.size());
    for (std::size_t i = slot; i < end; ++i) {
        if (ranges_[i].used) {
            used = true;
            hull.low = std::min(hull.low, ranges_[i].low);
            hull.high = std::max(hull.high, ranges_[i].high);
        }
    }
    if (!used) {
        store(page_->active, load(page_->active) & ~bit, __ATOMIC_RELEASE);
        return;
    }
    store(page_->slots[slot].low, hull.low);
    store(page_->slots[slot].high, hull.high);
    store(page_->active, load(page_->active) | bit, __ATOMIC_RELEASE);
}

std::size_t TraceControl::activate(std::uint32_t low, std::uint32_t high) {
    const auto free = std::ranges::find(ranges_, false, &Range::used);
    const auto index = static_cast<std::size_t>(free - ranges_.begin());
    if (free == ranges_.end()) {
        ranges_.push_back({low, high, true});
    } else {
        *free = {low, high, true};
    }
    store(page_->heartbeat, traceNow());
    store(page_->generation, load(page_->generation) + 1, __ATOMIC_RELEASE);
    show(std::min(index, kControlSlots - 1));
    return index;
}

void TraceControl::deactivate(std::size_t slot) {
    ranges_[slot].used = false;
    show(std::min(slot, kControlSlots - 1));
}

} // namespace vela::platform::spoor
