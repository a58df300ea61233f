#include "backends/VelaReportingJouleUtility.h"

#include "backends/ApplicationName.h"
#include "common/VelaReportingLogCategories.h"
#include "common/VelaReportingVocabulary.h"

namespace vela {

namespace {

/// This service's number among the energy log's clients.
constexpr std::uint32_t kClientIdentifier = 28;

// Of messages, and of the events made from them.
const Key kEngineOnTime("EngineOnTime");
const Key kActiveHardwareTime("Haptic_Active_Hardware_Time_Seconds");
const Key kActiveClients("Active_Clients");
const Key kEngineOnDuration("EngineOnDuration");
const Key kApplicationName("ApplicationName");
const Key kTimestampEnd("TimestampEnd");

Dictionary engineUsage(const Dictionary& message, const VelaReportingSession* session) {
    DictionaryBuilder payload;
    payload.add(kEngineOnDuration, Value(message.find(kEngineOnTime)));
    if (Value applicationName = applicationNameOf(session)) {
        payload.add(kApplicationName, std::move(applicationName));
    } else {
        VelaReportingJouleCategory().error("failed to get app name for joule");
    }
    if (const ValueRef timestamp = message.find(VelaReportingMessageKeyVelaTimestamp)) {
        payload.add(kTimestampEnd, Value(timestamp));
    } else {
        VelaReportingJouleCategory().error("failed to get VelaReporting timestamp for joule");
    }
    return payload.build();
}

Dictionary leakedSession(const Dictionary& message) {
    DictionaryBuilder payload;
    payload.add(kActiveHardwareTime, Value(message.find(kActiveHardwareTime)));
    if (const ValueRef activeClients = message.find(kActiveClients)) {
        payload.add(kActiveClients, Value(activeClients));
    }
    return payload.build();
}

} // namespace

void VelaReportingJouleUtility::handleEvent(const Dictionary& message, std::uint32_t /*category*/, std::uint32_t type,
                                            const std::shared_ptr<VelaReportingSession>& session) {
    if (type != AudioEventTypeJoule) {
        return;
    }
    if (message.contains(kEngineOnTime)) {
        joule_.jouleLogRegisteredEvent(kClientIdentifier, "Lumen_Haptics", engineUsage(message, session.get()), {});
    } else if (message.contains(kActiveHardwareTime)) {
        joule_.jouleLogRegisteredEvent(kClientIdentifier, "LeakedHapticsSessionInfo", leakedSession(message), {});
    }
}

} // namespace vela
