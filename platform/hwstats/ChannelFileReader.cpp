#include "platform/hwstats/ChannelFileReader.h"

#include <algorithm>
#include <atomic>
#include <cerrno>
#include <cstring>
#include <string>
#include <unistd.h>

namespace vela::platform::hwstats {

namespace {

/// Attempts at one channel that keeps changing, and at all of one file's. An attempt is three short reads, 1 us or so.
constexpr std::size_t kAttempts = 32;
constexpr std::size_t kAttemptsOfFile = 2048;

Failure shrunk() { return {EIO, "it became shorter while it was read"}; }

std::uint64_t wordAt(const std::vector<char>& bytes, std::size_t offset) {
    std::uint64_t word = 0;
    std::memcpy(&word, bytes.data() + offset, sizeof(word));
    return word;
}

/// Reads the blocks of one file.
///
/// A publisher changes the two copies of a channel's values in turn, and its sequence number before each: while the
/// number is even, the first copy stands still, while it is odd, the second one. So a copy that was read between two
/// readings of the same number is whole. The readings are system calls of their own with fences between them, because
/// nothing orders the loads within one.
class BlockReader {
public:
    BlockReader(ByteSource& file, const ChannelFileHeader& header, const ChannelTable& table, std::uint64_t now)
        : file_(file),
          table_(table),
          now_(now),
          begin_(valuesOffset(header.descriptionBytes)),
          bytes_(valuesBytes(table)) {}

    Result<ChannelValues> read() {
        if (!readSequences(before_) || !readAll() || !readSequences(after_)) {
            return shrunk();
        }
        std::size_t offset = 0;
        for (std::size_t i = 0; i < table_.channels.size(); ++i) {
            const ChannelDescription& channel = table_.channels[i];
            bool isWhole = before_[i] == after_[i];
            std::uint64_t sequence = before_[i];
            for (std::size_t attempt = 0; !isWhole && attempt < kAttempts && attempts_ < kAttemptsOfFile; ++attempt) {
                ++attempts_;
                const Attempt result = readOne(channel, offset, sequence);
                if (result == Attempt::Short) {
                    return shrunk();
                }
                isWhole = result == Attempt::Whole;
            }
            take(channel, i, isWhole, offset, sequence);
            offset += blockBytes(channel);
        }
        return std::move(values_);
    }

private:
    enum class Attempt : std::uint8_t { Whole, Changed, Short };

    static std::size_t copyOffset(const ChannelDescription& channel, std::uint64_t sequence) {
        return kBlockHeadBytes + (sequence % 2) * fileWords(channel) * sizeof(std::uint64_t);
    }

    bool readAll() {
        bytesRead_.resize(bytes_);
        const bool isThere = file_.readAt(bytesRead_, begin_);
        std::atomic_thread_fence(std::memory_order_seq_cst);
        return isThere;
    }

    /// One call reads them with everything between them: cheaper than a call for each.
    bool readSequences(std::vector<std::uint64_t>& sequences) {
        scratch_.resize(bytes_);
        if (!file_.readAt(scratch_, begin_)) {
            return false;
        }
        std::atomic_thread_fence(std::memory_order_seq_cst);
        std::size_t offset = 0;
        sequences.reserve(table_.channels.size());
        for (const ChannelDescription& channel : table_.channels) {
            sequences.push_back(wordAt(scratch_, offset));
            offset += blockBytes(channel);
        }
        return true;
    }

    bool readSequence(std::size_t offset, std::uint64_t& sequence) {
        const bool isThere = file_.readAt({reinterpret_cast<char*>(&sequence), sizeof(sequence)}, begin_ + offset);
        std::atomic_thread_fence(std::memory_order_seq_cst);
        return isThere;
    }

    /// Reads the block at `offset` anew, into its place.
    Attempt readOne(const ChannelDescription& channel, std::size_t offset, std::uint64_t& sequence) {
        if (!readSequence(offset, sequence)) {
            return Attempt::Short;
        }
        const std::size_t copy = offset + copyOffset(channel, sequence);
        const std::span<char> place(bytesRead_.data() + copy, fileWords(channel) * sizeof(std::uint64_t));
        if (!file_.readAt(place, begin_ + copy)) {
            return Attempt::Short;
        }
        std::atomic_thread_fence(std::memory_order_seq_cst);
        std::uint64_t after = 0;
        if (!readSequence(offset, after)) {
            return Attempt::Short;
        }
        return sequence == after ? Attempt::Whole : Attempt::Changed;
    }

    void take(const ChannelDescription& channel, std::size_t index, bool isWhole, std::size_t offset,
              std::uint64_t sequence) {
        if (!isWhole) {
            values_.unreadable.resize(table_.channels.size());
            values_.unreadable[index] = true;
        }
        const std::size_t copy = offset + copyOffset(channel, sequence);
        const std::size_t begin = values_.words.size();
        const bool hasState = channel.format == HwStatsFormat::State;
        values_.words.resize(begin + channel.words());
        std::memcpy(values_.words.data() + begin, bytesRead_.data() + copy + (hasState ? 2 * sizeof(std::uint64_t) : 0),
                    channel.words() * sizeof(std::uint64_t));
        if (hasState) {
            addPresentState(channel, wordAt(bytesRead_, copy), wordAt(bytesRead_, copy + sizeof(std::uint64_t)), begin);
        }
    }

    void addPresentState(const ChannelDescription& channel, std::uint64_t state, std::uint64_t entered,
                         std::size_t begin) {
        if (state < channel.parts() && entered < now_) {
            values_.words[begin + 2 * state + 1] += now_ - entered;
        }
    }

    ByteSource& file_;
    const ChannelTable& table_;
    const std::uint64_t now_;
    const std::size_t begin_; ///< of the blocks, in the file
    const std::size_t bytes_; ///< of the blocks
    std::vector<char> scratch_;
    std::vector<char> bytesRead_;
    std::vector<std::uint64_t> before_;
    std::vector<std::uint64_t> after_;
    std::size_t attempts_ = 0;
    ChannelValues values_;
};

} // namespace

bool FileBytes::readAt(std::span<char> bytes, std::uint64_t offset) {
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

Result<ChannelFileHeader> readChannelFileHeader(ByteSource& file, std::uint64_t fileBytes) {
    ChannelFileHeader header;
    if (!file.readAt({reinterpret_cast<char*>(&header), sizeof(header)}, 0)) {
        return Failure{EINVAL, "it is shorter than a header"};
    }
    if (const Result<Done> checked = checkHeader(header, fileBytes); !checked) {
        return checked.failure();
    }
    return header;
}

Result<std::shared_ptr<const ChannelTable>> readChannelTable(ByteSource& file, const ChannelFileHeader& header) {
    std::string description(header.descriptionBytes, '\0');
    if (!file.readAt(description, sizeof(ChannelFileHeader))) {
        return shrunk();
    }
    auto table = decodeDescription(description, header.channelCount);
    if (table && valuesOffset(header.descriptionBytes) + valuesBytes(**table) != header.fileBytes) {
        return Failure{EINVAL, "its size is not that of its channels"};
    }
    return table;
}

Result<ChannelValues> readChannelValues(ByteSource& file, const ChannelFileHeader& header, const ChannelTable& table,
                                        std::uint64_t now) {
    return BlockReader(file, header, table, now).read();
}

} // namespace vela::platform::hwstats
