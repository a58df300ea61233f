#include "platform/sqlite/StoreBeacon.h"
#include "platform/sqlite/StoreHarness_test.h"

#include <cerrno>
#include <gmock/gmock.h>

namespace vela::platform {

namespace {

using ::testing::ElementsAre;
using ::testing::IsEmpty;
using ::testing::MatchesRegex;

const std::string kColumns = "SELECT operation, name, session_id, category, type, payload FROM deliveries ORDER BY seq";

class StoreBeaconTest : public StoreHarness {
protected:
    const std::unique_ptr<DeliveryStore> store_ = openStore();
    StoreBeacon beacon_{*store_, {"store"}};
    const Dictionary sessionInfo_{{"client_type", 19}, {"client_version", 2.1F}, {"session_id", 42}};
    const Dictionary userInfo_{{"client_name", "com.orvex.vela"}, {"service_name", "telephony_session"}};
};

TEST_F(StoreBeaconTest, ASessionLeavesItsMessagesBetweenItsMarks) {
    {
        const auto session = beacon_.createBeaconSession(sessionInfo_, userInfo_);
        EXPECT_TRUE(session->sendBeaconMessage(3, 5, {{"volume", 0.5}, {"route", "speaker"}}));
        session->flushBeaconMessages();
    }
    ASSERT_TRUE(store_->commitAll());
    EXPECT_THAT(query(kColumns),
                ElementsAre(R"(create_session|telephony_session|42|NULL|NULL|{"session_info":{"client_type":19,)"
                            R"("client_version":2.1,"session_id":42},"user_info":{"client_name":"com.orvex.vela",)"
                            R"("service_name":"telephony_session"}})",
                            R"(send|telephony_session|42|3|5|{"volume":0.5,"route":"speaker"})",
                            "flush|telephony_session|42|NULL|NULL|{}",
                            "end_session|telephony_session|42|NULL|NULL|{}"));
}

TEST_F(StoreBeaconTest, EveryKindOfValueComesBackAsItsJson) {
    const auto session = beacon_.createBeaconSession({}, {});
    const Dictionary payload{{"boolean", true},
                             {"least", std::int64_t{-9223372036854775807}},
                             {"greatest", std::uint64_t{18446744073709551615U}},
                             {"whole real", 1.0},
                             {"long real", 0.1 + 0.2},
                             {"text \"quoted\"", "line\nend \xC3\xA4"},
                             {"data", Data(std::string_view("\0\1\2", 3))},
                             {"date", Date{1.5}},
                             {"array", Array{1, "two", Value(Array())}},
                             {"dictionary", Dictionary{{"b", 1}, {"a", 2}}}};
    EXPECT_TRUE(session->sendBeaconMessage(1, 2, payload));
    ASSERT_TRUE(store_->commitAll());
    EXPECT_THAT(query("SELECT payload FROM deliveries WHERE operation = 'send'"),
                ElementsAre(R"({"boolean":true,"least":-9223372036854775807,"greatest":18446744073709551615,)"
                            R"("whole real":1.0,"long real":0.30000000000000004,)"
                            R"("text \"quoted\"":"line\nend )"
                            "\xC3\xA4"
                            R"(","data":"AAEC","date":"1970-01-01T00:00:01.500Z","array":[1,"two",[]],)"
                            R"("dictionary":{"b":1,"a":2}})"));
}

TEST_F(StoreBeaconTest, KeysWithANulOrInvalidBytesStayDifferent) {
    const auto session = beacon_.createBeaconSession({}, {});
    EXPECT_TRUE(session->sendBeaconMessage(1, 2, {{std::string_view("a\0b", 3), 1}}));
    EXPECT_TRUE(session->sendBeaconMessage(1, 2, {{"a", 2}}));
    EXPECT_TRUE(session->sendBeaconMessage(1, 2, {{"\xFF", 3}}));
    ASSERT_TRUE(store_->commitAll());
    EXPECT_THAT(query("SELECT payload FROM deliveries WHERE operation = 'send' ORDER BY seq"),
                ElementsAre(R"({"a\u0000b":1})", R"({"a":2})", "{\"\xEF\xBF\xBD\":3}"));
}

TEST_F(StoreBeaconTest, ASessionWithoutANumberHasNone) {
    const auto session = beacon_.createBeaconSession({}, {});
    ASSERT_TRUE(store_->commitAll());
    EXPECT_THAT(query(kColumns),
                ElementsAre(R"(create_session|NULL|NULL|NULL|NULL|{"session_info":{},"user_info":{}})"));
    EXPECT_EQ(session->description(), "<StoreBeaconSession without a number>");
}

TEST_F(StoreBeaconTest, ASingleMessageIsStoredWithTheServicesName) {
    EXPECT_TRUE(beacon_.sendOneBeaconMessage({{"session_id", -1}}, {{"service_name", "alarms"}}, 7, 8, {{"a", 1}}));
    ASSERT_TRUE(store_->commitAll());
    EXPECT_THAT(query(kColumns), ElementsAre(R"(send_one|alarms|-1|7|8|{"a":1})"));
}

TEST_F(StoreBeaconTest, DiscoveryAnswersTheConfiguredBackEndsInsideTheCall) {
    const auto session = beacon_.createBeaconSession({}, {});
    std::optional<Array> found;
    session->startBeaconBackendDiscovery([&](std::optional<Array> backends) { found = std::move(backends); });
    EXPECT_EQ(found, Array{"store"});
}

TEST_F(StoreBeaconTest, DiscoveryFindsNoneWhenNoneIsConfigured) {
    StoreBeacon beacon(*store_, {});
    const auto session = beacon.createBeaconSession({}, {});
    std::optional<std::optional<Array>> answer;
    session->startBeaconBackendDiscovery([&](std::optional<Array> backends) { answer = std::move(backends); });
    ASSERT_TRUE(answer.has_value());
    EXPECT_EQ(*answer, std::nullopt);
}

TEST_F(StoreBeaconTest, TokensAreTextsBelowTheirParents) {
    const Value top = beacon_.newBeaconHierarchyToken({});
    const Value below = beacon_.newBeaconHierarchyToken(top);
    EXPECT_THAT(std::string(top.ref().text()), MatchesRegex("[0-9a-f]{32}"));
    EXPECT_THAT(std::string(below.ref().text()), MatchesRegex(std::string(top.ref().text()) + "\\.[0-9a-f]{32}"));
    EXPECT_NE(beacon_.newBeaconHierarchyToken({}), top);
}

TEST_F(StoreBeaconTest, AMessageIsDeliveredOnItsCallersAccountWhenItIsCommitted) {
    const auto entry = ledger_.open(7, 42);
    const auto session = beacon_.createBeaconSession(sessionInfo_, userInfo_);
    {
        const LedgerScope scope(entry);
        entry->received(DeliveryBackend::Beacon);
        EXPECT_TRUE(session->sendBeaconMessage(1, 2, {{"a", 1}}));
    }
    EXPECT_EQ(entry->counts(DeliveryBackend::Beacon).queued(), 1U);
    ASSERT_TRUE(store_->commitAll());
    EXPECT_EQ(entry->counts(DeliveryBackend::Beacon).delivered, 1U);
    EXPECT_EQ(entry->counts(DeliveryBackend::Beacon).queued(), 0U);
    EXPECT_THAT(query("SELECT client, session, backend, received, delivered FROM ledger"), ElementsAre("7|42|0|1|1"));
}

TEST_F(StoreBeaconTest, AMessageOutsideEveryScopeIsTheServicesOwn) {
    const auto session = beacon_.createBeaconSession(sessionInfo_, userInfo_);
    EXPECT_TRUE(session->sendBeaconMessage(1, 2, {}));
    ASSERT_TRUE(store_->commitAll());
    EXPECT_EQ(ledger_.own()->counts(DeliveryBackend::Beacon).received, 1U);
    EXPECT_EQ(ledger_.own()->counts(DeliveryBackend::Beacon).delivered, 1U);
}

TEST_F(StoreBeaconTest, MarksAreNotCounted) {
    {
        const auto session = beacon_.createBeaconSession(sessionInfo_, userInfo_);
        session->flushBeaconMessages();
    }
    ASSERT_TRUE(store_->commitAll());
    EXPECT_EQ(ledger_.own()->counts(DeliveryBackend::Beacon), LedgerCounts());
    EXPECT_THAT(query("SELECT * FROM ledger"), IsEmpty());
}

TEST_F(StoreBeaconTest, AMessageLargerThanTheQueueIsRefusedForItsSize) {
    const auto session = beacon_.createBeaconSession(sessionInfo_, userInfo_);
    const std::string text(33 * 1024 * 1024, 'x');
    const Result<Done> sent = session->sendBeaconMessage(1, 2, {{"text", std::string_view(text)}});
    ASSERT_FALSE(sent);
    EXPECT_EQ(sent.failure().code, EMSGSIZE);
    EXPECT_EQ(sent.failure().description, "the message is larger than the store's queue");
    EXPECT_EQ(dropped(ledger_.own(), DeliveryBackend::Beacon, DropReason::Limit), 1U);
    EXPECT_TRUE(session->sendBeaconMessage(1, 2, {{"a", 1}}));
}

TEST_F(StoreBeaconTest, AMessageForAClosedStoreIsTheCallersToCount) {
    const auto entry = ledger_.open(7, 42);
    const auto session = beacon_.createBeaconSession(sessionInfo_, userInfo_);
    store_->close();
    const LedgerScope scope(entry);
    entry->received(DeliveryBackend::Beacon);
    const Result<Done> sent = session->sendBeaconMessage(1, 2, {});
    ASSERT_FALSE(sent);
    EXPECT_EQ(sent.failure().description, "the store is closed");
    EXPECT_EQ(entry->counts(DeliveryBackend::Beacon).queued(), 1U);
}

} // namespace

} // namespace vela::platform
