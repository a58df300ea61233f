// The built service as a program sees it that speaks through sd-bus, another implementation of the protocol.
#include "app/RunningService_integrationtest.h"

#include <cstring>
#include <systemd/sd-bus.h>

namespace vela {

namespace {

/// One connection, and the reply of the last call.
class SdBusClient {
public:
    explicit SdBusClient(const std::string& address) {
        EXPECT_GE(sd_bus_new(&bus_), 0);
        EXPECT_GE(sd_bus_set_address(bus_, address.c_str()), 0);
        const int started = sd_bus_start(bus_);
        EXPECT_GE(started, 0) << std::strerror(-started);
    }
    SdBusClient(const SdBusClient&) = delete;
    SdBusClient& operator=(const SdBusClient&) = delete;
    ~SdBusClient() {
        sd_bus_error_free(&error_);
        sd_bus_message_unref(reply_);
        sd_bus_close_unref(bus_);
    }

    sd_bus* bus() const { return bus_; }

    /// Whether the service answered; arguments as for sd_bus_call_method.
    template <class... Arguments>
    bool call(const char* interface, const char* member, const char* types, Arguments... arguments) {
        forgetReply();
        return sd_bus_call_method(bus_, kService, kPath, interface, member, &error_, &reply_, types, arguments...) >= 0;
    }
    template <class... Arguments>
    bool call(const char* member, const char* types, Arguments... arguments) {
        return call(kInterface.c_str(), member, types, arguments...);
    }
    /// The reply's only argument, a boolean.
    bool booleanReply() {
        int value = 0;
        EXPECT_GT(sd_bus_message_read(reply_, "b", &value), 0);
        return value != 0;
    }
    sd_bus_message* reply() const { return reply_; }
    /// "name: text" of the error that the last call was answered with; empty for none.
    std::string error() const {
        return sd_bus_error_is_set(&error_) != 0 ? std::string(error_.name) + ": " + error_.message : std::string();
    }

    static constexpr const char* kService = "com.orvex.vela.reporting.server";
    static constexpr const char* kPath = "/com/orvex/vela/reporting/server";
    static inline const std::string kInterface = "com.orvex.vela.reporting.VelaReportingServiceProtocol";

private:
    void forgetReply() {
        sd_bus_error_free(&error_);
        error_ = {};
        reply_ = sd_bus_message_unref(reply_);
    }

    sd_bus* bus_ = nullptr;
    sd_bus_message* reply_ = nullptr;
    sd_bus_error error_{};
};

class SdBusClientTest : public ::testing::Test {
protected:
    bool create(std::int64_t session) {
        return client_.call("createReportingSession", "x", session) && client_.booleanReply();
    }

    RunningService service_;
    SdBusClient client_{service_.address()};
};

TEST_F(SdBusClientTest, ASessionIsCreatedConfiguredAndDescribed) {
    EXPECT_TRUE(create(42));
    EXPECT_TRUE(client_.call("setServiceType", "qx", 1, std::int64_t{42}) && client_.booleanReply());
    EXPECT_TRUE(client_.call("setConfiguration", "a{sv}x", 1, "HostApplicationDisplayID", "s", "com.example.player",
                             std::int64_t{42}) &&
                client_.booleanReply());
    ASSERT_TRUE(client_.call("reporterID", "x", std::int64_t{42})) << client_.error();
    std::int64_t reporterID = 0;
    std::uint16_t serviceType = 0;
    EXPECT_GT(sd_bus_message_read(client_.reply(), "a{sv}", 2, nullptr, "x", &reporterID, nullptr, "q", &serviceType),
              0);
    EXPECT_EQ(reporterID, 42);
    EXPECT_EQ(serviceType, 1);
}

TEST_F(SdBusClientTest, AMessageOfEveryKindReachesTheSession) {
    EXPECT_TRUE(create(42));
    EXPECT_TRUE(client_.call("startReportingSessionForID", "x", std::int64_t{42}) && client_.booleanReply());
    ASSERT_TRUE(client_.call("sendMessage", "a{sv}uqaax", 8, "boolean", "b", 1, "byte", "y", 7, "short", "n", -2,
                             "long", "x", std::int64_t{-3}, "real", "d", 1.5, "text", "s", "word", "data", "ay", 2, 1,
                             2, "list", "as", 2, "one", "two", 4, 1, 1, 1, std::int64_t{42}))
        << client_.error();
    EXPECT_STREQ(sd_bus_message_get_signature(client_.reply(), 1), "");
    EXPECT_EQ(service_.linesWith("sending message for session owned by 42"), 1U);
}

TEST_F(SdBusClientTest, ABroadcastAndAListOfNobodyAreToldApart) {
    EXPECT_TRUE(create(42));
    EXPECT_TRUE(client_.call("sendMessage", "a{sv}uqaax", 1, "a", "x", std::int64_t{1}, 4, 1, 1, 0)) << client_.error();
    EXPECT_EQ(service_.linesWith("active reporting sessions"), 0U);
    EXPECT_TRUE(client_.call("sendMessage", "a{sv}uqaax", 1, "a", "x", std::int64_t{1}, 4, 1, 0)) << client_.error();
    EXPECT_EQ(service_.linesWith("active reporting sessions"), 1U);
}

TEST_F(SdBusClientTest, AnUnknownMemberIsAnError) {
    EXPECT_FALSE(client_.call("launchReportingSession", "x", std::int64_t{42}));
    EXPECT_THAT(client_.error(), ::testing::StartsWith("org.freedesktop.DBus.Error.UnknownMethod: "));
    EXPECT_TRUE(create(42)) << "the connection goes on";
}

TEST_F(SdBusClientTest, WrongArgumentsAreAnErrorThatNamesTheKey) {
    EXPECT_FALSE(client_.call("setConfiguration", "a{sv}x", 1, "place", "(ii)", 1, 2, std::int64_t{42}));
    EXPECT_THAT(client_.error(), ::testing::StartsWith("org.freedesktop.DBus.Error.InvalidArgs: "));
    EXPECT_THAT(client_.error(), ::testing::HasSubstr("place"));
}

TEST_F(SdBusClientTest, ItIntrospectsAndPings) {
    ASSERT_TRUE(client_.call("org.freedesktop.DBus.Peer", "Ping", "")) << client_.error();
    ASSERT_TRUE(client_.call("org.freedesktop.DBus.Introspectable", "Introspect", "")) << client_.error();
    const char* description = nullptr;
    EXPECT_GT(sd_bus_message_read(client_.reply(), "s", &description), 0);
    EXPECT_THAT(description, ::testing::HasSubstr("<method name=\"getAllReporters\">"));
}

} // namespace

} // namespace vela
