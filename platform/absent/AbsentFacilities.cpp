#include "platform/absent/AbsentFacilities.h"

#include "platform/Mutex.h"

#include <cerrno>
#include <utility>

namespace vela::platform {

namespace {

Failure absence(std::string_view facility) { return {ENOTSUP, "this device has no " + std::string(facility)}; }

class AbsentBeaconSession final : public BeaconSession {
public:
    void startBeaconBackendDiscovery(UniqueFunction<void(std::optional<Array> backends)> completion) override {
        if (completion) {
            completion(std::nullopt);
        }
    }
    Result<Done> sendBeaconMessage(std::uint16_t, std::uint16_t, const Dictionary&) override {
        return absence("Beacon");
    }
    void flushBeaconMessages() override {}
    std::string description() const override { return "no Beacon"; }
};

class AbsentMaladyReporter final : public MaladyReporter {
public:
    void requestSnapshot(const MaladySignature&, double, std::optional<Dictionary>, std::optional<Dictionary>,
                         UniqueFunction<void(const Dictionary&)> reply) override {
        if (reply) {
            reply(Dictionary{{"success", false}, {"error", std::string_view(absence("Malady reporter").description)}});
        }
    }
};

class NoChannels final : public HwStatsChannels {};

class AbsentSpoorSession final : public SpoorSession {
public:
    void setCompletionHandler(UniqueFunction<void()> handler) override { completion_ = std::move(handler); }
    void setWallTimesEnabled(bool) override {}
    int eventsRange(std::uint32_t, std::uint32_t, UniqueFunction<void(const SpoorEvent&)>) override { return 0; }
    int start(SerialQueue& queue) override {
        queue_ = &queue;
        return ENOTSUP;
    }
    int end() override {
        if (queue_ == nullptr) {
            return ENOTSUP; // nobody tried to start it: there is no queue to complete on
        }
        if (completion_) {
            queue_->post([handler = std::exchange(completion_, {})]() mutable { handler(); });
        }
        return 0;
    }
    std::uint64_t nanoseconds(std::uint64_t timestamp) const override { return timestamp; }
    std::uint64_t lostEvents() const override { return 0; }

private:
    SerialQueue* queue_ = nullptr; ///< where the start was tried
    UniqueFunction<void()> completion_;
};

class AbsentProbeTraceSession final : public ProbeTraceSession {
public:
    explicit AbsentProbeTraceSession(WorkQueue& queue) : queue_(queue) {}

    void setDelegate(std::weak_ptr<ProbeTraceDelegate> delegate) override {
        const MutexLock lock(state_->mutex);
        state_->delegate = std::move(delegate);
    }
    void startProbeTrace() override {
        queue_.post([state = state_] {
            const Failure failure = absence("performance-trace service");
            if (const auto delegate = state->lockDelegate()) {
                delegate->performanceTraceDidStart(failure);
            }
            // Asked again: the delegate may have been taken off.
            if (const auto delegate = state->lockDelegate()) {
                delegate->performanceTraceDidComplete({}, {}, failure);
            }
        });
    }
    void stopProbeTrace() override {}

private:
    struct State {
        std::shared_ptr<ProbeTraceDelegate> lockDelegate() {
            const MutexLock lock(mutex);
            return delegate.lock();
        }

        Mutex mutex;
        std::weak_ptr<ProbeTraceDelegate> delegate VELA_GUARDED_BY(mutex);
    };

    WorkQueue& queue_;
    const std::shared_ptr<State> state_ = std::make_shared<State>();
};

} // namespace

// Stands in dictionaries, so it is a value.
Value AbsentBeacon::newBeaconHierarchyToken(ValueRef) { return "no Beacon"; }

std::shared_ptr<BeaconSession> AbsentBeacon::createBeaconSession(const Dictionary&, const Dictionary&) {
    return std::make_shared<AbsentBeaconSession>();
}

Result<Done> AbsentBeacon::sendOneBeaconMessage(const Dictionary&, const Dictionary&, std::uint16_t, std::uint16_t,
                                                const Dictionary&) {
    return absence("Beacon");
}

std::unique_ptr<MaladyReporter> AbsentMalady::createReporter() { return std::make_unique<AbsentMaladyReporter>(); }

HwStatsAnswer<HwStatsChannels> AbsentHwStats::copyChannelsInGroup(std::optional<std::string_view>,
                                                                  std::optional<std::string_view>) {
    return {std::make_shared<NoChannels>(), std::nullopt};
}

std::int32_t AbsentHwStats::channelCount(const HwStatsChannels&) { return 0; }

HwStats::SubscriptionAnswer AbsentHwStats::createSubscription(const HwStatsChannels&) {
    return {nullptr, nullptr, HwStatsError{ENOTSUP}};
}

HwStatsAnswer<HwStatsSamples> AbsentHwStats::createSamples(const HwStatsSubscription&, const HwStatsChannels&) {
    return {nullptr, HwStatsError{ENOTSUP}};
}

HwStatsAnswer<HwStatsSamples> AbsentHwStats::createSamplesDelta(const HwStatsSamples*, const HwStatsSamples&) {
    return {nullptr, HwStatsError{ENOTSUP}};
}

void AbsentHwStats::iterate(const HwStatsSamples&, UniqueFunction<int(const HwStatsChannel&)>) {}

std::unique_ptr<SpoorSession> AbsentSpoor::createSession() { return std::make_unique<AbsentSpoorSession>(); }

std::shared_ptr<ProbeTraceConfig> AbsentProbe::makeProbeTraceConfig(int) {
    return std::make_shared<ProbeTraceConfig>();
}

std::shared_ptr<ProbeTraceSession> AbsentProbe::createProbeTraceSession(const ProbeTraceConfig&) {
    return std::make_shared<AbsentProbeTraceSession>(queue_);
}

} // namespace vela::platform
