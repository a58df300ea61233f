#include "cli/MessageTimes.h"

#include "common/VelaReportingVocabulary.h"
#include "common/values/Dictionary.h"
#include "platform/dbus/Protocol.h"

#include <chrono>
#include <cmath>

namespace vela {

namespace {

using Seconds = std::chrono::duration<double>;

} // namespace

void addMessageTimes(const Operation& operation, std::vector<Value>& arguments, const platform::Clock& clock,
                     platform::MonotonicTime processStart) {
    if (operation.name != platform::dbus::kSendMessage || arguments.empty() || !arguments[0].ref().isDictionary()) {
        return;
    }
    Dictionary message = arguments[0].ref().dictionary();
    const auto add = [&message](const Key& key, const Value& value) {
        if (!message.contains(key)) {
            message = message.setting(key, value);
        }
    };
    add(VelaReportingInternalEventEpochTime, Seconds(clock.now().time_since_epoch()).count());
    add(VelaReportingInternalEventSystemUptimeSec, std::lround(Seconds(clock.systemUptime()).count()));
    const auto uptime = clock.monotonicNow() - processStart;
    add(VelaReportingInternalEventProcessUptimeMs,
        std::chrono::duration_cast<std::chrono::milliseconds>(uptime).count());
    arguments[0] = std::move(message);
}

} // namespace vela
