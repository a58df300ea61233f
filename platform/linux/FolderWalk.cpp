#include "platform/linux/FolderWalk.h"

#include <array>
#include <cerrno>
#include <climits>
#include <cstddef>
#include <fcntl.h>
#include <optional>
#include <sys/stat.h>
#include <system_error>
#include <unistd.h>
#include <utility>

namespace vela::platform {

namespace {

constexpr std::uint32_t kPermissionBits = 07777;
constexpr int kMostLinks = 40; // as many as the kernel follows

/// Takes the first name off `rest`; empty when there is none.
std::string takeName(std::string& rest) {
    rest.erase(0, rest.find_first_not_of('/'));
    std::string name = rest.substr(0, rest.find('/'));
    rest.erase(0, name.size());
    return name;
}

class FolderWalk {
public:
    /// Without permissions nothing is made.
    FolderWalk(const std::string& path, std::optional<std::uint32_t> permissions)
        : path_(path),
          permissions_(permissions) {}

    Result<FileDescriptor> walk() {
        if (path_.empty() || path_.find('\0') != std::string::npos) {
            fail(EINVAL);
        } else {
            beginAt(path_.starts_with('/') ? "/" : ".");
        }
        std::string rest = path_;
        while (!failure_) {
            const std::string name = takeName(rest);
            if (name.empty()) {
                break;
            }
            reached_ = path_.size() - rest.size();
            enter(name);
        }
        return failure_ ? Result<FileDescriptor>(*failure_) : std::move(folder_);
    }

private:
    void fail(int code) { failWith(code, std::generic_category().message(code)); }
    void failWith(int code, const std::string& text) {
        // A folder that cannot be made is named; of one that cannot be opened the whole path tells more.
        const std::string what = permissions_ ? "create folder " + path_.substr(0, reached_) : "open folder " + path_;
        failure_ = Failure{code, what + ": " + text};
    }

    void beginAt(const char* folder) {
        folder_ = FileDescriptor(open(folder, O_PATH | O_DIRECTORY | O_CLOEXEC));
        if (!folder_) {
            fail(errno);
        }
    }

    /// O_DIRECTORY also has folders mounted that are mounted at their first use. ENOTDIR for a link.
    FileDescriptor find(const std::string& name) const {
        return FileDescriptor(openat(folder_.get(), name.c_str(), O_PATH | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC));
    }

    /// Into the folder `name`, or where the link of that name leads.
    void enter(const std::string& name) {
        std::string rest = name;
        bool isLinked = false;
        for (std::string part = takeName(rest); !part.empty() && !failure_; part = takeName(rest)) {
            FileDescriptor found = find(part);
            if (!found && errno == ENOENT && permissions_ && !isLinked) {
                found = make(part);
            }
            if (found) {
                folder_ = std::move(found);
            } else if (errno == ENOTDIR && !failure_) {
                isLinked = true;
                follow(part, rest);
            } else if (!failure_) {
                fail(errno == ENOENT && permissions_ && isLinked ? EEXIST : errno);
            }
        }
    }

    /// None with errno or the failure set.
    FileDescriptor make(const std::string& name) {
        if (mkdirat(folder_.get(), name.c_str(), S_IRWXU) != 0) {
            return errno == EEXIST ? find(name) : FileDescriptor();
        }
        FileDescriptor made = find(name);
        struct stat status {};
        if (!made || fstat(made.get(), &status) != 0) {
            return {};
        }
        // The umask may have taken bits away. Another one's folder may have been put in the new one's place.
        const std::string link = "/proc/self/fd/" + std::to_string(made.get());
        const bool isOwn = status.st_uid == geteuid();
        if (!isOwn || chmod(link.c_str(), *permissions_ & kPermissionBits) != 0) {
            const int error = isOwn ? errno : EPERM;
            failure_ = Failure{error, "set permissions of " + path_.substr(0, reached_) + ": " +
                                          std::generic_category().message(error)};
            return {};
        }
        return made;
    }

    /// Puts what the link `name` says before `rest`.
    void follow(const std::string& name, std::string& rest) {
        const FileDescriptor link(openat(folder_.get(), name.c_str(), O_PATH | O_NOFOLLOW | O_CLOEXEC));
        struct stat status {};
        if (!link || fstat(link.get(), &status) != 0) {
            return fail(errno);
        }
        if (!S_ISLNK(status.st_mode)) {
            return fail(ENOTDIR);
        }
        if (status.st_uid != 0 && status.st_uid != geteuid()) {
            return failWith(EACCES, "a link of user " + std::to_string(status.st_uid) + " is not followed");
        }
        std::array<char, PATH_MAX> target{};
        const ssize_t size = readlinkat(link.get(), "", target.data(), target.size());
        if (size <= 0 || ++links_ > kMostLinks) {
            return fail(size < 0 ? errno : (size == 0 ? ENOENT : ELOOP));
        }
        rest.insert(0, target.data(), static_cast<std::size_t>(size));
        if (rest.size() >= PATH_MAX) {
            return fail(ENAMETOOLONG);
        }
        if (rest.starts_with('/')) {
            beginAt("/");
        }
    }

    const std::string& path_;
    const std::optional<std::uint32_t> permissions_;
    FileDescriptor folder_;
    std::size_t reached_ = 0; ///< bytes of the path, up to the name that is entered
    int links_ = 0;
    std::optional<Failure> failure_;
};

} // namespace

Result<FileDescriptor> openFolder(const std::string& path) { return FolderWalk(path, std::nullopt).walk(); }

Result<FileDescriptor> makeFolders(const std::string& path, std::uint32_t permissions) {
    return FolderWalk(path, permissions).walk();
}

FileDescriptor openForListing(const FileDescriptor& folder) {
    return FileDescriptor(openat(folder.get(), ".", O_RDONLY | O_DIRECTORY | O_CLOEXEC));
}

} // namespace vela::platform
