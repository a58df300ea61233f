// The state of a few features of the device, told to every session when it starts and whenever one of them changes.
#include "common/VelaReportingUtility.h"
#include "common/values/Dictionary.h"
#include "service/FeatureKeys.h"
#include "service/ServiceLog.h"
#include "service/VelaReportingClientServerInstance.h"
#include "service/VelaReportingServiceDelegate.h"

#include <cassert>
#include <chrono>

namespace vela {

namespace {

/// The notification state that means "on".
constexpr std::uint64_t kOn = 1;

/// The state of one feature at this moment, or none.
Value stateOf(const Dictionary& feature, const platform::Platform& platform) {
    if (const ValueRef domain = feature.find(kFeatureDefaultsDomain)) {
        return platform.preferences.copyValue(domain.text(), feature.find(kFeatureDomain).text());
    }
    if (const ValueRef token = feature.find(kFeatureNotifyToken)) {
        const auto state = platform.notifications.state(static_cast<std::int32_t>(token.integer()));
        return state ? Value(*state == kOn) : Value();
    }
    return {};
}

// Whole seconds and their fraction apart: all the nanoseconds together are too many for a double.
double epochSeconds(const platform::Clock& clock) {
    const platform::WallTime now = clock.now();
    const auto second = std::chrono::floor<std::chrono::seconds>(now);
    return static_cast<double>(second.time_since_epoch().count()) + std::chrono::duration<double>(now - second).count();
}

/// To the nearest second, halves up.
std::int32_t uptimeSeconds(const platform::Clock& clock) {
    return static_cast<std::int32_t>(
        std::chrono::floor<std::chrono::seconds>(clock.systemUptime() + std::chrono::milliseconds(500)).count());
}

Array arrayOf(const std::vector<Dictionary>& table) {
    ArrayBuilder array;
    for (const Dictionary& entry : table) {
        array.add(entry);
    }
    return array.build();
}

} // namespace

void VelaReportingServiceDelegate::listenForFeatureStateChanges() {
    const Features table = featureTable();
    serviceLog().info("listening for features %@", arrayOf(table));
    for (std::size_t index = 0; index < table.size(); ++index) {
        const ValueRef notification = table[index].find(kFeatureNotification);
        if (!notification) {
            continue;
        }
        const platform::NotificationRegistration registration =
            context_->platform.notifications.registerForNotification(notification.text(), *reportingQueue_,
                                                                     [weak = weak_from_this()](std::int32_t token) {
                                                                         if (const auto self = weak.lock()) {
                                                                             self->featureChanged(token);
                                                                         }
                                                                     });
        if (registration.status == 0) {
            notifyTokens_.push_back(registration.token);
        }
        {
            // One that failed is kept as well: its state cannot be read.
            const MutexLock lock(featuresMutex_);
            features_[index] = table[index].setting(kFeatureNotifyToken, registration.token);
        }
        serviceLog().standard("notify setup result %i token %i", registration.status, registration.token);
    }
}

std::optional<Dictionary> VelaReportingServiceDelegate::getFeaturesState() const {
    serviceLog().standard("getting features");
    DictionaryBuilder state;
    for (const Dictionary& feature : featureTable()) {
        if (Value value = stateOf(feature, context_->platform)) {
            state.add(feature.find(kFeatureDomain).text(), std::move(value));
        }
    }
    if (state.size() == 0) {
        return std::nullopt;
    }
    const platform::Clock& clock = context_->platform.clock;
    state.add(VelaReportingInternalEventEpochTime, epochSeconds(clock));
    state.add(VelaReportingInternalEventSystemUptimeSec, uptimeSeconds(clock));
    return state.build();
}

void VelaReportingServiceDelegate::featureChanged(std::int32_t token) const {
    assert(reportingQueue_->isCurrent());
    serviceLog().info("feature %i changes", token);
    const std::optional<Dictionary> state = getFeaturesState();
    serviceLog().info("defaults %@", state);
    for (const auto& client : clients()) {
        for (const auto& session : client->clientReportingSessions()) {
            // Sent without any state as well: that the last one is gone is a change, too.
            session->sendMessage(state.value_or(Dictionary()), AudioEventCategorySetup, AudioEventTypeSetup, {});
        }
    }
}

Array VelaReportingServiceDelegate::features() const { return arrayOf(featureTable()); }

VelaReportingServiceDelegate::Features VelaReportingServiceDelegate::featureTable() const {
    const MutexLock lock(featuresMutex_);
    return features_;
}

} // namespace vela
