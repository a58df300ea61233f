// Takes any bytes for a ring, the head and the begin of the records from the input, and changes some of them between
// the readings as a hostile emitter would. Reading ends, and gives times that neither fall nor lie in the future.
#include "platform/spoor/RingReader.h"

#include <algorithm>
#include <cstdint>
#include <cstdlib>
#include <cstring>
#include <vector>

namespace {

using namespace vela::platform::spoor;

constexpr std::uint64_t kNow = 1'000'000;

/// A ring's head is 80 bytes of the input, what follows are records from the first and from the last place on.
class HostileRing final : public RingBytes {
public:
    HostileRing(const std::uint8_t* data, std::size_t size, bool changes)
        : bytes_(kRingFileBytes, '\0'),
          changes_(changes) {
        const std::size_t head = std::min(size, sizeof(RingHeader));
        std::memcpy(bytes_.data(), data, head);
        const std::size_t records = std::min(size - head, kRingFileBytes - kRingDataOffset);
        const std::size_t front = records / 2;
        std::memcpy(bytes_.data() + kRingDataOffset, data + head, front);
        std::memcpy(bytes_.data() + bytes_.size() - (records - front), data + head + front, records - front);
    }

    bool readAt(std::span<char> bytes, std::size_t offset) override {
        ++readings_;
        if (changes_) {
            ++bytes_[64 + readings_ % 16];
            ++bytes_[kRingDataOffset + readings_ * 61 % 4096];
            if (readings_ == 9) {
                bytes_.resize(bytes_.size() / 2);
            }
        }
        if (offset > bytes_.size() || bytes.size() > bytes_.size() - offset) {
            return false;
        }
        std::memcpy(bytes.data(), bytes_.data() + offset, bytes.size());
        return true;
    }

private:
    std::vector<char> bytes_;
    const bool changes_;
    std::size_t readings_ = 0;
};

void require(bool condition) {
    if (!condition) {
        std::abort();
    }
}

void read(const std::uint8_t* data, std::size_t size, bool changes) {
    HostileRing ring(data, size, changes);
    RingReader reader;
    if (!reader.beginNew(ring, kRingFileBytes)) {
        return;
    }
    std::vector<TraceRecord> records;
    for (int i = 0; i < 4; ++i) {
        const std::size_t before = records.size();
        const auto progress = reader.read(ring, kNow, records);
        require(records.size() - before == progress.records && progress.records <= kRingRecords);
    }
    require(std::ranges::is_sorted(records, {}, &TraceRecord::time));
    require(records.empty() || records.back().time <= kNow);
}

} // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
    if (size != 0) {
        read(data, size, false);
        read(data, size, true);
    }
    return 0;
}
