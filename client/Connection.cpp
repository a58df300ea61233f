#include "client/Connection.h"

#include "platform/dbus/MessageReader.h"

#include <array>
#include <cassert>
#include <cerrno>
#include <sys/socket.h>
#include <system_error>
#include <utility>

namespace vela::client {

namespace {

namespace dbus = platform::dbus;

/// No reply of the protocol comes near it.
constexpr std::size_t kMostMessageBytes = std::size_t{16} * 1024 * 1024;
constexpr std::size_t kReceiveBytes = std::size_t{16} * 1024;

std::string errorText(int error) { return std::system_category().message(error); }

} // namespace

bool Connection::open(const dbus::SocketAddress& address) {
    assert(state_ == State::Closed);
    input_.clear();
    taken_ = 0;
    failure_.clear();
    authentication_ = {};
    // A queue of callers that is full is an attempt that failed.
    auto connected = dbus::connectTo({address}, false);
    if (!connected) {
        return fail(connected.failure().description), false;
    }
    socket_ = *std::move(connected);
    state_ = State::Authenticating;
    const std::string_view opening = dbus::ClientAuthentication::opening();
    // An empty socket takes so few bytes at once.
    if (send(opening) != opening.size()) {
        return fail(address.text() + " takes no bytes"), false;
    }
    return true;
}

void Connection::close() {
    socket_ = {};
    state_ = State::Closed;
}

void Connection::fail(std::string text) {
    failure_ = std::move(text);
    close();
}

void Connection::receive() {
    std::array<char, kReceiveBytes> block;
    while (state_ != State::Closed) {
        const ssize_t got = recv(socket_.get(), block.data(), block.size(), MSG_DONTWAIT);
        if (got < 0 && errno == EINTR) {
            continue;
        }
        if (got < 0 && errno == EAGAIN) {
            return;
        }
        if (got <= 0) {
            return fail(got == 0 ? "the service ended the connection" : errorText(errno));
        }
        input_.erase(0, taken_);
        taken_ = 0;
        input_.append(block.data(), static_cast<std::size_t>(got));
        if (state_ == State::Authenticating) {
            authenticate();
        }
        if (input_.size() > kMostMessageBytes) {
            return; // whole messages first
        }
    }
}

void Connection::authenticate() {
    std::string_view rest = input_;
    switch (authentication_.feed(rest)) {
    case dbus::AuthenticationState::Done:
        state_ = State::Ready;
        break;
    case dbus::AuthenticationState::Refused:
        fail("the service let this process not in: " + authentication_.refusal());
        return;
    case dbus::AuthenticationState::Waiting:
        break;
    }
    taken_ = input_.size() - rest.size();
}

bool Connection::nextMessage(std::string_view& message) {
    const std::string_view rest = std::string_view(input_).substr(taken_);
    const dbus::Frame frame = dbus::frameOf(rest);
    const bool known = frame.state == dbus::Frame::State::Known;
    if (frame.state == dbus::Frame::State::Invalid || (known && frame.bytes > kMostMessageBytes)) {
        fail("the service sent bytes that are no message");
        return false;
    }
    if (!known || frame.bytes > rest.size()) {
        return false;
    }
    message = rest.substr(0, frame.bytes);
    taken_ += frame.bytes;
    return true;
}

std::size_t Connection::send(std::string_view bytes) {
    std::size_t sent = 0;
    while (sent < bytes.size()) {
        const ssize_t count =
            ::send(socket_.get(), bytes.data() + sent, bytes.size() - sent, MSG_DONTWAIT | MSG_NOSIGNAL);
        if (count >= 0) {
            sent += static_cast<std::size_t>(count);
        } else if (errno == EAGAIN) {
            break;
        } else if (errno != EINTR) {
            const int error = errno;
            receive(); // what the service said before it ended
            if (state_ != State::Closed) {
                fail(errorText(error));
            }
            break;
        }
    }
    return sent;
}

} // namespace vela::client
