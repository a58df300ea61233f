#include "platform/dbus/ConnectionChannel.h"

#include "platform/dbus/PeerCredentials.h"

#include <cerrno>
#include <sys/socket.h>
#include <utility>

namespace vela::platform::dbus {

namespace {

/// An emptied buffer keeps this much for the next replies.
constexpr std::size_t kKeptBytes = 16 * 1024;

} // namespace

ConnectionChannel::ConnectionChannel(FileDescriptor socket, std::shared_ptr<EventLoop> loop, std::uint64_t token,
                                     ChannelLimits limits)
    : loop_(std::move(loop)),
      token_(token),
      limits_(limits),
      descriptor_(socket.get()),
      registered_(loop_->add(descriptor_, EPOLLIN, token_)),
      socket_(std::move(socket)),
      watched_(registered_) {}

bool ConnectionChannel::confirmPeer() const {
    const MutexLock lock(mutex_);
    return !socket_ || !peerIsGone(descriptor_);
}

void ConnectionChannel::sendBytes(std::string_view bytes) {
    const MutexLock lock(mutex_);
    if (sending_) {
        output_ += bytes;
        flush();
    }
}

void ConnectionChannel::flush() {
    if (writing_) {
        return; // the loop tells when the socket takes bytes again
    }
    while (sent_ < output_.size()) {
        const ssize_t count =
            ::send(descriptor_, output_.data() + sent_, output_.size() - sent_, MSG_DONTWAIT | MSG_NOSIGNAL);
        if (count >= 0) {
            sent_ += static_cast<std::size_t>(count);
        } else if (errno == EAGAIN) {
            // Bytes that were sent are dropped now and then, so that the buffer stays near what is unsent.
            if (sent_ > output_.size() / 2) {
                output_.erase(0, std::exchange(sent_, 0));
            }
            noteOpen();
            return watch(reading_, true);
        } else if (errno != EINTR) {
            return discardOutput(); // the end of the connection shows when reading
        }
    }
    output_.clear();
    sent_ = 0;
    noteOpen();
    if (output_.capacity() > kKeptBytes) {
        output_.shrink_to_fit();
    }
}

void ConnectionChannel::discardOutput() {
    sending_ = false;
    output_ = std::string();
    sent_ = 0;
    noteOpen();
    watch(reading_, false);
}

void ConnectionChannel::watch(bool reading, bool writing) {
    if (watched_ && (reading != reading_ || writing != writing_)) {
        loop_->modify(descriptor_, (reading ? EPOLLIN : 0U) | (writing ? EPOLLOUT : 0U), token_);
    }
    reading_ = reading;
    writing_ = writing;
}

void ConnectionChannel::callEnds(std::uint64_t bytes) {
    const MutexLock lock(mutex_);
    end(bytes);
}

void ConnectionChannel::end(std::uint64_t bytes) {
    const bool wasLast = underWay_.fetch_sub(underWay(bytes), std::memory_order_relaxed) == underWay(bytes);
    if (gathering_ && !looking_ && wasLast) {
        flush();
        loop_->ring(token_);
    } else {
        flushUnlessGathering();
    }
    resumeIfPossible();
}

void ConnectionChannel::flushUnlessGathering() {
    if (!gathering_ || unsent() > kGatheredBytes) {
        flush();
    }
}

bool ConnectionChannel::mayProceed() {
    if (belowLimits()) [[likely]] {
        return true;
    }
    const MutexLock lock(mutex_);
    if (belowLimits()) {
        return true;
    }
    paused_ = true;
    watch(false, writing_);
    return false;
}

bool ConnectionChannel::hasRoom() const { return belowLimits(); }

void ConnectionChannel::noteOpen() {
    const bool open = !held_ && unsent() <= limits_.unsentBytes;
    if (open != open_.load(std::memory_order_relaxed)) {
        open_.store(open, std::memory_order_release);
    }
}

void ConnectionChannel::beginGathering() {
    const MutexLock lock(mutex_);
    gathering_ = true;
    paused_ = false;
    watch(false, writing_);
}

bool ConnectionChannel::beginLook() {
    const MutexLock lock(mutex_);
    looking_ = true;
    const std::size_t before = unsent();
    flush();
    return unsent() < before;
}

bool ConnectionChannel::endLook() {
    const MutexLock lock(mutex_);
    looking_ = false;
    if (inFlight() > 0) {
        return false;
    }
    flush();
    return true;
}

void ConnectionChannel::endGathering() {
    const MutexLock lock(mutex_);
    gathering_ = looking_ = false;
    flush();
    watch(true, writing_);
}

void ConnectionChannel::resumeIfPossible() {
    // Not at the first free place: reading in runs costs fewer wake-ups.
    if (paused_ && !held_ && isHalfEmpty() && unsent() <= limits_.unsentBytes / 2) {
        paused_ = false;
        watch(true, writing_);
        loop_->ring(token_);
    }
}

void ConnectionChannel::release() {
    const MutexLock lock(mutex_);
    if (std::exchange(held_, false)) {
        noteOpen();
        // Also where nothing waits: a client that hung up while it was held is looked at again.
        paused_ = true;
        resumeIfPossible();
    }
}

bool ConnectionChannel::held() const {
    const MutexLock lock(mutex_);
    return held_;
}

void ConnectionChannel::writable() {
    const MutexLock lock(mutex_);
    watch(reading_, false);
    if (sending_) {
        flush();
        resumeIfPossible();
    }
}

void ConnectionChannel::hangUp() {
    const MutexLock lock(mutex_);
    discardOutput();
    if (std::exchange(watched_, false)) {
        loop_->remove(descriptor_);
    }
}

void ConnectionChannel::close() {
    const MutexLock lock(mutex_);
    discardOutput();
    if (std::exchange(watched_, false)) {
        loop_->remove(descriptor_);
    }
    socket_ = FileDescriptor();
}

} // namespace vela::platform::dbus
