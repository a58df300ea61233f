#include "platform/dbus/ServiceConnection.h"

#include "platform/linux/DeferredWakes.h"

#include <algorithm>
#include <cerrno>
#include <sys/socket.h>
#include <utility>

namespace vela::platform::dbus {

namespace {

/// An emptied buffer keeps this much for the next bytes.
constexpr std::size_t kKeptBytes = 4 * 1024;

} // namespace

ServiceConnection::ServiceConnection(ConnectionSetup setup)
    : channel_(std::move(setup.channel)),
      messageBytes_(setup.messageBytes),
      refused_(!setup.refusal.empty()) {
    target_.facts = setup.facts;
    target_.connection = setup.number;
    authentication_.emplace(setup.peer.user, setup.serverId, std::move(setup.refusal));
    target_.peer = std::move(setup.peer);
}

void ServiceConnection::setExportedObject(std::shared_ptr<ReportingServiceProtocol> object) {
    const MutexLock lock(mutex_);
    std::swap(object_, object); // the former one is destroyed behind the lock
}

void ServiceConnection::setInterruptionHandler(UniqueFunction<void()> handler) {
    const MutexLock lock(mutex_);
    std::swap(interruption_, handler);
}

void ServiceConnection::setInvalidationHandler(UniqueFunction<void()> handler) {
    const MutexLock lock(mutex_);
    std::swap(invalidation_, handler);
}

std::string ServiceConnection::description() const {
    return "<connection " + std::to_string(target_.connection) + " pid " +
           std::to_string(target_.peer.processIdentifier) + " uid " + std::to_string(target_.peer.user) + ">";
}

ServiceConnection::Turn ServiceConnection::turn(std::span<char> scratch, IpcListenerDelegate& delegate) {
    if (state_ == State::Ended) {
        return Turn::Waiting; // it was queued before it ended
    }
    const DeferredWakes wakes;
    budget_ = kMessagesPerTurn;
    if (gathering_ && !std::exchange(looking_, true)) {
        delivered_ = channel_->beginLook();
    }
    atLimit_ = false;
    takeBuffered(delegate);
    if (ending_) {
        return Turn::Ended;
    }
    if (stopsAtLimit()) {
        return endLook(true);
    }
    return budget_ == 0 ? Turn::More : readOnce(scratch, delegate);
}

bool ServiceConnection::mayProceed() const {
    if (hungUp_) {
        return !channel_->held();
    }
    return gathering_ ? channel_->hasRoom() : channel_->mayProceed();
}

/// Whether a limit ends this turn. Calls end on other threads at any time: where one made room only behind `take`,
/// what `take` left is still there, and nobody but this turn knows.
bool ServiceConnection::stopsAtLimit() const { return atLimit_ || (state_ == State::Open && !mayProceed()); }

/// How it goes on when all that was received has been dispatched, or, at a limit, some of it must wait.
ServiceConnection::Turn ServiceConnection::endLook(bool atLimit) {
    if (hungUp_) {
        return Turn::Waiting;
    }
    if (!gathering_) {
        if (found_ < kBetweenGatherings || channel_->inFlight() < 2) {
            return Turn::Waiting;
        }
        gathering_ = true;
        found_ = 0;
        channel_->beginGathering();
        return Turn::Soon;
    }
    looking_ = false;
    if (found_ >= kWorthGathering || (atLimit && delivered_)) {
        found_ = 0;
        // Those who work on the calls are as fast as this thread: it goes on.
        return channel_->endLook() ? Turn::More : Turn::Soon;
    }
    if (soon) { // a look before its time is no judgement
        channel_->endLook();
        return Turn::Soon;
    }
    gathering_ = false;
    found_ = 0;
    channel_->endGathering();
    // From now on the channel rings when what was received may go on.
    return atLimit && mayProceed() ? Turn::More : Turn::Waiting;
}

ServiceConnection::Turn ServiceConnection::readOnce(std::span<char> scratch, IpcListenerDelegate& delegate) {
    const ssize_t count = recv(channel_->descriptor(), scratch.data(), scratch.size(), MSG_DONTWAIT);
    if (count < 0 && errno == EINTR) {
        return Turn::More;
    }
    if (count < 0 && errno == EAGAIN) {
        return hungUp_ ? Turn::Ended : endLook();
    }
    if (count <= 0) {
        return Turn::Ended; // what is left over is half a message
    }
    std::string_view bytes(scratch.data(), static_cast<std::size_t>(count));
    if (received_.empty()) {
        // The usual case: whole messages, straight from the scratch buffer.
        take(bytes, delegate);
        received_ = bytes;
    } else {
        received_ += bytes;
        takeBuffered(delegate);
    }
    if (ending_) {
        return Turn::Ended;
    }
    if (stopsAtLimit()) {
        return endLook(true);
    }
    return budget_ == 0 || hungUp_ ? Turn::More : endLook();
}

void ServiceConnection::takeBuffered(IpcListenerDelegate& delegate) {
    if (received_.empty()) {
        return;
    }
    std::string_view bytes = std::string_view(received_).substr(taken_);
    take(bytes, delegate);
    taken_ = received_.size() - bytes.size();
    if (!bytes.empty() && taken_ <= received_.size() / 2) {
        return;
    }
    received_.erase(0, std::exchange(taken_, 0));
    if (received_.size() < kKeptBytes && received_.capacity() > kKeptBytes) {
        received_.shrink_to_fit();
    }
}

void ServiceConnection::take(std::string_view& bytes, IpcListenerDelegate& delegate) {
    while (!bytes.empty() && !ending_ && budget_ > 0) {
        if (skipped_ > 0) {
            const std::size_t now = std::min<std::uint64_t>(skipped_, bytes.size());
            bytes.remove_prefix(now);
            skipped_ -= now;
        } else if (state_ == State::Authenticating) {
            if (!takeAuthentication(bytes, delegate)) {
                return;
            }
        } else if (!mayProceed()) {
            atLimit_ = true;
            return;
        } else if (!takeMessage(bytes)) {
            return;
        }
    }
}

bool ServiceConnection::takeAuthentication(std::string_view& bytes, IpcListenerDelegate& delegate) {
    std::string answer;
    const AuthenticationState result = authentication_->feed(bytes, answer);
    channel_->sendBytes(answer);
    if (result == AuthenticationState::Waiting) {
        return false;
    }
    authentication_.reset();
    if (result == AuthenticationState::Refused) {
        ending_ = true;
        return false;
    }
    state_ = State::Open;
    if (!delegate.shouldAcceptNewConnection(shared_from_this())) {
        // It was never the service's: no handler hears of its end.
        ending_ = true;
        setInterruptionHandler({});
        setInvalidationHandler({});
        return false;
    }
    return true;
}

bool ServiceConnection::takeMessage(std::string_view& bytes) {
    const Frame frame = frameOf(bytes);
    if (frame.state == Frame::State::Invalid) {
        ending_ = broken_ = true;
        return false;
    }
    if (frame.state == Frame::State::Incomplete) {
        return false;
    }
    if (frame.bytes > messageBytes_) {
        refuseMessage(frame);
        skipped_ = frame.bytes;
        return true;
    }
    if (frame.bytes > bytes.size()) {
        return false;
    }
    --budget_;
    ++found_;
    dispatch(bytes.substr(0, frame.bytes));
    bytes.remove_prefix(frame.bytes);
    return true;
}

void ServiceConnection::refuseMessage(const Frame& frame) {
    const bool answered = frame.type == MessageType::MethodCall && (frame.flags & kNoReplyExpectedFlag) == 0;
    if (answered) {
        channel_->send([&](MessageWriter& writer, std::uint32_t serial) {
            writer.error(kLimitsExceededError,
                         "limits.message_bytes is " + std::to_string(messageBytes_) + ": this message has " +
                             std::to_string(frame.bytes),
                         {.serial = serial, .replySerial = frame.serial});
        });
    }
}

void ServiceConnection::dispatch(std::string_view message) {
    if (headers_.read(message)) {
        ending_ = broken_ = true;
        return;
    }
    const MessageHeader& header = headers_.header();
    if (header.type != MessageType::MethodCall) {
        return; // nobody was asked anything, and nobody listens to signals
    }
    {
        const MutexLock lock(mutex_);
        target_.object = object_;
    }
    ending_ = broken_ = !dispatchCall(header, target_, channel_);
}

void ServiceConnection::hangUp() {
    if (std::exchange(gathering_, false)) {
        channel_->endGathering(); // the end may be the service's own
    }
    hungUp_ = true;
    channel_->hangUp();
}

void ServiceConnection::end() {
    const bool wasOpen = state_ == State::Open;
    Handlers handlers = close();
    if (wasOpen && broken_ && handlers.interruption) {
        handlers.interruption();
    }
    if (wasOpen && handlers.invalidation) {
        handlers.invalidation();
    }
    target_.object = nullptr;
}

void ServiceConnection::abandon() {
    close();
    target_.object = nullptr;
}

// Answers the handlers, which are destroyed without being called otherwise.
ServiceConnection::Handlers ServiceConnection::close() {
    state_ = State::Ended;
    if (std::exchange(gathering_, false)) {
        channel_->endGathering(); // what was answered is sent
    }
    channel_->close();
    received_ = std::string();
    Handlers handlers;
    std::shared_ptr<ReportingServiceProtocol> object;
    {
        const MutexLock lock(mutex_);
        std::swap(handlers.interruption, interruption_);
        std::swap(handlers.invalidation, invalidation_);
        std::swap(object, object_);
    }
    target_.object = std::move(object); // the handlers may count on it
    return handlers;
}

} // namespace vela::platform::dbus
