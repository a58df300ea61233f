#include "platform/linux/ServiceManager.h"
#include "testing/TemporaryFolder.h"

#include <array>
#include <cerrno>
#include <chrono>
#include <cstdlib>
#include <cstring>
#include <fcntl.h>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <string>
#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>

namespace vela::platform {

namespace {

constexpr std::array kVariables = {"NOTIFY_SOCKET",  "LISTEN_PID",   "LISTEN_FDS",
                                   "LISTEN_FDNAMES", "WATCHDOG_PID", "WATCHDOG_USEC"};

sockaddr_un addressOf(const std::string& path) {
    sockaddr_un address{};
    address.sun_family = AF_UNIX;
    std::memcpy(address.sun_path, path.data(), path.size());
    return address;
}

/// A bound datagram socket: the manager's side.
class Manager {
public:
    /// `path` begins with NUL for an abstract name.
    explicit Manager(const std::string& path) : socket_(::socket(AF_UNIX, SOCK_DGRAM | SOCK_CLOEXEC, 0)) {
        const sockaddr_un address = addressOf(path);
        const auto length = static_cast<socklen_t>(offsetof(sockaddr_un, sun_path) + path.size());
        EXPECT_EQ(bind(socket_.get(), reinterpret_cast<const sockaddr*>(&address), length), 0) << strerror(errno);
    }
    std::string received() {
        std::array<char, 1000> bytes{};
        const ssize_t size = recv(socket_.get(), bytes.data(), bytes.size(), MSG_DONTWAIT);
        return size < 0 ? "nothing" : std::string(bytes.data(), static_cast<std::size_t>(size));
    }

private:
    FileDescriptor socket_;
};

class ServiceManagerTest : public ::testing::Test {
protected:
    ServiceManagerTest() { clear(); }
    ~ServiceManagerTest() override { clear(); }

    static void clear() {
        for (const char* const name : kVariables) {
            unsetenv(name);
        }
    }
    static void set(const char* name, const std::string& value) { setenv(name, value.c_str(), 1); }
    static std::string ownPid() { return std::to_string(getpid()); }

    // For the child processes that stand in for a program that was just started; they answer by their exit status.
    /// Puts `descriptor` where a service manager puts it, and says so.
    static void handOver(int descriptor, const std::string& count = "1") {
        dup2(descriptor, 3);
        set("LISTEN_PID", ownPid());
        set("LISTEN_FDS", count);
    }
    int listeningSocket() const {
        const int socket = ::socket(AF_UNIX, SOCK_STREAM, 0);
        const sockaddr_un address = addressOf(folder_ / "socket");
        bind(socket, reinterpret_cast<const sockaddr*>(&address), sizeof(address));
        listen(socket, 1);
        return socket;
    }
    /// Ends the process with 0 when taking the socket fails with `words`.
    [[noreturn]] static void expectFailure(const std::string& words) {
        ServiceManager manager;
        const auto taken = manager.takeListeningSocket();
        const bool expected = !taken && taken.failure().description == words;
        if (!expected) {
            std::fprintf(stderr, "%s\n", taken ? "taken" : taken.failure().description.c_str());
        }
        std::_Exit(expected ? 0 : 1);
    }

    const testing::TemporaryFolder folder_;
};

TEST_F(ServiceManagerTest, WithoutAManagerThereIsNothingAndNobodyIsTold) {
    ServiceManager manager;
    const auto taken = manager.takeListeningSocket();
    ASSERT_TRUE(taken);
    EXPECT_FALSE(taken->has_value());
    EXPECT_FALSE(manager.isListening());
    EXPECT_EQ(manager.watchdogLimit(), std::nullopt);
    EXPECT_TRUE(manager.tellReady());
    EXPECT_TRUE(manager.tellStatus("idle"));
}

TEST_F(ServiceManagerTest, ItsVariablesAreTakenAway) {
    for (const char* const name : kVariables) {
        set(name, "1");
    }
    const ServiceManager manager;
    for (const char* const name : kVariables) {
        EXPECT_EQ(std::getenv(name), nullptr) << name;
    }
}

TEST_F(ServiceManagerTest, AListeningSocketIsTakenOnceAndClosedForProgramsStartedHere) {
    EXPECT_EXIT(
        {
            handOver(listeningSocket());
            ServiceManager manager;
            auto taken = manager.takeListeningSocket();
            const bool good = taken && *taken && (*taken)->get() == 3 && (fcntl(3, F_GETFD) & FD_CLOEXEC) != 0;
            const auto again = manager.takeListeningSocket();
            std::_Exit(good && again && !again->has_value() ? 0 : 1);
        },
        ::testing::ExitedWithCode(0), "");
}

TEST_F(ServiceManagerTest, AnotherProcessesDescriptorsAreLeftAlone) {
    EXPECT_EXIT(
        {
            handOver(listeningSocket());
            set("LISTEN_PID", std::to_string(getppid()));
            ServiceManager manager;
            const auto taken = manager.takeListeningSocket();
            std::_Exit(taken && !taken->has_value() && fcntl(3, F_GETFD) == 0 ? 0 : 1);
        },
        ::testing::ExitedWithCode(0), "");
}

TEST_F(ServiceManagerTest, ASocketThatDoesNotListenIsRefused) {
    EXPECT_EXIT(
        {
            handOver(::socket(AF_UNIX, SOCK_STREAM, 0));
            expectFailure("descriptor 3 of the service manager is no listening stream socket of the Unix family");
        },
        ::testing::ExitedWithCode(0), "");
}

TEST_F(ServiceManagerTest, ASocketOfAnotherFamilyIsRefused) {
    EXPECT_EXIT(
        {
            const int socket = ::socket(AF_INET, SOCK_STREAM, 0);
            listen(socket, 1);
            handOver(socket);
            expectFailure("descriptor 3 of the service manager is no listening stream socket of the Unix family");
        },
        ::testing::ExitedWithCode(0), "");
}

TEST_F(ServiceManagerTest, ADatagramSocketIsRefused) {
    EXPECT_EXIT(
        {
            handOver(::socket(AF_UNIX, SOCK_DGRAM, 0));
            expectFailure("descriptor 3 of the service manager is no listening stream socket of the Unix family");
        },
        ::testing::ExitedWithCode(0), "");
}

TEST_F(ServiceManagerTest, AFileIsNoSocket) {
    EXPECT_EXIT(
        {
            handOver(open("/dev/null", O_RDONLY));
            expectFailure("descriptor 3 of the service manager is no listening stream socket of the Unix family");
        },
        ::testing::ExitedWithCode(0), "");
}

TEST_F(ServiceManagerTest, AClosedDescriptorIsRefused) {
    EXPECT_EXIT(
        {
            handOver(::socket(AF_UNIX, SOCK_DGRAM, 0));
            close(3);
            expectFailure("descriptor 3 of the service manager: Bad file descriptor");
        },
        ::testing::ExitedWithCode(0), "");
}

TEST_F(ServiceManagerTest, MoreThanOneSocketIsRefused) {
    EXPECT_EXIT(
        {
            handOver(listeningSocket(), "2");
            expectFailure("the service manager handed over 2 sockets instead of one");
        },
        ::testing::ExitedWithCode(0), "");
}

TEST_F(ServiceManagerTest, NumbersThatAreNoneHandOverNothing) {
    for (const char* const count : {"", "x", "0", "-1", "1x", "99999999999"}) {
        set("LISTEN_PID", ownPid());
        set("LISTEN_FDS", count);
        const auto taken = ServiceManager().takeListeningSocket();
        ASSERT_TRUE(taken) << count;
        EXPECT_FALSE(taken->has_value()) << count;
    }
}

TEST_F(ServiceManagerTest, EachMessageIsADatagram) {
    Manager there(folder_ / "notify");
    set("NOTIFY_SOCKET", folder_ / "notify");
    const ServiceManager manager;
    EXPECT_TRUE(manager.isListening());
    EXPECT_TRUE(manager.tellReady());
    EXPECT_TRUE(manager.tellStatus("3 sessions"));
    EXPECT_TRUE(manager.tellAlive());
    EXPECT_TRUE(manager.tellStopping());
    EXPECT_EQ(there.received(), "READY=1");
    EXPECT_EQ(there.received(), "STATUS=3 sessions");
    EXPECT_EQ(there.received(), "WATCHDOG=1");
    EXPECT_EQ(there.received(), "STOPPING=1");
    EXPECT_EQ(there.received(), "nothing");
}

TEST_F(ServiceManagerTest, AStatusStaysOneLine) {
    Manager there(folder_ / "notify");
    set("NOTIFY_SOCKET", folder_ / "notify");
    EXPECT_TRUE(ServiceManager().tellStatus("a\nREADY=1\n"));
    EXPECT_EQ(there.received(), "STATUS=a READY=1 ");
}

TEST_F(ServiceManagerTest, AnAbstractSocketIsReached) {
    const std::string name = "vela-test-" + ownPid();
    Manager there(std::string(1, '\0') + name);
    set("NOTIFY_SOCKET", "@" + name);
    EXPECT_TRUE(ServiceManager().tellReady());
    EXPECT_EQ(there.received(), "READY=1");
}

TEST_F(ServiceManagerTest, AManagerThatIsGoneIsAFailure) {
    set("NOTIFY_SOCKET", folder_ / "gone");
    const auto told = ServiceManager().tellReady();
    ASSERT_FALSE(told);
    EXPECT_EQ(told.failure().description,
              "tell the service manager at " + (folder_ / "gone") + ": No such file or directory");
}

TEST_F(ServiceManagerTest, AddressesThatAreNoneAreFailures) {
    for (const std::string& address :
         {std::string("relative"), std::string("@"), std::string("/"), "/" + std::string(107, 'x'),
          "@" + std::string(108, 'x'), std::string("vsock:2:1")}) {
        set("NOTIFY_SOCKET", address);
        EXPECT_EQ(ServiceManager().tellReady().failure().code, EAFNOSUPPORT) << address;
    }
}

TEST_F(ServiceManagerTest, TheWatchdogsLimitIsInMicroseconds) {
    set("WATCHDOG_USEC", "30000000");
    set("WATCHDOG_PID", ownPid());
    EXPECT_EQ(ServiceManager().watchdogLimit(), std::optional<Nanoseconds>(std::chrono::seconds(30)));
    set("WATCHDOG_USEC", "1");
    EXPECT_EQ(ServiceManager().watchdogLimit(), std::optional<Nanoseconds>(std::chrono::microseconds(1)));
}

TEST_F(ServiceManagerTest, AWatchdogOfAnotherProcessOrWithoutANumberIsNone) {
    set("WATCHDOG_USEC", "30000000");
    set("WATCHDOG_PID", "1");
    EXPECT_EQ(ServiceManager().watchdogLimit(), std::nullopt);
    for (const char* const limit : {"0", "-5", "x", "", "9223372036854775807"}) {
        set("WATCHDOG_USEC", limit);
        EXPECT_EQ(ServiceManager().watchdogLimit(), std::nullopt) << limit;
    }
}

} // namespace

} // namespace vela::platform
