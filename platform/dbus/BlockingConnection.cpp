#include "platform/dbus/BlockingConnection.h"

#include "platform/dbus/Authentication.h"

#include <algorithm>
#include <array>
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

Failure closedFailure() { return {ECONNRESET, "the service closed the connection"}; }

} // namespace

std::string Reply::errorText() const {
    if (!header.signature.starts_with('s')) {
        return {};
    }
    BodyReader body(header);
    return std::string(body.string());
}

Result<BlockingConnection> BlockingConnection::open(const std::vector<SocketAddress>& addresses, Nanoseconds patience) {
    Result<FileDescriptor> descriptor = connectTo(addresses, true);
    if (!descriptor) {
        return descriptor.failure();
    }
    BlockingConnection connection(*std::move(descriptor));
    const Result<Done> done = connection.authenticate(patience);
    if (!done) {
        return done.failure();
    }
    return connection;
}

Result<Done> BlockingConnection::authenticate(Nanoseconds patience) {
    const Result<Done> sent = send(ClientAuthentication::opening());
    if (!sent) {
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
        if (const Result<Done> ready = waitFor(POLLIN, patience); !ready) {
            return Failure{0, "the service did not answer: " + ready.failure().description};
        }
        if (const Result<Done> taken = takeIn(); !taken) {
            return taken.failure();
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
            Result<Done> taken = takeIn();
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
        if (auto found = replies_.extract(serial)) {
            return std::move(found.mapped());
        }
        if (const Result<Done> ready = waitFor(POLLIN, patience); !ready) {
            return ready.failure();
        }
        Result<Done> taken = takeIn();
        if (taken) {
            taken = takeApart();
        }
        if (!taken) {
            return taken.failure();
        }
    }
}

Result<Done> BlockingConnection::waitFor(short events, Nanoseconds patience) {
    const auto deadline = std::chrono::steady_clock::now() + patience;
    for (;;) {
        const auto left = std::chrono::ceil<std::chrono::milliseconds>(deadline - std::chrono::steady_clock::now());
        if (left.count() < 0) {
            return Failure{ETIMEDOUT, "no answer within " +
                                          std::to_string(std::chrono::duration<double>(patience).count()) + " seconds"};
        }
        pollfd waiting{descriptor_.get(), events, 0};
        const int ready = ::poll(&waiting, 1, static_cast<int>(std::min<std::int64_t>(left.count(), 1'000'000)));
        if (ready > 0) {
            return Done();
        }
        if (ready < 0 && errno != EINTR) {
            return systemFailure("waiting for the service", errno);
        }
    }
}

// Reads what is there.
Result<Done> BlockingConnection::takeIn() {
    std::array<char, 16384> buffer; // NOLINT(*-member-init): written before it is read
    const ssize_t got = ::recv(descriptor_.get(), buffer.data(), buffer.size(), MSG_DONTWAIT);
    if (got > 0) {
        received_.append(buffer.data(), static_cast<std::size_t>(got));
        return Done();
    }
    if (got == 0 || errno == ECONNRESET) {
        return closedFailure();
    }
    if (errno != EAGAIN && errno != EINTR) {
        return systemFailure("reading from the service", errno);
    }
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
            replies_.insert_or_assign(reply.header.replySerial, std::move(reply));
        }
    }
}

} // namespace vela::platform::dbus
