#include "platform/dbus/BlockingConnection.h"

#include "platform/dbus/Authentication.h"

#include <algorithm>
#include <array>
#include <cerrno>
#include <charconv>
#include <chrono>
#include <cstring>
#include <optional>
#include <poll.h>
#include <sys/socket.h>

namespace vela::platform::dbus {

namespace {

Failure systemFailure(const std::string& what, int error) {
    return {error, what + ": " + std::strerror(error)}; // NOLINT(concurrency-mt-unsafe): glibc's is safe
}

std::uint32_t serialOf(const Reply& reply) { return reply.header.replySerial; }

Failure closedFailure() { return {ECONNRESET, "the service closed the connection"}; }

/// "10 seconds", "0.02 seconds"
std::string secondsText(Nanoseconds time) {
    std::array<char, 64> digits{};
    const double seconds = std::chrono::duration<double>(time).count();
    const auto written = std::to_chars(digits.data(), digits.data() + digits.size(), seconds, std::chars_format::fixed);
    const std::string text(digits.data(), written.ptr);
    return text + (text == "1" ? " second" : " seconds");
}

Failure silenceFailure(Nanoseconds patience) { return {ETIMEDOUT, "no answer within " + secondsText(patience)}; }

/// What of `events` has come, or nothing when `patience` is over.
Result<short> waitFor(int descriptor, short events, Nanoseconds patience) {
    const Nanoseconds time = std::max(patience, Nanoseconds::zero());
    const auto seconds = std::chrono::floor<std::chrono::seconds>(time);
    const timespec limit{seconds.count(), (time - seconds).count()};
    pollfd waiting{descriptor, events, 0};
    int ready = -1;
    do {
        ready = ::ppoll(&waiting, 1, &limit, nullptr);
    } while (ready < 0 && errno == EINTR);
    if (ready < 0) {
        return systemFailure("waiting for the service", errno);
    }
    return waiting.revents;
}

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
    const Result<Done> sent = send(ClientAuthentication::opening(), patience);
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
        const Result<bool> taken = takeIn(patience);
        if (!taken) {
            return taken.failure();
        }
        if (!*taken) {
            return Failure{0, "the service did not answer: " + silenceFailure(patience).description};
        }
    }
}

Result<Done> BlockingConnection::send(std::string_view bytes, Nanoseconds patience) {
    std::optional<MonotonicTime> deadline; // from when the service takes nothing in
    while (!bytes.empty()) {
        const ssize_t sent = ::send(descriptor_.get(), bytes.data(), bytes.size(), MSG_NOSIGNAL | MSG_DONTWAIT);
        if (sent > 0) {
            bytes.remove_prefix(static_cast<std::size_t>(sent));
            deadline.reset();
            continue;
        }
        if (errno == EPIPE || errno == ECONNRESET) {
            return closedFailure();
        }
        if (errno != EAGAIN && errno != EINTR) {
            return systemFailure("sending to the service", errno);
        }
        const MonotonicTime now = std::chrono::steady_clock::now();
        if (deadline && now >= *deadline) {
            return Failure{ETIMEDOUT, "the service takes nothing in within " + secondsText(patience)};
        }
        deadline = deadline ? deadline : now + patience;
        if (const Result<Done> waited = waitForRoom(*deadline - now); !waited) {
            return waited.failure();
        }
    }
    return Done();
}

// A service that stops reading until its replies are read must not meet a client that does the same.
Result<Done> BlockingConnection::waitForRoom(Nanoseconds patience) {
    const Result<short> ready = waitFor(descriptor_.get(), POLLIN | POLLOUT, patience);
    if (!ready) {
        return ready.failure();
    }
    return (*ready & POLLIN) != 0 ? takeWhatIsThere() : Done();
}

Result<Reply> BlockingConnection::receive(std::uint32_t serial, Nanoseconds patience) {
    for (;;) {
        const auto found = std::ranges::find(replies_, serial, serialOf);
        if (found != replies_.end()) {
            Reply reply = std::move(*found);
            replies_.erase(found);
            return reply;
        }
        const Result<bool> taken = takeIn(patience);
        if (!taken) {
            return taken.failure();
        }
        if (!*taken) {
            return silenceFailure(patience);
        }
    }
}

// Waits by `ppoll`: a reading that waits is woken also whenever the service reads, and goes to sleep again for nothing.
Result<bool> BlockingConnection::takeIn(Nanoseconds patience) {
    const Result<short> ready = waitFor(descriptor_.get(), POLLIN, patience);
    if (!ready) {
        return ready.failure();
    }
    if (*ready == 0) {
        return false;
    }
    if (const Result<Done> taken = takeWhatIsThere(); !taken) {
        return taken.failure();
    }
    return true;
}

Result<Done> BlockingConnection::takeWhatIsThere() {
    const ssize_t got = ::recv(descriptor_.get(), scratch_.data(), scratch_.size(), MSG_DONTWAIT);
    if (got < 0 && (errno == EAGAIN || errno == EINTR)) {
        return Done();
    }
    if (got == 0 || (got < 0 && errno == ECONNRESET)) {
        return closedFailure();
    }
    if (got < 0) {
        return systemFailure("reading from the service", errno);
    }
    received_.append(scratch_.data(), static_cast<std::size_t>(got));
    return authenticated_ ? takeApart() : Done();
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
