// One client's connection to the service: its bytes in, its calls dispatched, its end told. The operations of
// IpcConnection are thread-safe; everything else is the endpoint's thread's. The endpoint owns it while the socket is
// open; the service may keep it for longer.
//
//     Authenticating --BEGIN, delegate takes it--> Open --end of file--> Ended (invalidation handler)
//           |                                        `--bytes that are no message--> Ended (interruption handler, then
//           `--refused, garbage, too late, delegate does not take it--> Ended         invalidation handler)
#pragma once

#include "platform/Ipc.h"
#include "platform/Mutex.h"
#include "platform/dbus/Authentication.h"
#include "platform/dbus/ConnectionChannel.h"
#include "platform/dbus/PeerCredentials.h"
#include "platform/dbus/ServiceCalls.h"

#include <cstdint>
#include <memory>
#include <optional>
#include <span>
#include <string>
#include <string_view>

namespace vela::platform::dbus {

/// What the endpoint gives a new connection.
struct ConnectionSetup {
    std::uint64_t number = 0; ///< never used again
    PeerCredentials peer;
    std::shared_ptr<ConnectionChannel> channel;
    const ServiceFacts* facts = nullptr; ///< outlives the endpoint's hold on the connection
    std::uint64_t messageBytes = 0;      ///< the longest message that is taken
    std::string_view serverId;
    std::string refusal; ///< see ServerAuthentication
};

class ServiceConnection final : public IpcConnection, public std::enable_shared_from_this<ServiceConnection> {
public:
    explicit ServiceConnection(ConnectionSetup setup);

    std::int32_t processIdentifier() const override { return target_.peer.processIdentifier; }
    std::optional<Identity> peerIdentity() const override { return target_.peer.identity(); }
    bool confirmProcess() const override { return channel_->confirmPeer(); }
    void setExportedObject(std::shared_ptr<ReportingServiceProtocol> object) override;
    void setInterruptionHandler(UniqueFunction<void()> handler) override;
    void setInvalidationHandler(UniqueFunction<void()> handler) override;
    /// Before it, calls wait.
    void resume() override { channel_->release(); }
    /// `<connection 7 pid 1234 uid 1000>`: numbers alone, so that no client can make it say anything else.
    std::string description() const override;

    // The endpoint's thread.

    enum class Turn : std::uint8_t {
        Waiting, ///< for the socket, or for the channel to ring
        More,    ///< there is more to do at once
        Soon,    ///< it gathers: to be looked at again after a while, whatever the socket says
        Ended,   ///< to be ended
    };
    /// Reads once at most and dispatches up to kMessagesPerTurn messages, so that no client keeps the others waiting.
    Turn turn(std::span<char> scratch, IpcListenerDelegate& delegate);
    /// The client is gone: from now on the limits count no more, and everything that it sent is dispatched.
    void hangUp();
    /// Closes the socket and tells the service, once.
    void end();
    /// Closes the socket and tells nobody: it is the service that goes, not its client.
    void abandon();
    void writable() { channel_->writable(); }

    /// Whether the next turn is the first of a look while it gathers.
    bool beginsLook() const { return gathering_ && !looking_; }
    bool isAuthenticating() const { return state_ == State::Authenticating; }
    bool isRefused() const { return refused_; }
    std::uint32_t user() const { return target_.peer.user; }
    std::uint64_t number() const { return target_.connection; }

    bool queued = false; ///< for its next turn, by the endpoint
    bool soon = false;   ///< for its next look, by the endpoint
    bool due = false;    ///< the time of that look has come

    static constexpr int kMessagesPerTurn = 8;

    // A client that does not wait for each reply is looked at from time to time, so that its calls and their replies
    // share wake-ups, which cost more than the calls do. It goes on for as long as it pays.
    static constexpr Nanoseconds kGatheringTime = std::chrono::microseconds(200);
    /// The same while the service is behind: 128 calls each time are 32,000 a second, a fifth of what the store takes
    /// in on two small processors.
    static constexpr Nanoseconds kBehindTime = std::chrono::milliseconds(4);
    /// Messages that a look must find.
    static constexpr unsigned kWorthGathering = 4;
    /// Messages between two attempts.
    static constexpr unsigned kBetweenGatherings = 64;

private:
    enum class State : std::uint8_t { Authenticating, Open, Ended };

    struct Handlers {
        UniqueFunction<void()> interruption;
        UniqueFunction<void()> invalidation;
    };
    Handlers close();
    bool mayProceed() const;
    bool stopsAtLimit() const;
    Turn readOnce(std::span<char> scratch, IpcListenerDelegate& delegate);
    Turn endLook(bool atLimit = false);
    void takeBuffered(IpcListenerDelegate& delegate);
    void take(std::string_view& bytes, IpcListenerDelegate& delegate);
    bool takeAuthentication(std::string_view& bytes, IpcListenerDelegate& delegate);
    bool takeMessage(std::string_view& bytes);
    void refuseMessage(const Frame& frame);
    void dispatch(std::string_view message);

    // Constant after construction.
    const std::shared_ptr<ConnectionChannel> channel_;
    const std::uint64_t messageBytes_;
    const bool refused_;

    // The endpoint's thread's.
    CallTarget target_;
    State state_ = State::Authenticating;
    std::optional<ServerAuthentication> authentication_;
    HeaderReader headers_;
    std::string received_; ///< bytes that were not dispatched yet, behind `taken_` that were
    std::size_t taken_ = 0;
    std::uint64_t skipped_ = 0; ///< bytes of a message too long that are still to come
    int budget_ = 0;            ///< messages that this turn may still dispatch
    bool ending_ = false;       ///< what is left is not wanted
    bool broken_ = false;       ///< the bytes are no messages
    bool atLimit_ = false;      ///< a limit made this turn leave what was received
    bool hungUp_ = false;
    bool gathering_ = false;
    bool looking_ = false;   ///< while it gathers: between the begin of a look and its end
    bool delivered_ = false; ///< this look sent replies
    unsigned found_ = 0;     ///< messages that this look found; while not gathering, since the last attempt

    Mutex mutex_;
    std::shared_ptr<ReportingServiceProtocol> object_ VELA_GUARDED_BY(mutex_);
    UniqueFunction<void()> interruption_ VELA_GUARDED_BY(mutex_);
    UniqueFunction<void()> invalidation_ VELA_GUARDED_BY(mutex_);
};

} // namespace vela::platform::dbus
