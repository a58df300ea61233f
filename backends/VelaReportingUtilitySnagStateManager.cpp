#include "backends/VelaReportingUtilitySnagStateManager.h"

#include "common/VelaReportingLogCategories.h"
#include "common/VelaReportingUtility.h"

#include <cassert>

namespace vela {

namespace {

/// Messages that are counted before the next one makes a capture.
constexpr std::int64_t kCountedBeforeCapture = 1;

const Key kActiveHardwareTime("Haptic_Active_Hardware_Time_Seconds");

/// Its lines have always borne this name, which is not the class's.
NamedLogCategory snagLog() { return VelaReportingSnagLogCategory().as("VelaReportingSnagStateManagerUtility"); }

} // namespace

void VelaReportingUtilitySnagStateManager::handleEvent(const Dictionary& message, std::uint32_t category,
                                                       std::uint32_t type,
                                                       const std::shared_ptr<VelaReportingSession>& session,
                                                       const std::optional<std::string>& processName) {
    if (type != AudioEventTypeJoule || !message.contains(kActiveHardwareTime) || message == messageCache_) {
        return;
    }
    if (leakedHapticsSessionCounter_ != kCountedBeforeCapture) {
        messageCache_ = message;
        snagLog().info("Incrementing Snag counter. %@", processName);
        ++leakedHapticsSessionCounter_;
        return;
    }
    assert(session != nullptr);
    snagLog().info("Getting snapshot with Malady Reporter");
    requestSnapshot({
        .domain = "AudioAnalytics",
        .type = std::string(VelaReportingUtilityGenerateServiceNameFromServiceType(session->serviceType())),
        .subType = VelaReportingUtilityCategoryString(category),
        .subtypeContext = std::string(VelaReportingUtilityTypeString(AudioEventTypeJoule)),
        .detectedProcess = processName.value_or(""),
        .triggerThresholdValues = std::nullopt,
    });
    leakedHapticsSessionCounter_ = 0;
    messageCache_ = {};
}

void VelaReportingUtilitySnagStateManager::requestSnapshot(const platform::MaladySignature& signature) {
    maladyReporter_ = malady_.createReporter();
    // The reply comes on a thread of the reporter's, perhaps when this manager is gone.
    maladyReporter_->requestSnapshot(signature, 0, std::nullopt, std::nullopt, [](const Dictionary& response) {
        snagLog().info("Response from maladyReporter : %@", response);
    });
}

} // namespace vela
