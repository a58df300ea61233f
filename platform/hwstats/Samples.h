// Values of channels at one moment, or their change between two. A sample set holds blocks: the channels of one driver
// that one source gave. Immutable once made; blocks share their tables.
#pragma once

#include "platform/HwStats.h"
#include "platform/Result.h"
#include "platform/hwstats/ChannelTable.h"

#include <cstddef>
#include <cstdint>
#include <memory>
#include <set>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

namespace vela::platform::hwstats {

struct SampleBlock {
    std::string key; ///< the same in every sampling, and no other block's: "file:...", "cpuidle:...", ...
    std::shared_ptr<const ChannelTable> table;
    std::vector<std::uint64_t> words; ///< the channels' words one after another; signed numbers in two's complement

    /// When the counting began, in nanoseconds of the monotonic clock. The states of a channel are shares of the time
    /// since then; where it is not known, of the time that they lasted together.
    std::uint64_t since = kUnknown;
    /// Another one means that the counters began anew at 0.
    std::uint64_t generation = 0;
    /// Whether counters that were not there before began at 0 since then.
    bool wholeWhenNew = false;
    /// Nobody changes the values any more.
    bool ended = false;
    /// Of each channel, when any is: it could not be read without a change on its way, its words mean nothing.
    std::vector<bool> unreadable;
    /// Of each channel, when any is not 0: appended to its name, so that no two channels have one key.
    std::vector<std::uint32_t> suffixes;

    static constexpr std::uint64_t kUnknown = ~std::uint64_t{0};
    bool isUnreadable(std::size_t channel) const { return !unreadable.empty() && unreadable[channel]; }
};

class Samples final : public HwStatsSamples {
public:
    std::vector<SampleBlock> blocks;
    std::set<std::string, std::less<>> missed; ///< keys of blocks that are there and could not be sampled
    bool incomplete = false;                   ///< there are more blocks than a sampling takes
    std::uint64_t time = 0;                    ///< nanoseconds of the monotonic clock
};

/// Makes a table and its words in one go, for sources that are read anew each time. What is no text in a name becomes
/// "?".
class BlockBuilder {
public:
    BlockBuilder(std::string key, std::string_view driverName);

    void simple(std::string_view name, std::string unit, std::uint64_t value);

    struct State {
        std::string name;
        std::uint64_t inTransitions = 0;
        std::uint64_t residency = 0; ///< nanoseconds
    };
    void state(std::string_view name, const std::vector<State>& states);

    /// The counting began when the system started.
    void countsSinceStart() { block_.since = 0; }
    bool empty() const { return table_.channels.empty(); }
    SampleBlock build(const std::optional<std::string>& group, const std::optional<std::string>& subGroup) &&;

private:
    SampleBlock block_;
    ChannelTable table_;
};

/// What changed from `previous` to `current`:
///
///     block or channel                               difference
///     in both, same generation                       current less previous
///     in both, another generation                    current
///     in both, same generation, a counter went back  current, of that channel
///     only in current, `wholeWhenNew`                current, unless `previous` missed it
///     only in current, otherwise                     none
///     unreadable in either, or ended in both         none
std::shared_ptr<const Samples> differenceOf(const Samples& previous, const Samples& current);

/// Gives channels of one sample set whose names differ only in what becomes no part of a key (each "_" and " ", and
/// what stands behind the "<" of a driver's name) suffixes that tell them apart.
void addSuffixes(Samples& samples);

/// Calls `use` for each readable channel until it answers other than 0. The channel is valid during the call.
void iterateSamples(const Samples& samples, UniqueFunction<int(const HwStatsChannel&)>& use);

} // namespace vela::platform::hwstats
