// How connections and the endpoint begin and end.
#include "platform/dbus/ServiceEndpoint_integrationtest.h"

#include <csignal>
#include <fcntl.h>
#include <filesystem>
#include <fstream>
#include <sys/file.h>
#include <sys/stat.h>
#include <sys/wait.h>

namespace vela::platform::dbus {

namespace {

using namespace std::chrono_literals;
using ::testing::ElementsAre;
using ::testing::HasSubstr;
using std::string_view_literals::operator""sv; // NOLINT(misc-unused-using-decls): the tool does not see literals

// The end of a connection.

TEST(ServiceEndpointLifeTest, ConnectionsAreDescribedByNumbers) {
    RunningEndpoint endpoint;
    RawClient client = endpoint.client();
    endpoint.journal.waitFor(1);
    const auto connection = endpoint.delegate.lastConnection();
    EXPECT_EQ(connection->processIdentifier(), getpid());
    EXPECT_EQ(connection->description(),
              "<connection 16 pid " + std::to_string(getpid()) + " uid " + std::to_string(getuid()) + ">");
}

TEST(ServiceEndpointLifeTest, AConnectionKnowsOnWhoseBehalfItsPeerCalls) {
    RunningEndpoint endpoint;
    RawClient client = endpoint.client();
    endpoint.journal.waitFor(1);
    std::vector<std::uint32_t> groups(static_cast<std::size_t>(getgroups(0, nullptr)));
    ASSERT_EQ(getgroups(static_cast<int>(groups.size()), groups.data()), static_cast<int>(groups.size()));
    std::optional<Identity> identity = endpoint.delegate.lastConnection()->peerIdentity();
    ASSERT_TRUE(identity);
    EXPECT_EQ(identity->user, geteuid());
    EXPECT_EQ(identity->group, getegid());
    EXPECT_THAT(identity->groups, ::testing::UnorderedElementsAreArray(groups));
}

TEST(ServiceEndpointLifeTest, WithoutAllOfItsGroupsAPeerIsNotKnown) {
    PeerCredentials peer;
    peer.user = 1000;
    peer.group = 1001;
    peer.groups = {29};
    EXPECT_EQ(peer.identity(), std::nullopt);
    peer.groupsKnown = true;
    EXPECT_EQ(peer.identity(), (Identity{1000, 1001, {29}}));
}

TEST(ServiceEndpointLifeTest, TheEndOfTheBytesInvalidatesOnce) {
    RunningEndpoint endpoint;
    RawClient client = endpoint.client();
    client.call(simpleCall("createReportingSession", 1));
    client.close();
    EXPECT_THAT(endpoint.journal.waitFor(3), ElementsAre("connected", "create 1", "invalidated"));
    endpoint.stop();
    EXPECT_EQ(endpoint.journal.lines().size(), 3U);
}

TEST(ServiceEndpointLifeTest, AClientThatEndsItsSendingIsGone) {
    RunningEndpoint endpoint;
    RawClient client = endpoint.client();
    shutdown(client.descriptor(), SHUT_WR);
    EXPECT_TRUE(client.atEnd());
    EXPECT_THAT(endpoint.journal.waitFor(2), ElementsAre("connected", "invalidated"));
}

TEST(ServiceEndpointLifeTest, HalfAMessageAtTheEndIsJustTheEnd) {
    RunningEndpoint endpoint;
    const std::string call = simpleCall("createReportingSession", 1);
    for (const std::size_t length : {std::size_t{1}, std::size_t{15}, std::size_t{16}, call.size() - 1}) {
        const std::size_t before = endpoint.journal.lines().size();
        RawClient client = endpoint.client();
        client.send(call.substr(0, length));
        client.close();
        const auto lines = endpoint.journal.waitFor(before + 2);
        EXPECT_EQ(lines.size(), before + 2);
        EXPECT_EQ(lines.back(), "invalidated");
    }
}

TEST(ServiceEndpointLifeTest, BytesThatAreNoMessageInterruptAndInvalidate) {
    const std::string good = simpleCall("stopReportingSessionForID", 1);
    std::string boolean =
        callOf("setConfiguration", "a{sv}x", Bytes().array(Bytes().text("k").type("b").pad(4).u32(2), 8).pad(8).u64(1));
    for (const std::string& bad : {std::string("GET / HTTP/1.1\r\n\r\n"), std::string("l\1\0\2"sv),
                                   callOf("", "", Bytes()), boolean, std::string(16, 'l')}) {
        RunningEndpoint endpoint;
        RawClient client = endpoint.client();
        for (const std::string& bytes : {good, bad, good}) {
            client.send(bytes);
        }
        endpoint.journal.waitFor(4);
        EXPECT_THAT(endpoint.journal.lines(), ElementsAre("connected", "stop 1", "interrupted", "invalidated"));
        EXPECT_EQ(client.readMessage().header.replySerial, 7U);
        EXPECT_TRUE(client.atEnd());
    }
}

/// Its object is the connection's alone.
class LoneObjectDelegate final : public IpcListenerDelegate {
public:
    explicit LoneObjectDelegate(Journal& journal) : journal_(journal) {}

    bool shouldAcceptNewConnection(const std::shared_ptr<IpcConnection>& connection) override {
        const auto object = std::make_shared<RecordingService>(journal_);
        connection->setExportedObject(object);
        connection->setInvalidationHandler([this, weak = std::weak_ptr(object)] {
            journal_.add(weak.expired() ? "invalidated without its object" : "invalidated");
        });
        connection->resume();
        return true;
    }

private:
    Journal& journal_;
};

TEST(ServiceEndpointLifeTest, TheObjectLivesUntilTheInvalidationHandlerHasRunAlsoWhereNothingWasCalled) {
    for (const bool broken : {false, true}) {
        const testing::TemporaryFolder folder;
        Journal journal;
        LoneObjectDelegate delegate(journal);
        DbusServiceOptions options;
        options.socketPath = folder / "socket";
        options.endsOnSignals = false;
        const auto endpoint = *DbusServiceEndpoint::open(std::move(options));
        endpoint->setDelegate(delegate);
        std::thread thread([&endpoint] { EXPECT_TRUE(endpoint->resume()); });
        {
            RawClient client(folder / "socket");
            client.authenticate();
            client.send(broken ? "no message, but as long as the header of one" : "");
            if (broken) {
                EXPECT_TRUE(client.atEnd());
            }
        }
        EXPECT_THAT(journal.waitFor(1), ElementsAre("invalidated"));
        endpoint->stop();
        thread.join();
    }
}

TEST(ServiceEndpointLifeTest, CallsThatWereSentBeforeTheEndAllArrive) {
    RunningEndpoint endpoint;
    // More calls than may be under way, and none is answered while they are sent.
    endpoint.service->keepReplies();
    RawClient client = endpoint.client();
    // In one write: small ones fill the socket before their bytes do.
    std::string calls;
    for (std::uint32_t serial = 1; serial <= 500; ++serial) {
        calls += simpleCall("stopReportingSessionForID", serial, serial);
    }
    ASSERT_TRUE(client.send(calls));
    client.close();
    const auto lines = endpoint.journal.waitFor(502);
    ASSERT_EQ(lines.size(), 502U);
    for (std::size_t serial = 1; serial <= 500; ++serial) {
        EXPECT_EQ(lines[serial], "stop " + std::to_string(serial));
    }
    EXPECT_EQ(lines.back(), "invalidated");
}

TEST(ServiceEndpointLifeTest, MessagesThatExpectNoReplyAllArriveFromAClientThatNeverReads) {
    RunningEndpoint endpoint;
    RawClient client(endpoint.path());
    client.send(ClientAuthentication::opening());
    for (std::uint32_t serial = 1; serial <= 500; ++serial) {
        ASSERT_TRUE(client.send(sendMessageCall({{"n", serial}}, std::nullopt, serial, false)));
    }
    client.close();
    const auto lines = endpoint.journal.waitFor(502);
    EXPECT_EQ(endpoint.journal.count("send 3 4 to all"), 500U);
    EXPECT_EQ(lines.back(), "invalidated");
}

TEST(ServiceEndpointLifeTest, AnotherConnectionLivesOn) {
    RunningEndpoint endpoint;
    RawClient first = endpoint.client();
    RawClient second = endpoint.client();
    first.send("garbage");
    EXPECT_TRUE(first.atEnd());
    EXPECT_EQ(second.call(simpleCall("stopReportingSessionForID", 1)).error(), "");
}

// The beginning of a connection.

TEST(ServiceEndpointLifeTest, GarbageInsteadOfAuthenticationIsNotTheServicesAffair) {
    RunningEndpoint endpoint;
    for (const std::string_view bytes : {"GET /\r\n"sv, "\0BEGIN\r\n"sv, "\0\xFF\r\n"sv}) {
        RawClient client(endpoint.path());
        client.send(bytes);
        EXPECT_TRUE(client.atEnd());
    }
    RawClient gone(endpoint.path());
    gone.send("\0AUTH"sv);
    gone.close();
    endpoint.client().call(simpleCall("stopReportingSessionForID", 1));
    EXPECT_EQ(endpoint.journal.lines().front(), "connected");
    EXPECT_EQ(endpoint.journal.count("connected"), 1U);
}

TEST(ServiceEndpointLifeTest, AuthenticationHasItsTime) {
    DbusServiceOptions options;
    options.authentication = 20ms;
    RunningEndpoint endpoint(std::move(options));
    RawClient silent(endpoint.path());
    RawClient slow(endpoint.path());
    slow.send("\0AUTH EXTERNAL"sv);
    EXPECT_TRUE(silent.atEnd());
    EXPECT_TRUE(slow.atEnd());
    EXPECT_THAT(endpoint.journal.lines(), ElementsAre());
}

TEST(ServiceEndpointLifeTest, WhoIsAuthenticatedHasAllTheTime) {
    DbusServiceOptions options;
    options.authentication = 20ms;
    RunningEndpoint endpoint(std::move(options));
    RawClient client = endpoint.client();
    // A later client's time passes, so that the first one's did as well.
    EXPECT_TRUE(RawClient(endpoint.path()).atEnd());
    EXPECT_EQ(client.call(simpleCall("stopReportingSessionForID", 1)).error(), "");
}

TEST(ServiceEndpointLifeTest, AConnectionThatTheServiceDoesNotTakeIsClosed) {
    RunningEndpoint endpoint;
    endpoint.delegate.refuse();
    RawClient client = endpoint.client();
    client.send(simpleCall("stopReportingSessionForID", 1));
    EXPECT_TRUE(client.atEnd());
    endpoint.stop();
    EXPECT_THAT(endpoint.journal.lines(), ElementsAre("refused"));
}

TEST(ServiceEndpointLifeTest, CallsWaitForTheConnectionsResume) {
    RunningEndpoint endpoint;
    endpoint.delegate.hold();
    RawClient client = endpoint.client();
    client.send(simpleCall("stopReportingSessionForID", 1));
    endpoint.journal.waitFor(1);
    RawClient other(endpoint.path());
    other.authenticate();
    endpoint.journal.waitFor(2);
    EXPECT_EQ(endpoint.journal.count("stop 1"), 0U);
    // The first one is the second last: its bytes were there before the other's.
    endpoint.delegate.lastConnection()->resume();
    EXPECT_EQ(other.call(simpleCall("stopReportingSessionForID", 2)).error(), "");
    EXPECT_EQ(endpoint.journal.count("stop 1"), 0U);
}

TEST(ServiceEndpointLifeTest, AClientThatHangsUpBeforeTheResumeIsHeardAfterIt) {
    RunningEndpoint endpoint;
    endpoint.delegate.hold();
    RawClient client = endpoint.client();
    client.send(simpleCall("stopReportingSessionForID", 1));
    client.close();
    endpoint.journal.waitFor(1);
    endpoint.delegate.lastConnection()->resume();
    EXPECT_THAT(endpoint.journal.waitFor(3), ElementsAre("connected", "stop 1", "invalidated"));
}

// The endpoint's own life.

TEST(ServiceEndpointLifeTest, StoppingDispatchesWhatWasSentAndInvalidatesNobody) {
    RunningEndpoint endpoint;
    RawClient client = endpoint.client();
    std::string calls;
    for (std::uint32_t serial = 1; serial <= 300; ++serial) {
        calls += simpleCall("stopReportingSessionForID", serial, serial, Order::Little, kNoReplyExpectedFlag);
    }
    client.send(calls);
    endpoint.stop();
    const auto lines = endpoint.journal.lines();
    ASSERT_EQ(lines.size(), 301U);
    EXPECT_EQ(lines[300], "stop 300");
    EXPECT_TRUE(client.atEnd());
}

TEST(ServiceEndpointLifeTest, ASignalEndsTheEndpoint) {
    const vela::testing::TemporaryFolder folder;
    Journal journal;
    TestDelegate delegate(journal, nullptr);
    for (const int signal : {SIGTERM, SIGINT}) {
        // In a process of its own, whose only other threads are its.
        const pid_t child = fork();
        if (child == 0) {
            DbusServiceEndpoint::blockEndSignals();
            DbusServiceOptions options;
            options.socketPath = folder / "socket";
            auto endpoint = DbusServiceEndpoint::open(std::move(options));
            if (!endpoint) {
                _exit(2);
            }
            const auto owned = *std::move(endpoint);
            owned->setDelegate(delegate);
            kill(getpid(), signal);
            _exit(owned->resume() ? 0 : 3);
        }
        int status = 0;
        ASSERT_EQ(waitpid(child, &status, 0), child);
        EXPECT_TRUE(WIFEXITED(status));
        EXPECT_EQ(WEXITSTATUS(status), 0);
        EXPECT_FALSE(std::filesystem::exists(folder / "socket"));
    }
}

TEST(ServiceEndpointLifeTest, TheSocketHasExactlyItsModeAndGoesWithTheService) {
    const vela::testing::TemporaryFolder folder;
    const mode_t before = umask(0077);
    for (const unsigned mode : {0666U, 0660U, 0600U}) {
        DbusServiceOptions options;
        options.socketPath = folder / "socket";
        options.socketMode = mode;
        auto endpoint = DbusServiceEndpoint::open(std::move(options));
        ASSERT_TRUE(endpoint) << endpoint.failure().description;
        struct stat status {};
        ASSERT_EQ(stat((folder / "socket").c_str(), &status), 0);
        EXPECT_EQ(status.st_mode & 07777U, mode);
        auto gone = *std::move(endpoint);
        gone.reset();
        EXPECT_FALSE(std::filesystem::exists(folder / "socket"));
    }
    umask(before);
}

DbusServiceOptions optionsAt(const std::string& path) {
    DbusServiceOptions options;
    options.socketPath = path;
    return options;
}

TEST(ServiceEndpointLifeTest, ASecondServiceIsRefusedAndTheFirstGoesOn) {
    const vela::testing::TemporaryFolder folder;
    const auto first = DbusServiceEndpoint::open(optionsAt(folder / "socket"));
    ASSERT_TRUE(first);
    const auto second = DbusServiceEndpoint::open(optionsAt(folder / "socket"));
    ASSERT_FALSE(second);
    EXPECT_EQ(second.failure().code, EADDRINUSE);
    EXPECT_EQ(second.failure().description, "another service answers at " + (folder / "socket"));
    RawClient still(folder / "socket");
}

TEST(ServiceEndpointLifeTest, ASocketThatNobodyListensAtIsReplaced) {
    const vela::testing::TemporaryFolder folder;
    const std::string path = folder / "socket";
    {
        const FileDescriptor stale(socket(AF_UNIX, SOCK_STREAM, 0));
        sockaddr_un address{};
        address.sun_family = AF_UNIX;
        std::memcpy(address.sun_path, path.data(), path.size());
        ASSERT_EQ(bind(stale.get(), reinterpret_cast<const sockaddr*>(&address), sizeof(address)), 0);
    }
    const auto endpoint = DbusServiceEndpoint::open(optionsAt(path));
    ASSERT_TRUE(endpoint) << endpoint.failure().description;
    RawClient client(path);
}

TEST(ServiceEndpointLifeTest, WhoeverLocksTheFolderKeepsNobodyFromStarting) {
    const vela::testing::TemporaryFolder folder;
    const FileDescriptor held(open(folder.path().c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
    ASSERT_EQ(flock(held.get(), LOCK_EX), 0);
    EXPECT_TRUE(DbusServiceEndpoint::open(optionsAt(folder / "socket")));
    struct stat lock {};
    ASSERT_EQ(stat((folder / "socket.lock").c_str(), &lock), 0);
    EXPECT_EQ(lock.st_mode & 0777U, 0600U) << "nobody else may lock that one";
}

TEST(ServiceEndpointLifeTest, AFileThatIsNoSocketStays) {
    const vela::testing::TemporaryFolder folder;
    std::ofstream(folder / "socket") << "kept";
    const auto endpoint = DbusServiceEndpoint::open(optionsAt(folder / "socket"));
    ASSERT_FALSE(endpoint);
    EXPECT_EQ(endpoint.failure().description, (folder / "socket") + " exists and is no socket");
    EXPECT_EQ(std::filesystem::file_size(folder / "socket"), 4U);
}

TEST(ServiceEndpointLifeTest, AnotherServicesSocketIsNotRemoved) {
    const vela::testing::TemporaryFolder folder;
    auto first = DbusServiceEndpoint::open(optionsAt(folder / "socket"));
    ASSERT_TRUE(first);
    std::filesystem::remove(folder / "socket");
    const auto second = DbusServiceEndpoint::open(optionsAt(folder / "socket"));
    ASSERT_TRUE(second);
    auto gone = *std::move(first);
    gone.reset();
    RawClient client(folder / "socket");
}

TEST(ServiceEndpointLifeTest, PathsThatCannotBeAreNamed) {
    const vela::testing::TemporaryFolder folder;
    const auto longer = DbusServiceEndpoint::open(optionsAt(folder / std::string(200, 'x')));
    ASSERT_FALSE(longer);
    EXPECT_EQ(longer.failure().code, ENAMETOOLONG);
    const auto nowhere = DbusServiceEndpoint::open(optionsAt(folder / "none/socket"));
    ASSERT_FALSE(nowhere);
    EXPECT_EQ(nowhere.failure().code, ENOENT);
}

TEST(ServiceEndpointLifeTest, ASocketFromTheServiceManagerIsServedAndLeft) {
    const vela::testing::TemporaryFolder folder;
    auto given = ListeningSocket::create(folder / "socket", 0666);
    ASSERT_TRUE(given);
    Journal journal;
    TestDelegate delegate(journal, std::make_shared<RecordingService>(journal));
    DbusServiceOptions options;
    options.listeningDescriptor = dup(given->descriptor());
    options.endsOnSignals = false;
    auto opened = DbusServiceEndpoint::open(std::move(options));
    ASSERT_TRUE(opened);
    const auto endpoint = *std::move(opened);
    endpoint->setDelegate(delegate);
    std::thread thread([&endpoint] { EXPECT_TRUE(endpoint->resume()); });
    RawClient client(folder / "socket");
    client.authenticate();
    EXPECT_EQ(client.call(simpleCall("stopReportingSessionForID", 1)).error(), "");
    endpoint->stop();
    thread.join();
    EXPECT_TRUE(std::filesystem::exists(folder / "socket"));
}

TEST(ServiceEndpointLifeTest, ADescriptorThatIsNoListeningSocketIsRefused) {
    DbusServiceOptions options;
    options.listeningDescriptor = open("/dev/null", O_RDONLY | O_CLOEXEC);
    const auto endpoint = DbusServiceEndpoint::open(std::move(options));
    ASSERT_FALSE(endpoint);
    EXPECT_THAT(endpoint.failure().description, HasSubstr("is no listening Unix stream socket"));
}

TEST(ServiceEndpointLifeTest, HooksRunOnTheEndpointsThread) {
    Journal journal;
    std::atomic<int> turns{0};
    DbusServiceOptions options;
    options.interval = 1ms;
    options.periodic = [&journal] { journal.add("periodic"); };
    options.onLoopTurn = [&turns] { ++turns; };
    RunningEndpoint endpoint(std::move(options));
    journal.waitFor(3);
    EXPECT_GE(turns, 2);
}

TEST(ServiceEndpointLifeTest, AnIdleEndpointDoesNotWakeUp) {
    std::atomic<int> turns{0};
    DbusServiceOptions options;
    options.authentication = 1ms;
    options.onLoopTurn = [&turns] { ++turns; };
    RunningEndpoint endpoint(std::move(options));
    RawClient client = endpoint.client();
    client.call(simpleCall("stopReportingSessionForID", 1));
    EXPECT_TRUE(becomesQuiet(turns));
}

} // namespace

} // namespace vela::platform::dbus
