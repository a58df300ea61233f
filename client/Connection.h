// One connection to the service: socket, authentication, messages in and bytes out. Nothing here waits. Confined to the
// client's thread.
//
//     Closed -> open -> Authenticating -> Ready -> Closed
//                             |-------------------> Closed
#pragma once

#include "platform/dbus/Address.h"
#include "platform/dbus/Authentication.h"
#include "platform/linux/FileDescriptor.h"

#include <cstddef>
#include <cstdint>
#include <string>
#include <string_view>

namespace vela::client {

class Connection {
public:
    enum class State : std::uint8_t { Closed, Authenticating, Ready };

    /// Connects and sends the opening of the authentication. False, with the reason in `failure()`, leaves it closed.
    bool open(const platform::dbus::SocketAddress& address);
    void close();

    State state() const { return state_; }
    int descriptor() const { return socket_.get(); }
    /// Why it is closed, for a person.
    const std::string& failure() const { return failure_; }

    /// Takes in what has arrived; the state may change to Ready or Closed. What arrived before the end can still be
    /// read.
    void receive();
    /// The next whole message, valid until the next call of either function. Closes on bytes that are none.
    bool nextMessage(std::string_view& message);

    /// Writes as much of `bytes` as the socket takes now and answers how much that was. Closes on errors, after
    /// taking in what has arrived.
    std::size_t send(std::string_view bytes);

private:
    void fail(std::string text);
    void authenticate();

    State state_ = State::Closed;
    platform::FileDescriptor socket_;
    platform::dbus::ClientAuthentication authentication_;
    std::string input_;
    std::size_t taken_ = 0; ///< of `input_`
    std::string failure_;
};

} // namespace vela::client
