// The client's thread: takes calls from the queue, passes them on to the service, keeps the connection and hands
// replies to those who wait. `run` and the private parts belong to that thread; the other public functions are
// thread-safe. What the constructor is given outlives the link.
//
// A call leaves the queue only when all its bytes are written: a connection that is lost before has the call written
// anew to the next one, and the session table holds exactly what some service was told.
#pragma once

#include "client/Backoff.h"
#include "client/CallQueue.h"
#include "client/Connection.h"
#include "client/Doorbell.h"
#include "client/Operations.h"
#include "client/SessionTable.h"
#include "client/WaitingCalls.h"

#include <array>
#include <atomic>
#include <chrono>
#include <cstdint>
#include <deque>
#include <string>
#include <string_view>
#include <unordered_map>
#include <vector>

namespace vela::client {

class ServiceLink {
public:
    ServiceLink(CallQueue& queue, Doorbell& doorbell, WaitingCalls& waitingCalls,
                std::vector<platform::dbus::SocketAddress> addresses);

    /// Runs until `stop` and what follows from it.
    void run();

    /// Somebody waits for a call: if there is no connection, it is tried for at once. To be followed by the doorbell.
    void prompt() { prompted_.store(true, std::memory_order_seq_cst); }
    /// Ends `run` once the queue is passed on, the service cannot be reached, or `patience` is over. Called once.
    void stop(std::chrono::milliseconds patience);

    bool connected() const { return connected_.load(std::memory_order_relaxed); }
    std::uint64_t connections() const { return connections_.load(std::memory_order_relaxed); }
    std::uint64_t sent() const { return sent_.load(std::memory_order_relaxed); }
    std::uint64_t notRemembered() const { return notRemembered_.load(std::memory_order_relaxed); }

private:
    /// A call whose bytes are in the output up to `outputEnd`.
    struct Written {
        std::size_t outputEnd = 0;
        std::uint64_t queueEnd = 0;
        const CallRecord* record = nullptr;
        std::uint32_t serial = 0; ///< 0: it was left out, nobody waits for it any more
        bool replyWanted = false;
    };
    struct Unanswered {
        std::uint64_t ticket = 0;
        Operation operation{};
    };

    // Connecting.
    void keepConnection();
    bool wantsConnection() const { return !sessions_.empty() || !queue_.empty(); }
    void attempt(std::size_t firstAddress);
    void connectionReady();
    void connectionEnded();
    void dropOutput();

    // Calls out.
    void passOn();
    void gather();
    void append(const CallQueue::Read& read);
    void settleWritten();
    bool outputPending() const { return outputSent_ < output_.size(); }
    std::uint32_t takeSerial();

    // Replies in.
    void handleArrived();
    void handle(std::string_view message);
    void expectReply(const Written& written);

    // Resting.
    void rest();
    Rest restKind() const;
    int timeoutOf(Rest rest) const;
    bool somethingCameUp(Rest rest) const;
    bool stopping() const { return stopping_.load(std::memory_order_seq_cst); }
    bool finished();

    // Constant after construction.
    CallQueue& queue_;
    Doorbell& doorbell_;
    WaitingCalls& waitingCalls_;
    const std::vector<platform::dbus::SocketAddress> addresses_;
    std::array<std::string, kOperations> headers_; ///< of calls, without flags, serial and length of the body

    // The thread's own.
    Connection connection_;
    Connection::State knownState_ = Connection::State::Closed;
    Backoff backoff_;
    std::size_t address_ = 0; ///< of the connection
    std::uint64_t ticketsOfAttempt_ = 0;
    bool attempted_ = false;
    bool attemptedWhileStopping_ = false;
    SessionTable sessions_;
    std::string output_;
    std::size_t outputSent_ = 0;
    std::deque<Written> written_;
    std::uint32_t lastSerial_ = 0;
    std::unordered_map<std::uint32_t, Unanswered> unanswered_; ///< by serial
    std::size_t unansweredLimit_ = 1024;                       ///< when to look for those nobody waits for
    Moment busyAt_{};
    Moment now_{};
    bool deadlineKnown_ = false;
    Moment deadline_{};

    // Shared.
    std::atomic<bool> prompted_ = false;
    std::atomic<bool> stopping_ = false;
    std::atomic<std::int64_t> patienceMilliseconds_ = 0;
    std::atomic<bool> connected_ = false;
    std::atomic<std::uint64_t> connections_ = 0;
    std::atomic<std::uint64_t> sent_ = 0;
    std::atomic<std::uint64_t> notRemembered_ = 0;
};

} // namespace vela::client
