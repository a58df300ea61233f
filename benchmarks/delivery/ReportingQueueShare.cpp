// What a message costs the reporting queue alone. The service stands on the real queues. The reporting queue is held
// while messages are posted; then one thread of the pool runs them in one turn, between two looks at its processor
// time.
#include "benchmarks/SessionBench.h"
#include "benchmarks/delivery/Peer.h"
#include "common/VelaReportingLogCategories.h"
#include "common/VelaReportingUtility.h"
#include "platform/absent/AbsentFacilities.h"
#include "platform/host/SettingsDeviceProperties.h"
#include "platform/linux/LinuxProcessControl.h"
#include "platform/linux/LinuxProcessInformation.h"
#include "service/VelaReportingClientServerInstance.h"
#include "service/VelaReportingServiceDelegate.h"
#include "testing/RunningProgram.h"

#include <algorithm>
#include <array>

namespace vela::deliverybench {

namespace {

constexpr std::int64_t kReporter = 42;

/// The first queue that is made is the reporting queue.
class BenchQueues final : public platform::WorkQueues {
public:
    platform::SerialQueue& reportingQueue() { return *reportingQueue_; }

    std::unique_ptr<platform::SerialQueue> makeSerialQueue(std::string_view name,
                                                           platform::QualityOfService quality) override {
        auto queue = queues_.makeSerialQueue(name, quality);
        reportingQueue_ = reportingQueue_ == nullptr ? queue.get() : reportingQueue_;
        return queue;
    }
    platform::WorkQueue& background() override { return queues_.background(); }
    std::unique_ptr<platform::Semaphore> makeSemaphore(std::uint32_t initial) override {
        return queues_.makeSemaphore(initial);
    }
    std::unique_ptr<platform::Condition> makeCondition() override { return queues_.makeCondition(); }
    void beginBlocking() override { queues_.beginBlocking(); }
    void endBlocking() override { queues_.endBlocking(); }

private:
    platform::LinuxWorkQueues queues_;
    platform::SerialQueue* reportingQueue_ = nullptr;
};

struct NoNotifications final : platform::Notifications {
    platform::NotificationRegistration registerForNotification(std::string_view, platform::WorkQueue&,
                                                               platform::UniqueFunction<void(std::int32_t)>) override {
        return {.status = 1};
    }
    std::optional<std::uint64_t> state(std::int32_t) const override { return std::nullopt; }
    void cancel(std::int32_t) override {}
};

struct NoPreferences final : platform::Preferences {
    Value copyValue(std::string_view, std::string_view) const override { return {}; }
};

struct NoPropertyLists final : platform::PropertyListReading {
    platform::Result<Value> read(std::string_view, const platform::PropertyListLimits&) const override {
        return platform::Failure{};
    }
    platform::Result<std::string> write(ValueRef, platform::PropertyListFormat) const override {
        return platform::Failure{};
    }
};

struct DiscardingLog final : platform::LogSink {
    DiscardingLog() { setLogDestination(this, platform::LogLevel::Default); }
    ~DiscardingLog() override { setLogDestination(nullptr, platform::LogLevel::Error); }
    DiscardingLog(const DiscardingLog&) = delete;
    DiscardingLog& operator=(const DiscardingLog&) = delete;
    void write(const platform::LogRecord&) override {}
    std::uint64_t lost() const override { return 0; }
};

/// A client that keeps what the service exports to it.
struct LocalConnection final : platform::IpcConnection {
    std::shared_ptr<platform::ReportingServiceProtocol> exported;

    std::int32_t processIdentifier() const override { return getpid(); }
    bool confirmProcess() const override { return true; }
    std::optional<platform::Identity> peerIdentity() const override { return std::nullopt; }
    void setExportedObject(std::shared_ptr<platform::ReportingServiceProtocol> object) override {
        exported = std::move(object);
    }
    void setInterruptionHandler(platform::UniqueFunction<void()>) override {}
    void setInvalidationHandler(platform::UniqueFunction<void()>) override {}
    void resume() override {}
    std::string description() const override { return "local"; }
};

/// The service with one client and its started session. Back ends discard what they get, no event has a consumer.
class QueueBench {
public:
    QueueBench() : delegate_(VelaReportingServiceDelegate::init({platform_, "", &memory_, &ledger_})) {
        delegate_->shouldAcceptNewConnection(connection_);
        const auto ignore = [](const auto&...) {};
        client().createReportingSession(kReporter, ignore);
        client().setServiceType(AudioServiceTypeHaptics, kReporter, ignore);
        client().startReportingSessionForID(kReporter, nullptr, ignore);
        finishQueue();
        const auto session = delegate_->findReportingSessionForID(kReporter);
        require(session != nullptr &&
                    testing::waitUntil([&session] { return session->getBeaconReportingStartedState().load(); }),
                "the session does not start");
    }

    /// Processor seconds of the reporting queue for so many messages, fewer than a turn has; `number` is that of the
    /// first.
    double send(std::int64_t number, std::size_t messages) {
        platform::SerialQueue& queue = queues_.reportingQueue();
        double before = 0;
        double after = 0;
        queue.suspend();
        queue.post([&before] { before = threadSeconds(); });
        for (std::size_t count = 0; count < messages; ++count) {
            client().sendMessage(benchMessage(number++), AudioEventCategoryPlayback, AudioEventTypeState,
                                 std::vector{kReporter}, [](const auto&...) {});
        }
        queue.post([&after] { after = threadSeconds(); });
        queue.resume();
        finishQueue();
        return after - before;
    }
    std::uint64_t sent() const { return beacon_.sent; }

private:
    platform::ReportingServiceProtocol& client() { return *connection_->exported; }
    void finishQueue() {
        const auto done = std::shared_ptr<platform::Semaphore>(queues_.makeSemaphore(0));
        queues_.reportingQueue().post([done] { done->signal(); });
        done->wait(std::nullopt);
    }

    DiscardingLog log_;
    DiscardingBeacon beacon_;
    platform::LinuxClock clock_;
    Settings settings_;
    platform::SettingsDeviceProperties device_{settings_};
    VelaReportingBuildType buildType_{device_};
    platform::LinuxFileSystem fileSystem_;
    platform::AbsentHwStats hwStats_;
    platform::AbsentJoule joule_;
    platform::LinuxJsonWriting json_;
    platform::AbsentMalady malady_;
    platform::AbsentMetricsheet metricsheet_;
    NoNotifications notifications_;
    NoPreferences preferences_;
    platform::LinuxProcessControl processControl_;
    platform::LinuxProcessInformation processes_;
    NoPropertyLists propertyLists_;
    DiscardingSpoor spoor_;
    platform::AbsentTally tally_;
    platform::AbsentTelem telem_;
    DeliveryLedger ledger_{getpid()};
    VelaReportingSessionMemory memory_{{std::uint64_t{4} << 30U, std::uint64_t{8} << 30U}};
    BenchQueues queues_;
    platform::AbsentProbe probe_{queues_.background()};
    const platform::Platform platform_{beacon_,      clock_, device_,         fileSystem_,  hwStats_,
                                       joule_,       json_,  malady_,         metricsheet_, notifications_,
                                       preferences_, probe_, processControl_, processes_,   propertyLists_,
                                       spoor_,       tally_, telem_,          queues_};
    const std::shared_ptr<LocalConnection> connection_ = std::make_shared<LocalConnection>();
    const std::shared_ptr<VelaReportingServiceDelegate> delegate_;
};

} // namespace

double reportingQueueShare() {
    constexpr std::size_t kRounds = 5;
    constexpr std::size_t kBatch = 60;
    constexpr std::size_t kBatches = 400;
    std::array<double, kRounds> shares{};
    QueueBench bench;
    std::int64_t number = 0;
    for (double& share : shares) {
        double seconds = 0;
        for (std::size_t batch = 0; batch < kBatches; ++batch) {
            seconds += bench.send(number, kBatch);
            number += static_cast<std::int64_t>(kBatch);
        }
        share = seconds / static_cast<double>(kBatch * kBatches);
    }
    const auto sent = static_cast<std::uint64_t>(number);
    require(testing::waitUntil([&] { return bench.sent() == sent; }), "not every message reached its back end");
    std::sort(shares.begin(), shares.end());
    return shares[kRounds / 2];
}

} // namespace vela::deliverybench
