#include "shaping/RapidMessages.h"

#include "common/VelaReportingVocabulary.h"

#include <algorithm>
#include <cstddef>
#include <optional>

namespace vela {

namespace {

/// The entries of one burst. Values that a later member overwrote are dropped whenever most are of that kind, so that a
/// burst takes memory for its keys and not for its members.
class Burst {
public:
    void add(const Dictionary& message) {
        addEntries(message);
        if (entries_.size() >= compactAt_) {
            const Dictionary merged = entries_.build();
            compactAt_ = std::max(kFirstCompaction, kGrowth * merged.size());
            addEntries(merged);
        }
    }

    /// The combined message; the burst is empty afterwards.
    Dictionary finish() {
        compactAt_ = kFirstCompaction;
        return entries_.build();
    }

private:
    static constexpr std::size_t kFirstCompaction = 256;
    static constexpr std::size_t kGrowth = 4;

    void addEntries(const Dictionary& message) {
        for (const auto& [key, value] : message) {
            entries_.add(key, Value(value));
        }
    }

    DictionaryBuilder entries_;
    std::size_t compactAt_ = kFirstCompaction;
};

bool containsAny(const Dictionary& message, std::span<const Key> keys) {
    return std::any_of(keys.begin(), keys.end(), [&message](const Key& key) { return message.contains(key); });
}

} // namespace

std::vector<Dictionary> combineRapidMessages(std::span<const StoredMessage> messages,
                                             std::span<const Key> keysToCombine, double maximumPausetime) {
    std::vector<Dictionary> output;
    output.reserve(messages.size());
    Burst burst;
    std::optional<std::size_t> place; // of the current burst in the output; filled in when the burst is complete
    std::optional<double> lastTime;   // of the burst's last member, when that had one
    for (const StoredMessage& stored : messages) {
        const Dictionary& message = stored.message;
        if (!containsAny(message, keysToCombine)) {
            output.push_back(message);
            continue;
        }
        const ValueRef timestamp = message.find(VelaReportingMessageKeyVelaTimestamp);
        const double time = timestamp.doubleValue();
        const bool afterPause = lastTime && time - *lastTime > maximumPausetime;
        if (place && afterPause) {
            output[*place] = burst.finish();
        }
        if (!place || afterPause) {
            place = output.size();
            output.emplace_back();
        }
        burst.add(message);
        lastTime = timestamp ? std::optional(time) : std::nullopt;
    }
    if (place) {
        output[*place] = burst.finish();
    }
    return output;
}

} // namespace vela
