#include "testing/FakeHwStats.h"

#include <algorithm>
#include <utility>

namespace vela::testing {

using platform::HwStatsAnswer;
using platform::HwStatsChannel;
using platform::HwStatsChannels;
using platform::HwStatsError;
using platform::HwStatsSamples;
using platform::HwStatsSubscription;

class FakeHwStats::Channels final : public HwStatsChannels {
public:
    Channels(Name channelsName, Count count) : name(std::move(channelsName)), count_(std::move(count)) {}

    const Name name;

private:
    const Count count_;
};

class FakeHwStats::Subscription final : public HwStatsSubscription {
public:
    Subscription(Name subscribedName, Count count) : name(std::move(subscribedName)), count_(std::move(count)) {}

    const Name name;

private:
    const Count count_;
};

class FakeHwStats::Samples final : public HwStatsSamples {
public:
    Samples(Name sampledName, std::uint32_t sampling, std::vector<HwStatsChannel> sampled, Count count)
        : name(std::move(sampledName)),
          number(sampling),
          channels(std::move(sampled)),
          count_(std::move(count)) {}

    const Name name;
    const std::uint32_t number; ///< 0 for a difference
    const std::vector<HwStatsChannel> channels;

private:
    const Count count_;
};

namespace {

std::optional<HwStatsError> errorOf(std::optional<std::int64_t> code) {
    return code ? std::optional(HwStatsError{*code}) : std::nullopt;
}

/// Counters less what they were; minima, maxima, bounds and duty cycles as they are.
HwStatsChannel differenceOf(const HwStatsChannel& previous, HwStatsChannel channel) {
    channel.simpleValue -= previous.simpleValue;
    for (std::size_t i = 0; i < std::min(channel.buckets.size(), previous.buckets.size()); ++i) {
        channel.buckets[i].hits -= previous.buckets[i].hits;
    }
    for (std::size_t i = 0; i < std::min(channel.states.size(), previous.states.size()); ++i) {
        channel.states[i].inTransitions -= previous.states[i].inTransitions;
        channel.states[i].residency -= previous.states[i].residency;
    }
    return channel;
}

std::vector<HwStatsChannel> differenceOf(const std::vector<HwStatsChannel>& previous,
                                         std::vector<HwStatsChannel> current) {
    for (std::size_t i = 0; i < std::min(current.size(), previous.size()); ++i) {
        current[i] = differenceOf(previous[i], std::move(current[i]));
    }
    return current;
}

std::size_t othersThan(const std::shared_ptr<const int>& count) {
    return static_cast<std::size_t>(count.use_count()) - 1;
}

} // namespace

FakeHwStats::FakeHwStats()
    : channelsAlive_(std::make_shared<const int>()),
      subscriptionsAlive_(std::make_shared<const int>()),
      samplesAlive_(std::make_shared<const int>()) {}

FakeHwStats::~FakeHwStats() = default;

void FakeHwStats::set(std::optional<std::string> group, std::optional<std::string> subGroup, Driver driver) {
    const MutexLock lock(mutex_);
    drivers_.insert_or_assign({std::move(group), std::move(subGroup)}, std::move(driver));
}

void FakeHwStats::setObserver(std::function<void(std::string_view call)> observer) {
    const MutexLock lock(mutex_);
    observer_ = std::move(observer);
}

std::vector<std::string> FakeHwStats::calls() const {
    const MutexLock lock(mutex_);
    return calls_;
}

void FakeHwStats::clearCalls() {
    const MutexLock lock(mutex_);
    calls_.clear();
}

std::size_t FakeHwStats::liveChannels() const { return othersThan(channelsAlive_); }
std::size_t FakeHwStats::liveSubscriptions() const { return othersThan(subscriptionsAlive_); }
std::size_t FakeHwStats::liveSamples() const { return othersThan(samplesAlive_); }

std::vector<int> FakeHwStats::callbackAnswers() const {
    const MutexLock lock(mutex_);
    return callbackAnswers_;
}

std::string FakeHwStats::textOf(const Name& name) {
    return name.first.value_or("none") + "/" + name.second.value_or("none");
}

FakeHwStats::Driver FakeHwStats::driverOf(const Name& name) const {
    const MutexLock lock(mutex_);
    const auto found = drivers_.find(name);
    return found == drivers_.end() ? Driver{.channelsThere = false} : found->second;
}

void FakeHwStats::note(const std::string& call) {
    std::function<void(std::string_view)> observer;
    {
        const MutexLock lock(mutex_);
        calls_.push_back(call);
        observer = observer_;
    }
    if (observer) {
        observer(call);
    }
}

HwStatsAnswer<HwStatsChannels> FakeHwStats::copyChannelsInGroup(std::optional<std::string_view> group,
                                                                std::optional<std::string_view> subGroup) {
    const Name name(group, subGroup);
    note("copyChannelsInGroup " + textOf(name));
    const Driver driver = driverOf(name);
    HwStatsAnswer<HwStatsChannels> answer{nullptr, errorOf(driver.channelsError)};
    if (driver.channelsThere) {
        answer.thing = std::make_shared<const Channels>(name, channelsAlive_);
    }
    return answer;
}

std::int32_t FakeHwStats::channelCount(const HwStatsChannels& channels) {
    const auto& own = dynamic_cast<const Channels&>(channels);
    note("channelCount " + textOf(own.name));
    return driverOf(own.name).channelCount;
}

platform::HwStats::SubscriptionAnswer FakeHwStats::createSubscription(const HwStatsChannels& channels) {
    const auto& own = dynamic_cast<const Channels&>(channels);
    note("createSubscription " + textOf(own.name));
    const Driver driver = driverOf(own.name);
    SubscriptionAnswer answer{nullptr, nullptr, errorOf(driver.subscriptionError)};
    if (driver.subscriptionThere) {
        answer.subscription = std::make_shared<const Subscription>(own.name, subscriptionsAlive_);
    }
    if (driver.subscribedThere) {
        answer.subscribed = std::make_shared<const Channels>(own.name, channelsAlive_);
    }
    return answer;
}

HwStatsAnswer<HwStatsSamples> FakeHwStats::createSamples(const HwStatsSubscription& subscription,
                                                         const HwStatsChannels& subscribed) {
    const Name& name = dynamic_cast<const Subscription&>(subscription).name;
    const Name& other = dynamic_cast<const Channels&>(subscribed).name;
    note("createSamples " + textOf(name) + (name == other ? "" : " with channels of " + textOf(other)));
    Driver driver = driverOf(name);
    HwStatsAnswer<HwStatsSamples> answer{nullptr, errorOf(driver.samplesError)};
    if (driver.samplesThere) {
        const MutexLock lock(mutex_);
        answer.thing = std::make_shared<const Samples>(name, ++samplings_, std::move(driver.channels), samplesAlive_);
    }
    return answer;
}

HwStatsAnswer<HwStatsSamples> FakeHwStats::createSamplesDelta(const HwStatsSamples* previous,
                                                              const HwStatsSamples& current) {
    const auto& now = dynamic_cast<const Samples&>(current);
    const auto* before = previous == nullptr ? nullptr : &dynamic_cast<const Samples&>(*previous);
    note("createSamplesDelta " + textOf(now.name) + " from " +
         (before == nullptr ? "none" : std::to_string(before->number)) + " to " + std::to_string(now.number));
    Driver driver = driverOf(now.name);
    HwStatsAnswer<HwStatsSamples> answer{nullptr, errorOf(driver.deltaError)};
    if (before == nullptr) {
        answer.error = HwStatsError{kNoPreviousSamples};
    } else if (driver.deltaThere) {
        answer.thing = std::make_shared<const Samples>(
            now.name, 0, driver.delta ? std::move(*driver.delta) : differenceOf(before->channels, now.channels),
            samplesAlive_);
    }
    return answer;
}

void FakeHwStats::iterate(const HwStatsSamples& samples, platform::UniqueFunction<int(const HwStatsChannel&)> use) {
    const auto& own = dynamic_cast<const Samples&>(samples);
    note("iterate " + textOf(own.name));
    for (const HwStatsChannel& channel : own.channels) {
        const int answer = use(channel);
        {
            const MutexLock lock(mutex_);
            callbackAnswers_.push_back(answer);
        }
        if (answer != 0) {
            return;
        }
    }
}

} // namespace vela::testing
