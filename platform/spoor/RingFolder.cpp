#include "platform/spoor/RingFolder.h"

#include "common/VelaReportingLogCategories.h"
#include "platform/spoor/OwnerLock.h"
#include "platform/spoor/SystemFailure.h"

#include <algorithm>
#include <cerrno>
#include <dirent.h>
#include <fcntl.h>
#include <iterator>
#include <memory>
#include <unistd.h>
#include <utility>

namespace vela::platform::spoor {

namespace {

/// A folder's time of change is that of the kernel's last tick, which is at most 10 ms ago.
constexpr std::uint64_t kTick = 20'000'000;

/// Between two looks at whose emitter lives.
constexpr std::uint64_t kLifeInterval = 500'000'000;

/// A file that has got no name for so long never gets one.
constexpr time_t kSecondsToName = 60;

constexpr int kReadings = 4;

class FileBytes final : public RingBytes {
public:
    explicit FileBytes(int descriptor) : descriptor_(descriptor) {}

    bool readAt(std::span<char> bytes, std::size_t offset) override {
        while (!bytes.empty()) {
            const ssize_t got = pread(descriptor_, bytes.data(), bytes.size(), static_cast<off_t>(offset));
            if (got == 0 || (got < 0 && errno != EINTR)) {
                return false;
            }
            const std::size_t count = got < 0 ? 0 : static_cast<std::size_t>(got);
            bytes = bytes.subspan(count);
            offset += count;
        }
        return true;
    }

private:
    const int descriptor_;
};

FileDescriptor openForReading(const FileDescriptor& folder, const std::string& name, struct stat& status) {
    FileDescriptor file(openat(folder.get(), name.c_str(), O_RDONLY | O_CLOEXEC | O_NOFOLLOW | O_NONBLOCK | O_NOCTTY));
    return file && fstat(file.get(), &status) == 0 && S_ISREG(status.st_mode) ? std::move(file) : FileDescriptor();
}

} // namespace

Result<Done> RingFolder::begin() {
    folder_ = FileDescriptor(open(path_.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
    if (!folder_) {
        return systemFailure("open " + path_, errno);
    }
    toldOfRings_ = false;
    toldOfNames_ = false;
    passed_ = 0;
    list(true);
    return Done{};
}

void RingFolder::end() {
    rings_.clear();
    unread_.clear();
    folder_ = FileDescriptor();
}

bool RingFolder::isTouched() {
    struct stat status {};
    if (!folder_ || fstat(folder_.get(), &status) != 0) {
        return false;
    }
    const std::uint64_t now = traceNow();
    if (status.st_mtim.tv_sec != changed_.tv_sec || status.st_mtim.tv_nsec != changed_.tv_nsec) {
        changed_ = status.st_mtim;
        seenChanged_ = now;
    }
    // A second change in the same tick shows in no time.
    return now - seenChanged_ < kTick;
}

void RingFolder::list(bool isFirst) {
    FileDescriptor copy(fcntl(folder_.get(), F_DUPFD_CLOEXEC, 0));
    const std::unique_ptr<DIR, int (*)(DIR*)> folder(fdopendir(copy.get()), &closedir);
    if (folder == nullptr) {
        return;
    }
    copy.release();
    rewinddir(folder.get()); // the descriptors share their place
    std::size_t seen = 0;
    // A stream of its own: nobody else reads it meanwhile.
    while (const dirent* const entry = readdir(folder.get())) { // NOLINT(concurrency-mt-unsafe)
        const std::string name(&entry->d_name[0]);
        if (++seen > kMostNames) {
            if (!std::exchange(toldOfNames_, true)) {
                VelaReportingTraceCategory().standard("kernel trace: %@ has more than its limit of %lu names: events "
                                                      "of further rings are lost, uncounted",
                                                      path_, kMostNames);
            }
            return;
        }
        if (name.starts_with('.')) {
            if (isFirst) {
                sweepTemporary(name);
            }
        } else if (name.ends_with(kRingSuffix) && !rings_.contains(name)) {
            takeUp(name, isFirst);
        }
    }
}

void RingFolder::sweepTemporary(const std::string& name) {
    struct stat status {};
    const FileDescriptor file = openForReading(folder_, name, status);
    if (file && !hasLivingOwner(file.get()) && time(nullptr) - status.st_mtim.tv_sec > kSecondsToName) {
        unlinkat(folder_.get(), name.c_str(), 0);
    }
}

bool RingFolder::hasRoom(uid_t owner) const {
    const auto ofUser = static_cast<std::size_t>(
        std::ranges::count_if(rings_, [&](const auto& entry) { return entry.second.owner == owner; }));
    return rings_.size() < kMostRings && ofUser < kMostRingsOfUser;
}

void RingFolder::takeUp(const std::string& name, bool isFirst) {
    const auto unread = unread_.find(name);
    if (unread != unread_.end() && !hasRoom(unread->second.owner)) {
        return;
    }
    struct stat status {};
    Ring ring;
    ring.file = openForReading(folder_, name, status);
    if (!ring.file) {
        return;
    }
    ring.owner = status.st_uid;
    const bool isAlive = hasLivingOwner(ring.file.get());
    if (isFirst && !isAlive) {
        removeFile(name, ring); // whoever collected meanwhile is gone, too
        return;
    }
    FileBytes bytes(ring.file.get());
    const auto fileBytes = static_cast<std::uint64_t>(status.st_size);
    if (unread != unread_.end()) {
        ring.reader = std::move(unread->second.reader);
        ring.refused = unread->second.refused;
        passed_ = ring.refused ? passed_ : saturatingSum(passed_, ring.reader.pass(bytes));
        unread_.erase(unread);
    } else if (!(isFirst ? ring.reader.begin(bytes, fileBytes) : ring.reader.beginNew(bytes, fileBytes))) {
        ring.refused = true; // remembered, so that it is not read again and again
    }
    if (ring.refused) {
        ring.file = FileDescriptor();
    }
    if (hasRoom(ring.owner)) {
        rings_.emplace(name, std::move(ring));
    } else {
        leave(name, std::move(ring));
    }
}

void RingFolder::leave(const std::string& name, Ring ring) {
    if (!ring.refused && !std::exchange(toldOfRings_, true)) {
        VelaReportingTraceCategory().standard("kernel trace: no room for ring %@: the limit is %lu rings, %lu of one "
                                              "user; events of further threads are lost",
                                              name, kMostRings, kMostRingsOfUser);
    }
    if (unread_.size() < kMostNames) {
        ring.file = FileDescriptor();
        unread_.emplace(name, std::move(ring));
    }
}

void RingFolder::countUnread(std::uint64_t& lost) {
    for (auto entry = unread_.begin(); entry != unread_.end();) {
        struct stat status {};
        Ring& ring = entry->second;
        ring.file = openForReading(folder_, entry->first, status);
        const bool isDead = !ring.file || (!ring.refused && !hasLivingOwner(ring.file.get()));
        if (ring.file && !ring.refused) {
            FileBytes bytes(ring.file.get());
            lost = saturatingSum(lost, ring.reader.pass(bytes));
        }
        if (ring.file && isDead) {
            removeFile(entry->first, ring);
        }
        ring.file = FileDescriptor();
        entry = isDead ? unread_.erase(entry) : std::next(entry);
    }
}

void RingFolder::removeFile(const std::string& name, const Ring& ring) {
    struct stat held {};
    struct stat named {};
    if (fstat(ring.file.get(), &held) == 0 && fstatat(folder_.get(), name.c_str(), &named, AT_SYMLINK_NOFOLLOW) == 0 &&
        held.st_dev == named.st_dev && held.st_ino == named.st_ino) {
        unlinkat(folder_.get(), name.c_str(), 0);
    }
}

bool RingFolder::readRing(Ring& ring, std::vector<TraceRecord>& records, std::uint64_t& lost) {
    FileBytes bytes(ring.file.get());
    const RingReader::Progress progress = ring.reader.read(bytes, traceNow(), records);
    lost = saturatingSum(lost, progress.lost);
    if (!progress.readable) {
        ring.refused = true;
        ring.file = FileDescriptor();
    }
    return progress.records != 0;
}

void RingFolder::drain(bool all, std::vector<TraceRecord>& records, std::uint64_t& lost) {
    if (isTouched() || all) {
        list(false);
    }
    if (all) {
        countUnread(lost);
    }
    lost = saturatingSum(lost, std::exchange(passed_, 0));
    const std::uint64_t now = traceNow();
    const bool looksForLife = all || now - checked_ > kLifeInterval;
    checked_ = looksForLife ? now : checked_;
    for (auto entry = rings_.begin(); entry != rings_.end();) {
        Ring& ring = entry->second;
        // Asked before the events are read: what an emitter wrote before its end is among them.
        const bool isDead = looksForLife && !ring.refused && !hasLivingOwner(ring.file.get());
        for (int i = 0; !ring.refused && readRing(ring, records, lost) && (all || isDead) && i < kReadings; ++i) {
        }
        if (isDead && !ring.refused) {
            removeFile(entry->first, ring);
            entry = rings_.erase(entry);
        } else {
            ++entry;
        }
    }
}

} // namespace vela::platform::spoor
