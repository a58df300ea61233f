#include "platform/hwstats/ChannelPublisher.h"

#include "platform/hwstats/ChannelFileNames.h"
#include "platform/linux/LinuxProcessInformation.h"

#include <cerrno>
#include <cstring>
#include <ctime>
#include <fcntl.h>
#include <sys/mman.h>
#include <sys/random.h>
#include <sys/stat.h>
#include <system_error>
#include <utility>

namespace vela::platform::hwstats {

namespace {

constexpr mode_t kFilePermissions = 0644;

/// How many publishers of one name may live at a time.
constexpr int kMostNumbers = 64;

Failure failureOf(const std::string& operation, int code) {
    return {code, operation + ": " + std::generic_category().message(code)};
}

std::uint64_t randomNumber() {
    std::uint64_t number = 0;
    if (getrandom(&number, sizeof(number), GRND_NONBLOCK) != static_cast<ssize_t>(sizeof(number))) {
        number = monotonicNanoseconds(); // only right after the system's start
    }
    return number;
}

std::uint64_t ownStart() {
    ProcessRecord record;
    LinuxProcessInformation processes;
    return processes.read(processes.ownPid(), record) ? static_cast<std::uint64_t>(record.startTimeTicks) : 0;
}

/// The names that one publisher's file may have, and the taking of one.
class FileName {
public:
    FileName(const FileDescriptor& folder, const std::string& stem) : folder_(folder), stem_(stem) {}

    /// Gives the file `temporary` the first name that no living publisher has; empty with errno set when there is none.
    std::string take(const std::string& temporary) {
        for (int number = 1; number <= kMostNumbers; ++number) {
            std::string name =
                stem_ + (number == 1 ? "" : "~" + std::to_string(number)) + std::string(kChannelFileSuffix);
            if (linkat(folder_.get(), temporary.c_str(), folder_.get(), name.c_str(), 0) == 0) {
                unlinkat(folder_.get(), temporary.c_str(), 0);
                return name;
            }
            if (errno != EEXIST) {
                return {};
            }
            if (replaceDead(temporary, name)) {
                return name;
            }
        }
        errno = EBUSY;
        return {};
    }

private:
    /// Who holds the lock of a file whose publisher is gone may replace it.
    bool replaceDead(const std::string& temporary, const std::string& name) {
        const FileDescriptor old(
            openat(folder_.get(), name.c_str(), O_RDWR | O_CLOEXEC | O_NOFOLLOW | O_NONBLOCK | O_NOCTTY));
        struct stat held {};
        struct stat named {};
        return old && lockAsPublisher(old.get()) && fstat(old.get(), &held) == 0 &&
               fstatat(folder_.get(), name.c_str(), &named, AT_SYMLINK_NOFOLLOW) == 0 && held.st_dev == named.st_dev &&
               held.st_ino == named.st_ino &&
               renameat(folder_.get(), temporary.c_str(), folder_.get(), name.c_str()) == 0;
    }

    const FileDescriptor& folder_;
    const std::string& stem_;
};

} // namespace

std::uint64_t monotonicNanoseconds() {
    constexpr std::uint64_t kNanosecondsPerSecond = 1'000'000'000;
    timespec time{};
    clock_gettime(CLOCK_MONOTONIC, &time);
    return static_cast<std::uint64_t>(time.tv_sec) * kNanosecondsPerSecond + static_cast<std::uint64_t>(time.tv_nsec);
}

ChannelPublisher::Mapping::~Mapping() {
    if (begin_ != nullptr) {
        munmap(begin_, bytes_);
    }
}

bool ChannelPublisher::Mapping::map(const FileDescriptor& file, std::size_t bytes) {
    void* const begin = mmap(nullptr, bytes, PROT_READ | PROT_WRITE, MAP_SHARED | MAP_POPULATE, file.get(), 0);
    if (begin == MAP_FAILED) {
        return false;
    }
    begin_ = static_cast<char*>(begin);
    bytes_ = bytes;
    // A real-time thread should meet no page that is not there. Where the limit of locked memory is too low, it may.
    mlock(begin, bytes);
    std::memset(begin, 0, bytes);
    return true;
}

void ChannelPublisher::fill(const ChannelTable& table, const std::string& description, std::uint64_t fileBytes) {
    ChannelFileHeader header;
    header.fileBytes = fileBytes;
    header.generation = randomNumber();
    header.processStart = ownStart();
    header.pid = getpid();
    header.channelCount = static_cast<std::uint32_t>(table.channels.size());
    header.descriptionBytes = static_cast<std::uint32_t>(description.size());
    header.created = monotonicNanoseconds();
    std::memcpy(mapping_.begin(), &header, sizeof(header));
    std::memcpy(mapping_.begin() + sizeof(header), description.data(), description.size());
    std::size_t offset = valuesOffset(description.size());
    for (const ChannelDescription& channel : table.channels) {
        auto* const block = reinterpret_cast<std::uint64_t*>(mapping_.begin() + offset);
        if (channel.format == HwStatsFormat::State) {
            block[kBlockHeadBytes / sizeof(std::uint64_t)] = kNoState;
            block[kBlockHeadBytes / sizeof(std::uint64_t) + fileWords(channel)] = kNoState;
        }
        channels_.emplace_back(channel, block);
        offset += blockBytes(channel);
    }
}

Result<std::unique_ptr<ChannelPublisher>>
ChannelPublisher::create(const std::string& folder, const std::string& publisher, const ChannelTable& table) {
    const Result<std::string> description = encodeDescription(table);
    if (!description) {
        return description.failure();
    }
    const std::size_t fileBytes = valuesOffset(description->size()) + valuesBytes(table);
    const FileDescriptor parent(open(folder.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
    if (!parent) {
        return failureOf("open " + folder, errno);
    }
    std::unique_ptr<ChannelPublisher> made(new ChannelPublisher());
    const std::string temporary = ".vela-" + std::to_string(getpid()) + "-" + std::to_string(randomNumber());
    made->file_ = FileDescriptor(
        openat(parent.get(), temporary.c_str(), O_RDWR | O_CREAT | O_EXCL | O_NOFOLLOW | O_CLOEXEC, kFilePermissions));
    if (!made->file_) {
        return failureOf("write in " + folder, errno);
    }
    // All of its blocks now: a full file system must not be met by an update.
    const int full = posix_fallocate(made->file_.get(), 0, static_cast<off_t>(fileBytes));
    if (full != 0 || fchmod(made->file_.get(), kFilePermissions) != 0 || !lockAsPublisher(made->file_.get()) ||
        !made->mapping_.map(made->file_, fileBytes)) {
        const int error = full != 0 ? full : errno;
        unlinkat(parent.get(), temporary.c_str(), 0);
        return failureOf("write in " + folder, error);
    }
    made->fill(table, *description, fileBytes);
    const std::string stem = channelFileStem(publisher, table);
    const std::string name = FileName(parent, stem).take(temporary);
    if (name.empty()) {
        const int error = errno;
        unlinkat(parent.get(), temporary.c_str(), 0);
        return failureOf("write " + folder + "/" + stem, error);
    }
    made->path_ = folder + "/" + name;
    return made;
}

ChannelPublisher::~ChannelPublisher() {
    if (mapping_.begin() == nullptr || path_.empty()) {
        return;
    }
    const std::uint64_t now = monotonicNanoseconds();
    for (PublishedChannel& channel : channels_) {
        channel.enter(kNoState, now);
    }
    auto* const closed = reinterpret_cast<std::uint32_t*>(mapping_.begin() + offsetof(ChannelFileHeader, closed));
    std::atomic_ref<std::uint32_t>(*closed).store(1, std::memory_order_release);
}

} // namespace vela::platform::hwstats
