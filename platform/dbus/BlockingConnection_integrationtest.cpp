#include "platform/dbus/BlockingConnection.h"
#include "platform/dbus/ServiceEndpoint_integrationtest.h"

#include <array>
#include <optional>
#include <sys/socket.h>
#include <thread>
#include <utility>

namespace vela::platform::dbus {

namespace {

using namespace std::chrono_literals;

BlockingConnection connectionTo(const RunningEndpoint& endpoint) {
    auto connection = BlockingConnection::open({{endpoint.path(), false}}, kPatience);
    EXPECT_TRUE(connection) << (connection ? "" : connection.failure().description);
    return *std::move(connection);
}

TEST(BlockingConnectionTest, RepliesAreFoundInWhateverOrder) {
    const RunningEndpoint endpoint;
    BlockingConnection connection = connectionTo(endpoint);
    for (const std::uint32_t serial : {1U, 2U, 3U}) {
        ASSERT_TRUE(connection.send(simpleCall("stopReportingSessionForID", serial, serial)));
    }
    for (const std::uint32_t serial : {3U, 1U, 2U}) {
        const auto reply = connection.receive(serial, kPatience);
        ASSERT_TRUE(reply) << reply.failure().description;
        EXPECT_EQ(reply->header.replySerial, serial);
    }
}

TEST(BlockingConnectionTest, AServiceThatSaysNothingIsWaitedForAsLongAsAsked) {
    const RunningEndpoint endpoint;
    endpoint.service->keepReplies();
    BlockingConnection connection = connectionTo(endpoint);
    ASSERT_TRUE(connection.send(simpleCall("stopReportingSessionForID", 1, 1)));
    const std::vector<std::pair<Nanoseconds, std::string>> patiences{{20ms, "no answer within 0.02 seconds"},
                                                                     {0ms, "no answer within 0 seconds"}};
    for (const auto& [patience, text] : patiences) {
        const auto reply = connection.receive(1, patience);
        ASSERT_FALSE(reply);
        EXPECT_EQ(reply.failure().code, ETIMEDOUT);
        EXPECT_EQ(reply.failure().description, text);
    }
    // It may still come.
    for (auto& answer : endpoint.service->takeReplies()) {
        answer();
    }
    EXPECT_TRUE(connection.receive(1, kPatience));
}

TEST(BlockingConnectionTest, ARefusalIsReadAlsoWhereTheServiceHasClosedAlready) {
    const testing::TemporaryFolder folder;
    const auto socket = ListeningSocket::create(folder / "socket", 0666);
    ASSERT_TRUE(socket);
    FileDescriptor descriptor = *connectTo({{folder / "socket", false}}, true);
    {
        const FileDescriptor client(accept4(socket->descriptor(), nullptr, nullptr, SOCK_CLOEXEC));
        const std::string_view answer = "REJECTED limits.clients_per_user=1\r\n";
        ASSERT_EQ(::send(client.get(), answer.data(), answer.size(), MSG_NOSIGNAL), std::ssize(answer));
    }
    const auto connection = BlockingConnection::open(std::move(descriptor), kPatience);
    ASSERT_FALSE(connection);
    EXPECT_EQ(connection.failure().description,
              "the service refused the connection: REJECTED limits.clients_per_user=1");
}

TEST(BlockingConnectionTest, AServiceThatEndsIsSeen) {
    RunningEndpoint endpoint;
    BlockingConnection connection = connectionTo(endpoint);
    endpoint.stop();
    const auto reply = connection.receive(1, kPatience);
    ASSERT_FALSE(reply);
    EXPECT_EQ(reply.failure().code, ECONNRESET);
}

/// A connection to a service that this test plays itself: what it sends and reads is its other end's.
struct PlayedService {
    PlayedService() {
        std::array<int, 2> ends{};
        EXPECT_EQ(socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0, ends.data()), 0);
        service = FileDescriptor(ends[0]);
        say("OK 0123456789abcdef0123456789abcdef\r\n");
        auto opened = BlockingConnection::open(FileDescriptor(ends[1]), kPatience);
        EXPECT_TRUE(opened) << (opened ? "" : opened.failure().description);
        connection.emplace(*std::move(opened));
    }
    void say(std::string_view bytes) const {
        EXPECT_EQ(::send(service.get(), bytes.data(), bytes.size(), MSG_NOSIGNAL), std::ssize(bytes));
    }
    static std::string replyTo(std::uint32_t serial) {
        std::string bytes;
        MessageWriter writer(bytes);
        writer.beginReturn({.serial = serial, .replySerial = serial, .sender = {}, .signature = "b"});
        writer.boolean(true);
        EXPECT_TRUE(writer.finish());
        return bytes;
    }

    FileDescriptor service;
    std::optional<BlockingConnection> connection;
};

/// More than a socket holds.
std::string bytesBeyondASocket() { return std::string(std::size_t{16} * 1024 * 1024, 'a'); }

TEST(BlockingConnectionTest, AServiceThatTakesNothingInIsWaitedForAsLongAsAsked) {
    PlayedService played;
    const std::vector<std::pair<Nanoseconds, std::string>> patiences{
        {20ms, "the service takes nothing in within 0.02 seconds"},
        {0ms, "the service takes nothing in within 0 seconds"}};
    for (const auto& [patience, text] : patiences) {
        const auto sent = played.connection->send(bytesBeyondASocket(), patience);
        ASSERT_FALSE(sent);
        EXPECT_EQ(sent.failure().code, ETIMEDOUT);
        EXPECT_EQ(sent.failure().description, text);
    }
}

TEST(BlockingConnectionTest, RepliesAreKeptWhileTheServiceTakesNothingIn) {
    PlayedService played;
    played.say(PlayedService::replyTo(7));
    EXPECT_FALSE(played.connection->send(bytesBeyondASocket(), 20ms));
    EXPECT_TRUE(played.connection->hasReply(7));
}

TEST(BlockingConnectionTest, AServiceThatReadsIsSentMoreThanASocketHolds) {
    PlayedService played;
    std::thread reading([&played] {
        std::vector<char> block(std::size_t{64} * 1024);
        std::size_t left = 16 * 1024 * 1024;
        while (left > 0) {
            const ssize_t got = recv(played.service.get(), block.data(), block.size(), 0);
            ASSERT_GT(got, 0);
            left -= std::min(left, static_cast<std::size_t>(got));
        }
    });
    EXPECT_TRUE(played.connection->send(bytesBeyondASocket(), kPatience));
    shutdown(played.service.get(), SHUT_RDWR);
    reading.join();
}

TEST(BlockingConnectionTest, WhatComesIsTakenInBeforeItsTimeIsOver) {
    PlayedService played;
    const auto nothing = played.connection->takeIn(20ms);
    ASSERT_TRUE(nothing);
    EXPECT_FALSE(*nothing);
    const std::string reply = PlayedService::replyTo(7);
    played.say(reply.substr(0, 10));
    const auto part = played.connection->takeIn(kPatience);
    ASSERT_TRUE(part);
    EXPECT_TRUE(*part);
    EXPECT_FALSE(played.connection->hasReply(7));
    played.say(reply.substr(10));
    EXPECT_TRUE(played.connection->takeIn(kPatience));
    EXPECT_TRUE(played.connection->hasReply(7));
    played.service = FileDescriptor();
    const auto closed = played.connection->takeIn(kPatience);
    ASSERT_FALSE(closed);
    EXPECT_EQ(closed.failure().code, ECONNRESET);
    EXPECT_EQ(closed.failure().description, "the service closed the connection");
}

} // namespace

} // namespace vela::platform::dbus
