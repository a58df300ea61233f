#include "reporters/pipewire/ReportSender.h"

#include <algorithm>
#include <utility>

namespace vela::reporter {

namespace {

/// Between two attempts while there is something to bring and nobody who takes it.
constexpr std::chrono::milliseconds kFirstPause{50};
constexpr std::chrono::milliseconds kLongestPause{1000};

} // namespace

ReportSender::ReportSender(ServiceCalls& service) : delivery_(service), thread_([this] { run(); }) {}

ReportSender::~ReportSender() { end(std::chrono::milliseconds(0)); }

void ReportSender::createSession(const SessionDescription& session) { add(CreateCall{session}); }
void ReportSender::startSession(std::int64_t reporterID) { add(StartCall{reporterID}); }
void ReportSender::send(std::int64_t reporterID, Report report) { add(SendCall{reporterID, std::move(report)}); }
void ReportSender::stopSession(std::int64_t reporterID) { add(StopCall{reporterID}); }
void ReportSender::destroySession(std::int64_t reporterID) { add(DestroyCall{reporterID}); }

void ReportSender::add(Call call) {
    {
        const std::lock_guard lock(mutex_);
        if (isEnding_ || !admission_.admits(call, calls_.size())) {
            ++dropped_;
            return;
        }
        calls_.push_back(std::move(call));
    }
    changed_.notify_one();
}

void ReportSender::run() {
    std::chrono::milliseconds pause = kFirstPause;
    std::unique_lock lock(mutex_);
    while (true) {
        changed_.wait(lock, [this] { return isEnding_ || !calls_.empty(); });
        if (calls_.empty() || (isEnding_ && std::chrono::steady_clock::now() >= deadline_)) {
            return;
        }
        const Call& call = calls_.front(); // stays where it is: only this thread takes calls away
        lock.unlock();
        const bool done = delivery_.perform(call);
        lock.lock();
        if (done) {
            calls_.pop_front();
            pause = kFirstPause;
            continue;
        }
        // New calls wake it early, which costs a look at the connection.
        changed_.wait_for(lock, isEnding_ ? kFirstPause : pause);
        pause = std::min(pause * 2, kLongestPause);
    }
}

std::size_t ReportSender::end(std::chrono::milliseconds patience) {
    {
        const std::lock_guard lock(mutex_);
        if (!isEnding_) {
            isEnding_ = true;
            deadline_ = std::chrono::steady_clock::now() + patience;
        }
    }
    changed_.notify_one();
    if (thread_.joinable()) {
        thread_.join();
    }
    const std::lock_guard lock(mutex_);
    return calls_.size();
}

std::size_t ReportSender::dropped() const {
    const std::lock_guard lock(mutex_);
    return dropped_;
}

} // namespace vela::reporter
