// What stands in for the facilities that this device does not have, so that the service runs as it would where they
// are there and answer "no". Each says how its "no" looks. Thread-safe; nothing is kept.
#pragma once

#include "platform/Beacon.h"
#include "platform/HwStats.h"
#include "platform/Joule.h"
#include "platform/Malady.h"
#include "platform/Metricsheet.h"
#include "platform/Probe.h"
#include "platform/Spoor.h"
#include "platform/Tally.h"
#include "platform/Telem.h"
#include "platform/WorkQueue.h"

#include <array>
#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <string_view>

namespace vela::platform {

/// Sessions whose discovery finds no back end, inside the call. Every send fails with ENOTSUP.
class AbsentBeacon final : public Beacon {
public:
    Value newBeaconHierarchyToken(ValueRef parent) override;
    std::shared_ptr<BeaconSession> createBeaconSession(const Dictionary& sessionInfo,
                                                       const Dictionary& userInfo) override;
    Result<Done> sendOneBeaconMessage(const Dictionary& sessionInfo, const Dictionary& userInfo, std::uint16_t category,
                                      std::uint16_t type, const Dictionary& payload) override;
};

/// Nobody uses any event; a payload is destroyed unbuilt.
class AbsentTally final : public Tally {
public:
    bool tallyIsEventUsed(std::string_view) override { return false; }
    void tallySendEventLazy(std::string_view, UniqueFunction<Dictionary()>, std::size_t) override {}
    using Tally::tallySendEventLazy;
};

/// Events are dropped.
class AbsentJoule final : public Joule {
public:
    void jouleLogRegisteredEvent(std::uint32_t, std::string_view, const Dictionary&, const Dictionary&) override {}
};

/// Records are dropped.
class AbsentTelem final : public Telem {
public:
    void telemPostMetric(std::uint32_t, std::string_view, const Dictionary&) override {}
};

/// Reporters whose snapshots are answered, inside the call, by `{success = 0; error = "..."}`.
class AbsentMalady final : public Malady {
public:
    std::unique_ptr<MaladyReporter> createReporter() override;
};

/// Every group is there and has no channels. Nothing can be subscribed to or sampled.
class AbsentHwStats final : public HwStats {
public:
    HwStatsAnswer<HwStatsChannels> copyChannelsInGroup(std::optional<std::string_view> group,
                                                       std::optional<std::string_view> subGroup) override;
    std::int32_t channelCount(const HwStatsChannels& channels) override;
    SubscriptionAnswer createSubscription(const HwStatsChannels& channels) override;
    HwStatsAnswer<HwStatsSamples> createSamples(const HwStatsSubscription& subscription,
                                                const HwStatsChannels& subscribed) override;
    HwStatsAnswer<HwStatsSamples> createSamplesDelta(const HwStatsSamples* previous,
                                                     const HwStatsSamples& current) override;
    void iterate(const HwStatsSamples& samples, UniqueFunction<int(const HwStatsChannel&)> use) override;
};

/// Sessions that cannot start: ENOTSUP. Their end is complete all the same, for those who wait for it. Events that are
/// emitted go nowhere.
class AbsentSpoor final : public Spoor {
public:
    using Spoor::emit;
    std::unique_ptr<SpoorSession> createSession() override;
    void emit(std::uint32_t, const std::array<std::uint64_t, 4>&) override {}
};

/// Traces that fail to start: the delegate is told of the failed start and, as somebody may wait for it, of the end, in
/// one item of `queue`, which outlives this and its sessions.
class AbsentProbe final : public Probe {
public:
    explicit AbsentProbe(WorkQueue& queue) : queue_(queue) {}
    std::shared_ptr<ProbeTraceConfig> makeProbeTraceConfig(int templateNumber) override;
    std::shared_ptr<ProbeTraceSession> createProbeTraceSession(const ProbeTraceConfig& config) override;

private:
    WorkQueue& queue_;
};

/// No file can be opened.
class AbsentMetricsheet final : public Metricsheet {
public:
    std::unique_ptr<MetricsheetWriter> openWriter(const std::string&, std::string_view, std::uint32_t) override {
        return nullptr;
    }
};

} // namespace vela::platform
