// What calls do and answer, over a real socket.
#include "platform/dbus/ServiceEndpoint_integrationtest.h"

namespace vela::platform::dbus {

namespace {

using ::testing::ElementsAre;
using ::testing::HasSubstr;
using ::testing::Not;
using std::string_view_literals::operator""sv;

TEST(ServiceEndpointCallsTest, EveryOperationArrivesAndIsAnswered) {
    RunningEndpoint endpoint;
    RawClient client = endpoint.client();
    const auto boolean = [&client](std::string_view call) {
        const Received reply = client.call(call);
        EXPECT_EQ(reply.error(), "");
        EXPECT_EQ(reply.header.signature, "b");
        EXPECT_EQ(reply.header.replySerial, 7U);
        return reply.reader().boolean();
    };
    EXPECT_TRUE(boolean(simpleCall("createReportingSession", 42)));
    EXPECT_TRUE(boolean(callOf("setServiceType", "qx", Bytes().u16(11).pad(8).u64(42))));
    EXPECT_TRUE(boolean(callOf("setConfiguration", "a{sv}x", Bytes().u32(0).pad(8).u64(42))));
    EXPECT_TRUE(boolean(simpleCall("startReportingSessionForID", 42)));
    EXPECT_TRUE(boolean(simpleCall("stopReportingSessionForID", 42)));
    EXPECT_TRUE(boolean(simpleCall("destroyReportingSession", -42)));
    EXPECT_TRUE(boolean(callOf("killService", "", Bytes()))) << "the peer is the service's own user";

    const Received name = client.call(simpleCall("getServiceNameForReporterID", 42));
    EXPECT_EQ(name.header.signature, "q");
    EXPECT_EQ(name.reader().uint16(), 65535);
    const Received all = client.call(callOf("getAllReporters", "", Bytes()));
    EXPECT_EQ(all.header.signature, "ax");
    EXPECT_THAT(all.reader().int64s(), ElementsAre(1, -2));
    const Received sent = client.call(sendMessageCall({{"a", 1}, {"b", "two"}}, std::vector<std::int64_t>{42, 43}));
    EXPECT_EQ(sent.header.type, MessageType::MethodReturn);
    EXPECT_EQ(sent.header.signature, "");
    EXPECT_THAT(endpoint.journal.lines(),
                ElementsAre("connected", "create 42", "type 11 42", "configure 42", "start 42", "stop 42",
                            "destroy -42", "kill", "name 42", "all", "send 3 4 42 43"));
    EXPECT_EQ(endpoint.service->messages().back(), (Dictionary{{"a", 1}, {"b", "two"}}));
}

TEST(ServiceEndpointCallsTest, AReportersDescriptionHasTheTypesOfItsKeys) {
    RunningEndpoint endpoint;
    const Received reply = endpoint.client().call(simpleCall("reporterID", 42));
    EXPECT_EQ(reply.header.signature, "a{sv}");
    EXPECT_EQ(reply.header.body, "\x36\0\0\0\0\0\0\0"
                                 "\x0A\0\0\0reporterID\0\1x\0\0\0\0\0\0\0\x2A\0\0\0\0\0\0\0"
                                 "\x0B\0\0\0serviceType\0\1q\0\0\xFF\xFF"sv);
}

TEST(ServiceEndpointCallsTest, AListOfReportersMayBeAbsentOrEmpty) {
    RunningEndpoint endpoint;
    RawClient client = endpoint.client();
    client.call(sendMessageCall({}, std::nullopt));
    client.call(sendMessageCall({}, std::vector<std::int64_t>()));
    EXPECT_THAT(endpoint.journal.lines(), ElementsAre("connected", "send 3 4 to all", "send 3 4"));
    const Received twice = client.call(callOf(
        "sendMessage", "a{sv}uqaax", Bytes().u32(0).pad(8).u32(3).u16(4).pad(4).u32(12).u32(0).pad(8).u32(0).pad(8)));
    EXPECT_THAT(twice.error(), HasSubstr("InvalidArgs: the list of reporter IDs, \"aax\", has more than one element"));
}

TEST(ServiceEndpointCallsTest, ForeignByteOrderIsUnderstood) {
    RunningEndpoint endpoint;
    RawClient client = endpoint.client();
    const Received reply = client.call(simpleCall("createReportingSession", 42, 0x01020304, Order::Big));
    EXPECT_EQ(reply.header.replySerial, 0x01020304U);
    EXPECT_TRUE(reply.reader().boolean());
    EXPECT_THAT(endpoint.journal.lines(), ElementsAre("connected", "create 42"));
}

TEST(ServiceEndpointCallsTest, TheServicesErrorHasItsNameOnTheWire) {
    RunningEndpoint endpoint;
    endpoint.service->fail({.domain = "com.orvex.audio.reporting", .code = 1});
    const Received reply = endpoint.client().call(sendMessageCall({}, std::nullopt));
    EXPECT_EQ(reply.header.type, MessageType::Error);
    EXPECT_EQ(reply.header.errorName, "com.orvex.audio.reporting.Code1");
}

TEST(ServiceEndpointCallsTest, AnErrorsDomainThatIsNoNameIsToldInTheText) {
    RunningEndpoint endpoint;
    endpoint.service->fail({.domain = "no name", .code = -1});
    EXPECT_EQ(endpoint.client().call(sendMessageCall({}, std::nullopt)).error(),
              "org.freedesktop.DBus.Error.Failed: Error -1 of \"no name\"");
}

TEST(ServiceEndpointCallsTest, TheServicesLimitsAreLimitsOnTheWire) {
    RunningEndpoint endpoint;
    endpoint.service->fail({.domain = {}, .code = 0, .limit = "limits.session_bytes is 67108864"});
    EXPECT_EQ(endpoint.client().call(sendMessageCall({}, std::nullopt)).error(),
              "org.freedesktop.DBus.Error.LimitsExceeded: limits.session_bytes is 67108864");
}

TEST(ServiceEndpointCallsTest, WhoeverExpectsNoReplyGetsNone) {
    RunningEndpoint endpoint;
    RawClient client = endpoint.client();
    client.send(simpleCall("createReportingSession", 1, 5, Order::Little, kNoReplyExpectedFlag));
    client.send(callOf("nothing", "", Bytes(), 6, kNoReplyExpectedFlag));
    EXPECT_EQ(client.call(simpleCall("createReportingSession", 2, 7)).header.replySerial, 7U);
    EXPECT_THAT(endpoint.journal.lines(), ElementsAre("connected", "create 1", "create 2"));
}

TEST(ServiceEndpointCallsTest, WrongSignaturesAreInvalidArguments) {
    RunningEndpoint endpoint;
    RawClient client = endpoint.client();
    EXPECT_EQ(client.call(callOf("createReportingSession", "t", Bytes().u64(1))).error(),
              "org.freedesktop.DBus.Error.InvalidArgs: createReportingSession takes arguments of the signature \"x\", "
              "not \"t\"");
    EXPECT_EQ(client.call(callOf("createReportingSession", "", Bytes())).error(),
              "org.freedesktop.DBus.Error.InvalidArgs: createReportingSession takes arguments of the signature \"x\", "
              "not \"\"");
    EXPECT_THAT(endpoint.journal.lines(), ElementsAre("connected"));
}

TEST(ServiceEndpointCallsTest, ValuesThatNoPropertyListHasAreInvalidArguments) {
    RunningEndpoint endpoint;
    RawClient client = endpoint.client();
    Bytes entries;
    entries.text("key").type("(ii)").pad(8).u32(1).u32(2);
    const Received reply = client.call(callOf("setConfiguration", "a{sv}x", Bytes().array(entries, 8).pad(8).u64(1)));
    EXPECT_EQ(reply.error(), "org.freedesktop.DBus.Error.InvalidArgs: the value of \"key\" is of the type \"(ii)\", "
                             "which no property-list value has");
    EXPECT_EQ(client.call(simpleCall("createReportingSession", 1)).error(), "") << "the connection goes on";
}

TEST(ServiceEndpointCallsTest, UnknownThingsAreNamed) {
    RunningEndpoint endpoint;
    RawClient client = endpoint.client();
    const auto error = [&client](std::string_view member, std::string_view interface, std::string_view path) {
        return client.call(callOf(member, "", Bytes(), 7, 0, interface, path)).error();
    };
    EXPECT_THAT(error("m", "a.b", kObjectPath), HasSubstr("UnknownInterface: There is no interface \"a.b\""));
    EXPECT_THAT(error("m", kReportingInterface, kObjectPath), HasSubstr("UnknownMethod: There is no member \"m\" in"));
    EXPECT_THAT(error("m", "", kObjectPath), HasSubstr("UnknownMethod: There is no member \"m\" in any interface"));
    EXPECT_THAT(error("killService", "", "/other"), HasSubstr("UnknownObject: "));
    EXPECT_THAT(error("killService", kReportingInterface, "/com"), HasSubstr("UnknownMethod: "));
    EXPECT_THAT(error("Introspect", "", "/other"), HasSubstr("UnknownObject: "));
    EXPECT_THAT(endpoint.journal.lines(), ElementsAre("connected"));
}

TEST(ServiceEndpointCallsTest, WithoutAnInterfaceTheMemberIsFoundByItsName) {
    RunningEndpoint endpoint;
    RawClient client = endpoint.client();
    EXPECT_EQ(client.call(callOf("getAllReporters", "", Bytes(), 7, 0, "")).error(), "");
    EXPECT_EQ(client.call(callOf("Ping", "", Bytes(), 7, 0, "")).error(), "");
    EXPECT_THAT(endpoint.journal.lines(), ElementsAre("connected", "all"));
}

TEST(ServiceEndpointCallsTest, TextsInErrorsAreBoundedAndValid) {
    RunningEndpoint endpoint;
    const std::string error =
        endpoint.client().call(callOf(std::string(255, 'm'), "", Bytes(), 7, 0, "a." + std::string(250, 'i'))).error();
    EXPECT_LT(error.size(), 400U);
    EXPECT_TRUE(isValidText(error));
}

TEST(ServiceEndpointCallsTest, WhatEveryObjectAnswers) {
    RunningEndpoint endpoint;
    RawClient client = endpoint.client();
    const auto call = [&client](std::string_view member, std::string_view interface, std::string_view path,
                                std::string_view signature = "", const Bytes& body = Bytes()) {
        return client.call(callOf(member, signature, body, 7, 0, interface, path));
    };
    EXPECT_EQ(call("Ping", kPeerInterface, "/anywhere").header.type, MessageType::MethodReturn);
    EXPECT_THAT(std::string(call("Hello", kBusInterface, kBusPath).reader().string()),
                ::testing::MatchesRegex(":1\\.[0-9]+"));
    EXPECT_EQ(call("AddMatch", kBusInterface, kBusPath, "s", Bytes().text("type='signal'")).error(), "");
    EXPECT_EQ(call("RemoveMatch", kBusInterface, kBusPath, "s", Bytes().text("type='signal'")).error(), "");
    const Received identity = call("GetMachineId", kPeerInterface, kObjectPath);
    if (identity.header.type == MessageType::Error) {
        EXPECT_THAT(identity.error(), HasSubstr("This machine has no identity"));
    } else {
        EXPECT_EQ(identity.reader().string().size(), 32U);
    }
}

TEST(ServiceEndpointCallsTest, ThereAreNoProperties) {
    RunningEndpoint endpoint;
    RawClient client = endpoint.client();
    const auto call = [&client](std::string_view member, std::string_view signature, const Bytes& body) {
        return client.call(callOf(member, signature, body, 7, 0, kPropertiesInterface));
    };
    EXPECT_EQ(call("GetAll", "s", Bytes().text(kReportingInterface)).reader().dictionary(), Dictionary());
    EXPECT_THAT(call("GetAll", "s", Bytes().text("a.b")).error(), HasSubstr("UnknownInterface"));
    EXPECT_THAT(call("Get", "ss", Bytes().text(kInspectionInterface).text("P")).error(), HasSubstr("UnknownProperty"));
    EXPECT_THAT(call("Get", "ss", Bytes().text("a.b").text("P")).error(), HasSubstr("UnknownInterface"));
    EXPECT_THAT(
        call("Set", "ssv", Bytes().text(kReportingInterface).text("P").type("(ii)").pad(8).u32(1).u32(2)).error(),
        HasSubstr("UnknownProperty"));
}

TEST(ServiceEndpointCallsTest, IntrospectionShowsEveryMemberWithItsTypes) {
    RunningEndpoint endpoint;
    RawClient client = endpoint.client();
    const auto introspect = [&client](std::string_view path) {
        return std::string(
            client.call(callOf("Introspect", "", Bytes(), 7, 0, kIntrospectableInterface, path)).reader().string());
    };
    const std::string object = introspect(kObjectPath);
    EXPECT_THAT(object, HasSubstr(" <interface name=\"com.orvex.vela.reporting.VelaReportingServiceProtocol\">\n"));
    EXPECT_THAT(object, HasSubstr("  <method name=\"sendMessage\">\n"
                                  "   <arg name=\"message\" type=\"a{sv}\" direction=\"in\"/>\n"
                                  "   <arg name=\"withCategory\" type=\"u\" direction=\"in\"/>\n"
                                  "   <arg name=\"andType\" type=\"q\" direction=\"in\"/>\n"
                                  "   <arg name=\"forReportingIDs\" type=\"aax\" direction=\"in\"/>\n"
                                  "  </method>\n"));
    EXPECT_THAT(object, HasSubstr("  <method name=\"GetSessions\">\n"
                                  "   <arg name=\"sessions\" type=\"aa{sv}\" direction=\"out\"/>\n"
                                  "  </method>\n"));
    EXPECT_THAT(object, HasSubstr("   <arg name=\"interface_name\" type=\"s\" direction=\"in\"/>\n"));
    EXPECT_THAT(object, Not(HasSubstr("\"\"")));
    EXPECT_THAT(introspect("/"), HasSubstr(" <node name=\"com\"/>\n"));
    EXPECT_THAT(introspect("/com"), HasSubstr(" <node name=\"orvex\"/>\n"));
    EXPECT_THAT(introspect("/com/orvex/vela/reporting"), HasSubstr(" <node name=\"server\"/>\n"));
    EXPECT_THAT(introspect("/"), Not(HasSubstr("sendMessage")));
}

class FixedInspection : public ServiceInspection {
public:
    Array sessions() const override { return Array{Dictionary{{"reporterID", 42}}, Dictionary{}}; }
    Dictionary ledger() const override { return {{"received", 3}, {"dropped", Dictionary{{"full", 1}}}}; }
};

TEST(ServiceEndpointCallsTest, InspectionAnswersWhatTheServiceTells) {
    const FixedInspection inspection;
    DbusServiceOptions options;
    options.version = "1.2.3";
    RunningEndpoint endpoint(std::move(options), &inspection);
    RawClient client = endpoint.client();
    const auto call = [&client](std::string_view member) {
        return client.call(callOf(member, "", Bytes(), 7, 0, kInspectionInterface));
    };
    EXPECT_EQ(call("GetVersion").reader().string(), "1.2.3");
    EXPECT_EQ(call("GetLedger").reader().dictionary(), inspection.ledger());
    const Received sessions = call("GetSessions");
    EXPECT_EQ(sessions.header.signature, "aa{sv}");
    EXPECT_EQ(sessions.reader().dictionaries(), inspection.sessions());
}

TEST(ServiceEndpointCallsTest, RepliesAndSignalsOfClientsAreIgnored) {
    RunningEndpoint endpoint;
    RawClient client = endpoint.client();
    std::string messages;
    MessageWriter writer(messages);
    writer.beginSignal({.serial = 1, .path = "/a", .interface = "a.b", .member = "S"});
    EXPECT_TRUE(writer.finish());
    writer.error("a.b", "text", {.serial = 2, .replySerial = 9});
    writer.beginReturn({.serial = 3, .replySerial = 9});
    EXPECT_TRUE(writer.finish());
    client.send(messages);
    EXPECT_EQ(client.call(simpleCall("createReportingSession", 1, 4)).header.replySerial, 4U);
}

TEST(ServiceEndpointCallsTest, CallsArriveInTheClientsOrderHoweverTheyAreCut) {
    RunningEndpoint endpoint;
    RawClient client = endpoint.client();
    std::string calls;
    for (int count = 0; count < 20; ++count) {
        calls += simpleCall("stopReportingSessionForID", count, static_cast<std::uint32_t>(count) + 1);
    }
    for (const char& byte : calls) {
        ASSERT_TRUE(client.send({&byte, 1}));
    }
    const auto lines = endpoint.journal.waitFor(21);
    for (int count = 0; count < 20; ++count) {
        EXPECT_EQ(lines[static_cast<std::size_t>(count) + 1], "stop " + std::to_string(count));
        EXPECT_EQ(client.readMessage().header.replySerial, static_cast<std::uint32_t>(count) + 1);
    }
}

TEST(ServiceEndpointCallsTest, AuthenticationAndCallsMayComeInOneWrite) {
    RunningEndpoint endpoint;
    RawClient client(endpoint.path());
    std::string all(ClientAuthentication::opening());
    for (std::uint32_t serial = 1; serial <= 30; ++serial) {
        all += simpleCall("stopReportingSessionForID", serial, serial);
    }
    client.send(all);
    EXPECT_EQ(client.readLine(), "DATA");
    EXPECT_THAT(client.readLine(), ::testing::StartsWith("OK "));
    for (std::uint32_t serial = 1; serial <= 30; ++serial) {
        EXPECT_EQ(client.readMessage().header.replySerial, serial);
    }
}

// Replies.

TEST(ServiceEndpointRepliesTest, ARepliesSecondCallIsDropped) {
    RunningEndpoint endpoint;
    endpoint.service->keepReplies();
    RawClient client = endpoint.client();
    client.send(simpleCall("createReportingSession", 1, 5));
    endpoint.journal.waitFor(2);
    auto replies = endpoint.service->takeReplies();
    ASSERT_EQ(replies.size(), 1U);
    replies[0]();
    replies[0]();
    EXPECT_EQ(client.readMessage().header.replySerial, 5U);
    EXPECT_EQ(client.call(callOf("Ping", "", Bytes(), 6, 0, kPeerInterface)).header.replySerial, 6U);
}

TEST(ServiceEndpointRepliesTest, AReplyThatIsDestroyedAnswersThatNoneWillCome) {
    RunningEndpoint endpoint;
    endpoint.service->keepReplies();
    RawClient client = endpoint.client();
    client.send(simpleCall("startReportingSessionForID", 1, 5));
    endpoint.journal.waitFor(2);
    endpoint.service->takeReplies().clear();
    const Received reply = client.readMessage();
    EXPECT_EQ(reply.header.replySerial, 5U);
    EXPECT_EQ(reply.header.errorName, kNoReplyError);
}

TEST(ServiceEndpointRepliesTest, RepliesMayComeFromAnyThread) {
    RunningEndpoint endpoint;
    endpoint.service->keepReplies();
    RawClient client = endpoint.client();
    for (std::uint32_t serial = 1; serial <= 40; ++serial) {
        client.send(simpleCall("stopReportingSessionForID", serial, serial));
    }
    endpoint.journal.waitFor(41);
    auto replies = endpoint.service->takeReplies();
    std::vector<std::thread> threads;
    for (std::size_t first = 0; first < 4; ++first) {
        threads.emplace_back([&replies, first] {
            for (std::size_t index = first; index < replies.size(); index += 4) {
                replies[index]();
            }
        });
    }
    std::set<std::uint32_t> answered;
    for (int count = 0; count < 40; ++count) {
        answered.insert(client.readMessage().header.replySerial);
    }
    for (auto& thread : threads) {
        thread.join();
    }
    EXPECT_EQ(answered.size(), 40U);
}

TEST(ServiceEndpointRepliesTest, RepliesMayOutliveConnectionAndEndpoint) {
    std::vector<UniqueFunction<void()>> replies;
    {
        RunningEndpoint endpoint;
        endpoint.service->keepReplies();
        RawClient client = endpoint.client();
        client.send(simpleCall("stopReportingSessionForID", 1, 1));
        client.send(simpleCall("stopReportingSessionForID", 2, 2));
        endpoint.journal.waitFor(3);
        client.close();
        endpoint.journal.waitFor(4);
        replies = endpoint.service->takeReplies();
        replies[0]();
    }
    replies[1]();
    replies.clear();
}

} // namespace

} // namespace vela::platform::dbus
