#include "client/WaitingCalls.h"

#include <chrono>
#include <utility>

namespace vela::client {

WaitingCalls::Waiter::Waiter(WaitingCalls& calls) : calls_(calls) {
    const std::scoped_lock lock(calls_.mutex_);
    // NOLINTNEXTLINE(cppcoreguidelines-prefer-member-initializer): read under the lock
    ticket_ = calls_.nextTicket_++;
    calls_.waiters_.emplace(ticket_, this);
}

WaitingCalls::Waiter::~Waiter() {
    const std::scoped_lock lock(calls_.mutex_);
    calls_.waiters_.erase(ticket_);
}

Reply WaitingCalls::Waiter::wait(std::int32_t milliseconds) {
    std::unique_lock lock(calls_.mutex_);
    const auto answered = [this] { return answered_; };
    if (milliseconds < 0) {
        changed_.wait(lock, answered);
    } else if (!changed_.wait_for(lock, std::chrono::milliseconds(milliseconds), answered)) {
        // From here on a reply is nobody's.
        answered_ = true;
        reply_.status = VelaReportingStatusTimeout;
    }
    return std::move(reply_);
}

bool WaitingCalls::isWaiting(std::uint64_t ticket) const {
    const std::scoped_lock lock(mutex_);
    const auto found = waiters_.find(ticket);
    return found != waiters_.end() && !found->second->answered_;
}

void WaitingCalls::answer(std::uint64_t ticket, Reply reply) {
    const std::scoped_lock lock(mutex_);
    const auto found = waiters_.find(ticket);
    if (found != waiters_.end()) {
        settle(*found->second, std::move(reply));
    }
}

void WaitingCalls::answerAll(std::uint64_t before, VelaReportingStatus status, const std::string& text) {
    const std::scoped_lock lock(mutex_);
    for (const auto& [ticket, waiter] : waiters_) {
        if (ticket < before) {
            Reply reply;
            reply.status = status;
            reply.errorText = text;
            settle(*waiter, std::move(reply));
        }
    }
}

std::uint64_t WaitingCalls::nextTicket() const {
    const std::scoped_lock lock(mutex_);
    return nextTicket_;
}

void WaitingCalls::settle(Waiter& waiter, Reply reply) {
    if (waiter.answered_) {
        return;
    }
    waiter.answered_ = true;
    waiter.reply_ = std::move(reply);
    // Under the mutex: the waiter ends as soon as it can take it.
    waiter.changed_.notify_one();
}

} // namespace vela::client
