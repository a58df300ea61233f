#include "platform/linux/FileOpening.h"

#include "platform/Mutex.h"

#include <array>
#include <cerrno>
#include <climits>
#include <cstdint>
#include <fcntl.h>
#include <linux/capability.h>
#include <optional>
#include <string_view>
#include <sys/fsuid.h>
#include <sys/prctl.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <sys/xattr.h>
#include <system_error>
#include <thread>
#include <unistd.h>
#include <utility>

namespace vela::platform {

namespace {

constexpr unsigned kRead = 4;
constexpr unsigned kSearch = 1;
constexpr int kMostLinks = 40; // as many as the kernel follows

Failure failureOf(const std::string& path, int code) {
    return {code, "open " + path + ": " + std::generic_category().message(code)};
}

bool allows(const struct stat& status, const Identity& reader, unsigned right) {
    // What is nobody's may be anybody's whom this name space does not know.
    const bool owns = status.st_uid == reader.user && reader.user != Identity::kNobody;
    const bool shares = reader.isInGroup(status.st_gid) && status.st_gid != Identity::kNobody;
    const unsigned bits = owns ? 6 : (shares ? 3 : 0);
    return ((status.st_mode >> bits) & right) != 0;
}

bool mayHaveAccessList(const FileDescriptor& descriptor) {
    const std::string link = "/proc/self/fd/" + std::to_string(descriptor.get());
    return getxattr(link.c_str(), "system.posix_acl_access", nullptr, 0) >= 0 ||
           (errno != ENODATA && errno != EOPNOTSUPP);
}

/// The way to one file.
class PathWalk {
public:
    /// `judged`: whose rights are to be checked here; null where the kernel does it.
    PathWalk(const std::string& path, const Identity* judged)
        : path_(path),
          judged_(judged != nullptr && judged->user != 0 ? judged : nullptr),
          rest_(path) {}

    Result<FileDescriptor> open() {
        if (path_.empty() || path_.find('\0') != std::string::npos) {
            return failureOf(path_, EINVAL);
        }
        beginAt(path_.starts_with('/') ? "/" : ".");
        while (!failure_ && !file_) {
            step();
        }
        return failure_ ? Result<FileDescriptor>(*failure_) : std::move(file_);
    }

private:
    void fail(int code) { failure_ = failureOf(path_, code); }
    void failAsNoFile(mode_t mode) {
        failure_ = Failure{S_ISDIR(mode) ? EISDIR : EINVAL, "read " + path_ + ": not a regular file"};
    }

    void beginAt(const char* folder) {
        folder_ = FileDescriptor(::open(folder, O_PATH | O_DIRECTORY | O_CLOEXEC));
        if (!folder_) {
            fail(errno);
        }
    }

    /// False with the failure set when `descriptor` is not open or the reader has not that right.
    bool check(const FileDescriptor& descriptor, unsigned right, struct stat& status) {
        if (!descriptor || fstat(descriptor.get(), &status) != 0) {
            fail(errno);
            return false;
        }
        if (judged_ == nullptr || right == 0) {
            return true;
        }
        if (!allows(status, *judged_, right)) {
            fail(EACCES);
            return false;
        }
        if (mayHaveAccessList(descriptor)) {
            failure_ =
                Failure{EACCES, "open " + path_ + ": an access list is in force, which needs a privileged service"};
            return false;
        }
        return true;
    }

    /// One name further.
    void step() {
        if (rest_.size() >= PATH_MAX) {
            return fail(ENAMETOOLONG);
        }
        struct stat status {};
        if (!check(folder_, 0, status)) {
            return;
        }
        rest_.erase(0, rest_.find_first_not_of('/'));
        if (!S_ISDIR(status.st_mode)) {
            return fail(ENOTDIR);
        }
        if (rest_.empty()) {
            return failAsNoFile(status.st_mode);
        }
        if (!check(folder_, kSearch, status)) {
            return;
        }
        const std::string name = rest_.substr(0, rest_.find('/'));
        rest_.erase(0, name.size());
        FileDescriptor found(openat(folder_.get(), name.c_str(), O_PATH | O_NOFOLLOW | O_CLOEXEC));
        if (!check(found, 0, status)) {
            return;
        }
        if (S_ISLNK(status.st_mode)) {
            follow(found);
        } else if (rest_.empty()) {
            openFile(name, status.st_mode);
        } else {
            folder_ = std::move(found);
        }
    }

    void follow(const FileDescriptor& link) {
        std::array<char, PATH_MAX> target{};
        const ssize_t size = readlinkat(link.get(), "", target.data(), target.size());
        if (size <= 0 || ++links_ > kMostLinks) {
            return fail(size < 0 ? errno : (size == 0 ? ENOENT : ELOOP));
        }
        rest_.insert(0, target.data(), static_cast<std::size_t>(size));
        if (rest_.starts_with('/')) {
            beginAt("/");
        }
    }

    /// Looked at before it is opened, as opening a device may do something, and after, as it may be another one then.
    void openFile(const std::string& name, mode_t mode) {
        if (!S_ISREG(mode)) {
            return failAsNoFile(mode);
        }
        FileDescriptor opened(
            openat(folder_.get(), name.c_str(), O_RDONLY | O_NOFOLLOW | O_NONBLOCK | O_NOCTTY | O_CLOEXEC));
        struct stat status {};
        if (!check(opened, kRead, status)) {
            return;
        }
        if (!S_ISREG(status.st_mode)) {
            return failAsNoFile(status.st_mode);
        }
        file_ = std::move(opened);
    }

    const std::string& path_;
    const Identity* const judged_;
    std::string rest_; ///< of the way, from `folder_` on
    FileDescriptor folder_;
    FileDescriptor file_;
    int links_ = 0;
    std::optional<Failure> failure_;
};

using Capabilities = std::array<__user_cap_data_struct, _LINUX_CAPABILITY_U32S_3>;

__user_cap_header_struct callingThread() { return {_LINUX_CAPABILITY_VERSION_3, 0}; }

/// Whether the calling thread may take other users' and groups' rights.
bool mayChangeUser() {
    __user_cap_header_struct header = callingThread();
    Capabilities capabilities{};
    constexpr std::uint32_t kNeeded = (1U << CAP_SETUID) | (1U << CAP_SETGID);
    return syscall(SYS_capget, &header, capabilities.data()) == 0 && (capabilities[0].effective & kNeeded) == kNeeded;
}

/// Gives the calling thread, and no other, the rights of `reader` for file systems. 0 or an error number. The C
/// library's setgroups would change all threads.
int become(const Identity& reader) {
#ifdef SYS_setgroups32
    constexpr long kSetGroups = SYS_setgroups32;
#else
    constexpr long kSetGroups = SYS_setgroups;
#endif
    constexpr std::uint32_t kNone = 0xFFFFFFFF; // changes nothing; the answer is the present one
    if (syscall(kSetGroups, reader.groups.size(), reader.groups.data()) != 0) {
        return errno;
    }
    setfsgid(reader.group);
    setfsuid(reader.user);
    if (static_cast<std::uint32_t>(setfsgid(kNone)) != reader.group ||
        static_cast<std::uint32_t>(setfsuid(kNone)) != reader.user) {
        return EPERM;
    }
    if (reader.user == 0) {
        return 0;
    }
    // Those that override files' permissions go with root's user, but a service of another user may have them as well.
    __user_cap_header_struct header = callingThread();
    Capabilities none{};
    return syscall(SYS_capset, &header, none.data()) == 0 ? 0 : errno;
}

/// While one of these lives, threads of this process take other users. That makes the kernel regard the whole process
/// as one that nobody may look into: no core dumps, no debugger. It does not give this back when the threads end, so it
/// is done here, when the last one has.
class DumpableScope {
public:
    DumpableScope() {
        const MutexLock lock(state_.mutex);
        if (state_.users++ == 0) {
            state_.wasDumpable = prctl(PR_GET_DUMPABLE) == kDumpable;
        }
    }
    ~DumpableScope() {
        const MutexLock lock(state_.mutex);
        if (--state_.users == 0 && state_.wasDumpable) {
            prctl(PR_SET_DUMPABLE, kDumpable);
        }
    }
    DumpableScope(const DumpableScope&) = delete;
    DumpableScope& operator=(const DumpableScope&) = delete;

private:
    static constexpr int kDumpable = 1;

    struct State {
        Mutex mutex;
        int users VELA_GUARDED_BY(mutex) = 0;
        bool wasDumpable VELA_GUARDED_BY(mutex) = false;
    };
    // The attribute is the process's, so there is one state of it, never destroyed.
    static State& state() {
        static auto* const state = new State();
        return *state;
    }

    State& state_ = state();
};

/// On a thread that ends with the rights it took.
Result<FileDescriptor> openAs(const Identity& reader, const std::string& path) {
    std::optional<Result<FileDescriptor>> opened;
    const DumpableScope scope;
    try {
        std::thread([&] {
            const int error = become(reader);
            opened.emplace(error == 0 ? PathWalk(path, nullptr).open() : failureOf(path, error));
        }).join();
    } catch (const std::system_error& error) {
        return failureOf(path, error.code().value());
    }
    return *std::move(opened);
}

} // namespace

Result<FileDescriptor> openFor(const Identity& reader, const std::string& path) {
    return mayChangeUser() ? openAs(reader, path) : PathWalk(path, &reader).open();
}

} // namespace vela::platform
