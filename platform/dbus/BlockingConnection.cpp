#include "platform/dbus/BlockingConnection.h"

#include "platform/dbus/Authentication.h"

#include <algorithm>
#include <cerrno>
#include <chrono>
#include <cstring>
#include <poll.h>
#include <sys/socket.h>

namespace vela::platform::dbus {

namespace {

Failure systemFailure(const std::string& what, int error) {
    return {error, what + ": " + std::strerror(error)}; // NOLINT(concurrency-mt-unsafe): glibc's is safe
}

std::uint32_t serialOf(const Reply& reply) { return reply.header.replySerial; }

Failure closedFailure() { return {ECONNRESET, "the service closed the connection"}; }

} // namespace

std::string Reply::errorText() const {
    if (!header.signature.starts_with('s')) {
        return {};
    }
    BodyReader body(header);
    return std::string(body.string());
}

bool BlockingConnection::hasReply(std::uint32_t serial) const {
    return std::ranges::find(replies_, serial, serialOf) != replies_.end();
}

Result<BlockingConnection> BlockingConnection::open(const std::vector<SocketAddress>& addresses, Nanoseconds patience) {
    Result<FileDescriptor> descriptor = connectTo(addresses, true);
    if (!descriptor) {
        return descriptor.failure();
    }
    return open(*std::move(descriptor), patience);
}

Result<BlockingConnection> BlockingConnection::open(FileDescriptor connected, Nanoseconds patience) {
    BlockingConnection connection(std::move(connected));
    const Result<Done> done = connection.authenticate(patience);
    if (!done) {
        return done.failure();
    }
    return connection;
}

Result<Done> BlockingConnection::authenticate(Nanoseconds patience) {
    // A service that refuses at once may have gone already, but not its answer.
    const Result<Done> sent = send(ClientAuthentication::opening());
    if (!sent && sent.failure().code != ECONNRESET) {
        return sent.failure();
    }
    ClientAuthentication authentication;
    for (;;) {
        std::string_view bytes = received_;
        const AuthenticationState state = authentication.feed(bytes);
        received_.erase(0, received_.size() - bytes.size());
        if (state == AuthenticationState::Refused) {
            return Failure{0, "the service refused the connection: " + authentication.refusal()};
        }
        if (state == AuthenticationState::Done) {
            authenticated_ = true;
            return takeApart();
        }
        if (const Result<Done> taken = takeIn(patience); !taken) {
            return taken.failure().code == ETIMEDOUT
                       ? Failure{0, "the service did not answer: " + taken.failure().description}
                       : taken.failure();
        }
    }
}

Result<Done> BlockingConnection::send(std::string_view bytes) {
    while (!bytes.empty()) {
        const ssize_t sent = ::send(descriptor_.get(), bytes.data(), bytes.size(), MSG_NOSIGNAL | MSG_DONTWAIT);
        if (sent > 0) {
            bytes.remove_prefix(static_cast<std::size_t>(sent));
            continue;
        }
        if (errno == EPIPE || errno == ECONNRESET) {
            return closedFailure();
        }
        if (errno != EAGAIN && errno != EINTR) {
            return systemFailure("sending to the service", errno);
        }
        // A service that stops reading until its replies are read must not meet a client that does the same.
        pollfd waiting{descriptor_.get(), POLLIN | POLLOUT, 0};
        if (::poll(&waiting, 1, -1) > 0 && (waiting.revents & POLLIN) != 0) {
            Result<Done> taken = takeWhatIsThere();
            if (taken && authenticated_) {
                taken = takeApart();
            }
            if (!taken) {
                return taken;
            }
        }
    }
    return Done();
}

Result<Reply> BlockingConnection::receive(std::uint32_t serial, Nanoseconds patience) {
    for (;;) {
        const auto found = std::ranges::find(replies_, serial, serialOf);
        if (found != replies_.end()) {
            Reply reply = std::move(*found);
            replies_.erase(found);
            return reply;
        }
        Result<Done> taken = takeIn(patience);
        if (taken) {
            taken = takeApart();
        }
        if (!taken) {
            return taken.failure();
        }
    }
}

// Waits by `ppoll`: a reading that waits is woken also whenever the service reads, and goes to sleep again for nothing.
Result<Done> BlockingConnection::takeIn(Nanoseconds patience) {
    const Nanoseconds time = std::max(patience, Nanoseconds::zero());
    const auto seconds = std::chrono::floor<std::chrono::seconds>(time);
    const timespec limit{seconds.count(), (time - seconds).count()};
    pollfd waiting{descriptor_.get(), POLLIN, 0};
    int ready = -1;
    do {
        ready = ::ppoll(&waiting, 1, &limit, nullptr);
    } while (ready < 0 && errno == EINTR);
    if (ready < 0) {
        return systemFailure("waiting for the service", errno);
    }
    if (ready == 0) {
        return Failure{ETIMEDOUT, "no answer within " +
                                      std::to_string(std::chrono::duration<double>(patience).count()) + " seconds"};
    }
    return takeWhatIsThere();
}

Result<Done> BlockingConnection::takeWhatIsThere() {
    const ssize_t got = ::recv(descriptor_.get(), scratch_.data(), scratch_.size(), MSG_DONTWAIT);
    if (got < 0 && (errno == EAGAIN || errno == EINTR)) {
        return Done();
    }
    return keep(got);
}

// `got`: what a reading into scratch_ answered.
Result<Done> BlockingConnection::keep(ssize_t got) {
    if (got == 0 || (got < 0 && errno == ECONNRESET)) {
        return closedFailure();
    }
    if (got < 0) {
        return systemFailure("reading from the service", errno);
    }
    received_.append(scratch_.data(), static_cast<std::size_t>(got));
    return Done();
}

Result<Done> BlockingConnection::takeApart() {
    std::size_t begin = 0;
    for (;;) {
        const std::string_view rest = std::string_view(received_).substr(begin);
        const Frame frame = frameOf(rest);
        if (frame.state == Frame::State::Invalid) {
            return Failure{EPROTO, "the service sent what is no message"};
        }
        if (frame.state == Frame::State::Incomplete || frame.bytes > rest.size()) {
            received_.erase(0, begin);
            return Done();
        }
        Reply reply{std::make_unique<const std::string>(rest.substr(0, frame.bytes)), {}};
        begin += frame.bytes;
        if (const auto fault = reply.header.read(*reply.message)) {
            return Failure{EPROTO, "the service sent a broken message: " + fault->text};
        }
        if (reply.header.type == MessageType::MethodReturn || reply.header.type == MessageType::Error) {
            replies_.push_back(std::move(reply));
        }
    }
}

} // namespace vela::platform::dbus
