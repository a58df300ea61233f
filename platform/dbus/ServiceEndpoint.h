// The service's endpoint: a Unix socket that speaks D-Bus peer to peer. One thread, the one that calls `resume`, does
// everything but send replies; it never waits for anything but the next event. `stop` may be called on any thread.
//
// Limits, and what becomes of a client that passes them:
//  - authentication: closed when it takes longer;
//  - users that may not connect, and connections beyond clientsPerUser: the answer to AUTH is "REJECTED access-denied"
//    or "REJECTED limits.clients_per_user=N", and the connection is closed. The delegate never sees them. The same with
//    "REJECTED too-many-open-files" while the process has hardly a descriptor left;
//  - messageBytes, valueDepth, sessionsPerClient: that call is answered with LimitsExceeded, nothing else happens;
//  - callsInFlight, messageBytes for all calls in flight together, unsentReplies: the client is not read from until it
//    is below the half again.
// While the service is behind, a client with many calls under way is read from every kBehindTime only.
#pragma once

#include "platform/Ipc.h"
#include "platform/UniqueFunction.h"
#include "platform/dbus/AccessRule.h"
#include "platform/dbus/EventLoop.h"
#include "platform/dbus/ListeningSocket.h"
#include "platform/dbus/ServiceCalls.h"
#include "platform/dbus/ServiceConnection.h"

#include <atomic>
#include <chrono>
#include <cstdint>
#include <deque>
#include <memory>
#include <optional>
#include <string>
#include <unordered_map>
#include <vector>

namespace vela::platform {

struct DbusServiceOptions {
    // Where clients arrive.
    int listeningDescriptor = -1; ///< from the service manager, taken over; without one:
    std::string socketPath;       ///< in a folder that exists
    unsigned socketMode = 0666;   ///< of the socket's file, exactly; the access rule decides who is served

    dbus::AccessRule access;
    std::string version; ///< what GetVersion answers

    // Limits: see above.
    std::uint64_t messageBytes = 1024 * 1024;
    std::uint32_t valueDepth = 32;
    std::uint32_t sessionsPerClient = 1024;
    std::uint32_t clientsPerUser = 256;
    std::uint64_t unsentReplies = 4 * 1024 * 1024; ///< bytes of one client
    std::uint32_t callsInFlight = 128;             ///< of one client
    std::chrono::milliseconds authentication{5000};

    /// Whether SIGTERM and SIGINT end `resume`. Other threads must have them blocked: see blockEndSignals.
    bool endsOnSignals = true;
    /// Whether what clients send comes faster than it can be worked off: those with many calls under way are read from
    /// less often then. Called on the endpoint's thread; may be none.
    UniqueFunction<bool()> isBehind;
    /// Called on the endpoint's thread after each round of events; may be none.
    UniqueFunction<void()> onLoopTurn;
    /// Called on the endpoint's thread every `interval`, for the service manager's watchdog; without it nothing wakes
    /// up.
    UniqueFunction<void()> periodic;
    std::chrono::milliseconds interval{0};
};

class DbusServiceEndpoint final : public IpcListener {
public:
    /// Listens from now on; clients wait until `resume`.
    static Result<std::unique_ptr<DbusServiceEndpoint>> open(DbusServiceOptions options);
    DbusServiceEndpoint(const DbusServiceEndpoint&) = delete;
    DbusServiceEndpoint& operator=(const DbusServiceEndpoint&) = delete;
    ~DbusServiceEndpoint() override;

    /// Blocks SIGTERM and SIGINT for the calling thread and those that it starts: first thing in main, before there are
    /// other threads, so that only the endpoint takes the signals.
    static void blockEndSignals();

    void setDelegate(IpcListenerDelegate& delegate) override { delegate_ = &delegate; }
    void setInspection(const ServiceInspection& inspection) override { facts_.inspection = &inspection; }

    /// Serves until a signal or `stop`. Then no client arrives any more, what clients have sent by now is dispatched
    /// (up to kDrainedBytes of each), and every connection is closed before this returns. As the service ends and not
    /// its clients, their connections are not reported as invalid.
    Result<Done> resume() override;

    /// Ends `resume`, also one that comes later. Thread-safe.
    void stop();

    /// Connections that were refused by the access rule or the limit of connections. Thread-safe.
    std::uint64_t refusedConnections() const { return refused_; }

    static constexpr std::size_t kDrainedBytes = 1024 * 1024;

private:
    using Time = std::chrono::steady_clock::time_point;

    // Tokens of the event loop.
    static constexpr std::uint64_t kListenerToken = 1;
    static constexpr std::uint64_t kSignalToken = 2;
    static constexpr std::uint64_t kTimerToken = 3;
    static constexpr std::uint64_t kStopToken = 4;
    static constexpr std::uint64_t kFirstConnection = 16; ///< connections have their numbers

    DbusServiceEndpoint(DbusServiceOptions options, dbus::ListeningSocket socket, std::shared_ptr<dbus::EventLoop> loop,
                        std::string serverId);

    Result<Done> watchSources();
    void loopTurn();
    void handle(std::uint64_t token, std::uint32_t events);
    void handleConnection(std::uint64_t token, std::uint32_t events);
    std::optional<Nanoseconds> timeout();

    void acceptConnections();
    void pauseAccepting();
    void continueAccepting();
    void admit(FileDescriptor socket);
    std::string refusalOf(const dbus::PeerCredentials& peer);
    void addConnection(FileDescriptor socket, dbus::PeerCredentials peer, std::string refusal);

    void queue(const std::shared_ptr<dbus::ServiceConnection>& connection);
    void queueSoon(const std::shared_ptr<dbus::ServiceConnection>& connection);
    void queueThoseDue();
    bool isBehind() { return options_.isBehind && options_.isBehind(); }
    void runQueued();
    void runRung();
    void endLateAuthentications();
    void end(const std::shared_ptr<dbus::ServiceConnection>& connection);
    void endAll();

    // Constant after construction.
    DbusServiceOptions options_;
    const std::shared_ptr<dbus::EventLoop> loop_;
    const std::string serverId_;

    std::atomic<bool> stopping_{false};
    std::atomic<std::uint64_t> refused_{0};

    // The endpoint's thread's.
    dbus::ListeningSocket socket_;
    IpcListenerDelegate* delegate_ = nullptr;
    dbus::ServiceFacts facts_;
    FileDescriptor signals_;
    FileDescriptor timer_;
    std::vector<char> scratch_; ///< what a read fills; not cleared between reads
    std::uint64_t nextNumber_ = kFirstConnection;
    std::unordered_map<std::uint64_t, std::shared_ptr<dbus::ServiceConnection>> connections_;
    std::unordered_map<std::uint32_t, std::uint32_t> connectionsOfUser_;
    std::vector<std::shared_ptr<dbus::ServiceConnection>> queued_; ///< for their next turn
    std::vector<std::shared_ptr<dbus::ServiceConnection>> soon_;   ///< for a turn at soonAt_
    Time soonAt_;
    struct Deadline {
        Time time;
        std::uint64_t connection;
    };
    std::deque<Deadline> deadlines_;       ///< of the authentications, the next one first
    std::uint32_t lingering_ = 0;          ///< refused connections that have not been told yet
    std::optional<Time> acceptingAgainAt_; ///< while no descriptor is left
};

} // namespace vela::platform
