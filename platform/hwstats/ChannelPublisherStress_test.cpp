// Publishers and readers at the same time. What a reader sees must be of one moment, whatever the publishers do.
#include "platform/hwstats/ChannelFileReader.h"
#include "platform/hwstats/ChannelPublisher.h"
#include "testing/TemporaryFolder.h"

#include <atomic>
#include <fcntl.h>
#include <filesystem>
#include <gtest/gtest.h>
#include <thread>

namespace vela::platform::hwstats {
namespace {

constexpr std::int64_t kBuckets = 32;
constexpr std::size_t kReadings = 500;
constexpr int kMostSamplings = 100'000;

/// Two histograms and two state channels, so that each of two threads has one of both.
ChannelTable stressTable() {
    ChannelTable table{"Driver", "Speaker", std::nullopt, {}};
    for (const char* name : {"a", "b"}) {
        ChannelDescription histogram{HwStatsFormat::Histogram, name, std::nullopt, {}, {}};
        for (std::int64_t bound = 0; bound <= kBuckets; ++bound) {
            histogram.bounds.push_back(bound);
        }
        table.channels.push_back(histogram);
        table.channels.push_back({HwStatsFormat::State, name, std::nullopt, {}, {"s0", "s1", "s2"}});
    }
    return table;
}

class ChannelPublisherStressTest : public ::testing::Test {
protected:
    /// Records 0, 1, ... in a circle and enters the states in a circle, a nanosecond each.
    void publish(std::size_t histogram, std::uint64_t pauseEvery) {
        PublishedChannel& buckets = publisher_->channels()[histogram];
        PublishedChannel& states = publisher_->channels()[histogram + 1];
        for (std::uint64_t count = 0; !done_.load(std::memory_order_relaxed); ++count) {
            buckets.record(static_cast<std::int64_t>(count) % kBuckets);
            states.enter(count % 3, count + 1);
            if (pauseEvery != 0 && count % pauseEvery == 0) {
                std::this_thread::yield();
            }
        }
    }
    /// In a circle no bucket is ahead of a later one by more than 1, nor behind it.
    static void expectOneMoment(const std::uint64_t* hits) {
        for (std::int64_t i = 1; i < kBuckets; ++i) {
            ASSERT_LE(hits[i], hits[i - 1]);
        }
        ASSERT_LE(hits[0], hits[kBuckets - 1] + 1);
    }
    /// Every state but the present one lasted a nanosecond each time.
    static void expectOneMomentOfStates(const std::uint64_t* words) {
        const std::uint64_t entered = words[0] + words[2] + words[4];
        const std::uint64_t lasted = words[1] + words[3] + words[5];
        ASSERT_EQ(lasted + (entered > 0 ? 1 : 0), entered);
        ASSERT_LE(words[2], words[0]);
        ASSERT_LE(words[4], words[2]);
        ASSERT_LE(words[0], words[4] + 1);
    }
    /// How many channels could be read.
    std::size_t sample() {
        const FileDescriptor descriptor(open(publisher_->path().c_str(), O_RDONLY));
        FileBytes file(descriptor.get());
        const auto header = readChannelFileHeader(file, std::filesystem::file_size(publisher_->path()));
        const auto table = readChannelTable(file, *header);
        const auto values = readChannelValues(file, *header, **table, 0);
        std::size_t readable = 0;
        std::size_t word = 0;
        for (std::size_t i = 0; i < (*table)->channels.size(); ++i) {
            const bool isReadable = values->unreadable.empty() || !values->unreadable[i];
            readable += isReadable ? 1 : 0;
            if (isReadable && i % 2 == 0) {
                expectOneMoment(values->words.data() + word + 2);
            } else if (isReadable) {
                expectOneMomentOfStates(values->words.data() + word);
            }
            word += (*table)->channels[i].words();
        }
        return readable;
    }

    const testing::TemporaryFolder folder_;
    const std::unique_ptr<ChannelPublisher> publisher_ =
        *ChannelPublisher::create(folder_.path(), "stress", stressTable());
    std::atomic<bool> done_ = false;
};

TEST_F(ChannelPublisherStressTest, NoReadingIsTorn) {
    std::thread first([this] { publish(0, 0); });
    std::thread second([this] { publish(2, 50); });
    // A channel that changes all the time is mostly unreadable; what counts is what was read.
    std::size_t readable = 0;
    for (int i = 0; i < kMostSamplings && readable < kReadings && !HasFatalFailure(); ++i) {
        readable += sample();
    }
    done_ = true;
    first.join();
    second.join();
    EXPECT_GE(readable, kReadings);
    EXPECT_EQ(sample(), 4U) << "at rest everything can be read";
}

} // namespace
} // namespace vela::platform::hwstats
