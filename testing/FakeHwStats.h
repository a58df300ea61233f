// A hardware statistics library whose drivers and their channels a test sets. Thread-safe. Its objects may outlive it.
//
//     hwStats_.set("Haptics", "Stats", {.channels = {channel}});   // there is one such driver
//     hwStats_.set("Rx", std::nullopt, {.samplesError = 5});       // this one samples and says an error besides
#pragma once

#include "platform/HwStats.h"
#include "platform/Mutex.h"

#include <cstddef>
#include <cstdint>
#include <functional>
#include <map>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

namespace vela::testing {

class FakeHwStats final : public platform::HwStats {
public:
    /// How a group and subgroup answers.
    struct Driver {
        std::vector<platform::HwStatsChannel> channels{}; ///< what a sampling finds
        /// What every difference is; without it, the channels' present values less those of the earlier sampling.
        std::optional<std::vector<platform::HwStatsChannel>> delta{};
        std::int32_t channelCount = 1;
        // Whether there is a thing to answer.
        bool channelsThere = true;
        bool subscriptionThere = true;
        bool subscribedThere = true;
        bool samplesThere = true;
        bool deltaThere = true;
        // Errors stand beside the thing or alone.
        std::optional<std::int64_t> channelsError{};
        std::optional<std::int64_t> subscriptionError{};
        std::optional<std::int64_t> samplesError{};
        std::optional<std::int64_t> deltaError{};
    };

    /// Code of the error, and no difference, where there are no earlier samples.
    static constexpr std::int64_t kNoPreviousSamples = -3;

    FakeHwStats();
    ~FakeHwStats() override;
    FakeHwStats(const FakeHwStats&) = delete;
    FakeHwStats& operator=(const FakeHwStats&) = delete;

    // What a test arranges. Who was not set has neither channels nor an error.
    void set(std::optional<std::string> group, std::optional<std::string> subGroup, Driver driver);
    /// Called at the start of every call with its text, outside the lock.
    void setObserver(std::function<void(std::string_view call)> observer);

    // What a test looks at.
    /// "copyChannelsInGroup Haptics/Stats", "channelCount none/MCA", "createSubscription Rx/none",
    /// "createSamples Rx/none" (every sampling is numbered from 1), "createSamplesDelta Rx/none from 1 to 2" ("from
    /// none" without earlier samples), "iterate Rx/none". Where the subscribed channels are not the subscription's own,
    /// "createSamples Rx/none with channels of Tx/none".
    std::vector<std::string> calls() const;
    void clearCalls();
    /// How many objects of each kind are held by somebody.
    std::size_t liveChannels() const;
    std::size_t liveSubscriptions() const;
    std::size_t liveSamples() const; ///< differences included
    /// Answers of `iterate`'s callback, in order.
    std::vector<int> callbackAnswers() const;

    platform::HwStatsAnswer<platform::HwStatsChannels>
    copyChannelsInGroup(std::optional<std::string_view> group, std::optional<std::string_view> subGroup) override;
    std::int32_t channelCount(const platform::HwStatsChannels& channels) override;
    SubscriptionAnswer createSubscription(const platform::HwStatsChannels& channels) override;
    platform::HwStatsAnswer<platform::HwStatsSamples>
    createSamples(const platform::HwStatsSubscription& subscription,
                  const platform::HwStatsChannels& subscribed) override;
    platform::HwStatsAnswer<platform::HwStatsSamples>
    createSamplesDelta(const platform::HwStatsSamples* previous, const platform::HwStatsSamples& current) override;
    void iterate(const platform::HwStatsSamples& samples,
                 platform::UniqueFunction<int(const platform::HwStatsChannel&)> use) override;

private:
    class Channels;
    class Subscription;
    class Samples;
    /// Group and subgroup.
    using Name = std::pair<std::optional<std::string>, std::optional<std::string>>;

    static std::string textOf(const Name& name);
    /// The driver's arrangement at this moment.
    Driver driverOf(const Name& name) const;
    void note(const std::string& call);

    /// Counts the objects of one kind that live; they share it.
    using Count = std::shared_ptr<const int>;

    const Count channelsAlive_;
    const Count subscriptionsAlive_;
    const Count samplesAlive_;

    mutable Mutex mutex_;
    std::map<Name, Driver> drivers_ VELA_GUARDED_BY(mutex_);
    std::vector<std::string> calls_ VELA_GUARDED_BY(mutex_);
    std::vector<int> callbackAnswers_ VELA_GUARDED_BY(mutex_);
    std::function<void(std::string_view)> observer_ VELA_GUARDED_BY(mutex_);
    std::uint32_t samplings_ VELA_GUARDED_BY(mutex_) = 0;
};

} // namespace vela::testing
