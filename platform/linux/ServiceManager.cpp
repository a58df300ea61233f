#include "platform/linux/ServiceManager.h"

#include <algorithm>
#include <cerrno>
#include <charconv>
#include <cstddef>
#include <cstdlib>
#include <cstring>
#include <fcntl.h>
#include <limits>
#include <sys/socket.h>
#include <sys/time.h>
#include <sys/un.h>
#include <system_error>
#include <unistd.h>
#include <utility>

namespace vela::platform {

namespace {

constexpr int kFirstDescriptor = 3;

/// The environment variable's text, which is gone afterwards; empty where it was not set. Before there are threads.
std::string takeVariable(const char* name) {
    const char* const text = std::getenv(name); // NOLINT(concurrency-mt-unsafe)
    std::string taken = text == nullptr ? "" : text;
    unsetenv(name); // NOLINT(concurrency-mt-unsafe)
    return taken;
}

template <class Number>
std::optional<Number> numberIn(const std::string& text) {
    Number number = 0;
    const char* const end = text.data() + text.size();
    const auto [read, error] = std::from_chars(text.data(), end, number);
    return error == std::errc() && read == end ? std::optional(number) : std::nullopt;
}

Failure failureOf(std::string_view operation, int code) {
    return {code, std::string(operation) + ": " + std::generic_category().message(code)};
}

int socketOption(int descriptor, int option) {
    int value = -1;
    socklen_t size = sizeof(value);
    return getsockopt(descriptor, SOL_SOCKET, option, &value, &size) == 0 ? value : -1;
}

bool isListeningUnixStream(int descriptor) {
    return socketOption(descriptor, SO_DOMAIN) == AF_UNIX && socketOption(descriptor, SO_TYPE) == SOCK_STREAM &&
           socketOption(descriptor, SO_ACCEPTCONN) == 1;
}

/// A socket's address for a path or an abstract name ("@..."); its length, or 0 where it is none.
socklen_t fillAddress(const std::string& text, sockaddr_un& address) {
    const bool isAbstract = text.front() == '@';
    const std::size_t room = sizeof(address.sun_path) - (isAbstract ? 0 : 1); // a path needs its NUL
    if ((text.front() != '/' && !isAbstract) || text.size() > room || text.size() < 2) {
        return 0;
    }
    address.sun_family = AF_UNIX;
    std::memcpy(address.sun_path, text.data(), text.size());
    if (isAbstract) {
        address.sun_path[0] = '\0';
    }
    return static_cast<socklen_t>(offsetof(sockaddr_un, sun_path) + text.size() + (isAbstract ? 0 : 1));
}

} // namespace

ServiceManager::ServiceManager() : address_(takeVariable("NOTIFY_SOCKET")) {
    const auto isOurs = [](const std::string& pid) { return numberIn<pid_t>(pid) == getpid(); };
    const std::string listenPid = takeVariable("LISTEN_PID");
    const std::optional<int> descriptors = numberIn<int>(takeVariable("LISTEN_FDS"));
    takeVariable("LISTEN_FDNAMES");
    if (isOurs(listenPid) && descriptors && *descriptors > 0) {
        const MutexLock lock(mutex_);
        handedOver_ = *descriptors;
    }
    const std::string watchdogPid = takeVariable("WATCHDOG_PID");
    const auto microseconds = numberIn<std::int64_t>(takeVariable("WATCHDOG_USEC"));
    constexpr std::int64_t kMost = std::numeric_limits<std::int64_t>::max() / 1000;
    if (microseconds && *microseconds > 0 && *microseconds <= kMost && (watchdogPid.empty() || isOurs(watchdogPid))) {
        watchdogLimit_ = std::chrono::microseconds(*microseconds);
    }
}

Result<std::optional<FileDescriptor>> ServiceManager::takeListeningSocket() {
    int count = 0;
    {
        const MutexLock lock(mutex_);
        count = std::exchange(handedOver_, 0);
    }
    if (count == 0) {
        return std::optional<FileDescriptor>();
    }
    if (count > 1) {
        return Failure{0, "the service manager handed over " + std::to_string(count) + " sockets instead of one"};
    }
    if (fcntl(kFirstDescriptor, F_SETFD, FD_CLOEXEC) != 0) {
        return failureOf("descriptor 3 of the service manager", errno);
    }
    if (!isListeningUnixStream(kFirstDescriptor)) {
        return Failure{0, "descriptor 3 of the service manager is no listening stream socket of the Unix family"};
    }
    return std::optional<FileDescriptor>(FileDescriptor(kFirstDescriptor));
}

Result<Done> ServiceManager::tellStatus(std::string_view status) const {
    std::string message = "STATUS=" + std::string(status);
    std::replace(message.begin(), message.end(), '\n', ' ');
    return tell(message);
}

Result<Done> ServiceManager::tell(std::string_view message) const {
    if (!isListening()) {
        return Done();
    }
    const std::string operation = "tell the service manager at " + address_;
    sockaddr_un address{};
    const socklen_t length = fillAddress(address_, address);
    if (length == 0) {
        return failureOf(operation, EAFNOSUPPORT);
    }
    const FileDescriptor socket(::socket(AF_UNIX, SOCK_DGRAM | SOCK_CLOEXEC, 0));
    if (!socket) {
        return failureOf(operation, errno);
    }
    // A manager that does not read must not hold this up for ever.
    constexpr timeval kPatience{2, 0};
    setsockopt(socket.get(), SOL_SOCKET, SO_SNDTIMEO, &kPatience, sizeof(kPatience));
    const auto* const target = reinterpret_cast<const sockaddr*>(&address);
    ssize_t sent = -1;
    do {
        sent = sendto(socket.get(), message.data(), message.size(), MSG_NOSIGNAL, target, length);
    } while (sent < 0 && errno == EINTR);
    return sent < 0 ? Result<Done>(failureOf(operation, errno)) : Result<Done>(Done());
}

} // namespace vela::platform
