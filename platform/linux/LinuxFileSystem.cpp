#include "platform/linux/LinuxFileSystem.h"

#include "platform/linux/FileDescriptor.h"

#include <array>
#include <cerrno>
#include <climits>
#include <fcntl.h>
#include <sys/random.h>
#include <sys/stat.h>
#include <system_error>

namespace vela::platform {

namespace {

constexpr std::uint32_t kPermissionBits = 07777;

Failure failureOf(std::string_view operation, const std::string& path, int code) {
    return {code, std::string(operation) + " " + path + ": " + std::generic_category().message(code)};
}

/// The system's calls end a path at its first NUL and would name another file.
bool isPath(const std::string& path) { return !path.empty() && path.find('\0') == std::string::npos; }

struct SplitPath {
    std::string folder;
    std::string name;
};

SplitPath split(const std::string& path) {
    const auto slash = path.rfind('/');
    if (slash == std::string::npos) {
        return {".", path};
    }
    return {slash == 0 ? "/" : path.substr(0, slash), path.substr(slash + 1)};
}

/// A file beside the one to be written, under a name that nobody can guess. Removed at the end unless it got its own
/// name.
class TemporaryFile {
public:
    explicit TemporaryFile(const FileDescriptor& folder) : folder_(folder) {
        constexpr int kTries = 16;
        for (int attempt = 0; attempt < kTries; ++attempt) {
            name_ = randomName(attempt);
            file_ = FileDescriptor(openat(folder.get(), name_.c_str(),
                                          O_WRONLY | O_CREAT | O_EXCL | O_NOFOLLOW | O_CLOEXEC, S_IRUSR | S_IWUSR));
            if (file_ || errno != EEXIST) {
                return;
            }
        }
    }
    ~TemporaryFile() {
        if (file_ && !renamed_) {
            const int error = errno;
            unlinkat(folder_.get(), name_.c_str(), 0);
            errno = error;
        }
    }
    TemporaryFile(const TemporaryFile&) = delete;
    TemporaryFile& operator=(const TemporaryFile&) = delete;

    explicit operator bool() const { return static_cast<bool>(file_); }

    bool fill(std::string_view content, std::uint32_t permissions) const {
        while (!content.empty()) {
            const ssize_t written = ::write(file_.get(), content.data(), content.size());
            if (written < 0 && errno != EINTR) {
                return false;
            }
            content.remove_prefix(written < 0 ? 0 : static_cast<std::size_t>(written));
        }
        return fchmod(file_.get(), permissions & kPermissionBits) == 0 && fsync(file_.get()) == 0;
    }

    bool renameTo(const std::string& name) {
        renamed_ = renameat(folder_.get(), name_.c_str(), folder_.get(), name.c_str()) == 0;
        return renamed_;
    }

private:
    static std::string randomName(int attempt) {
        std::array<unsigned char, 8> bytes{};
        if (getrandom(bytes.data(), bytes.size(), GRND_NONBLOCK) != static_cast<ssize_t>(bytes.size())) {
            // Only right after the system's start. The name is still unused: the file is opened exclusively.
            bytes.fill(static_cast<unsigned char>(attempt));
        }
        std::string name = ".vela-";
        for (const unsigned char byte : bytes) {
            name += "0123456789abcdef"[byte >> 4U];
            name += "0123456789abcdef"[byte & 0xFU];
        }
        return name;
    }

    const FileDescriptor& folder_;
    std::string name_;
    FileDescriptor file_;
    bool renamed_ = false;
};

/// Makes the names in a folder last. Some file systems cannot be asked for it: EINVAL.
bool syncFolder(const FileDescriptor& folder) { return fsync(folder.get()) == 0 || errno == EINVAL; }

Result<Done> createDirectory(const std::string& path, std::uint32_t permissions) {
    if (mkdir(path.c_str(), S_IRWXU) == 0) {
        // The umask may have taken bits away. A link that somebody put in the new folder's place is not followed.
        if (fchmodat(AT_FDCWD, path.c_str(), permissions & kPermissionBits, AT_SYMLINK_NOFOLLOW) != 0) {
            return failureOf("set permissions of", path, errno);
        }
        return Done();
    }
    const int error = errno;
    struct stat status {};
    if (stat(path.c_str(), &status) != 0) {
        return failureOf("create folder", path, error);
    }
    if (!S_ISDIR(status.st_mode)) {
        return failureOf("create folder", path, ENOTDIR);
    }
    return Done();
}

} // namespace

Result<std::string> LinuxFileSystem::readFile(const std::string& path, std::size_t limit) const {
    if (!isPath(path)) {
        return failureOf("open", path, EINVAL);
    }
    const FileDescriptor file(open(path.c_str(), O_RDONLY | O_CLOEXEC | O_NONBLOCK | O_NOCTTY));
    struct stat status {};
    if (!file || fstat(file.get(), &status) != 0) {
        return failureOf("open", path, errno);
    }
    if (!S_ISREG(status.st_mode)) {
        return Failure{S_ISDIR(status.st_mode) ? EISDIR : EINVAL, "read " + path + ": not a regular file"};
    }
    std::string content;
    // Files of procfs have no size beforehand, and any file may grow: what was read decides.
    const bool isTooLarge = status.st_size > 0 && static_cast<std::uint64_t>(status.st_size) > limit;
    if (!isTooLarge && !readToEnd(file, content, limit)) {
        return failureOf("read", path, errno);
    }
    if (isTooLarge || content.size() > limit) {
        return Failure{EFBIG, "read " + path + ": larger than its limit of " + std::to_string(limit) + " bytes"};
    }
    return content;
}

Result<Done> LinuxFileSystem::writeFileAtomically(const std::string& path, std::string_view content,
                                                  std::uint32_t permissions) {
    const auto [folderPath, name] = split(path);
    if (!isPath(path) || name.empty()) {
        return failureOf("write", path, EINVAL);
    }
    const FileDescriptor folder(open(folderPath.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
    if (!folder) {
        return failureOf("open folder", folderPath, errno);
    }
    TemporaryFile temporary(folder);
    if (!temporary || !temporary.fill(content, permissions)) {
        return failureOf("write", path, errno);
    }
    if (!temporary.renameTo(name) || !syncFolder(folder)) {
        return failureOf("rename to", path, errno);
    }
    return Done();
}

Result<Done> LinuxFileSystem::createDirectories(const std::string& path, std::uint32_t permissions) {
    if (!isPath(path)) {
        return failureOf("create folder", path, EINVAL);
    }
    for (std::size_t end = path.find('/', 1);; end = path.find('/', end + 1)) {
        Result<Done> created = createDirectory(path.substr(0, end), permissions);
        if (!created || end == std::string::npos) {
            return created;
        }
    }
}

std::string LinuxFileSystem::currentDirectory() const {
    std::array<char, PATH_MAX> path{};
    return getcwd(path.data(), path.size()) == nullptr ? std::string() : std::string(path.data());
}

} // namespace vela::platform
