// How client instances reach the service. Queue-confined: called on the reporting queue, except where it says
// otherwise.
#pragma once

#include "common/values/Dictionary.h"
#include "platform/WorkQueue.h"
#include "session/VelaReportingSession.h"

#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <vector>

namespace vela {

class VelaReportingClientServerInstance;

class VelaReportingServiceDelegateProtocol {
public:
    using Clients = std::vector<std::shared_ptr<VelaReportingClientServerInstance>>;
    using Sessions = std::vector<std::shared_ptr<VelaReportingSession>>;

    virtual ~VelaReportingServiceDelegateProtocol() = default;

    /// The one serial queue on which every operation works. Any thread; lives as long as the delegate.
    virtual platform::SerialQueue& reportingQueue() const = 0;

    /// The sessions of every client that are started; clients in the order of their acceptance. Logs the sessions of
    /// each client, started or not. Any thread.
    virtual Sessions getAllActiveReportingSessions() const = 0;
    /// The session of the first client that has this reporter, or null. Reporter 0 is never found. Any thread.
    virtual std::shared_ptr<VelaReportingSession> findReportingSessionForID(std::int64_t reporterID) const = 0;
    /// The registry itself, in the order of acceptance.
    virtual const Clients& getAllClients() const = 0;
    /// Takes this very instance off the registry; none of it that is not there.
    virtual void removeClient(const VelaReportingClientServerInstance& client) = 0;

    /// As they were when the service began. Any thread.
    virtual const Dictionary& getDefaults() const = 0;
    /// Any thread.
    virtual bool isReportingEnabled() const = 0;

    /// Sessions that were started and not stopped. Sessions that end in any other way stay counted.
    virtual std::uint64_t activeSessionCount() const = 0;
    virtual void setActiveSessionCount(std::uint64_t count) = 0;

    /// Statistics of the audio drivers at this moment.
    virtual VelaReportingDriverSnapShot getSnapShot() const = 0;
    virtual void sendDriverLogsForSession(const std::shared_ptr<VelaReportingSession>& session) const = 0;

    /// The state of every feature that has one, and when it was read; none where no feature has one.
    virtual std::optional<Dictionary> getFeaturesState() const = 0;
    /// Called once, when the service begins.
    virtual void listenForFeatureStateChanges() = 0;

    /// Issue capture, on internal builds. `processName`: of the client that sent the message, where known.
    virtual void handleEventForSnag(const Dictionary& message, std::uint32_t category, std::uint32_t type,
                                    const std::shared_ptr<VelaReportingSession>& session,
                                    const std::optional<std::string>& processName) = 0;
};

} // namespace vela
