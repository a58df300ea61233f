#include "backends/VelaReportingTallyBridge.h"

#include "backends/ApplicationName.h"
#include "common/VelaReportingUtility.h"

#include <cstddef>
#include <initializer_list>
#include <string>
#include <string_view>

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

/// Every message asks for two names: a formatter would take a tenth of its time.
std::string joined(std::initializer_list<std::string_view> parts) {
    std::size_t size = 0;
    for (const std::string_view part : parts) {
        size += part.size();
    }
    std::string text;
    text.reserve(size);
    for (const std::string_view part : parts) {
        text += part;
    }
    return text;
}

} // namespace

void VelaReportingTallyBridge::handleEvent(const Dictionary& message, std::uint32_t category, std::uint32_t type,
                                           const std::shared_ptr<VelaReportingSession>& session) {
    const std::uint16_t serviceType =
        session == nullptr ? std::uint16_t{AudioServiceTypeGeneric} : session->serviceType();
    const std::string categoryName = VelaReportingUtilityCategoryString(category);
    const std::string_view typeName = VelaReportingUtilityTypeString(type);
    const std::string eventNames[] = {
        joined({"com.orvex.vela.", categoryName, ".", typeName}),
        joined({"com.orvex.", VelaReportingUtilityGenerateServiceNameFromServiceType(serviceType), ".", categoryName,
                ".", typeName}),
    };
    std::size_t payloadBytes = 0;
    for (const std::string& eventName : eventNames) {
        if (tally_.tallyIsEventUsed(eventName)) {
            payloadBytes = payloadBytes == 0 ? memoryOf(message) : payloadBytes;
            tally_.tallySendEventLazy(
                eventName, [message, session] { return payloadOf(message, session.get()); }, payloadBytes);
        }
    }
}

} // namespace vela
