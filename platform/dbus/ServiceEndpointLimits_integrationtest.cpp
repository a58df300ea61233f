// Limits: what they answer, and that nobody else suffers.
#include "platform/dbus/ServiceEndpoint_integrationtest.h"

#include <sys/resource.h>

namespace vela::platform::dbus {

namespace {

using namespace std::chrono_literals;
using ::testing::ElementsAre;
using ::testing::HasSubstr;
using std::string_view_literals::operator""sv; // NOLINT(misc-unused-using-decls): the tool does not see literals

TEST(ServiceEndpointLimitsTest, AMessageTooLongIsRefusedAndPassedOver) {
    DbusServiceOptions options;
    options.messageBytes = 4096;
    RunningEndpoint endpoint(std::move(options));
    RawClient client = endpoint.client();
    const std::string tooLong = sendMessageCall({{"k", String(std::string(300'000, 'x'))}}, std::nullopt, 5);
    EXPECT_EQ(client.call(tooLong).error(), "org.freedesktop.DBus.Error.LimitsExceeded: limits.message_bytes is 4096: "
                                            "this message has " +
                                                std::to_string(tooLong.size()));
    EXPECT_EQ(client.call(simpleCall("stopReportingSessionForID", 1, 6)).header.replySerial, 6U);
    EXPECT_THAT(endpoint.journal.lines(), ElementsAre("connected", "stop 1"));
}

TEST(ServiceEndpointLimitsTest, AMessageOfTheLimitsLengthIsTaken) {
    const std::string call = sendMessageCall({{"k", String(std::string(3000, 'x'))}}, std::nullopt, 5);
    DbusServiceOptions options;
    options.messageBytes = call.size();
    RunningEndpoint endpoint(std::move(options));
    RawClient client = endpoint.client();
    EXPECT_EQ(client.call(call).error(), "");
    EXPECT_THAT(client.call(sendMessageCall({{"k", String(std::string(3008, 'x'))}}, std::nullopt)).error(),
                HasSubstr("limits.message_bytes"));
}

TEST(ServiceEndpointLimitsTest, AMessageTooLongThatExpectsNoReplyIsPassedOver) {
    DbusServiceOptions options;
    options.messageBytes = 4096;
    RunningEndpoint endpoint(std::move(options));
    RawClient client = endpoint.client();
    client.send(sendMessageCall({{"k", String(std::string(300'000, 'x'))}}, std::nullopt, 5, false));
    EXPECT_EQ(client.call(simpleCall("stopReportingSessionForID", 1, 6)).header.replySerial, 6U);
}

TEST(ServiceEndpointLimitsTest, AMessageBeyondTheProtocolEndsTheConnection) {
    RunningEndpoint endpoint;
    RawClient client = endpoint.client();
    client.send("l\1\0\1\0\0\0\x08\7\0\0\0\0\0\0\0"sv);
    EXPECT_TRUE(client.atEnd());
    EXPECT_THAT(endpoint.journal.waitFor(3), ElementsAre("connected", "interrupted", "invalidated"));
}

TEST(ServiceEndpointLimitsTest, ALargeMessageInPiecesIsTaken) {
    RunningEndpoint endpoint;
    const Dictionary message{{"k", String(std::string(1'000'000, 'x'))}};
    RawClient client = endpoint.client();
    EXPECT_EQ(client.call(sendMessageCall(message, std::nullopt)).error(), "");
    EXPECT_EQ(endpoint.service->messages().back(), message);
}

TEST(ServiceEndpointLimitsTest, NestingBeyondItsLimitIsRefused) {
    DbusServiceOptions options;
    options.valueDepth = 2;
    RunningEndpoint endpoint(std::move(options));
    RawClient client = endpoint.client();
    EXPECT_EQ(client.call(sendMessageCall({{"k", Array{1}}}, std::nullopt)).error(), "");
    EXPECT_EQ(client.call(sendMessageCall({{"k", Array{Value(Array())}}}, std::nullopt)).error(),
              "org.freedesktop.DBus.Error.LimitsExceeded: limits.value_depth is 2: a value is nested more deeply");
}

TEST(ServiceEndpointLimitsTest, ThirtyTwoContainersInsideEachOtherAreTaken) {
    Dictionary message{{"k", 1}};
    for (int depth = 1; depth < 32; ++depth) {
        message = Dictionary{{"k", message}};
    }
    RunningEndpoint endpoint;
    RawClient client = endpoint.client();
    EXPECT_EQ(client.call(sendMessageCall(message, std::nullopt)).error(), "");
    EXPECT_EQ(endpoint.service->messages().back(), message);
    EXPECT_THAT(client.call(sendMessageCall({{"k", message}}, std::nullopt)).error(), HasSubstr("limits.value_depth"));
}

TEST(ServiceEndpointLimitsTest, AMessageNamesSoManyReportersAtTheMost) {
    RunningEndpoint endpoint;
    RawClient client = endpoint.client();
    const auto send = [&client](std::size_t reporters) {
        return client.call(sendMessageCall({{"k", 1}}, std::vector<std::int64_t>(reporters, 42))).error();
    };
    EXPECT_EQ(send(1024), "");
    EXPECT_EQ(send(1025), "org.freedesktop.DBus.Error.LimitsExceeded: a message may name 1024 reporters: this one "
                          "names 1025");
    EXPECT_EQ(endpoint.service->messages().size(), 1U);
}

TEST(ServiceEndpointLimitsTest, SessionsOfOneClientAreCounted) {
    DbusServiceOptions options;
    options.sessionsPerClient = 2;
    RunningEndpoint endpoint(std::move(options));
    RawClient client = endpoint.client();
    const auto create = [&client](std::int64_t id) {
        return client.call(simpleCall("createReportingSession", id)).error();
    };
    EXPECT_EQ(create(1), "");
    EXPECT_EQ(create(2), "");
    EXPECT_EQ(create(2), "") << "it takes the place of the one that is there";
    EXPECT_EQ(create(3), "org.freedesktop.DBus.Error.LimitsExceeded: limits.sessions_per_client is 2: this connection "
                         "has as many sessions");
    EXPECT_EQ(client.call(simpleCall("destroyReportingSession", 1)).error(), "");
    EXPECT_EQ(create(3), "");
    EXPECT_EQ(endpoint.client().call(simpleCall("createReportingSession", 1)).error(), "") << "another client's own";
    EXPECT_EQ(endpoint.journal.count("create 3"), 1U);
}

TEST(ServiceEndpointLimitsTest, TheSessionZeroStaysCounted) {
    DbusServiceOptions options;
    options.sessionsPerClient = 1;
    RunningEndpoint endpoint(std::move(options));
    RawClient client = endpoint.client();
    EXPECT_EQ(client.call(simpleCall("createReportingSession", 0)).error(), "");
    EXPECT_EQ(client.call(simpleCall("destroyReportingSession", 0)).error(), "");
    EXPECT_THAT(client.call(simpleCall("createReportingSession", 1)).error(), HasSubstr("limits.sessions_per_client"));
}

TEST(ServiceEndpointLimitsTest, ConnectionsOfOneUserAreCounted) {
    DbusServiceOptions options;
    options.clientsPerUser = 2;
    RunningEndpoint endpoint(std::move(options));
    RawClient first = endpoint.client();
    RawClient second = endpoint.client();
    RawClient third(endpoint.path());
    third.send("\0AUTH EXTERNAL\r\n"sv);
    EXPECT_EQ(third.readLine(), "REJECTED limits.clients_per_user=2");
    EXPECT_TRUE(third.atEnd());
    EXPECT_EQ((*endpoint).refusedConnections(), 1U);
    first.close();
    endpoint.journal.waitFor(3);
    EXPECT_EQ(endpoint.client().call(simpleCall("stopReportingSessionForID", 1)).error(), "");
}

TEST(ServiceEndpointLimitsTest, ManyRefusedConnectionsAreAllTold) {
    DbusServiceOptions options;
    options.clientsPerUser = 1;
    RunningEndpoint endpoint(std::move(options));
    RawClient first = endpoint.client();
    std::vector<RawClient> others;
    others.reserve(100);
    for (int count = 0; count < 100; ++count) {
        others.emplace_back(endpoint.path());
    }
    for (RawClient& client : others) {
        client.send("\0AUTH EXTERNAL\r\n"sv); // may come after the answer
        EXPECT_EQ(client.readLine(), "REJECTED limits.clients_per_user=1");
    }
    EXPECT_EQ((*endpoint).refusedConnections(), 100U);
    EXPECT_EQ(first.call(simpleCall("stopReportingSessionForID", 1)).error(), "");
}

// Calls under way.

TEST(ServiceEndpointLimitsTest, OnlySoManyCallsAreUnderWay) {
    RunningEndpoint endpoint;
    endpoint.service->keepReplies();
    RawClient client = endpoint.client();
    for (std::uint32_t serial = 1; serial <= 200; ++serial) {
        client.send(simpleCall("stopReportingSessionForID", serial, serial));
    }
    endpoint.journal.waitFor(129);
    // Another client is served meanwhile, several times over.
    RawClient other = endpoint.client();
    for (int count = 0; count < 10; ++count) {
        other.call(callOf("Ping", "", Bytes(), 7, 0, kPeerInterface));
    }
    EXPECT_EQ(endpoint.journal.lines().size(), 130U);
    auto replies = endpoint.service->takeReplies();
    ASSERT_EQ(replies.size(), 128U);
    for (auto& reply : replies) {
        reply();
    }
    endpoint.journal.waitFor(202);
    for (std::uint32_t serial = 1; serial <= 128; ++serial) {
        EXPECT_EQ(client.readMessage().header.replySerial, serial);
    }
}

TEST(ServiceEndpointLimitsTest, CallsUnderWayAreBoundedInBytesToo) {
    DbusServiceOptions options;
    options.messageBytes = 10'000;
    RunningEndpoint endpoint(std::move(options));
    endpoint.service->keepReplies();
    RawClient client = endpoint.client();
    const std::string text(4'000, 'x');
    for (std::uint32_t serial = 1; serial <= 10; ++serial) {
        client.send(sendMessageCall({{"text", std::string_view(text)}}, std::nullopt, serial));
    }
    endpoint.journal.waitFor(4);
    RawClient other = endpoint.client();
    EXPECT_EQ(other.call(callOf("Ping", "", Bytes(), 7, 0, kPeerInterface)).error(), "");
    EXPECT_EQ(endpoint.service->messages().size(), 3U) << "12,000 bytes and a bit";
    std::size_t answered = 0;
    while (answered < 10) {
        for (auto& reply : endpoint.service->takeReplies()) {
            reply();
            EXPECT_EQ(client.readMessage().header.replySerial, ++answered);
        }
    }
}

TEST(ServiceEndpointLimitsTest, ACallMayBeAsLargeAsAllTogether) {
    DbusServiceOptions options;
    options.messageBytes = 10'000;
    RunningEndpoint endpoint(std::move(options));
    RawClient client = endpoint.client();
    const std::string text(9'700, 'x');
    for (std::uint32_t serial = 1; serial <= 5; ++serial) {
        client.send(sendMessageCall({{"text", std::string_view(text)}}, std::nullopt, serial));
    }
    for (std::uint32_t serial = 1; serial <= 5; ++serial) {
        const Received reply = client.readMessage();
        EXPECT_EQ(reply.header.replySerial, serial);
        EXPECT_EQ(reply.error(), "");
    }
}

TEST(ServiceEndpointLimitsTest, AStartCountsUntilItsTokenIsGone) {
    DbusServiceOptions options;
    options.callsInFlight = 2;
    RunningEndpoint endpoint(std::move(options));
    endpoint.service->keepReplies();
    RawClient client = endpoint.client();
    // Replies that are kept do not count without their tokens.
    for (std::uint32_t serial = 1; serial <= 10; ++serial) {
        client.send(simpleCall("startReportingSessionForID", serial, serial));
    }
    endpoint.journal.waitFor(11);
    endpoint.service->keepTokens();
    for (std::uint32_t serial = 11; serial <= 14; ++serial) {
        client.send(simpleCall("startReportingSessionForID", serial, serial));
    }
    endpoint.journal.waitFor(13);
    endpoint.client().call(callOf("Ping", "", Bytes(), 7, 0, kPeerInterface));
    EXPECT_EQ(endpoint.journal.count("start 13"), 0U);
    for (auto& reply : endpoint.service->takeReplies()) {
        reply();
    }
    endpoint.client().call(callOf("Ping", "", Bytes(), 7, 0, kPeerInterface));
    EXPECT_EQ(endpoint.journal.count("start 13"), 0U) << "replies do not count";
    endpoint.service->dropTokens();
    client.close();
    endpoint.service->dropTokens();
}

TEST(ServiceEndpointLimitsTest, APausedClientThatHangsUpIsDispatchedToTheEnd) {
    DbusServiceOptions options;
    options.callsInFlight = 2;
    std::atomic<int> turns{0};
    options.onLoopTurn = [&turns] { ++turns; };
    RunningEndpoint endpoint(std::move(options));
    endpoint.service->keepReplies();
    RawClient client = endpoint.client();
    for (std::uint32_t serial = 1; serial <= 100; ++serial) {
        client.send(simpleCall("stopReportingSessionForID", serial, serial));
    }
    endpoint.journal.waitFor(3);
    client.close();
    const auto lines = endpoint.journal.waitFor(102);
    EXPECT_EQ(lines[100], "stop 100");
    EXPECT_EQ(lines[101], "invalidated");
    EXPECT_TRUE(becomesQuiet(turns)) << "the loop spins";
}

TEST(ServiceEndpointLimitsTest, KillingWorksWhileEverythingIsBlocked) {
    RunningEndpoint endpoint;
    endpoint.service->keepReplies();
    RawClient blocked = endpoint.client();
    for (std::uint32_t serial = 1; serial <= 128; ++serial) {
        blocked.send(simpleCall("stopReportingSessionForID", serial, serial));
    }
    endpoint.journal.waitFor(129);
    RawClient other = endpoint.client();
    other.send(callOf("killService", "", Bytes()));
    EXPECT_EQ(endpoint.journal.waitFor(131).back(), "kill");
    EXPECT_FALSE(other.somethingToRead());
}

// Clients that do not read.

TEST(ServiceEndpointLimitsTest, AClientThatNeverReadsIsNotReadFromEither) {
    DbusServiceOptions options;
    options.unsentReplies = 64 * 1024;
    RunningEndpoint endpoint(std::move(options));
    RawClient silent = endpoint.client();
    RawClient other = endpoint.client();
    std::string calls;
    for (std::uint32_t serial = 1; serial <= 1000; ++serial) {
        calls += callOf("Introspect", "", Bytes(), serial, 0, kIntrospectableInterface);
    }
    // Goes on until neither the endpoint nor the socket takes any more, which is judged by the other client's calls.
    std::size_t sent = 0;
    std::string_view rest = calls;
    for (int idle = 0; idle < 50;) {
        if (rest.empty()) {
            rest = calls;
        }
        const std::size_t taken = silent.sendSome(rest);
        rest.remove_prefix(taken);
        sent += taken;
        idle = taken == 0 ? idle + 1 : 0;
        EXPECT_EQ(other.call(simpleCall("stopReportingSessionForID", 1)).error(), "");
        ASSERT_LT(sent, 64U * 1024 * 1024) << "the endpoint takes everything";
    }
    // What was taken is answered once the client reads.
    EXPECT_EQ(silent.readMessage().header.replySerial, 1U);
    EXPECT_EQ(silent.readMessage().header.replySerial, 2U);
    for (std::uint32_t serial = 3; serial <= 400; ++serial) {
        EXPECT_EQ(silent.readMessage().header.replySerial, serial);
    }
}

TEST(ServiceEndpointLimitsTest, PartialWritesArriveInOrder) {
    RunningEndpoint endpoint;
    RawClient client = endpoint.client();
    constexpr std::uint32_t kCalls = 500;
    std::thread writer([&client] {
        for (std::uint32_t serial = 1; serial <= kCalls; ++serial) {
            client.send(callOf("Introspect", "", Bytes(), serial, 0, kIntrospectableInterface));
        }
    });
    for (std::uint32_t serial = 1; serial <= kCalls; ++serial) {
        const Received reply = client.readMessage();
        ASSERT_EQ(reply.header.replySerial, serial);
        ASSERT_GT(reply.reader().string().size(), 1000U);
    }
    writer.join();
}

// Many clients.

void serveMany(std::size_t clients) {
    rlimit descriptors{};
    ASSERT_EQ(getrlimit(RLIMIT_NOFILE, &descriptors), 0);
    if (descriptors.rlim_max < clients * 2 + 100) {
        GTEST_SKIP() << "only " << descriptors.rlim_max << " descriptors";
    }
    const rlimit before = descriptors;
    descriptors.rlim_cur = descriptors.rlim_max;
    ASSERT_EQ(setrlimit(RLIMIT_NOFILE, &descriptors), 0);
    {
        DbusServiceOptions options;
        options.clientsPerUser = static_cast<std::uint32_t>(clients);
        RunningEndpoint endpoint(std::move(options));
        std::vector<RawClient> all;
        for (std::size_t index = 0; index < clients; ++index) {
            all.emplace_back(endpoint.path());
            all.back().send(ClientAuthentication::opening());
            all.back().send(simpleCall("stopReportingSessionForID", static_cast<std::int64_t>(index)));
        }
        for (RawClient& client : all) {
            EXPECT_EQ(client.readLine(), "DATA");
            EXPECT_THAT(client.readLine(), ::testing::StartsWith("OK "));
            EXPECT_EQ(client.readMessage().error(), "");
        }
        all.clear();
        endpoint.journal.waitFor(3 * clients);
        EXPECT_EQ(endpoint.journal.count("invalidated"), clients);
    }
    setrlimit(RLIMIT_NOFILE, &before);
}

TEST(ServiceEndpointLimitsTest, WithFewDescriptorsLeftClientsAreRefusedInWords) {
    RunningEndpoint endpoint;
    RawClient first = endpoint.client();
    rlimit descriptors{};
    ASSERT_EQ(getrlimit(RLIMIT_NOFILE, &descriptors), 0);
    const rlimit before = descriptors;
    const FileDescriptor next(dup(0));
    // Room for some more, which are the service's own.
    descriptors.rlim_cur = static_cast<rlim_t>(next.get()) + 6;
    ASSERT_EQ(setrlimit(RLIMIT_NOFILE, &descriptors), 0);
    {
        RawClient refused(endpoint.path());
        refused.send("\0AUTH EXTERNAL\r\n"sv);
        EXPECT_EQ(refused.readLine(), "REJECTED too-many-open-files");
        EXPECT_TRUE(refused.atEnd());
    }
    EXPECT_EQ(first.call(simpleCall("stopReportingSessionForID", 1)).error(), "") << "who is there is served";
    setrlimit(RLIMIT_NOFILE, &before);
    EXPECT_EQ(endpoint.client().call(simpleCall("stopReportingSessionForID", 1)).error(), "");
}

TEST(ServiceEndpointLimitsTest, AThousandClientsAreServed) { serveMany(1000); }

TEST(ServiceEndpointLimitsTest, FiveThousandClientsAreServed) { serveMany(5000); }

#if defined(__has_feature)
#if __has_feature(undefined_behavior_sanitizer)
#define VELA_CHECKS_NEED_DESCRIPTORS
#endif
#endif

TEST(ServiceEndpointLimitsTest, WithoutDescriptorsClientsWaitAndTheLoopDoesNotSpin) {
#ifdef VELA_CHECKS_NEED_DESCRIPTORS
    GTEST_SKIP() << "the sanitizer opens pipes to look at objects, and takes those for broken where it cannot";
#endif
    std::atomic<int> turns{0};
    DbusServiceOptions options;
    options.onLoopTurn = [&turns] { ++turns; };
    RunningEndpoint endpoint(std::move(options));
    RawClient first = endpoint.client();
    std::vector<RawClient> waiting;
    waiting.reserve(5);
    for (int count = 0; count < 5; ++count) {
        waiting.emplace_back(endpoint.path());
    }
    for (RawClient& client : waiting) {
        client.authenticate();
    }
    rlimit descriptors{};
    ASSERT_EQ(getrlimit(RLIMIT_NOFILE, &descriptors), 0);
    const rlimit before = descriptors;
    // The client's own descriptor is open before the limit falls below those in use.
    const FileDescriptor late(socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0));
    descriptors.rlim_cur = 3;
    ASSERT_EQ(setrlimit(RLIMIT_NOFILE, &descriptors), 0);
    sockaddr_un address{};
    address.sun_family = AF_UNIX;
    const std::string path = endpoint.path();
    std::memcpy(address.sun_path, path.data(), path.size());
    EXPECT_EQ(connect(late.get(), reinterpret_cast<const sockaddr*>(&address), sizeof(address)), 0);
    EXPECT_EQ(first.call(simpleCall("stopReportingSessionForID", 1)).error(), "") << "who is there is served";
    EXPECT_TRUE(becomesQuiet(turns)) << "the loop spins";
    setrlimit(RLIMIT_NOFILE, &before);
    waiting.clear(); // a connection ends, so that the late one is taken
    const std::string_view opening = ClientAuthentication::opening();
    ASSERT_EQ(send(late.get(), opening.data(), opening.size(), MSG_NOSIGNAL), static_cast<ssize_t>(opening.size()));
    char answer[4] = {};
    const timeval patience{kPatience.count(), 0};
    setsockopt(late.get(), SOL_SOCKET, SO_RCVTIMEO, &patience, sizeof(patience));
    EXPECT_EQ(recv(late.get(), answer, sizeof(answer), MSG_WAITALL), 4);
    EXPECT_EQ(std::string_view(answer, 4), "DATA");
}

} // namespace

} // namespace vela::platform::dbus
