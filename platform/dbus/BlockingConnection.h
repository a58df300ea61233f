// A connection to the service for programs that have nothing to do but wait for its answers: the administrator's tool,
// tests and benchmarks. Confined to its owner's thread.
#pragma once

#include "platform/Clock.h"
#include "platform/Result.h"
#include "platform/dbus/Address.h"
#include "platform/dbus/MessageReader.h"
#include "platform/dbus/MessageWriter.h"
#include "platform/linux/FileDescriptor.h"

#include <chrono>
#include <cstdint>
#include <deque>
#include <memory>
#include <string>
#include <string_view>
#include <vector>

namespace vela::platform::dbus {

/// A reply: a return or an error.
struct Reply {
    std::unique_ptr<const std::string> message; ///< what the header's texts are views into
    MessageHeader header;

    bool isError() const { return header.type == MessageType::Error; }
    /// The text that came with an error; empty when there was none.
    std::string errorText() const;
};

class BlockingConnection {
public:
    /// Connects and authenticates. The failure's code is that of the system call, or 0 when the service refused or did
    /// not answer within `patience`.
    static Result<BlockingConnection> open(const std::vector<SocketAddress>& addresses, Nanoseconds patience);
    /// As above, of a socket that is connected and blocks.
    static Result<BlockingConnection> open(FileDescriptor connected, Nanoseconds patience);

    /// The serial for the next call, never 0 and never the same again.
    std::uint32_t nextSerial() { return ++serial_ == 0 ? ++serial_ : serial_; }

    /// Sends the bytes of whole messages, taking in replies meanwhile. Fails when the service closes the connection
    /// (code ECONNRESET) or takes no byte in for `patience` (code ETIMEDOUT); a part may have been sent then.
    Result<Done> send(std::string_view bytes, Nanoseconds patience = kSendPatience);

    /// The reply to the call `serial`, in whatever order replies come. Fails when the service closes the connection
    /// (code ECONNRESET) or says nothing for `patience` (code ETIMEDOUT).
    Result<Reply> receive(std::uint32_t serial, Nanoseconds patience);

    /// Whether a reply to the call has come in already.
    bool hasReply(std::uint32_t serial) const;

    /// Waits until something comes in, be it a part of a reply, and answers true; false when nothing has come for
    /// `patience`. Fails when the service closes the connection (code ECONNRESET).
    Result<bool> takeIn(Nanoseconds patience);

private:
    explicit BlockingConnection(FileDescriptor descriptor) : descriptor_(std::move(descriptor)) {}

    Result<Done> authenticate(Nanoseconds patience);
    Result<Done> waitForRoom(Nanoseconds patience);
    Result<Done> takeWhatIsThere();
    Result<Done> takeApart();

    static constexpr std::size_t kReadBytes = 16 * 1024;
    static constexpr std::chrono::seconds kSendPatience{30};

    FileDescriptor descriptor_;
    bool authenticated_ = false; ///< what comes in are messages
    std::uint32_t serial_ = 0;
    std::vector<char> scratch_ = std::vector<char>(kReadBytes); ///< what a reading fills
    std::string received_;
    std::deque<Reply> replies_; ///< in the order in which they came, which is mostly that of the calls
};

} // namespace vela::platform::dbus
