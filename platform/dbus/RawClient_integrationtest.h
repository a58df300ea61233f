// A client that sends bytes as they are. Confined to its owner's thread, but for sending on one and reading on another.
#pragma once

#include "platform/dbus/Authentication.h"
#include "platform/dbus/MessageReader.h"
#include "platform/dbus/MessageWriter.h"
#include "platform/linux/FileDescriptor.h"

#include <algorithm>
#include <array>
#include <cerrno>
#include <chrono>
#include <cstring>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <poll.h>
#include <string>
#include <sys/socket.h>
#include <sys/un.h>

namespace vela::platform::dbus {

/// So long may anything take before a test counts as hanging.
constexpr std::chrono::seconds kPatience{60};

/// A message that a client received.
struct Received {
    std::string bytes;
    MessageHeader header;

    explicit Received(std::string message) : bytes(std::move(message)) {
        const auto error = header.read(bytes);
        EXPECT_FALSE(error) << error->text;
    }
    Received(const Received&) = delete;
    Received& operator=(const Received&) = delete;
    BodyReader reader() const { return BodyReader(header); }
    /// "name: text" of an error, else empty.
    std::string error() const {
        return header.type == MessageType::Error ? std::string(header.errorName) + ": " + std::string(reader().string())
                                                 : std::string();
    }
};

class RawClient {
public:
    explicit RawClient(const std::string& path)
        : RawClient(FileDescriptor(socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0))) {
        sockaddr_un address{};
        address.sun_family = AF_UNIX;
        std::memcpy(address.sun_path, path.data(), std::min(path.size(), sizeof(address.sun_path) - 1));
        EXPECT_EQ(connect(socket_.get(), reinterpret_cast<const sockaddr*>(&address), sizeof(address)), 0)
            << std::strerror(errno); // NOLINT(concurrency-mt-unsafe): glibc's is safe
    }
    explicit RawClient(FileDescriptor socket) : socket_(std::move(socket)) {
        const timeval patience{kPatience.count(), 0};
        setsockopt(socket_.get(), SOL_SOCKET, SO_RCVTIMEO, &patience, sizeof(patience));
        setsockopt(socket_.get(), SOL_SOCKET, SO_SNDTIMEO, &patience, sizeof(patience));
    }

    /// False when the service is not there any more.
    bool send(std::string_view bytes) const {
        while (!bytes.empty()) {
            const ssize_t count = ::send(socket_.get(), bytes.data(), bytes.size(), MSG_NOSIGNAL);
            if (count <= 0) {
                return false;
            }
            bytes.remove_prefix(static_cast<std::size_t>(count));
        }
        return true;
    }
    /// What the socket takes without waiting, of `bytes`; how many bytes that were.
    std::size_t sendSome(std::string_view bytes) const {
        const ssize_t count = ::send(socket_.get(), bytes.data(), bytes.size(), MSG_NOSIGNAL | MSG_DONTWAIT);
        return count > 0 ? static_cast<std::size_t>(count) : 0;
    }
    void authenticate() {
        send(ClientAuthentication::opening());
        EXPECT_EQ(readLine(), "DATA");
        EXPECT_THAT(readLine(), ::testing::MatchesRegex("OK [0-9a-f]{32}"));
    }
    /// Without its end; what came so far when the service closes.
    std::string readLine() {
        std::string line;
        while (line.size() < 2 || line.substr(line.size() - 2) != "\r\n") {
            const std::string byte = read(1);
            if (byte.empty()) {
                return line;
            }
            line += byte;
        }
        return line.substr(0, line.size() - 2);
    }
    std::string read(std::size_t bytes) const {
        std::string result(bytes, '\0');
        std::size_t have = 0;
        while (have < bytes) {
            const ssize_t count = recv(socket_.get(), result.data() + have, bytes - have, 0);
            EXPECT_TRUE(count >= 0 || errno == ECONNRESET)
                << "nothing came: " << std::strerror(errno); // NOLINT(concurrency-mt-unsafe)
            if (count <= 0) {
                break;
            }
            have += static_cast<std::size_t>(count);
        }
        result.resize(have);
        return result;
    }
    Received readMessage() const {
        std::string bytes = read(kFixedHeaderBytes);
        const Frame frame = frameOf(bytes);
        EXPECT_EQ(frame.state, Frame::State::Known);
        if (frame.state == Frame::State::Known) {
            bytes += read(frame.bytes - bytes.size());
        }
        return Received(std::move(bytes));
    }
    Received call(std::string_view message) const {
        EXPECT_TRUE(send(message));
        return readMessage();
    }
    /// Waits until the service closes; false when it sends something instead.
    bool atEnd() const { return read(1).empty(); }
    bool somethingToRead() const {
        pollfd poll{socket_.get(), POLLIN, 0};
        return ::poll(&poll, 1, 0) > 0;
    }
    void dropWhatIsThere() const {
        std::array<char, 16 * 1024> bytes;
        while (recv(socket_.get(), bytes.data(), bytes.size(), MSG_DONTWAIT) > 0) {
        }
    }
    void close() { socket_ = FileDescriptor(); }
    int descriptor() const { return socket_.get(); }

private:
    FileDescriptor socket_;
};

} // namespace vela::platform::dbus
