#include "platform/hwstats/Samples.h"

#include "common/values/Utf8.h"

#include <algorithm>
#include <numeric>
#include <unordered_map>

namespace vela::platform::hwstats {

namespace {

// --- Texts of the system ---

/// Names that devices give themselves may hold anything.
std::string cleanText(std::string_view text) {
    constexpr std::size_t kMostBytes = 128;
    std::string clean;
    while (!text.empty() && clean.size() < kMostBytes) {
        const Utf8Step step = utf8Step(text);
        const bool isPlain = step.valid && step.codePoint >= U' ' && step.codePoint != U'\x7F';
        clean += isPlain ? text.substr(0, step.bytes) : std::string_view("?");
        text.remove_prefix(step.bytes);
    }
    return clean;
}

} // namespace

BlockBuilder::BlockBuilder(std::string key, std::string_view driverName) {
    block_.key = std::move(key);
    table_.driverName = cleanText(driverName);
}

void BlockBuilder::simple(std::string_view name, std::string unit, std::uint64_t value) {
    table_.channels.push_back({HwStatsFormat::Simple, cleanText(name), std::move(unit), {}, {}});
    block_.words.push_back(value);
}

void BlockBuilder::state(std::string_view name, const std::vector<State>& states) {
    ChannelDescription channel{HwStatsFormat::State, cleanText(name), "ns", {}, {}};
    for (const State& state : states) {
        channel.states.push_back(cleanText(state.name));
        block_.words.insert(block_.words.end(), {state.inTransitions, state.residency});
    }
    table_.channels.push_back(std::move(channel));
}

SampleBlock BlockBuilder::build(const std::optional<std::string>& group,
                                const std::optional<std::string>& subGroup) && {
    table_.group = group;
    table_.subGroup = subGroup;
    block_.table = std::make_shared<const ChannelTable>(std::move(table_));
    return std::move(block_);
}

namespace {

// --- Differences ---

std::int64_t asSigned(std::uint64_t word) { return static_cast<std::int64_t>(word); }

/// How many words at the front of a channel's are no counters: a histogram's least and greatest value.
std::size_t plainWords(const ChannelDescription& channel) { return channel.format == HwStatsFormat::Histogram ? 2 : 0; }

bool wentBack(const ChannelDescription& channel, const std::uint64_t* previous, const std::uint64_t* current) {
    if (channel.format == HwStatsFormat::Simple) {
        return asSigned(*current) < asSigned(*previous);
    }
    for (std::size_t i = plainWords(channel); i < channel.words(); ++i) {
        if (current[i] < previous[i]) {
            return true;
        }
    }
    return false;
}

/// Turns the words at `current` into their difference from those at `previous`.
void subtract(const ChannelDescription& channel, const std::uint64_t* previous, std::uint64_t* current, bool hasEnded) {
    // The stretch since the last transition counts while the publisher lives. How much of it there was when it died,
    // nobody knows.
    const bool mayShrink = hasEnded && channel.format == HwStatsFormat::State;
    if (!mayShrink && wentBack(channel, previous, current)) {
        return;
    }
    for (std::size_t i = plainWords(channel); i < channel.words(); ++i) {
        current[i] = mayShrink && current[i] < previous[i] ? 0 : current[i] - previous[i];
    }
}

bool isSameKind(const ChannelDescription& one, const ChannelDescription& other) {
    return one.format == other.format && one.bounds == other.bounds && one.states == other.states;
}

/// Finds channels of an earlier sampling of a block by name. Of channels of one name the first answers the first
/// question, and so on.
class ChannelIndex {
public:
    explicit ChannelIndex(const SampleBlock& block) : block_(block) {
        std::size_t word = 0;
        for (std::size_t i = 0; i < block.table->channels.size(); ++i) {
            places_[block.table->channels[i].name].places.push_back({i, word});
            word += block.table->channels[i].words();
        }
    }

    /// The words of the channel like `channel`; null where there is none or it was unreadable.
    const std::uint64_t* takeNext(const ChannelDescription& channel, bool& isThere) {
        const auto found = places_.find(channel.name);
        isThere = false;
        if (found == places_.end() || found->second.taken == found->second.places.size()) {
            return nullptr;
        }
        const Place place = found->second.places[found->second.taken++];
        isThere = isSameKind(block_.table->channels[place.channel], channel);
        return isThere && !block_.isUnreadable(place.channel) ? block_.words.data() + place.word : nullptr;
    }

private:
    struct Place {
        std::size_t channel;
        std::size_t word;
    };
    struct Namesakes {
        std::vector<Place> places;
        std::size_t taken = 0;
    };

    const SampleBlock& block_;
    std::unordered_map<std::string_view, Namesakes> places_;
};

void leaveOut(SampleBlock& block, std::size_t channel) {
    block.unreadable.resize(block.table->channels.size());
    block.unreadable[channel] = true;
}

/// The usual case: the channels are the same ones.
void subtractSameTable(const SampleBlock& previous, SampleBlock& current) {
    std::size_t word = 0;
    for (std::size_t i = 0; i < current.table->channels.size(); ++i) {
        const ChannelDescription& channel = current.table->channels[i];
        if (previous.isUnreadable(i)) {
            leaveOut(current, i);
        } else if (!current.isUnreadable(i)) {
            subtract(channel, previous.words.data() + word, current.words.data() + word, current.ended);
        }
        word += channel.words();
    }
}

void subtractByName(const SampleBlock& previous, SampleBlock& current) {
    ChannelIndex before(previous);
    std::size_t word = 0;
    for (std::size_t i = 0; i < current.table->channels.size(); ++i) {
        const ChannelDescription& channel = current.table->channels[i];
        bool wasThere = false;
        const std::uint64_t* const words = before.takeNext(channel, wasThere);
        if (words != nullptr && !current.isUnreadable(i)) {
            subtract(channel, words, current.words.data() + word, current.ended);
        } else if (wasThere || !current.wholeWhenNew) {
            leaveOut(current, i);
        }
        word += channel.words();
    }
}

bool isWholeWhenNew(const Samples& previous, const SampleBlock& block) {
    return block.wholeWhenNew && !previous.incomplete && !previous.missed.contains(block.key);
}

} // namespace

std::shared_ptr<const Samples> differenceOf(const Samples& previous, const Samples& current) {
    std::unordered_map<std::string_view, const SampleBlock*> before;
    for (const SampleBlock& block : previous.blocks) {
        before.emplace(block.key, &block);
    }
    auto difference = std::make_shared<Samples>();
    difference->time = current.time;
    for (const SampleBlock& block : current.blocks) {
        const auto found = before.find(block.key);
        if (found == before.end()) {
            if (isWholeWhenNew(previous, block)) {
                difference->blocks.push_back(block);
            }
            continue;
        }
        const SampleBlock& earlier = *found->second;
        const bool isSame = earlier.generation == block.generation;
        if (isSame && earlier.ended && block.ended) {
            continue;
        }
        SampleBlock& changed = difference->blocks.emplace_back(block);
        changed.since = isSame ? previous.time : block.since;
        if (isSame && (earlier.table == block.table || *earlier.table == *block.table)) {
            subtractSameTable(earlier, changed);
        } else if (isSame) {
            subtractByName(earlier, changed);
        }
    }
    return difference;
}

// --- Names ---

namespace {

constexpr std::uint64_t kHashStart = 0xCBF29CE484222325U;

std::uint64_t mixed(std::uint64_t hash, char character) {
    constexpr std::uint64_t kPrime = 0x100000001B3U;
    return (hash ^ static_cast<unsigned char>(character)) * kPrime;
}

/// Of `text` without what a key loses.
std::uint64_t mixed(std::uint64_t hash, std::string_view text) {
    for (const char character : text) {
        hash = character == '_' || character == ' ' ? hash : mixed(hash, character);
    }
    return hash;
}

std::uint64_t hashOfParts(const ChannelTable& table) {
    std::uint64_t hash = kHashStart;
    if (table.driverName) {
        const std::string_view driver = *table.driverName;
        hash = mixed(mixed(hash, driver.substr(0, driver.find('<'))), '_');
    }
    for (const auto* part : {&table.group, &table.subGroup}) {
        hash = *part ? mixed(mixed(hash, **part), '_') : hash;
    }
    return hash;
}

std::string suffixText(std::uint32_t suffix) { return "." + std::to_string(suffix); }

} // namespace

void addSuffixes(Samples& samples) {
    /// What is taken, each with the suffix to try next: so that many equal names cost no more than others.
    std::unordered_map<std::uint64_t, std::uint32_t> keys;
    keys.reserve(
        std::accumulate(samples.blocks.begin(), samples.blocks.end(), std::size_t{0},
                        [](std::size_t sum, const SampleBlock& block) { return sum + block.table->channels.size(); }));
    for (SampleBlock& block : samples.blocks) {
        const std::uint64_t parts = hashOfParts(*block.table);
        for (std::size_t i = 0; i < block.table->channels.size(); ++i) {
            const ChannelDescription& channel = block.table->channels[i];
            // Formats stand apart, in messages of their own.
            const std::uint64_t name = mixed(mixed(parts, static_cast<char>(channel.format)), channel.name);
            if (const auto [taken, isNew] = keys.emplace(name, 2); !isNew) {
                std::uint32_t suffix = taken->second;
                while (!keys.emplace(mixed(name, suffixText(suffix)), 2).second) {
                    ++suffix;
                }
                keys[name] = suffix + 1;
                block.suffixes.resize(block.table->channels.size());
                block.suffixes[i] = suffix;
            }
        }
    }
}

// --- Handing out ---

namespace {

void fillHistogram(const ChannelDescription& description, const std::uint64_t* words, HwStatsChannel& channel) {
    channel.histogramMin = asSigned(words[0]);
    channel.histogramMax = asSigned(words[1]);
    channel.buckets.resize(description.parts());
    for (std::size_t i = 0; i < channel.buckets.size(); ++i) {
        channel.buckets[i] = {description.bounds[i], description.bounds[i + 1], 0, asSigned(words[2 + i])};
    }
}

void fillStates(const ChannelDescription& description, const std::uint64_t* words, std::uint64_t elapsed,
                HwStatsChannel& channel) {
    channel.states.resize(description.parts());
    double all = 0;
    for (std::size_t i = 0; i < channel.states.size(); ++i) {
        HwStatsState& state = channel.states[i];
        state.name = description.states[i];
        state.inTransitions = words[2 * i];
        state.residency = words[2 * i + 1];
        all += static_cast<double>(state.residency);
    }
    // Sources that know only some of the states (the idle ones, say) leave the rest of the time to nobody.
    all = std::max(all, static_cast<double>(elapsed));
    for (HwStatsState& state : channel.states) {
        state.dutyCycle = all > 0 ? static_cast<double>(state.residency) / all : 0;
    }
}

void fill(const ChannelDescription& description, const std::uint64_t* words, std::uint64_t elapsed,
          HwStatsChannel& channel) {
    channel.format = static_cast<std::uint8_t>(description.format);
    channel.channelName = description.name;
    channel.unitLabel = description.unit;
    channel.simpleValue = 0;
    channel.histogramMin = 0;
    channel.histogramMax = 0;
    if (description.format != HwStatsFormat::Histogram) {
        channel.buckets.clear();
    }
    if (description.format != HwStatsFormat::State) {
        channel.states.clear();
    }
    switch (description.format) {
    case HwStatsFormat::Histogram:
        fillHistogram(description, words, channel);
        break;
    case HwStatsFormat::State:
        fillStates(description, words, elapsed, channel);
        break;
    default:
        channel.simpleValue = asSigned(*words);
        break;
    }
}

} // namespace

void iterateSamples(const Samples& samples, UniqueFunction<int(const HwStatsChannel&)>& use) {
    HwStatsChannel channel; // one for all: its texts and lists keep their memory
    for (const SampleBlock& block : samples.blocks) {
        channel.driverName = block.table->driverName;
        channel.group = block.table->group;
        channel.subGroup = block.table->subGroup;
        const std::uint64_t elapsed = samples.time > block.since ? samples.time - block.since : 0;
        std::size_t word = 0;
        for (std::size_t i = 0; i < block.table->channels.size(); ++i) {
            const ChannelDescription& description = block.table->channels[i];
            const std::uint64_t* const words = block.words.data() + word;
            word += description.words();
            if (block.isUnreadable(i)) {
                continue;
            }
            fill(description, words, elapsed, channel);
            if (!block.suffixes.empty() && block.suffixes[i] != 0) {
                *channel.channelName += suffixText(block.suffixes[i]);
            }
            if (use(channel) != 0) {
                return;
            }
        }
    }
}

} // namespace vela::platform::hwstats
