#include "platform/spoor/RingReader.h"

#include <cstring>
#include <functional>
#include <gmock/gmock.h>
#include <gtest/gtest.h>

namespace vela::platform::spoor {
namespace {

using ::testing::ElementsAre;
using ::testing::IsEmpty;

/// A ring in memory, written as an emitter does.
class MemoryRing final : public RingBytes {
public:
    MemoryRing() : bytes_(kRingFileBytes, '\0') { putHeader(header); }

    bool readAt(std::span<char> bytes, std::size_t offset) override {
        ++readings;
        if (before) {
            before(readings);
        }
        if (offset > bytes_.size() || bytes.size() > bytes_.size() - offset) {
            return false;
        }
        std::memcpy(bytes.data(), bytes_.data() + offset, bytes.size());
        return true;
    }

    void putHeader(const RingHeader& changed) {
        header = changed;
        std::memcpy(bytes_.data(), &header, sizeof(header));
    }
    void putRecord(const RingRecord& record, std::uint64_t index) {
        std::memcpy(bytes_.data() + ringOffset(index), &record, sizeof(record));
    }
    /// The next event, whose code is its number.
    void emit(std::uint64_t time) {
        const std::uint64_t index = header.head;
        putRecord({time, static_cast<std::uint32_t>(index), 1, 77, {index, 0, 0, 0}, index}, index);
        ++header.head;
        putHeader(header);
    }
    void emitMany(std::uint64_t count) {
        for (std::uint64_t i = 0; i < count; ++i) {
            emit(1000 + header.head);
        }
    }
    void shorten(std::size_t bytes) { bytes_.resize(bytes); }

    RingHeader header;
    int readings = 0;
    std::function<void(int reading)> before;

private:
    std::vector<char> bytes_;
};

class RingReaderTest : public ::testing::Test {
protected:
    RingReader::Progress read(std::uint64_t now = 1'000'000'000) { return reader_.read(ring_, now, records_); }
    std::vector<std::uint64_t> times() const {
        std::vector<std::uint64_t> times;
        for (const TraceRecord& record : records_) {
            times.push_back(record.time);
        }
        return times;
    }

    MemoryRing ring_;
    RingReader reader_;
    std::vector<TraceRecord> records_;
};

TEST_F(RingReaderTest, EventsComeAsTheyWereWritten) {
    ASSERT_TRUE(reader_.beginNew(ring_, kRingFileBytes));
    ring_.putRecord({500, 0x21040001, 3, 42, {1, 2, 3, 4}, 0}, 0);
    ring_.header.head = 1;
    ring_.putHeader(ring_.header);
    EXPECT_EQ(read().records, 1U);
    EXPECT_THAT(records_, ElementsAre(TraceRecord{500, 0x21040001, 3, 42, {1, 2, 3, 4}}));
}

TEST_F(RingReaderTest, EachEventComesOnce) {
    ASSERT_TRUE(reader_.beginNew(ring_, kRingFileBytes));
    ring_.emit(10);
    EXPECT_EQ(read().records, 1U);
    EXPECT_EQ(read().records, 0U);
    ring_.emit(20);
    EXPECT_EQ(read().records, 1U);
    EXPECT_THAT(times(), ElementsAre(10, 20));
}

TEST_F(RingReaderTest, ARingThatIsTakenUpInUseBeginsWithItsNextEvent) {
    ring_.header.lost = 9;
    ring_.emit(10);
    ASSERT_TRUE(reader_.begin(ring_, kRingFileBytes));
    EXPECT_EQ(read().lost, 0U);
    ring_.emit(20);
    EXPECT_EQ(read().lost, 0U);
    EXPECT_THAT(times(), ElementsAre(20));
}

TEST_F(RingReaderTest, AFullRingIsReadWhole) {
    ASSERT_TRUE(reader_.beginNew(ring_, kRingFileBytes));
    ring_.emitMany(16'384);
    const auto progress = read();
    EXPECT_EQ(progress.records, 16'384U);
    EXPECT_EQ(progress.lost, 0U);
}

TEST_F(RingReaderTest, WhatWasOverwrittenIsLostAndCounted) {
    ASSERT_TRUE(reader_.beginNew(ring_, kRingFileBytes));
    ring_.emitMany(16'384 + 5);
    const auto progress = read();
    EXPECT_EQ(progress.lost, 5U);
    EXPECT_EQ(progress.records, 16'384U);
    EXPECT_EQ(records_.front().code, 5U);
    EXPECT_EQ(records_.back().code, 16'388U);
}

TEST_F(RingReaderTest, AReadingGoesAroundTheEnd) {
    ASSERT_TRUE(reader_.beginNew(ring_, kRingFileBytes));
    ring_.emitMany(16'380);
    read();
    records_.clear();
    ring_.emitMany(10);
    EXPECT_EQ(read().records, 10U);
    EXPECT_EQ(records_.front().code, 16'380U);
    EXPECT_EQ(records_.back().code, 16'389U);
}

TEST_F(RingReaderTest, WhatIsOverwrittenDuringTheReadingIsLost) {
    ASSERT_TRUE(reader_.beginNew(ring_, kRingFileBytes));
    ring_.emitMany(16'384);
    ring_.readings = 0;
    ring_.before = [this](int reading) {
        if (reading == 3) { // behind the copying of records, before the second look at the count
            ring_.emitMany(7);
        }
    };
    const auto progress = read();
    EXPECT_EQ(progress.lost, 7U);
    EXPECT_EQ(progress.records, 16'377U);
    EXPECT_EQ(records_.front().code, 7U);
    ring_.before = nullptr;
    EXPECT_EQ(read().records, 7U);
}

TEST_F(RingReaderTest, ARecordThatIsBeingOverwrittenIsLost) {
    ASSERT_TRUE(reader_.beginNew(ring_, kRingFileBytes));
    ring_.emitMany(16'384);
    ring_.putRecord({5, 6, 7, 8, {}, kRingIndexOfNone}, 0);
    const auto progress = read();
    EXPECT_EQ(progress.lost, 1U);
    EXPECT_EQ(progress.records, 16'383U);
}

TEST_F(RingReaderTest, ACountAheadOfItsEventsIsNotBelieved) {
    ASSERT_TRUE(reader_.beginNew(ring_, kRingFileBytes));
    ring_.emitMany(3);
    RingHeader ahead = ring_.header;
    ahead.head = 100;
    const RingHeader right = ring_.header;
    ring_.putHeader(ahead);
    EXPECT_EQ(read().records, 3U);
    ring_.putHeader(right);
    EXPECT_EQ(read().records, 0U);
    ring_.emit(5000);
    EXPECT_EQ(read().records, 1U);
    EXPECT_EQ(read().lost, 0U);
}

TEST_F(RingReaderTest, ACountThatGoesBackGivesNothing) {
    ASSERT_TRUE(reader_.beginNew(ring_, kRingFileBytes));
    ring_.emitMany(3);
    read();
    ring_.header.head = 1;
    ring_.putHeader(ring_.header);
    EXPECT_EQ(read().records, 0U);
}

TEST_F(RingReaderTest, AnAbsurdCountIsOneBoundedReading) {
    ASSERT_TRUE(reader_.beginNew(ring_, kRingFileBytes));
    ring_.header.head = ~std::uint64_t{0};
    ring_.putHeader(ring_.header);
    const auto progress = read();
    EXPECT_TRUE(progress.readable);
    EXPECT_EQ(progress.records, 0U);
    EXPECT_EQ(read().records, 0U);
}

TEST_F(RingReaderTest, WhatTheEmitterCouldNotWriteIsLost) {
    ASSERT_TRUE(reader_.beginNew(ring_, kRingFileBytes));
    ring_.header.lost = 4;
    ring_.emit(10);
    EXPECT_EQ(read().lost, 4U);
    EXPECT_EQ(read().lost, 0U);
}

TEST_F(RingReaderTest, TimesOfTheFutureBecomeThePresent) {
    ASSERT_TRUE(reader_.beginNew(ring_, kRingFileBytes));
    ring_.emit(50);
    ring_.emit(~std::uint64_t{0});
    read(100);
    EXPECT_THAT(times(), ElementsAre(50, 100));
}

TEST_F(RingReaderTest, TimesDoNotFall) {
    ASSERT_TRUE(reader_.beginNew(ring_, kRingFileBytes));
    ring_.emit(50);
    ring_.emit(20);
    read(100);
    EXPECT_THAT(times(), ElementsAre(50, 50));
}

TEST_F(RingReaderTest, AFileThatBecomesShorterIsNotReadable) {
    ASSERT_TRUE(reader_.beginNew(ring_, kRingFileBytes));
    ring_.emit(10);
    ring_.shorten(4096);
    EXPECT_FALSE(read().readable);
    ring_.shorten(10);
    EXPECT_FALSE(read().readable);
    EXPECT_THAT(records_, IsEmpty());
}

TEST_F(RingReaderTest, WhatIsNoRingIsRefused) {
    EXPECT_FALSE(reader_.begin(ring_, kRingFileBytes - 1));
    const RingHeader right;
    const std::vector<std::function<void(RingHeader&)>> changes = {
        [](RingHeader& header) { header.magic[0] = 'x'; },  [](RingHeader& header) { header.byteOrder = 0x04030201; },
        [](RingHeader& header) { header.version = 2; },     [](RingHeader& header) { header.records = 16'385; },
        [](RingHeader& header) { header.recordBytes = 0; },
    };
    for (const auto& change : changes) {
        RingHeader wrong = right;
        change(wrong);
        ring_.putHeader(wrong);
        EXPECT_FALSE(reader_.begin(ring_, kRingFileBytes));
        EXPECT_FALSE(reader_.beginNew(ring_, kRingFileBytes));
    }
    ring_.shorten(79);
    EXPECT_FALSE(reader_.begin(ring_, kRingFileBytes));
}

} // namespace
} // namespace vela::platform::spoor
