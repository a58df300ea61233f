#include "platform/dbus/ListeningSocket.h"

#include <cerrno>
#include <cstring>
#include <fcntl.h>
#include <sys/file.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>
#include <utility>

namespace vela::platform::dbus {

namespace {

constexpr int kBacklog = 1024; // the system may allow fewer

int optionOf(int descriptor, int option) {
    int value = -1;
    socklen_t bytes = sizeof(value);
    return getsockopt(descriptor, SOL_SOCKET, option, &value, &bytes) == 0 ? value : -1;
}

FileDescriptor newSocket() { return FileDescriptor(socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0)); }

const sockaddr* generic(const sockaddr_un& address) { return reinterpret_cast<const sockaddr*>(&address); }

Result<Done> removeStale(const std::string& path, const sockaddr_un& address) {
    struct stat status {};
    if (lstat(path.c_str(), &status) != 0) {
        return errno == ENOENT ? Result<Done>(Done()) : Failure{errno, "cannot look at " + path};
    }
    if (!S_ISSOCK(status.st_mode)) {
        return Failure{EEXIST, path + " exists and is no socket"};
    }
    const FileDescriptor probe = newSocket();
    if (!probe) {
        return Failure{errno, "cannot create a socket"};
    }
    if (connect(probe.get(), generic(address), sizeof(address)) == 0 || errno == EAGAIN) {
        return Failure{EADDRINUSE, "another service answers at " + path};
    }
    if (errno != ECONNREFUSED && errno != ENOENT) {
        return Failure{errno, "cannot tell whether a service answers at " + path};
    }
    if (unlink(path.c_str()) != 0 && errno != ENOENT) {
        return Failure{errno, "cannot remove the socket of a service that is gone, " + path};
    }
    return Done();
}

/// Keeps other services that start at the same path out until the descriptor is closed. A file that nobody else may
/// open: whoever can open one can lock it, for as long as he likes.
Result<FileDescriptor> lockBeside(const std::string& path) {
    const std::string name = path + ".lock";
    FileDescriptor descriptor(open(name.c_str(), O_RDWR | O_CREAT | O_CLOEXEC | O_NOFOLLOW, S_IRUSR | S_IWUSR));
    int locked = -1;
    do {
        locked = descriptor ? flock(descriptor.get(), LOCK_EX) : -1;
    } while (descriptor && locked != 0 && errno == EINTR);
    if (locked != 0) {
        return Failure{errno, "cannot lock " + name};
    }
    return descriptor;
}

} // namespace

Result<ListeningSocket> ListeningSocket::adopt(int descriptor) {
    FileDescriptor socket(descriptor);
    if (optionOf(descriptor, SO_DOMAIN) != AF_UNIX || optionOf(descriptor, SO_TYPE) != SOCK_STREAM ||
        optionOf(descriptor, SO_ACCEPTCONN) != 1) {
        return Failure{EINVAL, "descriptor " + std::to_string(descriptor) + " is no listening Unix stream socket"};
    }
    const int flags = fcntl(descriptor, F_GETFL);
    if (flags < 0 || fcntl(descriptor, F_SETFL, flags | O_NONBLOCK) != 0 ||
        fcntl(descriptor, F_SETFD, FD_CLOEXEC) != 0) {
        return Failure{errno, "cannot set up descriptor " + std::to_string(descriptor)};
    }
    return ListeningSocket(std::move(socket));
}

Result<ListeningSocket> ListeningSocket::create(const std::string& path, unsigned mode) {
    sockaddr_un address{};
    address.sun_family = AF_UNIX;
    if (path.empty() || path.size() >= sizeof(address.sun_path)) {
        return Failure{ENAMETOOLONG, "the socket's path has " + std::to_string(path.size()) + " bytes, of at most " +
                                         std::to_string(sizeof(address.sun_path) - 1) + ": " + path};
    }
    std::memcpy(address.sun_path, path.data(), path.size());
    // From the look at what stands there until the new socket does, nobody else may do the same.
    auto lock = lockBeside(path);
    if (!lock) {
        return lock.failure();
    }
    if (auto removed = removeStale(path, address); !removed) {
        return removed.failure();
    }
    ListeningSocket listening(newSocket());
    // The file is never open to more users than it is meant to be: it begins with its owner's permissions alone.
    if (!listening.socket_ || fchmod(listening.descriptor(), S_IRUSR | S_IWUSR) != 0 ||
        bind(listening.descriptor(), generic(address), sizeof(address)) != 0) {
        return Failure{errno, "cannot create the socket " + path};
    }
    listening.path_ = path;
    struct stat status {};
    if (lstat(path.c_str(), &status) != 0) {
        return Failure{errno, "cannot look at the socket " + path};
    }
    listening.device_ = status.st_dev;
    listening.inode_ = status.st_ino;
    if (listen(listening.descriptor(), kBacklog) != 0 || chmod(path.c_str(), mode) != 0) {
        return Failure{errno, "cannot open the socket " + path + " to clients"};
    }
    return listening;
}

void ListeningSocket::close() {
    if (!socket_) {
        return;
    }
    struct stat status {};
    if (!path_.empty() && lstat(path_.c_str(), &status) == 0 && status.st_dev == device_ && status.st_ino == inode_) {
        unlink(path_.c_str());
    }
    socket_ = FileDescriptor();
}

} // namespace vela::platform::dbus
