#include "backends/VelaReportingTallyBridge.h"

#include "backends/ApplicationName.h"
#include "common/VelaReportingUtility.h"

#include <string>

namespace vela {

namespace {

/// What the client says about its application wins over its configuration.
Dictionary payloadOf(const Dictionary& message, const VelaReportingSession* session) {
    if (message.contains(VelaReportingApplicationName)) {
        return message;
    }
    Value applicationName = applicationNameOf(session);
    return applicationName ? message.setting(VelaReportingApplicationName, std::move(applicationName)) : message;
}

} // namespace

void VelaReportingTallyBridge::handleEvent(const Dictionary& message, std::uint32_t category, std::uint32_t type,
                                           const std::shared_ptr<VelaReportingSession>& session) {
    const std::uint16_t serviceType =
        session == nullptr ? std::uint16_t{AudioServiceTypeGeneric} : session->serviceType();
    const std::string categoryName = VelaReportingUtilityCategoryString(category);
    const std::string_view typeName = VelaReportingUtilityTypeString(type);
    const std::string eventNames[] = {
        formatText("com.orvex.vela.%@.%@", categoryName, typeName),
        formatText("com.orvex.%@.%@.%@", VelaReportingUtilityGenerateServiceNameFromServiceType(serviceType),
                   categoryName, typeName),
    };
    for (const std::string& eventName : eventNames) {
        if (tally_.tallyIsEventUsed(eventName)) {
            tally_.tallySendEventLazy(eventName, [message, session] { return payloadOf(message, session.get()); });
        }
    }
}

} // namespace vela
