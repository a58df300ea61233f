// How long a client was connected, told to the log and to the analytics service. A free function, callable from any
// thread.
#pragma once

#include "platform/Clock.h"
#include "service/VelaReportingServiceContext.h"

#include <cstdint>
#include <optional>
#include <string>

namespace vela {

/// The end of the connection of process `pid`. `startDate` and `processName` are none where the client was not
/// registered yet; without a start the uptime is -1 second, without a name no event is sent.
void VelaReportingSendClientUptime(const VelaReportingServiceContext& context, std::int32_t pid,
                                   const std::optional<platform::WallTime>& startDate,
                                   const std::optional<std::string>& processName);

} // namespace vela
