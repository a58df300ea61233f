// Takes calls from the thread of the graph, which must not wait, and brings them to the service on a thread of its own.
// Thread-safe. Sleeps as long as there is nothing to bring.
#pragma once

#include "reporters/pipewire/CallAdmission.h"
#include "reporters/pipewire/ReportDelivery.h"
#include "reporters/pipewire/Reports.h"

#include <chrono>
#include <condition_variable>
#include <cstddef>
#include <cstdint>
#include <deque>
#include <mutex>
#include <thread>

namespace vela::reporter {

class ReportSender final : public ReportSink {
public:
    /// `service` outlives this object.
    explicit ReportSender(ServiceCalls& service);
    /// As end() without patience.
    ~ReportSender() override;
    ReportSender(const ReportSender&) = delete;
    ReportSender& operator=(const ReportSender&) = delete;

    void createSession(const SessionDescription& session) override;
    void startSession(std::int64_t reporterID) override;
    void send(std::int64_t reporterID, Report report) override;
    void stopSession(std::int64_t reporterID) override;
    void destroySession(std::int64_t reporterID) override;

    /// Brings what waits, for at most `patience`, and ends. How many calls were not brought.
    std::size_t end(std::chrono::milliseconds patience);

    /// Calls that were dropped because too many waited for a service.
    std::size_t dropped() const;

    /// Beyond these, only stops and ends of what was taken before are taken: at most two for each session.
    static constexpr std::size_t kMostCalls = 20'000;

private:
    void add(Call call);
    void run();

    mutable std::mutex mutex_; ///< guards what follows
    std::condition_variable changed_;
    std::deque<Call> calls_; ///< the first is being brought
    CallAdmission admission_{kMostCalls};
    bool isEnding_ = false;
    std::chrono::steady_clock::time_point deadline_;
    std::size_t dropped_ = 0;

    ReportDelivery delivery_; ///< of the thread
    std::thread thread_;
};

} // namespace vela::reporter
