// What the built service delivers into its store, and what the ledger says of it.
#include "app/RunningService_integrationtest.h"
#include "common/DeliveryLedger.h"
#include "platform/sqlite/StoreReader.h"

#include <cstdlib>
#include <filesystem>
#include <map>
#include <random>
#include <sys/mount.h>

namespace vela {

namespace {

using ::testing::HasSubstr;

/// Messages that carry a payload; the rest are marks of where a session begins and ends.
bool isMark(const platform::StoredDelivery& delivery) {
    return delivery.backend == "beacon" && delivery.operation != "send" && delivery.operation != "send_one";
}

/// Number of deliveries in the store, by back end.
std::map<std::string, std::int64_t> storedBy(const std::string& path) {
    std::map<std::string, std::int64_t> counts;
    auto opened = platform::StoreReader::open(path);
    if (!opened) {
        return counts;
    }
    platform::StoreReader reader = *std::move(opened);
    platform::StoreFilter filter;
    for (;;) {
        const auto page = reader.read(filter);
        if (!page || page->empty()) {
            return counts;
        }
        for (const platform::StoredDelivery& delivery : *page) {
            counts[delivery.backend] += isMark(delivery) ? 0 : 1;
        }
        filter.after = page->back().seq;
    }
}

class ServiceDeliveriesTest : public ::testing::Test {
protected:
    /// Without the machine's own statistics, which would be delivered as well.
    ServiceDeliveriesTest()
        : service_({"device.InternalBuild=true", "store.commit_ms=20", "drivers.Tarn=[]", "drivers.Rx=[]",
                    "drivers.Tx=[]", "drivers.Haptics=[]"}) {}

    std::string storePath() const { return service_.folder("state/deliveries.db"); }
    std::vector<std::string> deliveries(std::vector<std::string> options) const {
        options.insert(options.begin(), "deliveries");
        options.insert(options.end(), {"--json", "--set", "paths.state=" + service_.folder("state")});
        std::istringstream lines(service_.velactl(options).out);
        std::vector<std::string> result;
        for (std::string line; std::getline(lines, line);) {
            result.push_back(line);
        }
        return result;
    }
    Dictionary ledger() const {
        const Value status = *readJson(service_.velactl({"status", "--json"}).out);
        return status.ref().dictionary().find("ledger").dictionary();
    }
    /// A number of the totals: {"beacon", "delivered"}.
    std::int64_t total(std::string_view backend, std::string_view number) const {
        const Dictionary totals = ledger().find("totals").dictionary();
        const ValueRef account = totals.find(backend);
        return account.isDictionary() ? account.dictionary().find(number).integerValue() : 0;
    }
    /// Every account of one reading balances.
    void expectBalance() const {
        const Dictionary read = ledger();
        const Array entries = read.find("entries").array();
        EXPECT_FALSE(entries.empty());
        for (const ValueRef entry : entries) {
            const Dictionary accounts = entry.dictionary();
            for (const auto& account : accounts) {
                if (!account.value.isDictionary()) {
                    continue;
                }
                const Dictionary counts = account.value.dictionary();
                std::int64_t outcomes = 0;
                for (const char* outcome : {"delivered", "queued", "redundant"}) {
                    outcomes += counts.find(outcome).integerValue();
                }
                const Dictionary dropped = counts.find("dropped").dictionary();
                for (const auto& reason : dropped) {
                    outcomes += reason.value.integerValue();
                }
                EXPECT_EQ(counts.find("received").integerValue(), outcomes) << jsonText(entry);
                EXPECT_GE(counts.find("queued").integerValue(), 0) << jsonText(entry);
            }
        }
    }
    bool waitUntilDelivered(std::string_view backend) const {
        return testing::waitUntil([&] { return total(backend, "queued") == 0; });
    }
    static void startSession(ServiceClient& client, std::int64_t reporterID = 42) {
        const std::string id = "[" + std::to_string(reporterID) + "]";
        client.call("createReportingSession", id);
        client.call("setServiceType", "[\"haptics\"," + std::to_string(reporterID) + "]");
        client.answer("startReportingSessionForID", client.send("startReportingSessionForID", id));
    }

    RunningService service_;
};

TEST_F(ServiceDeliveriesTest, TheTimeOfAClientThatHasGoneIsAnAnalyticsEvent) {
    EXPECT_EQ(service_.velactl({"call", "getAllReporters"}).status, 0);
    std::vector<std::string> events;
    EXPECT_TRUE(testing::waitUntil([&] {
        events = deliveries({"--backend", "tally"});
        return !events.empty();
    }));
    ASSERT_EQ(events.size(), 1U);
    EXPECT_THAT(events[0], HasSubstr("\"name\":\"com.orvex.vela.velareportingclientuptime\""));
    EXPECT_THAT(events[0], HasSubstr("{\"processName\":\"velactl\",\"seconds\":"));
}

TEST_F(ServiceDeliveriesTest, AMessageGoesToEveryBackEndThatWantsIt) {
    ServiceClient client = service_.client();
    startSession(client);
    client.call("sendMessage", R"([{"EngineOnTime":12},"Performance","Joule",[42]])");
    client.call("sendMessage", R"([{"issue_type":"silence","node":"out","rtaid_client":"a",)"
                               R"("any_channel_silence_seconds":3},"Error","IssueDetector",[42]])");
    ASSERT_TRUE(waitUntilDelivered("telem"));
    ASSERT_TRUE(waitUntilDelivered("beacon"));
    const auto joule = deliveries({"--backend", "joule"});
    ASSERT_EQ(joule.size(), 1U);
    EXPECT_THAT(joule[0], HasSubstr(R"("name":"Lumen_Haptics","session_id":42,"payload":{"client_id":28,)"
                                    R"("event":{"EngineOnDuration":12,"ApplicationName":"Unknown"}}})"));
    const auto telem = deliveries({"--backend", "telem"});
    ASSERT_EQ(telem.size(), 1U);
    // 10 03 1A 07 silence 22 03 out 2A 01 a
    EXPECT_THAT(telem[0], HasSubstr(R"("metric_id":5963779,"record":"EAMaB3NpbGVuY2UiA291dCoBYQ==")"));
    const auto tally = deliveries({"--backend", "tally", "--session", "42"});
    ASSERT_EQ(tally.size(), 4U);
    EXPECT_THAT(tally[0], HasSubstr("\"name\":\"com.orvex.vela.Performance.Joule\""));
    EXPECT_THAT(tally[1], HasSubstr("\"name\":\"com.orvex.haptics.Performance.Joule\""));
    EXPECT_THAT(tally[2], HasSubstr("\"name\":\"com.orvex.vela.Error.IssueDetector\""));
    EXPECT_THAT(tally[3], HasSubstr("\"name\":\"com.orvex.haptics.Error.IssueDetector\""));
}

TEST_F(ServiceDeliveriesTest, TheSecondLeakedSessionIsCaptured) {
    ServiceClient client = service_.client();
    startSession(client);
    client.call("sendMessage", R"([{"Haptic_Active_Hardware_Time_Seconds":1},"Performance","Joule",[42]])");
    client.call("sendMessage", R"([{"Haptic_Active_Hardware_Time_Seconds":2},"Performance","Joule",[42]])");
    ASSERT_TRUE(service_.waitForLine("Response from maladyReporter"));
    const auto snapshots = deliveries({"--backend", "malady"});
    ASSERT_EQ(snapshots.size(), 1U);
    EXPECT_THAT(snapshots[0], HasSubstr("\"detectedProcess\":\"running_service"));
    std::vector<std::string> bundles;
    for (const auto& entry : std::filesystem::directory_iterator(service_.folder("state/snapshots"))) {
        bundles.push_back(entry.path());
    }
    ASSERT_EQ(bundles.size(), 1U);
    std::ostringstream content;
    content << std::ifstream(bundles[0]).rdbuf();
    EXPECT_THAT(content.str(), HasSubstr("Getting snapshot with Malady Reporter"));
    EXPECT_THAT(content.str(), HasSubstr("\"reporterID\": 42"));
}

TEST_F(ServiceDeliveriesTest, TheLedgerBalancesWithTheStore) {
    constexpr int kMessages = 200;
    ServiceClient client = service_.client();
    startSession(client);
    for (int number = 0; number < kMessages; ++number) {
        // Every second one repeats the one before.
        client.send("sendMessage", R"([{"number":)" + std::to_string(number / 2) + R"(},"Playback","Start",[42]])");
    }
    client.call("stopReportingSessionForID", "[42]");
    for (const char* backend : {"beacon", "tally"}) {
        ASSERT_TRUE(waitUntilDelivered(backend));
    }
    service_.program().signal(SIGTERM);
    EXPECT_EQ(service_.program().waitForEnd(), 0);
    const auto stored = storedBy(storePath());
    service_.start();
    EXPECT_EQ(total("beacon", "received"), kMessages + 1); // and the summary
    EXPECT_EQ(total("beacon", "redundant"), kMessages / 2);
    EXPECT_EQ(total("beacon", "delivered"), stored.at("beacon"));
    EXPECT_EQ(total("beacon", "delivered"), kMessages / 2 + 1);
    expectBalance();
}

TEST_F(ServiceDeliveriesTest, AnEventWithoutAConsumerIsDroppedWithThatReason) {
    RunningService service({"tally.used=[\"com.orvex.vela.*\"]"});
    ServiceClient client = service.client();
    startSession(client);
    client.call("sendMessage", R"([{"a":1},"Playback","Start",[42]])");
    EXPECT_THAT(service.velactl({"status"}).out, HasSubstr("1 (no_consumer 1)"));
}

TEST_F(ServiceDeliveriesTest, NothingCommittedIsLostWhenTheServiceIsKilledUnderLoad) {
    const char* const wanted = std::getenv("VELA_KILL_ROUNDS"); // NOLINT(concurrency-mt-unsafe): one thread
    const long rounds = wanted == nullptr ? 5 : std::strtol(wanted, nullptr, 10);
    // NOLINTNEXTLINE(cert-msc32-c,cert-msc51-cpp): a failure must be met again
    std::mt19937 random(1);
    for (long round = 0; round < rounds; ++round) {
        {
            ServiceClient client = service_.client();
            startSession(client);
            const int messages = std::uniform_int_distribution<int>(1, 400)(random);
            for (int number = 0; number < messages; ++number) {
                client.send("sendMessage", R"([{"round":)" + std::to_string(round) + R"(,"number":)" +
                                               std::to_string(number) + R"(},"Playback","Start",[42]])");
            }
            service_.program().signal(SIGKILL);
            service_.program().waitForEnd();
        }
        const auto before = storedBy(storePath());
        service_.start();
        // A beacon delivery of this run may only be added by a session, and there is none yet.
        const auto stored = before.find("beacon");
        EXPECT_EQ(total("beacon", "delivered"), stored == before.end() ? 0 : stored->second) << "round " << round;
        EXPECT_EQ(total("beacon", "queued"), 0);
        if (!before.empty()) { // it may have been killed before its first commit
            expectBalance();
        }
    }
}

TEST_F(ServiceDeliveriesTest, AFullDiskIsSurvivedAndCounted) {
    const testing::TemporaryFolder folder;
    const std::string disk = folder / "disk";
    std::filesystem::create_directory(disk);
    if (mount("tmpfs", disk.c_str(), "tmpfs", 0, "size=1m") != 0) {
        GTEST_SKIP() << "this user may not mount a small disk";
    }
    {
        RunningService service({"store.path=" + disk + "/deliveries.db", "store.commit_ms=20"});
        ServiceClient client = service.client();
        startSession(client);
        const std::string text(4000, 'x');
        int sent = 0;
        const auto send = [&] {
            client.call("sendMessage", R"([{"number":)" + std::to_string(sent++) + R"(,"text":")" + text +
                                           R"("},"Playback","Start",[42]])");
        };
        const auto shows = [&](const std::string& part) {
            return service.velactl({"status"}).out.find(part) != std::string::npos;
        };
        EXPECT_TRUE(testing::waitUntil([&] {
            for (int number = 0; number < 50; ++number) {
                send();
            }
            return shows("store_failed");
        }));
        EXPECT_EQ(client.call("getAllReporters"), "[42]");
        // Room is made.
        ASSERT_EQ(mount("tmpfs", disk.c_str(), "tmpfs", MS_REMOUNT, "size=64m"), 0);
        const auto delivered = [&] {
            const Value status = *readJson(service.velactl({"status", "--json"}).out);
            const Dictionary totals = status.ref().dictionary().find("ledger").dictionary().find("totals").dictionary();
            return totals.find("beacon").dictionary().find("delivered").integerValue();
        };
        const std::int64_t before = delivered();
        EXPECT_TRUE(testing::waitUntil([&] {
            send();
            return delivered() > before;
        }));
    }
    umount(disk.c_str());
}

TEST_F(ServiceDeliveriesTest, DeliveriesAreFollowed) {
    ServiceClient client = service_.client();
    startSession(client);
    testing::RunningProgram follower({VELACTL, "deliveries", "--follow", "--json", "--backend", "joule", "--set",
                                      "paths.state=" + service_.folder("state")},
                                     RunningService::environment());
    client.call("sendMessage", R"([{"EngineOnTime":12},"Performance","Joule",[42]])");
    EXPECT_TRUE(testing::waitUntil([&] { return follower.out().find("Lumen_Haptics") != std::string::npos; }));
    client.call("sendMessage", R"([{"EngineOnTime":13},"Performance","Joule",[42]])");
    EXPECT_TRUE(
        testing::waitUntil([&] { return follower.out().find("\"EngineOnDuration\":13") != std::string::npos; }));
    EXPECT_TRUE(follower.runs());
}

TEST_F(ServiceDeliveriesTest, TheHeadingStandsOnceOverAllPages) {
    constexpr int kMessages = 300; // more than a page
    ServiceClient client = service_.client();
    startSession(client);
    for (int number = 0; number < kMessages; ++number) {
        client.send("sendMessage", R"([{"number":)" + std::to_string(number) + R"(},"Playback","Start",[42]])");
    }
    client.call("stopReportingSessionForID", "[42]");
    ASSERT_TRUE(waitUntilDelivered("beacon"));
    std::istringstream lines(
        service_.velactl({"deliveries", "--backend", "beacon", "--set", "paths.state=" + service_.folder("state")})
            .out);
    int headings = 0;
    int rows = 0;
    std::size_t backendColumn = 0;
    for (std::string line; std::getline(lines, line);) {
        if (line.starts_with("SEQ ")) {
            ++headings;
            backendColumn = line.find("BACKEND");
            continue;
        }
        ++rows;
        EXPECT_EQ(line.find("  beacon  "), backendColumn - 2) << line;
    }
    EXPECT_EQ(headings, 1);
    EXPECT_GE(rows, kMessages);
}

TEST_F(ServiceDeliveriesTest, AFollowerEndsWhenItsReaderHasGone) {
    ServiceClient client = service_.client();
    startSession(client);
    client.call("stopReportingSessionForID", "[42]");
    ASSERT_TRUE(waitUntilDelivered("beacon"));
    // Nothing is delivered from here on.
    testing::RunningProgram pipeline({"/bin/sh", "-c", R"(timeout 60 "$0" "$@" | head -n 1)", VELACTL, "deliveries",
                                      "--follow", "--set", "paths.state=" + service_.folder("state")},
                                     RunningService::environment());
    EXPECT_TRUE(testing::waitUntil([&] { return !pipeline.runs(); }));
    EXPECT_THAT(pipeline.out(), ::testing::StartsWith("SEQ  TIME "));
    EXPECT_EQ(pipeline.error(), "");
}

TEST_F(ServiceDeliveriesTest, AFolderIsNoStore) {
    const testing::ProgramRun run = service_.velactl({"deliveries", "--set", "store.path=/tmp"});
    EXPECT_EQ(run.status, 1);
    EXPECT_EQ(run.out, "");
    EXPECT_EQ(run.error, "velactl: /tmp is a folder and no store\n");
}

} // namespace

} // namespace vela
