#include "backends/VelaReportingTallyBridge.h"

#include "backends/ApplicationName.h"
#include "common/VelaReportingUtility.h"

#include <array>
#include <cassert>
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

/// Every message asks for two names, of fixed texts: a formatter, or memory of their own, would take a good part of its
/// time.
class VelaReportingEventName {
public:
    VelaReportingEventName(std::initializer_list<std::string_view> parts) {
        for (const std::string_view part : parts) {
            size_ += part.copy(text_.data() + size_, text_.size() - size_);
        }
        assert(size_ < text_.size());
    }
    std::string_view view() const { return {text_.data(), size_}; }

private:
    std::array<char, 128> text_; // filled above
    std::size_t size_ = 0;
};

} // namespace

void VelaReportingTallyBridge::handleEvent(const Dictionary& message, std::uint32_t category, std::uint32_t type,
                                           const std::shared_ptr<VelaReportingSession>& session) {
    const std::uint16_t serviceType =
        session == nullptr ? std::uint16_t{AudioServiceTypeGeneric} : session->serviceType();
    const std::string categoryName = VelaReportingUtilityCategoryString(category);
    const std::string_view typeName = VelaReportingUtilityTypeString(type);
    const VelaReportingEventName eventNames[] = {
        {"com.orvex.vela.", categoryName, ".", typeName},
        {"com.orvex.", VelaReportingUtilityGenerateServiceNameFromServiceType(serviceType), ".", categoryName, ".",
         typeName},
    };
    std::size_t payloadBytes = 0;
    for (const VelaReportingEventName& eventName : eventNames) {
        if (tally_.tallyIsEventUsed(eventName.view())) {
            payloadBytes = payloadBytes == 0 ? memoryOf(message) : payloadBytes;
            tally_.tallySendEventLazy(
                eventName.view(), [message, session] { return payloadOf(message, session.get()); }, payloadBytes);
        }
    }
}

} // namespace vela
