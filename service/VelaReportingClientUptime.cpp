#include "service/VelaReportingClientUptime.h"

#include "service/ServiceLog.h"

#include <chrono>
#include <cmath>
#include <string_view>

namespace vela {

namespace {

constexpr std::string_view kUptimeEvent = "com.orvex.vela.velareportingclientuptime";
const Key kProcessName("processName");
const Key kSeconds("seconds");

double uptimeSeconds(const VelaReportingServiceContext& context, std::int32_t pid,
                     const std::optional<platform::WallTime>& startDate,
                     const std::optional<std::string>& processName) {
    const platform::WallTime now = context.platform.clock.now();
    const std::string_view shownName = processName ? std::string_view(*processName) : "unknown";
    if (!startDate) {
        serviceLog().standard("clientStartDate is nil. clientpid=%d clientprocessname=%@", pid, shownName);
        return -1;
    }
    const double seconds = std::chrono::duration<double>(now - *startDate).count();
    if (*startDate > now) {
        // "in the past" of a start that lies ahead: the wording is wanted.
        serviceLog().standard("clientStartDate is in the past. clientpid=%d clientprocessname=%@", pid, shownName);
    }
    return std::abs(seconds);
}

} // namespace

void VelaReportingSendClientUptime(const VelaReportingServiceContext& context, std::int32_t pid,
                                   const std::optional<platform::WallTime>& startDate,
                                   const std::optional<std::string>& processName) {
    const double uptime = uptimeSeconds(context, pid, startDate, processName);
    serviceLog().standard("invalidationHandler: connection exited process=%@ uptime_sec=%d", processName,
                          static_cast<std::int64_t>(uptime));
    if (!processName) {
        serviceLog().standard("clientProcessName is nil. clientpid=%d", pid);
        return;
    }
    context.platform.tally.tallySendEventLazy(kUptimeEvent, [name = Value(std::string_view(*processName)), uptime] {
        DictionaryBuilder payload;
        payload.add(kProcessName, name);
        payload.add(kSeconds, uptime);
        return payload.build();
    });
}

} // namespace vela
