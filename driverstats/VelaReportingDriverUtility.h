// Samples the statistics channels that audio drivers publish and reports what changed over a session's life.
// Thread-safe: the subscriptions are made by the constructor and only read afterwards.
#pragma once

#include "common/values/Dictionary.h"
#include "driverstats/VelaReportingIOChannelSubscription.h"
#include "platform/HwStats.h"
#include "session/VelaReportingSession.h"

#include <cstdint>
#include <memory>
#include <vector>

namespace vela {

class VelaReportingDriverUtility {
public:
    /// Subscribes to every driver of its table that is there. Both outlive it.
    VelaReportingDriverUtility(platform::HwStats& hwStats, VelaReportingSessionEventHandler& analytics);

    /// The samples of this moment; a driver that could not be sampled has no entry.
    VelaReportingDriverSnapShot getSnapShot() const;

    /// Sends the session, and the analytics service, what changed since the session's snapshot: one message for each
    /// format of channels that has something to say. The snapshot stays. On the thread that stops the session.
    void sendDriverLogsForSession(const std::shared_ptr<VelaReportingSession>& session) const;

    const std::vector<VelaReportingIOChannelSubscription>& ioChannelSubscriptions() const {
        return ioChannelSubscriptions_;
    }

private:
    void subscribe(const VelaReportingDriver& driver);
    void send(const Dictionary& driverStats, std::uint16_t type,
              const std::shared_ptr<VelaReportingSession>& session) const;

    platform::HwStats& hwStats_;
    VelaReportingSessionEventHandler& analytics_;
    /// In the order of the table; filled by the constructor.
    std::vector<VelaReportingIOChannelSubscription> ioChannelSubscriptions_;
};

} // namespace vela
