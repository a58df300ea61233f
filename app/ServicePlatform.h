// The bindings that the service stands on, built from its settings. Made before any thread and destroyed after the last
// line was logged: it owns the log's destination and the threads of the queues.
#pragma once

#include "app/ServiceCheck.h"
#include "common/Settings.h"
#include "platform/Log.h"
#include "platform/linux/LinuxJsonWriting.h"
#include "platform/linux/LinuxProcessInformation.h"
#include "platform/linux/LinuxWorkQueues.h"
#include "platform/plist/PropertyListCodec.h"

#include <memory>
#include <string>

namespace vela {

class ServicePlatform {
public:
    explicit ServicePlatform(const Settings& settings);
    ~ServicePlatform();
    ServicePlatform(const ServicePlatform&) = delete;
    ServicePlatform& operator=(const ServicePlatform&) = delete;

    CheckedParts parts() { return {queues_, processes_, propertyLists_, json_}; }

    /// What this machine offers to a service with these settings.
    CheckedFacts facts(const Settings& settings) const;

private:
    std::string logFailure_; ///< why there is no journal although the settings ask for it
    const std::unique_ptr<platform::LogSink> log_;
    platform::LinuxProcessInformation processes_;
    platform::PropertyListCodec propertyLists_;
    platform::LinuxJsonWriting json_;
    platform::LinuxWorkQueues queues_; ///< last: its items use the others
};

} // namespace vela
