// What the service takes from outside, and what its delegate and its client instances share of it. Immutable once made.
#pragma once

#include "platform/Platform.h"
#include "session/VelaReportingSession.h"

#include <memory>
#include <string>
#include <utility>

namespace vela {

/// What the composition root hands down. All that it refers to outlives every session and whatever that has queued.
struct VelaReportingServicePlatform {
    const platform::Platform& platform;
    std::string pathRoot{};                       ///< what absolute paths stand under; empty for "/"
    VelaReportingSessionMemory* memory = nullptr; ///< bounds what sessions keep; null for no bounds
    DeliveryLedger* ledger = nullptr;             ///< counts what becomes of deliveries; null where nobody asks
};

/// Held by the delegate and by every client instance, whose sessions refer to it. What those sessions have queued, and
/// payloads that the analytics service has not built yet, refer to it as well: a program that does not wait for their
/// end ends without letting the service go.
struct VelaReportingServiceContext {
    using EventHandler = std::unique_ptr<VelaReportingSessionEventHandler>;

    VelaReportingServiceContext(const VelaReportingServicePlatform& servicePlatform, EventHandler tally,
                                EventHandler joule, EventHandler telem)
        : platform(servicePlatform.platform),
          tallyBridge(std::move(tally)),
          jouleUtility(std::move(joule)),
          telemBridge(std::move(telem)),
          tracePlatform{platform.deviceProperties,
                        platform.probe,
                        platform.propertyListReading,
                        {platform.fileSystem, platform.metricsheet, platform.processControl, platform.spoor,
                         platform.workQueues, servicePlatform.pathRoot}},
          sessionPlatform{platform.beacon,        platform.clock,         platform.fileSystem, platform.jsonWriting,
                          platform.spoor,         platform.workQueues,    *tallyBridge,        servicePlatform.pathRoot,
                          servicePlatform.memory, servicePlatform.ledger, &tracePlatform} {}
    VelaReportingServiceContext(const VelaReportingServiceContext&) = delete;
    VelaReportingServiceContext& operator=(const VelaReportingServiceContext&) = delete;
    ~VelaReportingServiceContext() = default;

    const platform::Platform platform;
    // In the order in which a message visits them.
    const EventHandler tallyBridge;
    const EventHandler jouleUtility;
    const EventHandler telemBridge;
    const VelaReportingTracePlatform tracePlatform;
    const VelaReportingSessionPlatform sessionPlatform;
};

} // namespace vela
