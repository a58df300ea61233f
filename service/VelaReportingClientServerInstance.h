// One client's connection, as the client sees it: turns every call into one item on the reporting queue, and owns the
// client's sessions.
//
// Thread-safe. Operations come on the endpoint's thread and return at once; all else runs on the reporting queue, which
// alone changes the sessions. Owned by its connection and the service's registry; queued work holds it. The delegate is
// held weakly: once it is gone nothing is done and no reply is called.
#pragma once

#include "platform/Clock.h"
#include "platform/Identity.h"
#include "platform/Ipc.h"
#include "platform/Mutex.h"
#include "service/VelaReportingServiceContext.h"
#include "service/VelaReportingServiceDelegateProtocol.h"

#include <cassert>
#include <cstdint>
#include <map>
#include <memory>
#include <optional>
#include <string>
#include <utility>
#include <vector>

namespace vela {

class VelaReportingClientServerInstance final : public platform::ReportingServiceProtocol,
                                                public std::enable_shared_from_this<VelaReportingClientServerInstance> {
    struct Private {
        explicit Private() = default;
    };

public:
    using Delegate = VelaReportingServiceDelegateProtocol;
    using Sessions = Delegate::Sessions;

    /// `pid`: the client's process. `identity`: on whose behalf it calls; none where that is not known. `peer`: who can
    /// tell whether that process is still there; may be none.
    static std::shared_ptr<VelaReportingClientServerInstance> initWithPID(
        std::int32_t pid, std::weak_ptr<Delegate> delegate, std::shared_ptr<const VelaReportingServiceContext> context,
        std::optional<platform::Identity> identity = std::nullopt, std::weak_ptr<platform::IpcConnection> peer = {});
    VelaReportingClientServerInstance(Private, std::int32_t pid, std::weak_ptr<Delegate> delegate,
                                      std::shared_ptr<const VelaReportingServiceContext> context,
                                      std::optional<platform::Identity> identity,
                                      std::weak_ptr<platform::IpcConnection> peer);
    ~VelaReportingClientServerInstance() override;
    VelaReportingClientServerInstance(const VelaReportingClientServerInstance&) = delete;
    VelaReportingClientServerInstance& operator=(const VelaReportingClientServerInstance&) = delete;

    // Operations of the client.

    void createReportingSession(std::int64_t reporterID, platform::IpcReply<bool> reply) override;
    void setServiceType(std::uint16_t serviceType, std::int64_t reportingSession,
                        platform::IpcReply<bool> reply) override;
    void getServiceNameForReporterID(std::int64_t reporterID, platform::IpcReply<std::uint16_t> reply) override;
    void setConfiguration(Dictionary configuration, std::int64_t forReporterID,
                          platform::IpcReply<bool> reply) override;
    void startReportingSessionForID(std::int64_t reporterID, std::shared_ptr<void> underWay,
                                    platform::IpcReply<bool> reply) override;
    void sendMessage(Dictionary message, std::uint32_t withCategory, std::uint16_t andType,
                     std::optional<std::vector<std::int64_t>> forReportingIDs, platform::IpcReply<> reply) override;
    void stopReportingSessionForID(std::int64_t reporterID, platform::IpcReply<bool> reply) override;
    void destroyReportingSession(std::int64_t reporterID, platform::IpcReply<bool> reply) override;
    void reporterID(std::int64_t reporterID, platform::IpcReply<Dictionary> valid) override;
    void getAllReporters(platform::IpcReply<std::vector<std::int64_t>> reply) override;
    /// Ends the process on this thread, whatever the reporting queue is doing.
    void killService(platform::IpcReply<bool> reply) override;

    // Of the connection and the registry.

    /// The connection was lost: queues the end of the client's sessions and of its place in the registry. May be called
    /// again.
    void handleConnectionError();

    /// The session of this reporter, or null: of this client, else, `acrossAllClients`, of the first that has it. Any
    /// thread.
    std::shared_ptr<VelaReportingSession> findReportingSessionForID(std::int64_t reporterID,
                                                                    bool acrossAllClients) const;
    /// Those of this client, by ascending reporter ID. Any thread.
    Sessions clientReportingSessions() const;

    std::int32_t processIdentifier() const { return processIdentifier_; }
    /// None until the client is registered.
    std::optional<platform::WallTime> clientStartDate() const;
    void setClientStartDate(platform::WallTime startDate);
    /// None until the client is registered, and where its name cannot be found.
    std::optional<std::string> clientProcessName() const;
    void setClientProcessName(std::optional<std::string> processName);

private:
    /// A message on its way to the sessions that it is for.
    struct Delivery {
        const Dictionary& message;
        std::uint32_t category;
        std::uint16_t type;
        const std::optional<std::string>& processName; ///< of this client, where issue capture may want it
        std::string passedLimit{};                     ///< the first that a session named when it refused the message
    };

    /// Posts `work(delegate)` to the reporting queue.
    template <class Work>
    void enqueue(Work work) {
        const std::shared_ptr<Delegate> posting = delegate_.lock();
        if (posting == nullptr) {
            return;
        }
        posting->reportingQueue().post([self = shared_from_this(), work = std::move(work)]() mutable {
            if (const std::shared_ptr<Delegate> delegate = self->delegate_.lock()) {
                assert(delegate->reportingQueue().isCurrent());
                work(*delegate);
            }
        });
    }

    std::optional<std::string> senderName() const;
    void startSession(Delegate& delegate, std::int64_t reporterID, platform::IpcReply<bool> reply);
    void stopSession(Delegate& delegate, std::int64_t reporterID);
    void endConnection(Delegate& delegate);
    void sendToReporters(Delegate& delegate, Delivery& delivery, const std::vector<std::int64_t>& reporterIDs);
    void sendToActiveSessions(Delegate& delegate, Delivery& delivery);
    void sendStandalone(Delegate& delegate, Delivery& delivery);
    static void send(Delivery& delivery, VelaReportingSession& session);
    void handleEvent(Delegate& delegate, const Delivery& delivery,
                     const std::shared_ptr<VelaReportingSession>& session);

    /// Answers the session that stood there before, which must not be released under the lock.
    std::shared_ptr<VelaReportingSession> storeSession(std::int64_t reporterID,
                                                       std::shared_ptr<VelaReportingSession> session);
    /// Answers what was removed.
    std::shared_ptr<VelaReportingSession> removeSession(std::int64_t reporterID);
    Sessions removeAllSessions();

    // Constant after construction.
    const std::int32_t processIdentifier_;
    const std::weak_ptr<Delegate> delegate_;
    const std::shared_ptr<const VelaReportingServiceContext> context_;
    const std::optional<platform::Identity> identity_;
    const std::weak_ptr<platform::IpcConnection> peer_;

    // Changed on the reporting queue, read on any thread. Held for a few instructions only, and inside the delegate's
    // lock where both are taken.
    mutable Mutex mutex_;
    std::map<std::int64_t, std::shared_ptr<VelaReportingSession>> clientReportingSessionMap_ VELA_GUARDED_BY(mutex_);
    std::optional<platform::WallTime> clientStartDate_ VELA_GUARDED_BY(mutex_);
    std::optional<std::string> clientProcessName_ VELA_GUARDED_BY(mutex_);
};

} // namespace vela
