// Driver statistics through the built service: a driver of its own process publishes channels while a session runs.
#include "app/RunningService_integrationtest.h"

#include <csignal>
#include <sstream>
#include <sys/wait.h>

namespace vela {

namespace {

using ::testing::ContainsRegex;
using ::testing::HasSubstr;

/// Without this machine's own numbers.
const std::vector<std::string> kQuiet{"drivers.Tarn=[\"channels\"]", "drivers.Haptics=[\"channels\"]",
                                      "drivers.Rx=[\"channels\"]", "drivers.Tx=[]"};

class ServiceDriversTest : public ::testing::Test {
protected:
    testing::RunningProgram driver() const {
        return testing::RunningProgram({VELA_CHANNELS_EXAMPLE}, {"VELA_RUNTIME=" + service_.folder("runtime")});
    }
    /// Whether the driver's counter is published and at least `count`.
    bool hasCounted(std::int64_t count) const {
        return testing::waitUntil([&] { return counted() >= count; });
    }
    /// What velactl says of the driver's counter; 0 without it.
    std::int64_t counted() const {
        std::vector<std::string> arguments{
            "drivers", "--json", "--set", "paths.runtime=" + service_.folder("runtime"), "--set", "paths.state=/s"};
        for (const std::string& setting : kQuiet) {
            arguments.insert(arguments.end(), {"--set", setting});
        }
        std::istringstream lines(service_.velactl(arguments).out);
        for (std::string line; std::getline(lines, line);) {
            const Value channel = *readJson(line);
            if (channel.ref().dictionary().find("channel") == ValueRef(Value("cycles"))) {
                return channel.ref().dictionary().find("value").integerValue();
            }
        }
        return 0;
    }
    /// Stops the driver and waits until it stands.
    static void pause(const testing::RunningProgram& publishing) {
        publishing.signal(SIGSTOP);
        siginfo_t state{};
        EXPECT_EQ(waitid(P_PID, static_cast<id_t>(publishing.pid()), &state, WSTOPPED), 0);
    }
    void startSession() {
        client_.call("createReportingSession", "[42]");
        EXPECT_EQ(client_.call("startReportingSessionForID", "[42]"), "true");
    }
    void stopSession() { EXPECT_EQ(client_.call("stopReportingSessionForID", "[42]"), "true"); }
    /// The messages of driver statistics that were delivered in the session's real-time reporting.
    std::string deliveries() {
        client_.call("destroyReportingSession", "[42]");
        std::string statistics;
        const std::string state = "paths.state=" + service_.folder("state");
        EXPECT_TRUE(testing::waitUntil([&] {
            std::istringstream lines(
                service_.velactl({"deliveries", "--backend", "beacon", "--json", "--set", state}).out);
            statistics.clear();
            bool hasEnded = false;
            for (std::string line; std::getline(lines, line);) {
                statistics += line.find(R"("category":12)") == std::string::npos ? "" : line + "\n";
                hasEnded = hasEnded || line.find("end_session") != std::string::npos;
            }
            return hasEnded;
        }));
        return statistics;
    }

    RunningService service_{kQuiet};
    ServiceClient client_ = service_.client();
};

TEST_F(ServiceDriversTest, ADriverThatStartsDuringTheSessionIsReportedAtItsStop) {
    EXPECT_TRUE(service_.waitForLine("subscribed to group group Speaker-(null)"));
    EXPECT_TRUE(service_.waitForLine("couldn't find any channels for driver group Tx-(null)"));
    startSession();
    const testing::RunningProgram publishing = driver();
    EXPECT_TRUE(hasCounted(5));
    stopSession();
    EXPECT_TRUE(service_.waitForLine("the current reported data is : name:"));
    const std::string statistics = deliveries();
    EXPECT_THAT(statistics, ContainsRegex("\"ExampleDriver_Speaker_Simple_cycles\":[1-9]"));
    EXPECT_THAT(statistics, ContainsRegex("\"ExampleDriver_Speaker_Histogram_late\":\"count=3,lower=0,upper=10000,"
                                          "min=0,max=[0-9]+,unit=us::0-100:[1-9]"));
    EXPECT_THAT(statistics, ContainsRegex("\"ExampleDriver_Speaker_State_stream\":\"name:idle,transition:[1-9]"));
}

TEST_F(ServiceDriversTest, OnlyWhatHappensDuringTheSessionCounts) {
    const testing::RunningProgram publishing = driver();
    EXPECT_TRUE(hasCounted(50));
    pause(publishing);
    const std::int64_t before = counted();
    startSession();
    publishing.signal(SIGCONT);
    EXPECT_TRUE(hasCounted(before + 5));
    pause(publishing);
    const std::int64_t after = counted();
    stopSession();
    EXPECT_THAT(deliveries(),
                HasSubstr("\"ExampleDriver_Speaker_Simple_cycles\":" + std::to_string(after - before) + ","));
}

TEST_F(ServiceDriversTest, ADriverThatIsKilledDuringTheSessionIsReportedOnce) {
    testing::RunningProgram publishing = driver();
    EXPECT_TRUE(hasCounted(1));
    startSession();
    const std::int64_t before = counted();
    EXPECT_TRUE(hasCounted(before + 5));
    publishing.signal(SIGKILL);
    publishing.waitForEnd();
    stopSession();
    EXPECT_THAT(deliveries(), ContainsRegex("\"ExampleDriver_Speaker_Simple_cycles\":[1-9]"));
    startSession();
    stopSession();
    EXPECT_EQ(service_.linesWith("the current reported data is : "), 1U);
}

} // namespace

} // namespace vela
