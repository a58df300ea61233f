// Publishes the channels of one driver in a file that anybody may read, and updates them. The file stays when the
// publisher ends, so that what it counted can still be reported; the next publisher of the same name replaces it.
//
// Creating and destroying are for one thread and make system calls. Updates are wait-free: some twenty instructions on
// memory that is there, no lock, no system call, no allocation. One thread at a time may update a channel; different
// channels may be updated at the same time. A fork's child must not update: it shares the memory.
#pragma once

#include "platform/Result.h"
#include "platform/hwstats/ChannelFileFormat.h"
#include "platform/hwstats/ChannelTable.h"
#include "platform/linux/FileDescriptor.h"

#include <algorithm>
#include <atomic>
#include <cstddef>
#include <cstdint>
#include <limits>
#include <memory>
#include <string>
#include <vector>

namespace vela::platform::hwstats {

/// Nanoseconds of the monotonic clock, without a system call where the kernel lets programs read its clock.
std::uint64_t monotonicNanoseconds();

/// One channel, for updates. An update that its format does not have does nothing.
class PublishedChannel {
public:
    PublishedChannel(const ChannelDescription& description, std::uint64_t* block)
        : format_(description.format),
          parts_(description.parts()),
          sequence_(block),
          first_(block + kBlockHeadBytes / sizeof(std::uint64_t)),
          second_(first_ + fileWords(description)),
          bounds_(description.bounds) {
        static_assert(std::atomic_ref<std::uint64_t>::is_always_lock_free);
    }

    void add(std::int64_t change) {
        if (format_ == HwStatsFormat::Simple) {
            update([=](Copy copy) { copy.add(0, static_cast<std::uint64_t>(change)); });
        }
    }
    void set(std::int64_t value) {
        if (format_ == HwStatsFormat::Simple) {
            update([=](Copy copy) { copy.set(0, static_cast<std::uint64_t>(value)); });
        }
    }
    /// Counts `value` in its bucket, the first or last one when it lies beyond them.
    void record(std::int64_t value) {
        if (format_ == HwStatsFormat::Histogram) {
            const std::size_t bucket = bucketOf(value);
            const bool isFirst = !recorded_;
            recorded_ = true;
            update([=](Copy copy) {
                copy.set(0, static_cast<std::uint64_t>(isFirst ? value : std::min(value, copy.signedAt(0))));
                copy.set(1, static_cast<std::uint64_t>(isFirst ? value : std::max(value, copy.signedAt(1))));
                copy.add(2 + bucket, 1);
            });
        }
    }
    /// Enters a state at `now`, nanoseconds of the monotonic clock; kNoState leaves the present one. To enter the
    /// present state again is no transition.
    void enter(std::uint64_t state, std::uint64_t now) {
        if (format_ == HwStatsFormat::State && (state < parts_ || state == kNoState)) {
            const std::size_t parts = parts_;
            update([=](Copy copy) {
                const std::uint64_t left = copy.at(0);
                if (left == state) {
                    return;
                }
                if (left < parts && copy.at(1) < now) {
                    copy.add(2 + 2 * left + 1, now - copy.at(1));
                }
                copy.set(0, state);
                copy.set(1, now);
                if (state < parts) {
                    copy.add(2 + 2 * state, 1);
                }
            });
        }
    }

private:
    /// The last bucket whose lower bound is not above `value`, or the first one. The steps are the same for every
    /// value, and none is a branch: values that nobody can foresee cost no more than others.
    std::size_t bucketOf(std::int64_t value) const {
        const std::int64_t* lower = bounds_.data();
        for (std::size_t buckets = parts_; buckets > 1;) {
            const std::size_t half = buckets / 2;
            lower += half * static_cast<std::size_t>(lower[half] <= value);
            buckets -= half;
        }
        return static_cast<std::size_t>(lower - bounds_.data());
    }

    /// Words that readers may be copying: each is written whole.
    class Copy {
    public:
        explicit Copy(std::uint64_t* words) : words_(words) {}

        std::uint64_t at(std::size_t index) const { return word(index).load(std::memory_order_relaxed); }
        std::int64_t signedAt(std::size_t index) const { return static_cast<std::int64_t>(at(index)); }
        void set(std::size_t index, std::uint64_t value) { word(index).store(value, std::memory_order_relaxed); }
        void add(std::size_t index, std::uint64_t change) { set(index, at(index) + change); }

    private:
        std::atomic_ref<std::uint64_t> word(std::size_t index) const {
            return std::atomic_ref<std::uint64_t>(words_[index]);
        }

        std::uint64_t* words_;
    };

    /// Readers take the first copy while the sequence number is even and the second one while it is odd, so there is
    /// always one that stands still: also when this thread is stopped, for ever perhaps, in the midst of it.
    template <class Change>
    void update(Change change) {
        const std::atomic_ref<std::uint64_t> sequence(*sequence_);
        // Even, whatever two threads that broke the rule may have left.
        const std::uint64_t number = sequence.load(std::memory_order_relaxed) & ~std::uint64_t{1};
        sequence.store(number + 1, std::memory_order_release); // the second copy is whole before readers go there
        std::atomic_thread_fence(std::memory_order_release);   // and they go before the first one changes
        change(Copy(first_));
        sequence.store(number + 2, std::memory_order_release);
        std::atomic_thread_fence(std::memory_order_release);
        change(Copy(second_));
    }

    HwStatsFormat format_;
    bool recorded_ = false; ///< whether the histogram has a value
    std::size_t parts_;
    std::uint64_t* sequence_;
    std::uint64_t* first_;
    std::uint64_t* second_;
    std::vector<std::int64_t> bounds_;
};

class ChannelPublisher {
public:
    /// Creates the file in `folder`, which is there. `publisher` tells apart programs with drivers of one name; while
    /// a file of the same name has a living publisher, this one's name gets a number.
    static Result<std::unique_ptr<ChannelPublisher>> create(const std::string& folder, const std::string& publisher,
                                                            const ChannelTable& table);
    /// Leaves the present states and marks the file as closed.
    ~ChannelPublisher();
    ChannelPublisher(const ChannelPublisher&) = delete;
    ChannelPublisher& operator=(const ChannelPublisher&) = delete;

    /// In the table's order. They live as long as this.
    std::vector<PublishedChannel>& channels() { return channels_; }
    const std::string& path() const { return path_; }

private:
    class Mapping {
    public:
        Mapping() = default;
        Mapping(const Mapping&) = delete;
        Mapping& operator=(const Mapping&) = delete;
        ~Mapping();
        /// Maps `bytes` of `file` and makes all of it present.
        bool map(const FileDescriptor& file, std::size_t bytes);
        char* begin() const { return begin_; }

    private:
        char* begin_ = nullptr;
        std::size_t bytes_ = 0;
    };

    ChannelPublisher() = default;
    void fill(const ChannelTable& table, const std::string& description, std::uint64_t fileBytes);

    std::string path_;
    FileDescriptor file_; ///< its lock tells readers that the publisher lives
    Mapping mapping_;
    std::vector<PublishedChannel> channels_;
};

} // namespace vela::platform::hwstats
