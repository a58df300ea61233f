// The bindings that the service stands on, built from its settings. Made before any thread and destroyed after the last
// line was logged: it owns the log's destination and the threads of the queues.
#pragma once

#include "app/RecentLog.h"
#include "app/ServiceCheck.h"
#include "common/Settings.h"
#include "platform/Log.h"
#include "platform/host/SettingsDeviceProperties.h"
#include "platform/linux/LinuxClock.h"
#include "platform/linux/LinuxFileSystem.h"
#include "platform/linux/LinuxJsonWriting.h"
#include "platform/linux/LinuxNotifications.h"
#include "platform/linux/LinuxPreferences.h"
#include "platform/linux/LinuxProcessInformation.h"
#include "platform/linux/LinuxWorkQueues.h"
#include "platform/plist/PropertyListCodec.h"

#include <memory>
#include <string>
#include <vector>

namespace vela {

class ServicePlatform {
public:
    /// `settings` outlives it.
    explicit ServicePlatform(const Settings& settings);
    ~ServicePlatform();
    ServicePlatform(const ServicePlatform&) = delete;
    ServicePlatform& operator=(const ServicePlatform&) = delete;

    CheckedParts parts() { return {queues_, processes_, propertyLists_, json_}; }

    platform::LinuxClock& clock() { return clock_; }
    platform::SettingsDeviceProperties& deviceProperties() { return deviceProperties_; }
    platform::LinuxFileSystem& fileSystem() { return fileSystem_; }
    platform::LinuxJsonWriting& json() { return json_; }
    platform::LinuxNotifications& notifications() { return notifications_; }
    platform::LinuxPreferences& preferences() { return preferences_; }
    platform::LinuxProcessInformation& processes() { return processes_; }
    platform::PropertyListCodec& propertyLists() { return propertyLists_; }
    platform::LinuxWorkQueues& queues() { return queues_; }

    /// The last lines of the log; none but on internal builds.
    std::vector<std::string> recentLog() const;

    /// What this machine offers to a service with these settings.
    CheckedFacts facts(const Settings& settings) const;

private:
    std::string logFailure_;         ///< why there is no journal although the settings ask for it
    RecentLog* recentLog_ = nullptr; ///< the log's destination, where lines are kept
    const std::unique_ptr<platform::LogSink> log_;
    platform::LinuxClock clock_;
    platform::LinuxFileSystem fileSystem_;
    platform::LinuxProcessInformation processes_;
    platform::PropertyListCodec propertyLists_;
    platform::LinuxJsonWriting json_;
    platform::SettingsDeviceProperties deviceProperties_;
    platform::LinuxPreferences preferences_;
    platform::LinuxWorkQueues queues_;           ///< behind the above, which its items use
    platform::LinuxNotifications notifications_; ///< posts to queues
};

} // namespace vela
