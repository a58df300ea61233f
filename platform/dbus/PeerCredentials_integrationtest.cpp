#include "platform/dbus/PeerCredentials.h"
#include "platform/linux/FileDescriptor.h"
#include "testing/TemporaryFolder.h"

#include <cstring>
#include <gtest/gtest.h>
#include <string>
#include <sys/socket.h>
#include <sys/un.h>
#include <sys/wait.h>
#include <unistd.h>

namespace vela::platform::dbus {

namespace {

/// Another process that connects to a socket, and its end of the connection.
class PeerCredentialsTest : public ::testing::Test {
public:
    PeerCredentialsTest() {
        sockaddr_un address{};
        address.sun_family = AF_UNIX;
        const std::string path = folder_ / "socket";
        std::memcpy(address.sun_path, path.data(), path.size());
        const auto* const generic = reinterpret_cast<const sockaddr*>(&address);
        const FileDescriptor listening(socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0));
        EXPECT_EQ(bind(listening.get(), generic, sizeof(address)), 0);
        EXPECT_EQ(listen(listening.get(), 1), 0);
        const FileDescriptor other(socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0));
        child_ = fork();
        if (child_ == 0) {
            if (connect(other.get(), generic, sizeof(address)) != 0) {
                _exit(1);
            }
            for (;;) {
                pause();
            }
        }
        socket_ = FileDescriptor(accept4(listening.get(), nullptr, nullptr, SOCK_CLOEXEC));
    }
    PeerCredentialsTest(const PeerCredentialsTest&) = delete;
    PeerCredentialsTest& operator=(const PeerCredentialsTest&) = delete;
    ~PeerCredentialsTest() override { reap(); }

protected:
    void endChild() {
        kill(child_, SIGKILL);
        siginfo_t information{};
        EXPECT_EQ(waitid(P_PID, static_cast<id_t>(child_), &information, WEXITED | WNOWAIT), 0);
    }
    void reap() {
        if (child_ > 0) {
            kill(child_, SIGKILL);
            EXPECT_EQ(waitpid(child_, nullptr, 0), child_);
            child_ = 0;
        }
    }

    const testing::TemporaryFolder folder_;
    pid_t child_ = 0;
    FileDescriptor socket_;
};

TEST_F(PeerCredentialsTest, ThePeerIsTheProcessThatConnected) {
    const auto peer = peerCredentials(socket_.get());
    ASSERT_TRUE(peer);
    EXPECT_EQ(peer->processIdentifier, child_);
    EXPECT_EQ(peer->user, getuid());
    EXPECT_EQ(peer->group, getgid());
}

TEST_F(PeerCredentialsTest, AProcessIsGoneWhenItsNumberMayBeAnothers) {
    constexpr int kPeerPidfdOption = 77;
    int descriptor = -1;
    socklen_t bytes = sizeof(descriptor);
    if (getsockopt(socket_.get(), SOL_SOCKET, kPeerPidfdOption, &descriptor, &bytes) != 0) {
        GTEST_SKIP() << "this kernel cannot tell";
    }
    ::close(descriptor);
    EXPECT_FALSE(peerIsGone(socket_.get()));
    endChild();
    EXPECT_FALSE(peerIsGone(socket_.get())) << "nobody has its number yet";
    reap();
    EXPECT_TRUE(peerIsGone(socket_.get()));
}

} // namespace

} // namespace vela::platform::dbus
