// The callers that wait for a reply. Thread-safe.
#pragma once

#include "client/Operations.h"

#include <condition_variable>
#include <cstdint>
#include <mutex>
#include <string>
#include <unordered_map>

namespace vela::client {

class WaitingCalls {
public:
    /// One caller, on its own stack. It is known by its ticket until its end.
    class Waiter {
    public:
        explicit Waiter(WaitingCalls& calls);
        ~Waiter();
        Waiter(const Waiter&) = delete;
        Waiter& operator=(const Waiter&) = delete;

        /// Never 0.
        std::uint64_t ticket() const { return ticket_; }
        /// Waits for the reply; a negative time waits for ever. Called once.
        Reply wait(std::int32_t milliseconds);

    private:
        friend class WaitingCalls;
        WaitingCalls& calls_;
        std::uint64_t ticket_;
        std::condition_variable changed_;
        bool answered_ = false; // guarded by the calls' mutex, with the reply
        Reply reply_;
    };

    /// Whether somebody still waits under this ticket without an answer.
    bool isWaiting(std::uint64_t ticket) const;
    /// Answers whoever waits under this ticket; nobody when it has gone or was answered.
    void answer(std::uint64_t ticket, Reply reply);
    /// Answers everybody who came before `before`.
    void answerAll(std::uint64_t before, VelaReportingStatus status, const std::string& text);
    /// The ticket that the next caller gets.
    std::uint64_t nextTicket() const;

private:
    static void settle(Waiter& waiter, Reply reply);

    mutable std::mutex mutex_;
    // Guarded by mutex_.
    std::uint64_t nextTicket_ = 1;
    std::unordered_map<std::uint64_t, Waiter*> waiters_;
};

} // namespace vela::client
