// The client against a service that works: calls, replies, limits, beginning and end.
#include "client/Client_integrationtest.h"

#include <vector>

namespace vela::client {

namespace {

using ::testing::ElementsAre;
using ::testing::HasSubstr;

// Calls that do not wait.

TEST_F(ClientTest, CallsReachTheServiceInTheirOrder) {
    const OwnedClient client = make();
    const VelaReportingField configuration[] = {field("HostApplicationDisplayID", VelaReportingText("app"))};
    EXPECT_EQ(VelaReportingCreateReportingSession(client.get(), 42), VelaReportingStatusOk);
    EXPECT_EQ(VelaReportingSetServiceType(client.get(), 11, 42), VelaReportingStatusOk);
    EXPECT_EQ(VelaReportingSetConfiguration(client.get(), configuration, 1, 42), VelaReportingStatusOk);
    EXPECT_EQ(VelaReportingStartReportingSessionForID(client.get(), 42), VelaReportingStatusOk);
    EXPECT_EQ(send(client, 7), VelaReportingStatusOk);
    EXPECT_EQ(VelaReportingSendMessage(client.get(), nullptr, 0, 2, 4, nullptr, 0), VelaReportingStatusOk);
    EXPECT_EQ(VelaReportingStopReportingSessionForID(client.get(), 42), VelaReportingStatusOk);
    EXPECT_EQ(VelaReportingDestroyReportingSession(client.get(), -42), VelaReportingStatusOk);
    service_.waitForCalls(8);
    EXPECT_THAT(service_.texts(), ElementsAre("createReportingSession 42", "setServiceType 11 42",
                                              R"(setConfiguration {"HostApplicationDisplayID":"app"} 42)",
                                              "startReportingSessionForID 42", sent(7), "sendMessage {} 2 4 all",
                                              "stopReportingSessionForID 42", "destroyReportingSession -42"));
    for (const testing::RecordedCall& call : service_.calls()) {
        EXPECT_FALSE(call.replyExpected) << call.text;
    }
}

TEST_F(ClientTest, MessagesCarryTheTimeOfTheCall) {
    const OwnedClient client = make();
    send(client, 1);
    send(client, 2);
    service_.waitForCalls(2);
    const Dictionary first = service_.calls()[0].dictionary;
    const Dictionary second = service_.calls()[1].dictionary;
    EXPECT_GT(first.find("velareporting_timestamp").doubleValue(), 1.6e9);
    EXPECT_GE(second.find("velareporting_timestamp").doubleValue(),
              first.find("velareporting_timestamp").doubleValue());
    EXPECT_GT(first.find("systemuptime_sec").integerValue(), 0);
    EXPECT_GE(first.find("processuptime_ms").integerValue(), 0);
}

TEST_F(ClientTest, WhatIsWaitedForComesBehindWhatWasQueued) {
    const OwnedClient client = make();
    for (int number = 0; number < 100; ++number) {
        send(client, number);
    }
    EXPECT_EQ(VelaReportingStopReportingSessionForIDAndWait(client.get(), 42, kPatience, nullptr),
              VelaReportingStatusOk);
    const auto texts = service_.texts();
    ASSERT_EQ(texts.size(), 101U);
    EXPECT_EQ(texts[99], sent(99));
    EXPECT_EQ(texts[100], "stopReportingSessionForID 42");
}

// Replies.

TEST_F(ClientTest, EveryOperationCanBeWaitedFor) {
    const OwnedClient owner = make();
    VelaReportingClient* const client = owner.get();
    const VelaReportingField fields[] = {field("a", VelaReportingInteger(1))};
    const std::int64_t ids[] = {42};
    VelaReportingError error = emptyError();
    EXPECT_EQ(VelaReportingCreateReportingSessionAndWait(client, 42, kPatience, &error), VelaReportingStatusOk);
    EXPECT_EQ(VelaReportingSetServiceTypeAndWait(client, 11, 42, kPatience, &error), VelaReportingStatusOk);
    EXPECT_EQ(VelaReportingSetConfigurationAndWait(client, fields, 1, 42, kPatience, &error), VelaReportingStatusOk);
    EXPECT_EQ(VelaReportingStartReportingSessionForIDAndWait(client, 42, kPatience, &error), VelaReportingStatusOk);
    EXPECT_EQ(VelaReportingSendMessageAndWait(client, fields, 1, 1, 3, ids, 1, kPatience, &error),
              VelaReportingStatusOk);
    EXPECT_EQ(VelaReportingStopReportingSessionForIDAndWait(client, 42, -1, &error), VelaReportingStatusOk);
    EXPECT_EQ(VelaReportingDestroyReportingSessionAndWait(client, 42, kPatience, nullptr), VelaReportingStatusOk);
    EXPECT_STREQ(error.text, "");
    EXPECT_THAT(service_.texts(),
                ElementsAre("createReportingSession 42", "setServiceType 11 42", R"(setConfiguration {"a":1} 42)",
                            "startReportingSessionForID 42", R"(sendMessage {"a":1} 1 3 [42])",
                            "stopReportingSessionForID 42", "destroyReportingSession 42"));
    for (const testing::RecordedCall& call : service_.calls()) {
        EXPECT_TRUE(call.replyExpected) << call.text;
    }
}

TEST_F(ClientTest, QuestionsAreAnswered) {
    const OwnedClient client = make();
    std::uint16_t serviceType = 0;
    EXPECT_EQ(VelaReportingGetServiceNameForReporterID(client.get(), 42, &serviceType, kPatience, nullptr),
              VelaReportingStatusOk);
    EXPECT_EQ(serviceType, 11);
    VelaReportingReporter reporter{};
    EXPECT_EQ(VelaReportingReporterID(client.get(), -9, &reporter, kPatience, nullptr), VelaReportingStatusOk);
    EXPECT_EQ(reporter.reporterID, -9);
    EXPECT_EQ(reporter.serviceType, 11);
}

TEST_F(ClientTest, AllReportersAreCountedWhateverTheRoom) {
    const OwnedClient client = make();
    std::int64_t ids[4] = {0, 0, 0, 0};
    std::size_t count = 0;
    EXPECT_EQ(VelaReportingGetAllReporters(client.get(), ids, 4, &count, kPatience, nullptr), VelaReportingStatusOk);
    EXPECT_EQ(count, 3U);
    EXPECT_THAT(ids, ElementsAre(42, -7, 4711, 0));
    ids[1] = 5;
    EXPECT_EQ(VelaReportingGetAllReporters(client.get(), ids, 1, &count, kPatience, nullptr), VelaReportingStatusOk);
    EXPECT_EQ(count, 3U);
    EXPECT_THAT(ids, ElementsAre(42, 5, 4711, 0));
    EXPECT_EQ(VelaReportingGetAllReporters(client.get(), nullptr, 0, &count, kPatience, nullptr),
              VelaReportingStatusOk);
    EXPECT_EQ(count, 3U);
}

TEST_F(ClientTest, ErrorsOfTheServiceHaveANameAndAText) {
    service_.setDisabled(true);
    const OwnedClient client = make();
    VelaReportingError error = emptyError();
    EXPECT_EQ(VelaReportingSendMessageAndWait(client.get(), nullptr, 0, 1, 1, nullptr, 0, kPatience, &error),
              VelaReportingStatusRefused);
    EXPECT_STREQ(error.name, "com.orvex.audio.reporting.Code1");
    EXPECT_STREQ(error.text, "reporting is disabled");
    EXPECT_EQ(VelaReportingKillService(client.get(), kPatience, &error), VelaReportingStatusRefused);
}

TEST_F(ClientTest, AnErrorOfAnOlderFormIsFilledAsFarAsItGoes) {
    service_.setDisabled(true);
    const OwnedClient client = make();
    VelaReportingError error = emptyError();
    std::strcpy(error.text, "as it was");
    error.size = offsetof(VelaReportingError, text);
    EXPECT_EQ(VelaReportingCreateReportingSessionAndWait(client.get(), 1, kPatience, &error),
              VelaReportingStatusRefused);
    EXPECT_STREQ(error.name, "com.orvex.audio.reporting.Code1");
    EXPECT_STREQ(error.text, "as it was");
}

TEST_F(ClientTest, AReplyOfAnotherFormIsAProtocolError) {
    service_.setWrongReply(true);
    const OwnedClient client = make();
    VelaReportingError error = emptyError();
    EXPECT_EQ(VelaReportingCreateReportingSessionAndWait(client.get(), 1, kPatience, &error),
              VelaReportingStatusProtocolError);
    EXPECT_STREQ(error.text, "the reply to createReportingSession has the signature \"u\"");
}

TEST_F(ClientTest, WithoutAnAnswerTheTimeIsOver) {
    service_.setAnswering(false);
    const OwnedClient client = make();
    VelaReportingError error = emptyError();
    EXPECT_EQ(VelaReportingCreateReportingSessionAndWait(client.get(), 1, 10, &error), VelaReportingStatusTimeout);
    EXPECT_STREQ(error.text, "no reply in time");
    service_.waitForCalls(1);
    service_.setAnswering(true);
    EXPECT_EQ(VelaReportingCreateReportingSessionAndWait(client.get(), 2, kPatience, nullptr), VelaReportingStatusOk);
}

TEST_F(ClientTest, ManyCallsThatNobodyAnsweredAreForgotten) {
    service_.setAnswering(false);
    const OwnedClient client = make();
    for (int number = 0; number < 3000; ++number) {
        ASSERT_EQ(VelaReportingCreateReportingSessionAndWait(client.get(), number, 0, nullptr),
                  VelaReportingStatusTimeout);
    }
    service_.waitForCalls(3000);
    service_.setAnswering(true);
    EXPECT_EQ(VelaReportingCreateReportingSessionAndWait(client.get(), 1, kPatience, nullptr), VelaReportingStatusOk);
}

TEST_F(ClientTest, KillingTheServiceIsDoneWhenTheConnectionEnds) {
    const OwnedClient client = make();
    EXPECT_EQ(VelaReportingKillService(client.get(), kPatience, nullptr), VelaReportingStatusOk);
    EXPECT_THAT(service_.texts(), ElementsAre("killService"));
}

TEST_F(ClientTest, ManyThreadsMayWait) {
    const OwnedClient client = make();
    std::vector<std::thread> threads;
    for (int number = 0; number < 8; ++number) {
        threads.emplace_back([&client, number] {
            for (int round = 0; round < 50; ++round) {
                VelaReportingReporter reporter{};
                const std::int64_t id = number * 1000 + round;
                EXPECT_EQ(VelaReportingReporterID(client.get(), id, &reporter, kPatience, nullptr),
                          VelaReportingStatusOk);
                EXPECT_EQ(reporter.reporterID, id);
            }
        });
    }
    for (std::thread& thread : threads) {
        thread.join();
    }
}

// Limits.

TEST_F(ClientTest, ASlowServiceGetsEverything) {
    service_.setReadBytes(300);
    const OwnedClient client = make();
    std::vector<std::string> expected;
    for (int number = 0; number < 1500; ++number) {
        ASSERT_EQ(send(client, number), VelaReportingStatusOk);
        expected.push_back(sent(number));
    }
    service_.waitForCalls(1500);
    EXPECT_EQ(service_.texts(), expected);
}

TEST_F(ClientTest, AServiceThatReadsNothingFillsTheQueueAndNoMore) {
    service_.setReading(false);
    const OwnedClient client = make();
    waitForConnection(client);
    std::vector<std::string> expected;
    std::uint64_t dropped = 0;
    // The socket takes some of it while the queue fills.
    for (int number = 0; dropped < 1000; ++number) {
        if (send(client, number) == VelaReportingStatusOk) {
            expected.push_back(sent(number));
        } else {
            ++dropped;
        }
    }
    const VelaReportingClientState state = stateOf(client);
    EXPECT_EQ(state.droppedQueueFull, dropped);
    EXPECT_EQ(state.queueBytes, 1048576U);
    EXPECT_LE(state.highestQueuedBytes, 1048576U - 65536U);
    EXPECT_GT(state.highestQueuedBytes, 524288U);
    // The last sixteenth is for other calls.
    EXPECT_EQ(VelaReportingStopReportingSessionForID(client.get(), 42), VelaReportingStatusOk);
    expected.emplace_back("stopReportingSessionForID 42");
    service_.setReading(true);
    service_.waitForCalls(expected.size());
    EXPECT_EQ(service_.texts(), expected);
}

TEST_F(ClientTest, ACallThatIsWaitedForIsToldThatTheQueueIsFull) {
    service_.setReading(false);
    const OwnedClient client = make();
    while (send(client, 1, 100'000) == VelaReportingStatusOk) {
    }
    VelaReportingError error = emptyError();
    VelaReportingStatus status = VelaReportingStatusTimeout;
    for (int number = 0; number < 10'000 && status == VelaReportingStatusTimeout; ++number) {
        status = VelaReportingCreateReportingSessionAndWait(client.get(), 1, 0, &error);
    }
    EXPECT_EQ(status, VelaReportingStatusQueueFull);
    EXPECT_STREQ(error.text, "the queue is full");
    service_.setReading(true);
}

TEST_F(ClientTest, WhatIsRefusedIsCountedByItsReason) {
    const OwnedClient client = make();
    EXPECT_EQ(send(client, 1, 200'000), VelaReportingStatusOk);
    EXPECT_EQ(send(client, 1, 262'144), VelaReportingStatusTooLarge);
    VelaReportingValue unknown = VelaReportingInteger(1);
    unknown.kind = 99;
    const VelaReportingField fields[] = {field("a", unknown)};
    EXPECT_EQ(VelaReportingSendMessage(client.get(), fields, 1, 1, 1, nullptr, 0), VelaReportingStatusInvalidArgument);
    EXPECT_EQ(VelaReportingSetConfiguration(client.get(), fields, 1, 1), VelaReportingStatusInvalidArgument);
    const VelaReportingClientState state = stateOf(client);
    EXPECT_EQ(state.droppedTooLarge, 1U);
    EXPECT_EQ(state.droppedInvalid, 2U);
    EXPECT_EQ(state.droppedQueueFull, 0U);
}

TEST_F(ClientTest, TheStateCountsWhatWasWritten) {
    const OwnedClient client = make();
    for (int number = 0; number < 10; ++number) {
        send(client, number);
    }
    waitForState(client, [](const VelaReportingClientState& state) { return state.sent == 10; });
    const VelaReportingClientState state = stateOf(client);
    EXPECT_TRUE(state.connected);
    EXPECT_EQ(state.connections, 1U);
    EXPECT_EQ(state.queuedBytes, 0U);
    EXPECT_EQ(state.notRemembered, 0U);
}

// Beginning and end.

TEST_F(ClientTest, TheEndPassesOnWhatIsQueued) {
    OwnedClient client = make();
    for (int number = 0; number < 2000; ++number) {
        ASSERT_EQ(send(client, number), VelaReportingStatusOk);
    }
    EXPECT_EQ(VelaReportingClientDestroy(client.release()), VelaReportingStatusOk);
    service_.waitForCalls(2000);
    EXPECT_EQ(service_.texts().back(), sent(1999));
}

TEST_F(ClientTest, TheEndDoesNotWaitForEver) {
    service_.setReading(false);
    VelaReportingClientOptions hasty = options();
    hasty.flushMilliseconds = 10;
    OwnedClient client = make(hasty);
    while (send(client, 1, 1000) == VelaReportingStatusOk) {
    }
    EXPECT_EQ(VelaReportingClientDestroy(client.release()), VelaReportingStatusTimeout);
}

TEST_F(ClientTest, OptionsThatAreImpossibleAreRefused) {
    const auto statusOf = [](const VelaReportingClientOptions& options) {
        VelaReportingClient* client = nullptr;
        const VelaReportingStatus status = VelaReportingClientCreate(&options, &client);
        VelaReportingClientDestroy(client);
        return status;
    };
    VelaReportingClientOptions wrong = options();
    wrong.size = 0;
    EXPECT_EQ(statusOf(wrong), VelaReportingStatusInvalidArgument);
    wrong = options();
    wrong.address = "no address";
    EXPECT_EQ(statusOf(wrong), VelaReportingStatusInvalidArgument);
    wrong = options();
    wrong.queueBytes = (std::size_t{1} << 30) + 1;
    EXPECT_EQ(statusOf(wrong), VelaReportingStatusInvalidArgument);
    EXPECT_EQ(VelaReportingClientCreate(&wrong, nullptr), VelaReportingStatusInvalidArgument);
}

TEST_F(ClientTest, OptionsOfANewerFormMustBeAtTheirDefaults) {
    struct {
        VelaReportingClientOptions known;
        std::uint64_t added;
    } newer{options(), 0};
    newer.known.size = sizeof(newer);
    VelaReportingClient* client = nullptr;
    EXPECT_EQ(VelaReportingClientCreate(&newer.known, &client), VelaReportingStatusOk);
    VelaReportingClientDestroy(client);
    newer.added = 1;
    EXPECT_EQ(VelaReportingClientCreate(&newer.known, &client), VelaReportingStatusInvalidArgument);
    EXPECT_EQ(client, nullptr);
}

TEST_F(ClientTest, TheQueueIsAPowerOfTwo) {
    VelaReportingClientOptions odd = options();
    odd.queueBytes = 100'000;
    EXPECT_EQ(stateOf(make(odd)).queueBytes, 131'072U);
    odd.queueBytes = 1;
    EXPECT_EQ(stateOf(make(odd)).queueBytes, 65'536U);
}

TEST_F(ClientTest, NullPointersAreRefused) {
    const OwnedClient client = make();
    std::uint16_t serviceType = 0;
    std::size_t count = 0;
    EXPECT_EQ(VelaReportingCreateReportingSession(nullptr, 1), VelaReportingStatusInvalidArgument);
    EXPECT_EQ(VelaReportingSendMessage(nullptr, nullptr, 0, 1, 1, nullptr, 0), VelaReportingStatusInvalidArgument);
    EXPECT_EQ(VelaReportingSendMessage(client.get(), nullptr, 1, 1, 1, nullptr, 0), VelaReportingStatusInvalidArgument);
    EXPECT_EQ(VelaReportingSendMessage(client.get(), nullptr, 0, 1, 1, nullptr, 1), VelaReportingStatusInvalidArgument);
    EXPECT_EQ(VelaReportingSetConfiguration(client.get(), nullptr, 1, 1), VelaReportingStatusInvalidArgument);
    EXPECT_EQ(VelaReportingGetServiceNameForReporterID(client.get(), 1, nullptr, 0, nullptr),
              VelaReportingStatusInvalidArgument);
    EXPECT_EQ(VelaReportingGetServiceNameForReporterID(nullptr, 1, &serviceType, 0, nullptr),
              VelaReportingStatusInvalidArgument);
    EXPECT_EQ(VelaReportingReporterID(client.get(), 1, nullptr, 0, nullptr), VelaReportingStatusInvalidArgument);
    EXPECT_EQ(VelaReportingGetAllReporters(client.get(), nullptr, 1, &count, 0, nullptr),
              VelaReportingStatusInvalidArgument);
    EXPECT_EQ(VelaReportingClientGetState(client.get(), nullptr), VelaReportingStatusInvalidArgument);
    EXPECT_EQ(VelaReportingClientDestroy(nullptr), VelaReportingStatusOk);
}

TEST(ReportingTest, EveryStatusHasAText) {
    for (int status = 0; status <= VelaReportingStatusProtocolError; ++status) {
        EXPECT_STRNE(VelaReportingStatusText(static_cast<VelaReportingStatus>(status)), "");
    }
    EXPECT_STREQ(VelaReportingStatusText(VelaReportingStatusQueueFull), "the queue is full");
    EXPECT_STREQ(VelaReportingStatusText(static_cast<VelaReportingStatus>(10)), "");
}

} // namespace

} // namespace vela::client
