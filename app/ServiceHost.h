// The running service: puts the service room on this device's bindings, and serves. One for the process, which ends
// when `serve` has returned: what sessions left queued then must find everything here still alive.
#pragma once

#include "app/DeliveryBackends.h"
#include "app/ServicePlatform.h"
#include "common/DeliveryLedger.h"
#include "common/Settings.h"
#include "common/VelaReportingUtility.h"
#include "platform/Ipc.h"
#include "platform/dbus/AccessRule.h"
#include "platform/dbus/ServiceEndpoint.h"
#include "platform/hwstats/LinuxHwStats.h"
#include "platform/linux/LinuxMetricsheet.h"
#include "platform/linux/LinuxProcessControl.h"
#include "platform/linux/ServiceManager.h"
#include "platform/perf/PerfProbe.h"
#include "platform/spoor/LinuxSpoor.h"
#include "service/VelaReportingServiceDelegate.h"

#include <memory>
#include <string>

namespace vela {

class ServiceHost {
public:
    /// All three outlive it.
    ServiceHost(const Settings& settings, ServicePlatform& servicePlatform, platform::ServiceManager& manager);
    ServiceHost(const ServiceHost&) = delete;
    ServiceHost& operator=(const ServiceHost&) = delete;

    /// Serves until the process is told to end, then commits what was delivered; no session is stopped. Fails when it
    /// cannot begin.
    platform::Result<platform::Done> serve();

private:
    platform::Platform facilities(DeliveryBackends& backends);
    platform::Result<std::unique_ptr<platform::DbusServiceEndpoint>> openEndpoint();
    platform::DbusServiceOptions endpointOptions();
    void handleWhatIsQueued();

    const Settings& settings_;
    ServicePlatform& platform_;
    platform::ServiceManager& manager_;
    const std::string pathRoot_; ///< empty for "/"
    const platform::dbus::AccessRule access_;
    const VelaReportingBuildType buildType_;
    DeliveryLedger ledger_;
    VelaReportingSessionMemory memory_;
    platform::LinuxHwStats hwStats_;
    platform::LinuxSpoor spoor_;
    platform::PerfProbe probe_;
    platform::LinuxProcessControl processControl_;
    platform::LinuxMetricsheet metricsheet_;
    std::unique_ptr<DeliveryBackends> backends_;
    std::unique_ptr<platform::Platform> facilities_;
    std::shared_ptr<VelaReportingServiceDelegate> delegate_;
};

} // namespace vela
