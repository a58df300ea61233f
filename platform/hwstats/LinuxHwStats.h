// The hardware statistics library on Linux: channel files that any driver or program publishes, and numbers of the
// kernel. The settings say which source feeds which group. A group with a source has channels from the start, one for
// each source that stands for all that the source will have: who is there is looked up at each sampling.
//
// Thread-safe: one sampling at a time. Samplings read a bounded number of files within a bounded time: numbers of the
// kernel that take longer are left out, and logged; until they have come nobody waits for any. Its objects may outlive
// it.
#pragma once

#include "platform/Clock.h"
#include "platform/HwStats.h"
#include "platform/Mutex.h"
#include "platform/hwstats/ChannelFolder.h"
#include "platform/hwstats/HwStatsGroups.h"
#include "platform/hwstats/SystemSampler.h"
#include "platform/hwstats/SystemSource.h"

#include <cerrno>
#include <chrono>
#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

namespace vela::platform {

struct LinuxHwStatsOptions {
    std::string channelFolder;        ///< of the channel files; may not be there yet
    std::string systemRoot;           ///< where /proc and /sys stand: "" for this machine's own
    std::vector<HwStatsGroup> groups; ///< every group that may be asked for
    std::chrono::milliseconds systemWait = hwstats::SystemSampler::kMostWait; ///< the longest wait for /proc and /sys
    /// Takes what is left out of samplings and why, each a line and once, on the thread that samples; without it, the
    /// log does.
    std::function<void(const std::string& fault)> complain{};
};

/// Those of a service with these settings.
LinuxHwStatsOptions hwStatsOptionsOf(const Settings& settings);

class LinuxHwStats final : public HwStats {
public:
    /// Codes of errors.
    static constexpr std::int64_t kNoPreviousSamples = ENODATA; ///< a difference from nothing
    static constexpr std::int64_t kStrangeObject = EINVAL;      ///< an object that is not of this library

    /// The clock outlives it.
    LinuxHwStats(LinuxHwStatsOptions options, const Clock& clock);
    ~LinuxHwStats() override;
    LinuxHwStats(const LinuxHwStats&) = delete;
    LinuxHwStats& operator=(const LinuxHwStats&) = delete;

    HwStatsAnswer<HwStatsChannels> copyChannelsInGroup(std::optional<std::string_view> group,
                                                       std::optional<std::string_view> subGroup) override;
    /// How many sources feed them.
    std::int32_t channelCount(const HwStatsChannels& channels) override;
    SubscriptionAnswer createSubscription(const HwStatsChannels& channels) override;
    /// Answers samples, none of them where nobody publishes anything; with an error besides when the folder of the
    /// channel files cannot be read.
    HwStatsAnswer<HwStatsSamples> createSamples(const HwStatsSubscription& subscription,
                                                const HwStatsChannels& subscribed) override;
    HwStatsAnswer<HwStatsSamples> createSamplesDelta(const HwStatsSamples* previous,
                                                     const HwStatsSamples& current) override;
    void iterate(const HwStatsSamples& samples, UniqueFunction<int(const HwStatsChannel&)> use) override;

private:
    class Channels;
    class Subscription;
    struct Group;

    /// The group of that very name; without one, all.
    std::vector<const Group*> groupsFor(const HwStatsGroupName& wanted) const VELA_REQUIRES(mutex_);
    HwStatsAnswer<HwStatsSamples> sample(const HwStatsGroupName& wanted, std::vector<std::string>& faults)
        VELA_EXCLUDES(mutex_);
    void sampleSystem(const std::vector<const Group*>& groups, const HwStatsGroupName& wanted,
                      hwstats::Samples& samples, std::vector<std::string>& faults) VELA_REQUIRES(mutex_);

    const Clock& clock_;
    const std::string channelFolder_;
    const std::function<void(const std::string&)> complain_;
    Mutex mutex_;
    hwstats::ChannelFolder folder_ VELA_GUARDED_BY(mutex_);
    /// The groups stay; their sources are used by the sampler alone.
    std::vector<Group> groups_ VELA_GUARDED_BY(mutex_);
    const std::chrono::milliseconds systemWait_;
    hwstats::SystemSampler sampler_; // destroyed before the sources
};

} // namespace vela::platform
