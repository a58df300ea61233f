// Takes any bytes for a channel file, and changes some of them between the readings as a hostile publisher would. What
// was read must be handed out, subtracted and named without a fault.
#include "platform/hwstats/ChannelFileReader.h"
#include "platform/hwstats/Samples.h"

#include <cstdint>
#include <cstdlib>
#include <cstring>
#include <string>

namespace {

using namespace vela::platform;
using namespace vela::platform::hwstats;

void require(bool condition) {
    if (!condition) {
        std::abort();
    }
}

/// Counts one byte up before every reading, each time another one; in the end the bytes become fewer.
class HostileBytes final : public ByteSource {
public:
    explicit HostileBytes(std::string bytes, bool changes) : bytes_(std::move(bytes)), changes_(changes) {}

    bool readAt(std::span<char> bytes, std::uint64_t offset) override {
        ++readings_;
        if (changes_ && !bytes_.empty()) {
            ++bytes_[readings_ * 61 % bytes_.size()];
        }
        if (changes_ && readings_ == 40) {
            bytes_.resize(bytes_.size() / 2);
        }
        if (offset > bytes_.size() || bytes.size() > bytes_.size() - offset) {
            return false;
        }
        std::memcpy(bytes.data(), bytes_.data() + offset, bytes.size());
        return true;
    }

private:
    std::string bytes_;
    const bool changes_;
    std::size_t readings_ = 0;
};

void read(const std::string& bytes, bool changes) {
    HostileBytes file(bytes, changes);
    const auto header = readChannelFileHeader(file, bytes.size());
    if (!header) {
        require(!header.failure().description.empty());
        return;
    }
    const auto table = readChannelTable(file, *header);
    if (!table) {
        require(!table.failure().description.empty());
        return;
    }
    const auto again = decodeDescription(*encodeDescription(**table), header->channelCount);
    require(again && **again == **table);
    Samples samples[2];
    for (Samples& sampled : samples) {
        const auto values = readChannelValues(file, *header, **table, 1'000'000);
        if (!values) {
            return;
        }
        SampleBlock& block = sampled.blocks.emplace_back();
        block.table = *table;
        block.words = values->words;
        block.unreadable = values->unreadable;
        block.wholeWhenNew = true;
        addSuffixes(sampled);
    }
    std::size_t channels = 0;
    UniqueFunction<int(const HwStatsChannel&)> use = [&](const HwStatsChannel& channel) {
        require(channel.channelName && !channel.channelName->empty());
        ++channels;
        return 0;
    };
    iterateSamples(*differenceOf(samples[0], samples[1]), use);
    iterateSamples(*differenceOf(Samples(), samples[1]), use);
    require(channels <= 2 * std::size_t{header->channelCount});
}

} // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
    const std::string bytes(reinterpret_cast<const char*>(data), size);
    read(bytes, false);
    read(bytes, true);
    return 0;
}
