// Connections of clients to the service's named endpoint.
#pragma once

#include "common/values/Dictionary.h"
#include "platform/Identity.h"
#include "platform/Result.h"
#include "platform/UniqueFunction.h"

#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <vector>

namespace vela::platform {

/// The one error that a client ever gets from an operation, or word of a limit that the operation passed.
struct IpcError {
    std::string domain;
    std::int32_t code = 0;
    std::string limit{}; ///< the limit's name and value; not empty where that is what it is, without domain and code
};

/// A reply: an error or none, then the value. It may be called from any thread; only the first call is answered.
template <class... Types>
using IpcReply = UniqueFunction<void(std::optional<IpcError> error, Types... values)>;

/// The operations that a client may call, as they arrive. Called on the endpoint's own thread, one at a time per
/// connection, in the client's order; none may block.
class ReportingServiceProtocol {
public:
    virtual ~ReportingServiceProtocol() = default;

    virtual void createReportingSession(std::int64_t reporterID, IpcReply<bool> reply) = 0;
    virtual void setServiceType(std::uint16_t serviceType, std::int64_t reportingSession, IpcReply<bool> reply) = 0;
    virtual void getServiceNameForReporterID(std::int64_t reporterID, IpcReply<std::uint16_t> reply) = 0;
    virtual void setConfiguration(Dictionary configuration, std::int64_t forReporterID, IpcReply<bool> reply) = 0;
    /// Its reply may come seconds later. The call counts as under way until the last copy of `underWay` is gone.
    virtual void startReportingSessionForID(std::int64_t reporterID, std::shared_ptr<void> underWay,
                                            IpcReply<bool> reply) = 0;
    virtual void sendMessage(Dictionary message, std::uint32_t withCategory, std::uint16_t andType,
                             std::optional<std::vector<std::int64_t>> forReportingIDs, IpcReply<> reply) = 0;
    virtual void stopReportingSessionForID(std::int64_t reporterID, IpcReply<bool> reply) = 0;
    virtual void destroyReportingSession(std::int64_t reporterID, IpcReply<bool> reply) = 0;
    virtual void reporterID(std::int64_t reporterID, IpcReply<Dictionary> valid) = 0;
    virtual void getAllReporters(IpcReply<std::vector<std::int64_t>> reply) = 0;
    virtual void killService(IpcReply<bool> reply) = 0;
};

/// What the service tells of itself, read-only. Called on the endpoint's own thread, also while an operation waits; it
/// does not block for long. Thread-safe.
class ServiceInspection {
public:
    virtual ~ServiceInspection() = default;

    /// Every session of every client, in the registry's order.
    virtual Array sessions() const = 0;
    /// What became of everything that was received; empty where nothing is counted.
    virtual Dictionary ledger() const = 0;
};

/// One client's connection. Thread-safe.
class IpcConnection {
public:
    virtual ~IpcConnection() = default;

    /// The peer's process, by the operating system's word.
    virtual std::int32_t processIdentifier() const = 0;
    /// Whether what was read of the process with this identifier until now was the peer's, and not that of a later one
    /// which has got the identifier. True where the system cannot tell.
    virtual bool confirmProcess() const = 0;
    /// On whose behalf the peer connected, by the operating system's word; none where that is not known whole.
    virtual std::optional<Identity> peerIdentity() const = 0;
    virtual void setExportedObject(std::shared_ptr<ReportingServiceProtocol> object) = 0;
    virtual void setInterruptionHandler(UniqueFunction<void()> handler) = 0;
    /// Called once, after the last operation that the client sent.
    virtual void setInvalidationHandler(UniqueFunction<void()> handler) = 0;
    virtual void resume() = 0;
    /// Text for log lines.
    virtual std::string description() const = 0;
};

class IpcListenerDelegate {
public:
    virtual ~IpcListenerDelegate() = default;

    /// Whether the service takes this connection. Called on the endpoint's own thread.
    virtual bool shouldAcceptNewConnection(const std::shared_ptr<IpcConnection>& connection) = 0;
};

class IpcListener {
public:
    virtual ~IpcListener() = default;

    /// The delegate outlives the listener.
    virtual void setDelegate(IpcListenerDelegate& delegate) = 0;
    /// `inspection` outlives the listener.
    virtual void setInspection(const ServiceInspection& inspection) = 0;
    /// Serves until the process is told to end, and returns then.
    virtual Result<Done> resume() = 0;
};

} // namespace vela::platform
