#include "platform/hwstats/LinuxHwStats.h"

#include "common/SettingValues.h"
#include "common/VelaReportingLogCategories.h"
#include "platform/hwstats/ChannelFileNames.h"

#include <algorithm>
#include <utility>

namespace vela::platform {

namespace {

using hwstats::ChannelTable;
using hwstats::Samples;
using Part = std::optional<std::string>;

/// Whether something can be of both names.
bool mayBeBoth(const Part& one, const Part& other) { return !one || !other || *one == *other; }
bool mayBeBoth(const HwStatsGroupName& one, const HwStatsGroupName& other) {
    return mayBeBoth(one.group, other.group) && mayBeBoth(one.subGroup, other.subGroup);
}

/// Whether what has these parts, and lacks those that are absent, is of the name.
bool isOf(const Part& part, const Part& wanted) { return !wanted || part == wanted; }
bool isOf(const Part& group, const Part& subGroup, const HwStatsGroupName& name) {
    return isOf(group, name.group) && isOf(subGroup, name.subGroup);
}

void logFault(const std::string& fault) { VelaReportingDriverUtilityCategory().error("%@", fault); }

} // namespace

/// A group of the settings with its sources.
struct LinuxHwStats::Group {
    /// Whether its channel files can be among those asked for.
    bool mayGiveFiles(const HwStatsGroupName& wanted) const { return hasChannelFiles && mayBeBoth(name, wanted); }
    /// Whether its other sources are asked for.
    bool givesSources(const HwStatsGroupName& wanted) const { return isOf(name.group, name.subGroup, wanted); }

    HwStatsGroupName name;
    bool hasChannelFiles = false;
    std::vector<std::unique_ptr<hwstats::SystemSource>> sources;
};

class LinuxHwStats::Channels final : public HwStatsChannels {
public:
    Channels(HwStatsGroupName wanted, std::int32_t sources) : name(std::move(wanted)), count(sources) {}

    const HwStatsGroupName name;
    const std::int32_t count;
};

class LinuxHwStats::Subscription final : public HwStatsSubscription {};

LinuxHwStatsOptions hwStatsOptionsOf(const Settings& settings) {
    return {hwstats::channelFolder(settings.paths.runtime), "", hwStatsGroupsOf(settings)};
}

LinuxHwStats::LinuxHwStats(LinuxHwStatsOptions options, const Clock& clock)
    : clock_(clock),
      channelFolder_(options.channelFolder),
      complain_(options.complain ? std::move(options.complain) : std::function(logFault)),
      folder_(std::move(options.channelFolder)),
      systemWait_(options.systemWait),
      sampler_(std::move(options.systemRoot), clock) {
    const MutexLock lock(mutex_);
    for (const HwStatsGroup& group : options.groups) {
        Group& made = groups_.emplace_back();
        made.name = group.name;
        for (const HwStatsSource source : group.sources) {
            if (auto system = hwstats::makeSystemSource(source, group.name)) {
                made.sources.push_back(std::move(system));
            } else {
                made.hasChannelFiles = true;
            }
        }
    }
}

LinuxHwStats::~LinuxHwStats() = default;

HwStatsAnswer<HwStatsChannels> LinuxHwStats::copyChannelsInGroup(std::optional<std::string_view> group,
                                                                 std::optional<std::string_view> subGroup) {
    const HwStatsGroupName wanted{Part(group), Part(subGroup)};
    std::size_t sources = 0;
    const MutexLock lock(mutex_);
    for (const Group* known : groupsFor(wanted)) {
        sources += known->mayGiveFiles(wanted) ? 1U : 0U;
        sources += known->givesSources(wanted) ? known->sources.size() : 0;
    }
    return {std::make_shared<const Channels>(wanted, static_cast<std::int32_t>(sources)), std::nullopt};
}

std::vector<const LinuxHwStats::Group*> LinuxHwStats::groupsFor(const HwStatsGroupName& wanted) const {
    std::vector<const Group*> groups;
    for (const Group& group : groups_) {
        if (group.name == wanted) {
            return {&group};
        }
        groups.push_back(&group);
    }
    return groups;
}

std::int32_t LinuxHwStats::channelCount(const HwStatsChannels& channels) {
    const auto* const own = dynamic_cast<const Channels*>(&channels);
    return own == nullptr ? 0 : own->count;
}

HwStats::SubscriptionAnswer LinuxHwStats::createSubscription(const HwStatsChannels& channels) {
    const auto* const own = dynamic_cast<const Channels*>(&channels);
    if (own == nullptr) {
        return {nullptr, nullptr, HwStatsError{kStrangeObject}};
    }
    return {std::make_shared<const Subscription>(), std::make_shared<const Channels>(own->name, own->count),
            std::nullopt};
}

HwStatsAnswer<HwStatsSamples> LinuxHwStats::createSamples(const HwStatsSubscription& subscription,
                                                          const HwStatsChannels& subscribed) {
    const auto* const channels = dynamic_cast<const Channels*>(&subscribed);
    if (channels == nullptr || dynamic_cast<const Subscription*>(&subscription) == nullptr) {
        return {nullptr, HwStatsError{kStrangeObject}};
    }
    std::vector<std::string> faults;
    HwStatsAnswer<HwStatsSamples> answer = sample(channels->name, faults);
    for (const std::string& fault : faults) {
        complain_(fault);
    }
    return answer;
}

HwStatsAnswer<HwStatsSamples> LinuxHwStats::sample(const HwStatsGroupName& wanted, std::vector<std::string>& faults) {
    auto samples = std::make_shared<Samples>();
    std::optional<HwStatsError> error;
    const MutexLock lock(mutex_);
    samples->time = static_cast<std::uint64_t>(clock_.monotonicNow().time_since_epoch().count());
    const std::vector<const Group*> groups = groupsFor(wanted);
    sampleSystem(groups, wanted, *samples, faults);
    if (std::ranges::any_of(groups, [&](const Group* group) { return group->mayGiveFiles(wanted); })) {
        const auto isWanted = [&](const ChannelTable& table) {
            return isOf(table.group, table.subGroup, wanted) &&
                   std::ranges::any_of(groups, [&table](const Group* group) {
                       return group->hasChannelFiles && isOf(table.group, table.subGroup, group->name);
                   });
        };
        if (const std::optional<int> code = folder_.sample(isWanted, *samples)) {
            error = HwStatsError{*code};
            samples->incomplete = true;
        }
        for (const std::string& fault : folder_.takeFaults()) {
            faults.push_back(escapedText(channelFolder_) + "/" + fault);
        }
    }
    hwstats::addSuffixes(*samples);
    return {std::move(samples), error};
}

/// A start samples many drivers one after another. When one has waited for a file of the kernel that does not answer,
/// the others do not wait for it again: nothing is waited for, or logged, until that reading has ended.
void LinuxHwStats::sampleSystem(const std::vector<const Group*>& groups, const HwStatsGroupName& wanted,
                                Samples& samples, std::vector<std::string>& faults) {
    std::vector<hwstats::SystemSource*> sources;
    for (const Group* group : groups) {
        for (std::size_t i = 0; group->givesSources(wanted) && i < group->sources.size(); ++i) {
            sources.push_back(group->sources[i].get());
        }
    }
    if (sources.empty() || sampler_.isBusy() || sampler_.sample(sources, samples, systemWait_)) {
        return;
    }
    faults.push_back("the system's numbers for driver " + wanted.group.value_or("") + "-" +
                     wanted.subGroup.value_or("") + " were not read within " + std::to_string(systemWait_.count()) +
                     " ms: until they are, samplings are without any");
}

HwStatsAnswer<HwStatsSamples> LinuxHwStats::createSamplesDelta(const HwStatsSamples* previous,
                                                               const HwStatsSamples& current) {
    if (previous == nullptr) {
        return {nullptr, HwStatsError{kNoPreviousSamples}};
    }
    const auto* const before = dynamic_cast<const Samples*>(previous);
    const auto* const now = dynamic_cast<const Samples*>(&current);
    if (before == nullptr || now == nullptr) {
        return {nullptr, HwStatsError{kStrangeObject}};
    }
    return {hwstats::differenceOf(*before, *now), std::nullopt};
}

void LinuxHwStats::iterate(const HwStatsSamples& samples, UniqueFunction<int(const HwStatsChannel&)> use) {
    if (const auto* const own = dynamic_cast<const Samples*>(&samples)) {
        hwstats::iterateSamples(*own, use);
    }
}

} // namespace vela::platform
