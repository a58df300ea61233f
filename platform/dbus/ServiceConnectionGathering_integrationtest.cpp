// When a connection is looked at from time to time instead of at once, and that nothing is lost by it. The turns are
// the test's own, so that nothing depends on time.
#include "platform/dbus/ServiceEndpoint_integrationtest.h"

#include <algorithm>
#include <array>

namespace vela::platform::dbus {

namespace {

using Turn = ServiceConnection::Turn;

constexpr std::uint32_t kCallsInFlight = 100;

/// A connection that is open, without an endpoint: its loop is asked for events and it is given its turns by hand.
class ServiceConnectionGatheringTest : public ::testing::Test {
public:
    ServiceConnectionGatheringTest() {
        std::array<int, 2> ends{};
        EXPECT_EQ(socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0, ends.data()), 0);
        client_.emplace(FileDescriptor(ends[0]));
        FileDescriptor socket(ends[1]);
        loop_ = *EventLoop::create();
        ConnectionSetup setup;
        setup.number = kNumber;
        setup.peer = *peerCredentials(socket.get());
        channel_ = std::make_shared<ConnectionChannel>(std::move(socket), loop_, kNumber,
                                                       ChannelLimits{1024 * 1024, kCallsInFlight, 1024 * 1024});
        setup.channel = channel_;
        setup.facts = &facts_;
        setup.messageBytes = 1024 * 1024;
        setup.serverId = "0123456789abcdef0123456789abcdef";
        connection_ = std::make_shared<ServiceConnection>(std::move(setup));
        client_->send(ClientAuthentication::opening());
        turns();
        client_->readLine();
        client_->readLine();
        loop_->takeRung();
        service_->keepReplies();
    }
    ServiceConnectionGatheringTest(const ServiceConnectionGatheringTest&) = delete;
    ServiceConnectionGatheringTest& operator=(const ServiceConnectionGatheringTest&) = delete;
    ~ServiceConnectionGatheringTest() override {
        for (auto& reply : service_->takeReplies()) {
            reply();
        }
        connection_->end();
    }

protected:
    /// Sends calls with the serials from `first` on, without waiting for replies.
    void sendCalls(std::uint32_t first, std::uint32_t count) {
        for (std::uint32_t serial = first; serial < first + count; ++serial) {
            client_->send(simpleCall("stopReportingSessionForID", serial, serial));
        }
    }
    /// Turns until one asks for something else than another one.
    Turn turns() {
        Turn turn = Turn::More;
        while (turn == Turn::More) {
            turn = connection_->turn(scratch_, delegate_);
        }
        return turn;
    }
    void answerAll() {
        for (auto& reply : service_->takeReplies()) {
            reply();
        }
    }
    /// The reply that was not called.
    UniqueFunction<void()> answerAllButOne() {
        auto replies = service_->takeReplies();
        for (auto reply = replies.begin(); reply + 1 != replies.end(); ++reply) {
            (*reply)();
        }
        return std::move(replies.back());
    }
    /// Many calls, none of them answered.
    void beginGathering() {
        sendCalls(1, kManyCalls);
        ASSERT_EQ(turns(), Turn::Soon);
    }
    bool loopSeesSomething() {
        std::array<epoll_event, 4> events{};
        return loop_->wait(events, Nanoseconds::zero()) > 0;
    }
    void expectReplies(std::uint32_t first, std::uint32_t count) {
        for (std::uint32_t serial = first; serial < first + count; ++serial) {
            EXPECT_EQ(client_->readMessage().header.replySerial, serial);
        }
        EXPECT_FALSE(client_->somethingToRead());
    }

    static constexpr std::uint64_t kNumber = 16;
    static constexpr std::uint32_t kManyCalls = ServiceConnection::kBetweenGatherings;
    static constexpr std::uint32_t kWorth = ServiceConnection::kWorthGathering;

    Journal journal_;
    const std::shared_ptr<RecordingService> service_ = std::make_shared<RecordingService>(journal_);
    TestDelegate delegate_{journal_, service_};
    ServiceFacts facts_;
    std::shared_ptr<EventLoop> loop_;
    std::optional<RawClient> client_;
    std::shared_ptr<ConnectionChannel> channel_;
    std::shared_ptr<ServiceConnection> connection_;
    std::array<char, 65536> scratch_{};
};

TEST_F(ServiceConnectionGatheringTest, FewCallsAreWaitedForByTheLoop) {
    sendCalls(1, kManyCalls - 1);
    EXPECT_EQ(turns(), Turn::Waiting);
    sendCalls(kManyCalls, 1);
    EXPECT_TRUE(loopSeesSomething());
}

TEST_F(ServiceConnectionGatheringTest, AClientThatWaitsForEachReplyIsAlwaysWaitedForByTheLoop) {
    for (std::uint32_t serial = 1; serial <= 3 * kManyCalls; ++serial) {
        sendCalls(serial, 1);
        ASSERT_TRUE(loopSeesSomething());
        ASSERT_EQ(turns(), Turn::Waiting);
        answerAll();
        expectReplies(serial, 1);
    }
}

TEST_F(ServiceConnectionGatheringTest, ManyCallsUnderWayAreLookedAtFromTimeToTime) {
    beginGathering();
    sendCalls(kManyCalls + 1, kWorth);
    EXPECT_FALSE(loopSeesSomething());
    EXPECT_EQ(turns(), Turn::Soon);
    EXPECT_EQ(service_->takeReplies().size(), kManyCalls + kWorth);
}

TEST_F(ServiceConnectionGatheringTest, RepliesWaitForTheNextLook) {
    beginGathering();
    const auto last = answerAllButOne();
    EXPECT_FALSE(client_->somethingToRead());
    turns();
    expectReplies(1, kManyCalls - 1);
}

TEST_F(ServiceConnectionGatheringTest, WhenTheLastCallEndsTheRepliesAreSentAndTheLoopIsRung) {
    beginGathering();
    answerAll();
    expectReplies(1, kManyCalls);
    EXPECT_TRUE(loopSeesSomething());
}

TEST_F(ServiceConnectionGatheringTest, ALookBeforeItsTimeIsNoJudgement) {
    beginGathering();
    connection_->soon = true;
    EXPECT_EQ(turns(), Turn::Soon);
    sendCalls(kManyCalls + 1, kWorth - 1);
    EXPECT_EQ(turns(), Turn::Soon);
    connection_->soon = false;
    sendCalls(kManyCalls + kWorth, 1);
    EXPECT_EQ(turns(), Turn::Soon) << "what was found early counts";
    EXPECT_EQ(turns(), Turn::Waiting);
}

TEST_F(ServiceConnectionGatheringTest, ALookThatFindsTooFewCallsIsTheLast) {
    beginGathering();
    sendCalls(kManyCalls + 1, kWorth - 1);
    EXPECT_EQ(turns(), Turn::Waiting);
    answerAll();
    expectReplies(1, kManyCalls + kWorth - 1); // at once
    sendCalls(1, 1);
    EXPECT_TRUE(loopSeesSomething());
}

TEST_F(ServiceConnectionGatheringTest, WhatCameWhileItGatheredIsNotForgottenAtItsEnd) {
    beginGathering();
    EXPECT_EQ(turns(), Turn::Waiting);
    sendCalls(kManyCalls + 1, 1);
    EXPECT_TRUE(loopSeesSomething());
    EXPECT_EQ(turns(), Turn::Waiting);
    EXPECT_EQ(service_->takeReplies().size(), kManyCalls + 1);
}

TEST_F(ServiceConnectionGatheringTest, AnAttemptThatDidNotPayIsNotRepeatedAtOnce) {
    beginGathering();
    EXPECT_EQ(turns(), Turn::Waiting);
    sendCalls(kManyCalls + 1, 10);
    EXPECT_EQ(turns(), Turn::Waiting);
}

TEST_F(ServiceConnectionGatheringTest, RepliesOfManyBytesWaitForNoLook) {
    beginGathering();
    const std::string text(ConnectionChannel::kGatheredBytes, 'x');
    channel_->send([&text](MessageWriter& writer, std::uint32_t serial) {
        writer.error(kFailedError, text, {.serial = serial, .replySerial = 1});
    });
    EXPECT_EQ(client_->readMessage().reader().string(), text);
}

TEST_F(ServiceConnectionGatheringTest, AtTheLimitItGoesOnWhileRepliesAreSent) {
    beginGathering();
    sendCalls(kManyCalls + 1, 200);
    EXPECT_EQ(turns(), Turn::Soon);
    auto replies = service_->takeReplies();
    ASSERT_EQ(replies.size(), kCallsInFlight);
    EXPECT_EQ(turns(), Turn::Waiting) << "nothing moves: the channel rings when it does";
    for (auto& reply : replies) {
        reply();
    }
    EXPECT_TRUE(loopSeesSomething());
    turns();
    EXPECT_EQ(service_->takeReplies().size(), kCallsInFlight);
}

/// Tells another thread when the last call that fits is under way.
class FullService final : public RecordingService {
public:
    using RecordingService::RecordingService;
    void stopReportingSessionForID(std::int64_t id, IpcReply<bool> reply) override {
        ++calls;
        if (id == kLastThatFits) {
            full = true; // what follows takes about as long as the other thread
        }
        RecordingService::stopReportingSessionForID(id, std::move(reply));
    }
    static constexpr std::int64_t kLastThatFits = 1000;
    std::uint32_t calls = 0;
    std::atomic<bool> full = false;
};

// The moment that matters is a few nanoseconds wide, and the other thread tries to meet it: a little later each time.
TEST_F(ServiceConnectionGatheringTest, ACallThatEndsRightBehindALookThatStoppedAtTheLimitLosesNoneThatIsLeft) {
    constexpr std::uint32_t kBefore = kCallsInFlight - 2;
    const auto service = std::make_shared<FullService>(journal_);
    service->keepReplies();
    connection_->setExportedObject(service);
    const auto sendCall = [this](std::int64_t id) { client_->send(simpleCall("stopReportingSessionForID", id)); };
    for (int round = 0; round < 1000; ++round) {
        service->calls = 0;
        sendCalls(1, kBefore);
        ASSERT_EQ(turns(), Turn::Soon);
        auto replies = service->takeReplies();
        std::thread answering([&service, first = std::move(replies.front()), round]() mutable {
            while (!service->full) {
            }
            for (std::atomic<int> spent = 0; spent < round % 100; ++spent) {
            }
            first();
        });
        sendCall(1);
        sendCall(FullService::kLastThatFits);
        sendCall(2);
        sendCall(3);
        const Turn turn = turns();
        answering.join();
        service->full = false;
        for (auto reply = replies.begin() + 1; reply != replies.end(); ++reply) {
            (*reply)();
        }
        if (turn == Turn::Waiting && service->calls < kBefore + 4) {
            ASSERT_TRUE(loopSeesSomething()) << "round " << round << ": nobody tells that calls are left";
        }
        turns();
        EXPECT_EQ(service->calls, kBefore + 4);
        for (auto& reply : service->takeReplies()) {
            reply();
        }
        turns();
        loop_->takeRung();
        client_->dropWhatIsThere();
    }
}

TEST_F(ServiceConnectionGatheringTest, AClientThatHangsUpIsDispatchedToTheEnd) {
    beginGathering();
    sendCalls(kManyCalls + 1, 200);
    client_->close();
    EXPECT_TRUE(loopSeesSomething()) << "a hang-up is seen";
    connection_->hangUp();
    EXPECT_EQ(turns(), Turn::Ended);
    EXPECT_EQ(service_->takeReplies().size(), kManyCalls + 200);
}

TEST_F(ServiceConnectionGatheringTest, WhatWasAnsweredBeforeTheServiceEndsIsSent) {
    beginGathering();
    const auto last = answerAllButOne();
    connection_->hangUp();
    connection_->abandon();
    for (std::uint32_t serial = 1; serial < kManyCalls; ++serial) {
        EXPECT_EQ(client_->readMessage().header.replySerial, serial);
    }
    EXPECT_TRUE(client_->atEnd());
}

// The same with an endpoint and its time: whatever comes of it, each call is answered once, in order.

TEST(ServiceEndpointGatheringTest, ManyCallsAreAnsweredInOrderByAnotherThread) {
    constexpr std::uint32_t kCalls = 20'000;
    RunningEndpoint endpoint;
    endpoint.service->keepReplies();
    std::atomic<bool> done = false;
    std::thread answering([&] {
        while (!done) {
            for (auto& reply : endpoint.service->takeReplies()) {
                reply();
            }
        }
    });
    RawClient client = endpoint.client();
    std::thread sending([&client] {
        for (std::uint32_t serial = 1; serial <= kCalls; ++serial) {
            client.send(simpleCall("stopReportingSessionForID", serial, serial));
        }
    });
    for (std::uint32_t serial = 1; serial <= kCalls; ++serial) {
        ASSERT_EQ(client.readMessage().header.replySerial, serial);
    }
    // And a client that waits, right behind.
    for (std::uint32_t serial = 1; serial <= 200; ++serial) {
        ASSERT_EQ(client.call(simpleCall("stopReportingSessionForID", serial, serial)).header.replySerial, serial);
    }
    sending.join();
    done = true;
    answering.join();
}

TEST(ServiceEndpointGatheringTest, WhileTheServiceIsBehindManyCallsUnderWayAreReadFromTimeToTimeOnly) {
    constexpr std::uint32_t kRounds = 12;
    constexpr std::uint32_t kTogether = 50;
    DbusServiceOptions options;
    options.isBehind = [] { return true; };
    options.callsInFlight = kTogether;
    RunningEndpoint endpoint(std::move(options));
    endpoint.service->keepReplies();
    RawClient client = endpoint.client();
    std::string all;
    for (std::uint32_t serial = 1; serial <= kRounds * kTogether; ++serial) {
        all += simpleCall("stopReportingSessionForID", serial, serial);
    }
    client.send(all);
    const auto begin = std::chrono::steady_clock::now();
    std::vector<UniqueFunction<void()>> replies;
    for (std::uint32_t round = 0; round < kRounds; ++round) {
        while (replies.size() < kTogether) {
            std::ranges::move(endpoint.service->takeReplies(), std::back_inserter(replies));
        }
        for (auto& reply : std::exchange(replies, {})) {
            reply();
        }
    }
    // The first two rounds are not gathered. Where this thread was slow, gathering ends with a look that found nothing,
    // and two further rounds come at once.
    EXPECT_GE(std::chrono::steady_clock::now() - begin, (kRounds - 2) / 3 * ServiceConnection::kBehindTime);
    for (std::uint32_t serial = 1; serial <= kRounds * kTogether; ++serial) {
        ASSERT_EQ(client.readMessage().header.replySerial, serial);
    }
}

TEST(ServiceEndpointGatheringTest, AClientThatWaitsIsServedAtOnceWhileTheServiceIsBehind) {
    DbusServiceOptions options;
    std::atomic<int> asked = 0;
    options.isBehind = [&asked] { return ++asked > 0; };
    RunningEndpoint endpoint(std::move(options));
    RawClient client = endpoint.client();
    for (std::uint32_t serial = 1; serial <= 200; ++serial) {
        ASSERT_EQ(client.call(simpleCall("stopReportingSessionForID", serial, serial)).header.replySerial, serial);
    }
    EXPECT_EQ(asked, 0);
}

} // namespace

} // namespace vela::platform::dbus
