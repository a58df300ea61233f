// The client without a service, and with one that ends and comes back.
#include "client/Client_integrationtest.h"

#include <atomic>
#include <chrono>
#include <vector>

namespace vela::client {

namespace {

using ::testing::ElementsAre;
using ::testing::HasSubstr;

using ClientWithoutServiceTest = ClientTestBase;
using ClientLossTest = ClientTest;

TEST_F(ClientWithoutServiceTest, WhoeverWaitsIsToldAtOnce) {
    const OwnedClient client = make();
    VelaReportingError error = emptyError();
    EXPECT_EQ(VelaReportingCreateReportingSessionAndWait(client.get(), 1, -1, &error), VelaReportingStatusNoService);
    EXPECT_STREQ(error.name, "");
    EXPECT_EQ(std::string(error.text), address_ + ": No such file or directory");
    EXPECT_FALSE(stateOf(client).connected);
}

TEST_F(ClientWithoutServiceTest, WhatWasQueuedWaitsForTheService) {
    const OwnedClient client = make();
    VelaReportingCreateReportingSession(client.get(), 42);
    EXPECT_EQ(VelaReportingSetServiceTypeAndWait(client.get(), 11, 42, -1, nullptr), VelaReportingStatusNoService);
    std::uint16_t serviceType = 0;
    EXPECT_EQ(VelaReportingGetServiceNameForReporterID(client.get(), 42, &serviceType, -1, nullptr),
              VelaReportingStatusNoService);
    send(client, 1);
    const testing::FakeService service(path_);
    service.waitForCalls(3);
    send(client, 2);
    service.waitForCalls(4);
    // The question is not asked any more; nobody waits for the others.
    EXPECT_THAT(service.texts(), ElementsAre("createReportingSession 42", "setServiceType 11 42", sent(1), sent(2)));
    EXPECT_FALSE(service.calls()[1].replyExpected);
}

TEST_F(ClientWithoutServiceTest, WhoeverWaitsMakesTheClientTryAtOnce) {
    const OwnedClient client = make();
    for (int round = 0; round < 12; ++round) { // the pauses are at their longest then
        EXPECT_EQ(VelaReportingCreateReportingSessionAndWait(client.get(), 42, -1, nullptr),
                  VelaReportingStatusNoService);
    }
    const testing::FakeService service(path_);
    EXPECT_EQ(VelaReportingCreateReportingSessionAndWait(client.get(), 42, kPatience, nullptr), VelaReportingStatusOk);
}

TEST_F(ClientWithoutServiceTest, TheEndDoesNotWaitForOne) {
    OwnedClient client = make();
    send(client, 1);
    const auto begin = std::chrono::steady_clock::now();
    EXPECT_EQ(VelaReportingClientDestroy(client.release()), VelaReportingStatusTimeout);
    EXPECT_LT(std::chrono::steady_clock::now() - begin, std::chrono::milliseconds(kPatience));
}

TEST_F(ClientWithoutServiceTest, TheNextAddressIsTried) {
    testing::FakeService service(folder_ / "second");
    VelaReportingClientOptions two = options();
    const std::string list = address_ + ";unix:path=" + (folder_ / "second");
    two.address = list.c_str();
    const OwnedClient client = make(two);
    EXPECT_EQ(VelaReportingCreateReportingSessionAndWait(client.get(), 42, kPatience, nullptr), VelaReportingStatusOk);
}

TEST_F(ClientWithoutServiceTest, AnAddressMayBeAbstractAndEscaped) {
    VelaReportingClientOptions other = options();
    other.address = "unix:abstract=vela%2fnobody,guid=00";
    const OwnedClient client = make(other);
    VelaReportingError error = emptyError();
    EXPECT_EQ(VelaReportingCreateReportingSessionAndWait(client.get(), 1, -1, &error), VelaReportingStatusNoService);
    EXPECT_STREQ(error.text, "unix:abstract=vela/nobody: Connection refused");
}

TEST_F(ClientLossTest, AServiceThatLetsNobodyInIsNoService) {
    service_.setRefusing(true);
    const OwnedClient client = make();
    VelaReportingError error = emptyError();
    EXPECT_EQ(VelaReportingCreateReportingSessionAndWait(client.get(), 1, -1, &error), VelaReportingStatusNoService);
    EXPECT_STREQ(error.text, "the service let this process not in: REJECTED access-denied");
}

TEST_F(ClientLossTest, AfterARefusalTheNextAddressIsTried) {
    service_.setRefusing(true);
    testing::FakeService second(folder_ / "second");
    VelaReportingClientOptions two = options();
    const std::string list = address_ + ";unix:path=" + (folder_ / "second");
    two.address = list.c_str();
    const OwnedClient client = make(two);
    EXPECT_EQ(VelaReportingCreateReportingSessionAndWait(client.get(), 42, kPatience, nullptr), VelaReportingStatusOk);
    EXPECT_EQ(second.connections(), 1);
}

TEST_F(ClientLossTest, ANewServiceIsToldOfTheSessionsBeforeAnythingElse) {
    const OwnedClient client = make();
    const VelaReportingField one[] = {field("a", VelaReportingInteger(1)), field("b", VelaReportingDate(5))};
    const VelaReportingField two[] = {field("a", VelaReportingText("two"))};
    VelaReportingCreateReportingSession(client.get(), 42);
    VelaReportingCreateReportingSession(client.get(), 7);
    VelaReportingCreateReportingSession(client.get(), 8);
    VelaReportingSetServiceType(client.get(), 11, 42);
    VelaReportingSetConfiguration(client.get(), one, 2, 42);
    VelaReportingSetConfiguration(client.get(), two, 1, 42);
    VelaReportingStartReportingSessionForID(client.get(), 42);
    VelaReportingStartReportingSessionForID(client.get(), 7);
    VelaReportingStopReportingSessionForID(client.get(), 7);
    VelaReportingDestroyReportingSession(client.get(), 8);
    service_.waitForCalls(10);
    waitForState(client, [](const VelaReportingClientState& state) { return state.sent == 10; });
    service_.stop();
    waitForState(client, [](const VelaReportingClientState& state) { return !state.connected; });
    send(client, 1);
    service_.start();
    service_.waitForCalls(16);
    const auto texts = service_.texts();
    EXPECT_THAT(std::vector<std::string>(texts.begin() + 10, texts.end()),
                ElementsAre("createReportingSession 42", "setServiceType 11 42",
                            R"(setConfiguration {"a":"two","b":"1970-01-01T00:00:05Z"} 42)",
                            "startReportingSessionForID 42", "createReportingSession 7", sent(1)));
    EXPECT_EQ(stateOf(client).connections, 2U);
}

TEST_F(ClientLossTest, SessionsOutliveSeveralServices) {
    const OwnedClient client = make();
    VelaReportingCreateReportingSession(client.get(), 42);
    service_.waitForCalls(1);
    for (int round = 2; round <= 4; ++round) {
        service_.stop();
        service_.start();
        service_.waitForConnections(round);
        service_.waitForCalls(static_cast<std::size_t>(round));
    }
    EXPECT_THAT(service_.texts(), ::testing::Each("createReportingSession 42"));
}

TEST_F(ClientLossTest, WhatWasNotWrittenGoesToTheNextConnection) {
    service_.setReading(false);
    const OwnedClient client = make();
    waitForConnection(client);
    int accepted = 0;
    while (send(client, accepted) == VelaReportingStatusOk) {
        ++accepted;
    }
    const std::uint64_t written = stateOf(client).sent;
    ASSERT_LT(written, static_cast<std::uint64_t>(accepted));
    service_.cutConnections();
    service_.waitForConnections(2);
    service_.setReading(true);
    // The queue goes on with the first call that was not written; the socket may have taken more of them meanwhile.
    service_.waitForCalls(1);
    waitForState(client, [&](const VelaReportingClientState& state) {
        return state.sent == static_cast<std::uint64_t>(accepted);
    });
    VelaReportingStopReportingSessionForIDAndWait(client.get(), 42, kPatience, nullptr);
    const auto texts = service_.texts();
    ASSERT_GE(texts.size(), 2U);
    const std::size_t messages = texts.size() - 1;
    ASSERT_LE(messages, static_cast<std::size_t>(accepted) - written);
    for (std::size_t index = 0; index < messages; ++index) {
        ASSERT_EQ(texts[index], sent(static_cast<std::int64_t>(static_cast<std::size_t>(accepted) - messages + index)));
    }
}

TEST_F(ClientLossTest, ACallThatWasWrittenIsToldOfTheLoss) {
    service_.setAnswering(false);
    const OwnedClient client = make();
    VelaReportingError error = emptyError();
    std::thread caller([&] {
        EXPECT_EQ(VelaReportingCreateReportingSessionAndWait(client.get(), 42, -1, &error),
                  VelaReportingStatusDisconnected);
    });
    service_.waitForCalls(1);
    service_.cutConnections();
    caller.join();
    EXPECT_STREQ(error.text, "the service ended the connection");
}

TEST_F(ClientLossTest, ACallThatWasNotWrittenIsAnsweredByTheNextService) {
    service_.setReading(false);
    const OwnedClient client = make();
    waitForConnection(client);
    // What a full queue holds is several times what the socket takes, so nothing behind it is written.
    while (send(client, 1, 2000) == VelaReportingStatusOk) {
    }
    std::atomic<bool> calling = false;
    std::thread caller([&] {
        calling = true;
        EXPECT_EQ(VelaReportingCreateReportingSessionAndWait(client.get(), 42, -1, nullptr), VelaReportingStatusOk);
    });
    while (!calling) {
        std::this_thread::yield();
    }
    service_.cutConnections();
    service_.waitForConnections(2);
    service_.setReading(true);
    caller.join();
}

TEST_F(ClientLossTest, AClientWithoutSessionsComesBackWhenItHasSomethingToSay) {
    const OwnedClient client = make();
    service_.waitForConnections(1);
    service_.stop();
    waitForState(client, [](const VelaReportingClientState& state) { return !state.connected; });
    service_.start();
    send(client, 1);
    service_.waitForCalls(1);
    EXPECT_EQ(service_.calls()[0].connection, 2);
}

TEST_F(ClientLossTest, AServiceThatThrowsEverybodyOutIsNotCalledWithoutAPause) {
    const OwnedClient client = make();
    VelaReportingCreateReportingSession(client.get(), 42);
    service_.waitForCalls(1);
    const auto begin = std::chrono::steady_clock::now();
    for (int round = 2; round <= 4; ++round) {
        service_.cutConnections();
        service_.waitForConnections(round);
    }
    // Three times at least 50 ms, unless a connection happened to last a second.
    EXPECT_GE(std::chrono::steady_clock::now() - begin, std::chrono::milliseconds(150));
}

} // namespace

} // namespace vela::client
