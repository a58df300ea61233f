#include "platform/hwstats/ChannelFolder.h"

#include "common/SettingValues.h"
#include "platform/hwstats/ChannelFileNames.h"

#include <algorithm>
#include <cerrno>
#include <dirent.h>
#include <fcntl.h>
#include <string_view>
#include <utility>

namespace vela::platform::hwstats {

namespace {

/// Names that a folder's reading looks at.
constexpr std::size_t kMostNames = 4096;

bool isChannelFile(std::string_view name) { return !name.starts_with('.') && name.ends_with(kChannelFileSuffix); }

bool isSameFile(const struct stat& one, const struct stat& other) {
    return one.st_dev == other.st_dev && one.st_ino == other.st_ino && one.st_size == other.st_size;
}

/// A file that was refused may have been mended since.
bool isUntouched(const struct stat& one, const struct stat& other) {
    return isSameFile(one, other) && one.st_mtim.tv_sec == other.st_mtim.tv_sec &&
           one.st_mtim.tv_nsec == other.st_mtim.tv_nsec;
}

bool isSameDescription(const ChannelFileHeader& one, const ChannelFileHeader& other) {
    return one.generation == other.generation && one.fileBytes == other.fileBytes &&
           one.channelCount == other.channelCount && one.descriptionBytes == other.descriptionBytes;
}

/// What a table takes up in memory, but for what the allocator adds.
std::size_t bytesOf(const ChannelTable& table) {
    std::size_t bytes = sizeof(table);
    for (const ChannelDescription& channel : table.channels) {
        bytes += sizeof(channel) + channel.name.size() + channel.unit.value_or("").size() +
                 channel.bounds.size() * sizeof(std::int64_t);
        for (const std::string& state : channel.states) {
            bytes += sizeof(std::string) + state.size();
        }
    }
    return bytes;
}

template <class Count>
bool spend(Count& budget, std::size_t amount) {
    if (amount > budget) {
        return false;
    }
    budget -= amount;
    return true;
}

} // namespace

std::optional<int> ChannelFolder::sample(const Wanted& wanted, Samples& samples) {
    folder_ = FileDescriptor(open(path_.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
    if (!folder_ || !listFiles(samples)) {
        known_.clear();
        return errno == ENOENT ? std::nullopt : std::optional(errno);
    }
    std::erase_if(known_, [this](const auto& entry) { return !std::ranges::binary_search(names_, entry.first); });
    Budget budget;
    for (const std::string& name : names_) {
        if (!sampleFile(name, wanted, budget, samples)) {
            samples.missed.insert("file:" + name);
        }
    }
    folder_ = FileDescriptor();
    return std::nullopt;
}

bool ChannelFolder::listFiles(Samples& samples) {
    names_.clear();
    FileDescriptor copy(fcntl(folder_.get(), F_DUPFD_CLOEXEC, 0));
    const std::unique_ptr<DIR, int (*)(DIR*)> folder(fdopendir(copy.get()), &closedir);
    if (folder == nullptr) {
        return false;
    }
    copy.release();
    std::size_t seen = 0;
    // A stream of its own: nobody else reads it meanwhile.
    while (const dirent* const entry = readdir(folder.get())) { // NOLINT(concurrency-mt-unsafe)
        if (++seen > kMostNames) {
            samples.incomplete = true;
            break;
        }
        if (isChannelFile(&entry->d_name[0])) {
            names_.emplace_back(&entry->d_name[0]);
        }
    }
    std::ranges::sort(names_);
    if (names_.size() > kMostFiles) {
        names_.resize(kMostFiles);
        samples.incomplete = true;
    }
    return true;
}

const ChannelFolder::Known* ChannelFolder::learn(const std::string& name, ByteSource& file, const struct stat& status,
                                                 Budget& budget) {
    Known& known = known_[name];
    if (known.tableBytes == 0 && isUntouched(known.status, status)) {
        return &known; // refused
    }
    const auto header = readChannelFileHeader(file, static_cast<std::uint64_t>(status.st_size));
    const bool isSame =
        header && known.tableBytes > 0 && isSameFile(known.status, status) && isSameDescription(known.header, *header);
    if (isSame && (known.table != nullptr || known.tableBytes > room())) {
        known.header = *header;
        return &known;
    }
    if (header && !spend(budget.bytes, header->descriptionBytes)) {
        return nullptr;
    }
    known = {status, header ? *header : ChannelFileHeader(), nullptr, 0, std::move(known.fault)};
    if (header) {
        readTable(name, file, known);
    } else {
        refuse(name, known, header.failure().description);
    }
    return &known;
}

void ChannelFolder::readTable(const std::string& name, ByteSource& file, Known& known) {
    auto table = readChannelTable(file, known.header);
    if (!table) {
        refuse(name, known, table.failure().description);
        return;
    }
    known.tableBytes = bytesOf(**table);
    if (known.tableBytes > room()) {
        refuse(name, known, "the channels of all files take up more than " + std::to_string(kMostKeptBytes) + " bytes");
        return;
    }
    known.table = *std::move(table);
    known.fault.clear();
}

void ChannelFolder::refuse(const std::string& name, Known& known, const std::string& fault) {
    if (known.fault != fault) {
        known.fault = fault;
        faults_.push_back(escapedText(name) + ": " + fault);
    }
}

std::size_t ChannelFolder::room() const {
    std::size_t kept = 0;
    for (const auto& [name, known] : known_) {
        kept += known.table == nullptr ? 0 : known.tableBytes;
    }
    return kMostKeptBytes - kept;
}

bool ChannelFolder::sampleFile(const std::string& name, const Wanted& wanted, Budget& budget, Samples& samples) {
    const FileDescriptor descriptor(
        openat(folder_.get(), name.c_str(), O_RDONLY | O_CLOEXEC | O_NOFOLLOW | O_NONBLOCK | O_NOCTTY));
    struct stat status {};
    if (!descriptor || fstat(descriptor.get(), &status) != 0) {
        return errno == ENOENT; // gone since the folder was read
    }
    if (!S_ISREG(status.st_mode)) {
        return true; // whatever it is, it is none
    }
    FileBytes file(descriptor.get());
    const Known* const known = learn(name, file, status, budget);
    if (known == nullptr || known->table == nullptr) {
        return known != nullptr && known->header.channelCount == 0; // no channel file at all
    }
    if (!wanted(*known->table)) {
        return true;
    }
    if (!spend(budget.bytes, known->header.fileBytes) || !spend(budget.channels, known->table->channels.size())) {
        return false;
    }
    // Asked before the values are read: what a publisher did before its end is in them.
    const bool ended = known->header.closed != 0 || !hasLivingPublisher(descriptor.get());
    auto values = readChannelValues(file, known->header, *known->table, ended ? 0 : samples.time);
    if (!values) {
        return false;
    }
    SampleBlock& block = samples.blocks.emplace_back();
    block.key = "file:" + name;
    block.table = known->table;
    ChannelValues taken = *std::move(values);
    block.words = std::move(taken.words);
    block.unreadable = std::move(taken.unreadable);
    block.since = known->header.created;
    block.generation = known->header.generation;
    block.wholeWhenNew = true;
    block.ended = ended;
    return true;
}

} // namespace vela::platform::hwstats
