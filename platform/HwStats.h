// The hardware statistics library: channels of counters, histograms and state residencies that audio drivers publish.
#pragma once

#include "platform/UniqueFunction.h"

#include <cstddef>
#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

namespace vela::platform {

/// The formats of a channel, by the library's own codes.
enum class HwStatsFormat : std::uint8_t { None = 0, Simple = 1, State = 2, Histogram = 3, SimpleArray = 4 };

struct HwStatsError {
    std::int64_t code = 0;
};

struct HwStatsBucket {
    std::int64_t lower = 0;
    std::int64_t upper = 0;
    std::int32_t boundsFailure = 0; ///< what the query for the bounds answered; 0 when it worked
    std::int64_t hits = 0;
};

struct HwStatsState {
    std::string name;
    std::uint64_t inTransitions = 0;
    std::uint64_t residency = 0;
    double dutyCycle = 0; ///< 0 to 1
};

/// One channel of a sample set, with its values.
struct HwStatsChannel {
    std::uint8_t format = 0; ///< an `HwStatsFormat`, or a code that this version does not know
    std::optional<std::string> group;
    std::optional<std::string> subGroup;
    std::optional<std::string> driverName;
    std::optional<std::string> channelName;
    std::optional<std::string> unitLabel;
    std::int64_t simpleValue = 0;
    std::vector<HwStatsBucket> buckets;
    std::int64_t histogramMin = 0;
    std::int64_t histogramMax = 0;
    std::vector<HwStatsState> states;
};

// Opaque objects of the library. Immutable.
class HwStatsChannels {
public:
    virtual ~HwStatsChannels() = default;
};
class HwStatsSubscription {
public:
    virtual ~HwStatsSubscription() = default;
};
class HwStatsSamples {
public:
    virtual ~HwStatsSamples() = default;
};

/// A thing, an error, both or neither: the library may answer any of the four.
template <class Thing>
struct HwStatsAnswer {
    std::shared_ptr<const Thing> thing;
    std::optional<HwStatsError> error;
};

/// Thread-safe. Sampling may touch devices; it never waits for one without limit.
class HwStats {
public:
    virtual ~HwStats() = default;

    /// The channels of a group and subgroup; none matches any.
    virtual HwStatsAnswer<HwStatsChannels> copyChannelsInGroup(std::optional<std::string_view> group,
                                                               std::optional<std::string_view> subGroup) = 0;
    virtual std::int32_t channelCount(const HwStatsChannels& channels) = 0;

    /// Subscribes to `channels`; `subscribed` is the channel set to sample with.
    struct SubscriptionAnswer {
        std::shared_ptr<const HwStatsSubscription> subscription;
        std::shared_ptr<const HwStatsChannels> subscribed;
        std::optional<HwStatsError> error;
    };
    virtual SubscriptionAnswer createSubscription(const HwStatsChannels& channels) = 0;

    virtual HwStatsAnswer<HwStatsSamples> createSamples(const HwStatsSubscription& subscription,
                                                        const HwStatsChannels& subscribed) = 0;

    /// What changed from `previous` (null when there is none) to `current`.
    virtual HwStatsAnswer<HwStatsSamples> createSamplesDelta(const HwStatsSamples* previous,
                                                             const HwStatsSamples& current) = 0;

    /// Calls `use` for every channel of `samples` in the library's order until it answers other than 0.
    virtual void iterate(const HwStatsSamples& samples, UniqueFunction<int(const HwStatsChannel&)> use) = 0;
};

} // namespace vela::platform
