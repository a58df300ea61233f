// What stands behind the C API's handle: the queue with its producers' side, the callers that wait, and the thread.
// Thread-safe. Calls that do not wait neither lock, allocate nor throw.
#pragma once

#include "client/CallClock.h"
#include "client/CallQueue.h"
#include "client/Doorbell.h"
#include "client/Operations.h"
#include "client/ServiceLink.h"
#include "client/ValueEncoder.h"
#include "client/WaitingCalls.h"
#include "client/include/vela/reporting.h"

#include <atomic>
#include <chrono>
#include <cstdint>
#include <span>
#include <thread>
#include <vector>

namespace vela::client {

struct ClientSettings {
    std::vector<platform::dbus::SocketAddress> addresses;
    std::size_t queueBytes = std::size_t{1024} * 1024; ///< a power of two, see CallQueue
    std::chrono::milliseconds patience{1000};          ///< for what is queued at the end
};

/// A call about one session, or about none.
struct PlainCall {
    Operation operation{};
    std::int64_t reporterID = 0;
    std::uint16_t serviceType = 0;
};

class Client {
public:
    /// Throws std::bad_alloc and std::system_error.
    explicit Client(ClientSettings settings);
    Client(const Client&) = delete;
    Client& operator=(const Client&) = delete;
    ~Client();

    // `ticket`: of the caller that will wait, or 0.
    VelaReportingStatus call(const PlainCall& call, std::uint64_t ticket = 0);
    VelaReportingStatus setConfiguration(const ConfigurationArguments& arguments, std::uint64_t ticket = 0);
    /// Adds the stamps.
    VelaReportingStatus sendMessage(MessageArguments arguments, std::uint64_t ticket = 0);

    WaitingCalls& waitingCalls() { return waitingCalls_; }
    VelaReportingClientState state() const;

    /// Passes on what is queued and ends the thread: Ok, or Timeout when something was left.
    VelaReportingStatus end();

private:
    VelaReportingStatus refuse(VelaReportingStatus status);
    template <class Write>
    VelaReportingStatus enqueue(const PlainCall& call, std::size_t bytes, std::uint64_t ticket, const Write& write);

    const std::chrono::milliseconds patience_;
    const CallClock clock_;
    CallQueue queue_;
    Doorbell doorbell_;
    WaitingCalls waitingCalls_;
    ServiceLink link_;
    std::atomic<std::uint64_t> droppedQueueFull_ = 0;
    std::atomic<std::uint64_t> droppedTooLarge_ = 0;
    std::atomic<std::uint64_t> droppedInvalid_ = 0;
    std::thread thread_;
};

} // namespace vela::client
