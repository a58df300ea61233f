// The service: takes connections, keeps the registry of clients, finds sessions across all of them, and owns what they
// share: the reporting queue, the bridges, the drivers' sampler, issue capture and the table of features.
//
// Thread-safe: connections come and end on the endpoint's threads; the reporting queue alone changes the registry. One
// for the process. The listener is to be started after `init` returned.
#pragma once

#include "backends/VelaReportingUtilitySnagStateManager.h"
#include "driverstats/VelaReportingDriverUtility.h"
#include "platform/Ipc.h"
#include "platform/Mutex.h"
#include "service/VelaReportingServiceContext.h"
#include "service/VelaReportingServiceDelegateProtocol.h"

#include <atomic>
#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <vector>

namespace vela {

class VelaReportingServiceDelegate final : public VelaReportingServiceDelegateProtocol,
                                           public platform::IpcListenerDelegate,
                                           public platform::ServiceInspection,
                                           public std::enable_shared_from_this<VelaReportingServiceDelegate> {
    struct Private {
        explicit Private() = default;
    };

public:
    /// What `servicePlatform` refers to outlives the delegate, every session and whatever these have queued.
    static std::shared_ptr<VelaReportingServiceDelegate> init(const VelaReportingServicePlatform& servicePlatform);
    VelaReportingServiceDelegate(Private, const VelaReportingServicePlatform& servicePlatform);
    ~VelaReportingServiceDelegate() override;
    VelaReportingServiceDelegate(const VelaReportingServiceDelegate&) = delete;
    VelaReportingServiceDelegate& operator=(const VelaReportingServiceDelegate&) = delete;

    // The endpoint.

    /// Always true.
    bool shouldAcceptNewConnection(const std::shared_ptr<platform::IpcConnection>& connection) override;

    /// For every session, in the registry's order: "reporterID", "serviceType", "serviceName", "owner" (pid), "process"
    /// (its name, where known), "application" (where the configuration names one), "started", "beaconReportingEnabled",
    /// "messages" (how many it keeps). Waits for no queue and for no session's work.
    Array sessions() const override;
    /// Empty where nothing is counted.
    Dictionary ledger() const override;

    // Client instances.

    platform::SerialQueue& reportingQueue() const override { return *reportingQueue_; }
    Sessions getAllActiveReportingSessions() const override;
    std::shared_ptr<VelaReportingSession> findReportingSessionForID(std::int64_t reporterID) const override;
    const Clients& getAllClients() const override;
    void removeClient(const VelaReportingClientServerInstance& client) override;
    const Dictionary& getDefaults() const override { return defaults_; }
    bool isReportingEnabled() const override { return reportingEnabled_; }
    std::uint64_t activeSessionCount() const override;
    void setActiveSessionCount(std::uint64_t count) override;
    VelaReportingDriverSnapShot getSnapShot() const override;
    void sendDriverLogsForSession(const std::shared_ptr<VelaReportingSession>& session) const override;
    std::optional<Dictionary> getFeaturesState() const override;
    void listenForFeatureStateChanges() override;
    void handleEventForSnag(const Dictionary& message, std::uint32_t category, std::uint32_t type,
                            const std::shared_ptr<VelaReportingSession>& session,
                            const std::optional<std::string>& processName) override;

    // Properties.

    /// True from `init` on; the service never clears it.
    void setReportingEnabled(bool enabled) { reportingEnabled_ = enabled; }
    /// The feature table: three dictionaries (service/FeatureKeys.h), with the tokens of their registrations. Any
    /// thread.
    Array features() const;
    /// Null but on internal builds. For the reporting queue.
    const VelaReportingUtilitySnagStateManager* snagStateManager() const { return snagStateManager_.get(); }

private:
    using Features = std::vector<Dictionary>;

    void initialise();
    /// `connection`: none when it is gone already.
    void registerClient(const std::shared_ptr<VelaReportingClientServerInstance>& client,
                        const std::shared_ptr<platform::IpcConnection>& connection);
    static void installHandlers(const std::shared_ptr<platform::IpcConnection>& connection,
                                const std::shared_ptr<VelaReportingClientServerInstance>& client,
                                const std::shared_ptr<const VelaReportingServiceContext>& context);
    void featureChanged(std::int32_t token) const;
    Features featureTable() const;
    Clients clients() const;

    // Constant after construction.
    const std::shared_ptr<const VelaReportingServiceContext> context_;

    // Written by `init` before the first connection, and only read afterwards.
    Dictionary defaults_;
    std::unique_ptr<VelaReportingDriverUtility> driverUtility_;
    std::unique_ptr<VelaReportingUtilitySnagStateManager> snagStateManager_; // used on the reporting queue

    std::atomic<bool> reportingEnabled_ = false;

    // Confined to the reporting queue.
    std::uint64_t activeSessionCount_ = 0;

    // Guards the registry, which only the reporting queue changes, and the making of a client instance. Recursive: what
    // is called inside may look a session up. Never held while a session starts, stops or sends.
    mutable RecursiveMutex lock_;
    Clients clients_ VELA_GUARDED_BY(lock_);

    mutable Mutex featuresMutex_;
    Features features_ VELA_GUARDED_BY(featuresMutex_);
    std::vector<std::int32_t> notifyTokens_; ///< registrations that worked; for the making and the end

    // Destroyed first: its items refer to the members above.
    const std::unique_ptr<platform::SerialQueue> reportingQueue_;
};

} // namespace vela
