// Reads channel files. What is read is copied out of the file first, in pieces whose size is checked, and never mapped:
// a file that shrinks or changes meanwhile gives a failure or stale values, not a fault. Free functions; thread-safe.
#pragma once

#include "platform/Result.h"
#include "platform/hwstats/ChannelFileFormat.h"
#include "platform/hwstats/ChannelTable.h"

#include <cstdint>
#include <memory>
#include <span>
#include <vector>

namespace vela::platform::hwstats {

/// Bytes that a publisher may be changing. One reader at a time.
class ByteSource {
public:
    virtual ~ByteSource() = default;

    /// Fills `bytes` with what stands from `offset` on. False when there are fewer.
    virtual bool readAt(std::span<char> bytes, std::uint64_t offset) = 0;
};

/// An open file. Borrows the descriptor.
class FileBytes final : public ByteSource {
public:
    explicit FileBytes(int descriptor) : descriptor_(descriptor) {}
    bool readAt(std::span<char> bytes, std::uint64_t offset) override;

private:
    const int descriptor_;
};

/// The header of a file of `fileBytes` bytes.
Result<ChannelFileHeader> readChannelFileHeader(ByteSource& file, std::uint64_t fileBytes);

/// The description of the channels. It fits the header's size when it is answered.
Result<std::shared_ptr<const ChannelTable>> readChannelTable(ByteSource& file, const ChannelFileHeader& header);

struct ChannelValues {
    std::vector<std::uint64_t> words; ///< as a sample has them
    std::vector<bool> unreadable;     ///< of each channel, when any is
};

/// The values of all channels, each channel's from one moment. A channel that changes so fast that no attempt of a
/// bounded number found it unchanged is unreadable.
///
/// The time since a state was entered is added to its residency: `now` is the monotonic clock's nanoseconds, 0 where
/// the publisher is gone.
Result<ChannelValues> readChannelValues(ByteSource& file, const ChannelFileHeader& header, const ChannelTable& table,
                                        std::uint64_t now);

} // namespace vela::platform::hwstats
