#include "benchmarks/ipc/Subject.h"

#include "testing/RunningProgram.h"

#include <cerrno>
#include <csignal>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <sys/prctl.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <sys/wait.h>
#include <unistd.h>

namespace vela::ipcbench {

namespace {

sockaddr_un addressOf(const std::string& path) {
    sockaddr_un address{};
    address.sun_family = AF_UNIX;
    require(path.size() < sizeof(address.sun_path), "the socket's path is too long");
    std::memcpy(address.sun_path, path.data(), path.size());
    return address;
}

} // namespace

void require(bool good, const char* what) {
    if (!good) {
        std::fprintf(stderr, "benchmark: %s: %s\n", what, std::strerror(errno));
        std::_Exit(EXIT_FAILURE);
    }
}

std::string socketPath(const char* name) { return "/tmp/vela-ipc-benchmark-" + std::to_string(getpid()) + "-" + name; }

int connectedSocket(const std::string& path, int socketType) {
    const int descriptor = socket(AF_UNIX, socketType | SOCK_CLOEXEC, 0);
    const sockaddr_un address = addressOf(path);
    // The file is there somewhat before anybody listens.
    require(testing::waitUntil(
                [&] { return connect(descriptor, reinterpret_cast<const sockaddr*>(&address), sizeof(address)) == 0; }),
            "connect");
    return descriptor;
}

ForkedServer::ForkedServer(const std::string& path, int socketType, unsigned clients,
                           const std::function<void(int listener, unsigned clients)>& serve)
    : path_(path) {
    unlink(path.c_str());
    const int listener = socket(AF_UNIX, socketType | SOCK_CLOEXEC, 0);
    const sockaddr_un address = addressOf(path);
    require(bind(listener, reinterpret_cast<const sockaddr*>(&address), sizeof(address)) == 0, "bind");
    require(listen(listener, 128) == 0, "listen");
    process_ = fork();
    require(process_ >= 0, "fork");
    if (process_ == 0) {
        prctl(PR_SET_PDEATHSIG, SIGKILL);
        serve(listener, clients);
        std::_Exit(EXIT_SUCCESS);
    }
    close(listener);
}

ForkedServer::~ForkedServer() {
    channels_.clear();
    kill(process_, SIGKILL);
    waitpid(process_, nullptr, 0);
    unlink(path_.c_str());
}

} // namespace vela::ipcbench
