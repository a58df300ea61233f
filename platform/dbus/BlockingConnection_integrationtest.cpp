#include "platform/dbus/BlockingConnection.h"
#include "platform/dbus/ServiceEndpoint_integrationtest.h"

namespace vela::platform::dbus {

namespace {

using namespace std::chrono_literals;
using ::testing::StartsWith;

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
    for (const Nanoseconds patience : {Nanoseconds(20ms), Nanoseconds(0)}) {
        const auto reply = connection.receive(1, patience);
        ASSERT_FALSE(reply);
        EXPECT_EQ(reply.failure().code, ETIMEDOUT);
        EXPECT_THAT(reply.failure().description, StartsWith("no answer within 0.0"));
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

} // namespace

} // namespace vela::platform::dbus
