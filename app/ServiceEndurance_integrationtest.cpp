// What the built service withstands: clients that are killed wherever they stand, hours of clients that come and go,
// and its own end under load.
#include "app/ForkedClient_integrationtest.h"
#include "app/RunningService_integrationtest.h"
#include "common/DeliveryLedger.h"
#include "platform/dbus/Authentication.h"

#include <chrono>
#include <filesystem>
#include <functional>
#include <sys/socket.h>

namespace vela {

namespace {

using Report = ForkedClient::Report;

/// A sanitizer keeps what was freed, so the memory of a service that is built with one says nothing.
#if defined(__has_feature)
constexpr bool kSanitized = __has_feature(address_sanitizer) || __has_feature(thread_sanitizer);
#elif defined(__SANITIZE_ADDRESS__) || defined(__SANITIZE_THREAD__)
constexpr bool kSanitized = true;
#else
constexpr bool kSanitized = false;
#endif

std::string callBytes(const std::string& operation, const std::string& arguments, std::uint32_t serial) {
    std::vector<Value> values;
    const Value array = *readJson(arguments);
    for (const ValueRef value : array.ref().array()) {
        values.emplace_back(value);
    }
    std::string bytes;
    EXPECT_TRUE(appendCall(bytes, serial, *findOperation(operation), values));
    return bytes;
}

std::string messageBytes(std::uint32_t number, std::int64_t session) {
    return callBytes("sendMessage",
                     R"([{"number":)" + std::to_string(number) + R"(,"route":"Speaker","load":0.5},4,1,[)" +
                         std::to_string(session) + "]]",
                     number);
}

/// What the process has open; never 0.
std::size_t descriptorsOf(pid_t process) {
    std::size_t count = 0;
    std::error_code error;
    const std::filesystem::directory_iterator all("/proc/" + std::to_string(process) + "/fd", error);
    for (const auto& entry : all) {
        count += entry.path().empty() ? 0U : 1U;
    }
    EXPECT_GT(count, 0U);
    return count;
}

std::size_t residentKiBOf(pid_t process) {
    std::ifstream lines("/proc/" + std::to_string(process) + "/status");
    for (std::string line; std::getline(lines, line);) {
        if (line.starts_with("VmRSS:")) {
            return std::stoul(line.substr(6));
        }
    }
    ADD_FAILURE() << "no resident size";
    return 0;
}

/// Sends as much as the socket takes.
void sendSome(const platform::FileDescriptor& socket, std::string_view bytes) {
    while (!bytes.empty()) {
        const ssize_t sent = ::send(socket.get(), bytes.data(), bytes.size(), MSG_NOSIGNAL | MSG_DONTWAIT);
        if (sent <= 0) {
            return;
        }
        bytes.remove_prefix(static_cast<std::size_t>(sent));
    }
}

/// A client that sends `bytes` as they are and stays.
ForkedClient clientThatSent(const std::string& socket, const std::string& bytes) {
    return ForkedClient([&](const Report& report) {
        const auto connected = platform::dbus::connectTo({{socket}}, true);
        if (connected) {
            sendSome(*connected, bytes);
        }
        report(connected ? "sent" : "not connected");
        ForkedClient::stay();
    });
}

/// A client that made `calls`, whose replies it has read, and stays.
ForkedClient clientThatCalled(const std::string& socket,
                              const std::vector<std::pair<std::string, std::string>>& calls) {
    return ForkedClient([&](const Report& report) {
        ServiceClient client(socket);
        std::string answers;
        for (const auto& [operation, arguments] : calls) {
            answers += client.call(operation, arguments);
        }
        report(answers);
        ForkedClient::stay();
    });
}

/// A client with a started session that sends messages without end, and reads no replies.
ForkedClient floodingClient(const std::string& socket, std::int64_t session) {
    return ForkedClient([&](const Report& report) {
        ServiceClient client(socket);
        const std::string id = "[" + std::to_string(session) + "]";
        client.call("createReportingSession", id);
        client.call("startReportingSessionForID", id);
        constexpr std::uint32_t kFirst = 1000; // serials of its own
        constexpr std::uint32_t kUnderWay = 100;
        for (std::uint32_t number = kFirst;; ++number) {
            if (!client.connection().send(messageBytes(number, session))) {
                ForkedClient::stay();
            }
            if (number == kFirst + kUnderWay) {
                report("floods");
            }
        }
    });
}

/// Clients in every state in which one may be killed.
std::vector<ForkedClient> clientsInEveryState(const RunningService& service, std::int64_t round) {
    const std::string socket = service.socket();
    const std::string authentication(platform::dbus::ClientAuthentication::opening());
    const auto id = [round](std::int64_t state) { return std::to_string(round * 10 + state); };
    std::vector<ForkedClient> clients;
    const auto expect = [&clients](ForkedClient client, const std::string& report) {
        EXPECT_EQ(client.report(), report);
        clients.push_back(std::move(client));
    };
    expect(clientThatSent(socket, {}), "sent");
    expect(clientThatSent(socket, authentication.substr(0, authentication.size() / 2)), "sent");
    expect(clientThatCalled(socket, {{"createReportingSession", "[" + id(1) + "]"}}), "true");
    expect(clientThatCalled(socket, {{"createReportingSession", "[" + id(2) + "]"},
                                     {"startReportingSessionForID", "[" + id(2) + "]"}}),
           "truetrue");
    expect(floodingClient(socket, round * 10 + 3), "floods");
    const std::string half = messageBytes(1, 0);
    expect(clientThatSent(socket, authentication + half.substr(0, half.size() / 2)), "sent");
    std::string unread = authentication + callBytes("createReportingSession", "[" + id(4) + "]", 1);
    for (std::uint32_t serial = 2; serial < 3000; ++serial) {
        unread += callBytes("reporterID", "[" + id(4) + "]", serial);
    }
    expect(clientThatSent(socket, unread), "sent");
    return clients;
}

TEST(ServiceEnduranceTest, ClientsThatAreKilledInAnyStateLeaveNothingBehind) {
    constexpr std::size_t kRounds = 12;
    RunningService service({"log.level=error"});
    ServiceClient control = service.client();
    // The first session makes the service find the page of trace events, which stays open.
    ASSERT_EQ(control.call("createReportingSession", "[7]"), "true");
    ASSERT_EQ(control.call("destroyReportingSession", "[7]"), "true");
    ASSERT_EQ(control.call("getAllReporters"), "[]");
    const std::size_t descriptors = descriptorsOf(service.program().pid());
    for (std::size_t round = 1; round <= kRounds; ++round) {
        std::vector<ForkedClient> clients = clientsInEveryState(service, static_cast<std::int64_t>(round));
        EXPECT_NE(control.call("getAllReporters"), "[]");
        for (std::size_t number = 0; number < clients.size(); ++number) {
            clients[(round + number) % clients.size()].kill(); // not always the same one first
        }
    }
    EXPECT_TRUE(testing::waitUntil([&] { return control.call("getAllReporters") == "[]"; }));
    EXPECT_TRUE(testing::waitUntil([&] { return descriptorsOf(service.program().pid()) == descriptors; }))
        << descriptorsOf(service.program().pid()) << " descriptors, before " << descriptors;
    EXPECT_EQ(service.client().call("createReportingSession", "[42]"), "true");
    service.program().signal(SIGTERM);
    EXPECT_EQ(service.program().waitForEnd(), 0);
}

/// How long the soak takes; more for a person who asks for it: VELA_SOAK_SECONDS=600.
std::chrono::seconds soakTime() {
    const char* const asked = std::getenv("VELA_SOAK_SECONDS"); // NOLINT(concurrency-mt-unsafe): one thread
    constexpr long kStandard = 3;
    const long seconds = asked == nullptr ? kStandard : std::strtol(asked, nullptr, 10);
    return std::chrono::seconds(seconds > 0 ? seconds : kStandard);
}

/// One client's life, from its connection to its end.
void liveAsClient(const RunningService& service, std::int64_t session, std::uint32_t messages) {
    constexpr std::uint32_t kFirst = 1000;
    ServiceClient client = service.client();
    const std::string id = "[" + std::to_string(session) + "]";
    EXPECT_EQ(client.call("createReportingSession", id), "true");
    EXPECT_EQ(client.call("setServiceType", "[1," + std::to_string(session) + "]"), "true");
    EXPECT_EQ(client.call("setConfiguration",
                          R"([{"HostApplicationDisplayID":"com.example.player"},)" + std::to_string(session) + "]"),
              "true");
    EXPECT_EQ(client.call("startReportingSessionForID", id), "true");
    std::string bytes;
    for (std::uint32_t number = kFirst; number < kFirst + messages; ++number) {
        bytes += messageBytes(number, session);
    }
    EXPECT_TRUE(client.connection().send(bytes));
    EXPECT_EQ(client.answer("sendMessage", kFirst + messages - 1), "null");
    EXPECT_EQ(client.call("sendMessage", R"([{"to":"all"},4,1])"), "null");
    if (session % 2 == 0) { // the others leave that to the service
        EXPECT_EQ(client.call("stopReportingSessionForID", id), "true");
        EXPECT_EQ(client.call("destroyReportingSession", id), "true");
    }
}

TEST(ServiceEnduranceTest, ASoakLeavesDescriptorsAndMemoryAsTheyWere) {
    // The ledger has reached its full size, and every thread its own.
    constexpr std::int64_t kWarmUp = DeliveryLedger::kMostEntries + 100;
    constexpr std::uint32_t kMessages = 100;
    constexpr std::size_t kGrowthKiB = 32 * 1024;
    RunningService service({"log.level=error", "store.max_bytes=4 MiB"});
    const testing::RunningProgram& program = service.program();
    std::int64_t session = 0;
    while (session < kWarmUp && !HasFailure()) {
        ++session;
        liveAsClient(service, session, session % 10 == 0 ? kMessages : 1);
    }
    ServiceClient control = service.client();
    const auto isIdle = [&] { return control.call("getAllReporters") == "[]"; };
    ASSERT_TRUE(testing::waitUntil(isIdle));
    const std::size_t descriptors = descriptorsOf(program.pid());
    const std::size_t resident = residentKiBOf(program.pid());
    const auto end = std::chrono::steady_clock::now() + soakTime();
    while (std::chrono::steady_clock::now() < end && !HasFailure()) {
        liveAsClient(service, ++session, kMessages);
    }
    EXPECT_TRUE(testing::waitUntil(isIdle));
    EXPECT_TRUE(testing::waitUntil([&] { return descriptorsOf(program.pid()) == descriptors; }))
        << descriptorsOf(program.pid()) << " descriptors, before " << descriptors;
    RecordProperty("clients", std::to_string(session));
    RecordProperty("resident_before_kib", std::to_string(resident));
    RecordProperty("resident_after_kib", std::to_string(residentKiBOf(program.pid())));
    if (!kSanitized) {
        EXPECT_LT(residentKiBOf(program.pid()), resident + kGrowthKiB) << "after " << session << " clients";
    }
}

TEST(ServiceEnduranceTest, KillServiceUnderLoadAlwaysEndsWithTwo) {
    constexpr int kTimes = 100;
    RunningService service({"log.level=error"});
    for (int time = 0; time < kTimes && !HasFailure(); ++time) {
        if (time > 0) {
            service.start();
        }
        ServiceClient control = service.client();
        const ForkedClient load = floodingClient(service.socket(), 42);
        ASSERT_EQ(load.report(), "floods");
        const std::uint32_t serial = control.send("killService", "[]");
        EXPECT_EQ(control.answer("killService", serial), "the service closed the connection");
        EXPECT_EQ(service.program().waitForEnd(), 2);
    }
}

TEST(ServiceEnduranceTest, SigtermDuringAFloodOfMessagesEndsItWithZero) {
    constexpr int kTimes = 5;
    RunningService service({"log.level=error"});
    for (int time = 0; time < kTimes && !HasFailure(); ++time) {
        if (time > 0) {
            service.start();
        }
        std::vector<ForkedClient> load;
        for (std::int64_t session = 1; session <= 3; ++session) {
            load.push_back(floodingClient(service.socket(), session));
            ASSERT_EQ(load.back().report(), "floods");
        }
        service.program().signal(SIGTERM);
        ASSERT_TRUE(testing::waitUntil([&] { return !service.program().runs(); })) << "it goes on and on";
        EXPECT_EQ(service.program().waitForEnd(), 0);
    }
}

} // namespace

} // namespace vela
