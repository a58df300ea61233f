#include "platform/linux/LinuxFileSystem.h"

#include "platform/linux/FileDescriptor.h"
#include "platform/linux/FileOpening.h"
#include "platform/linux/FolderWalk.h"

#include <array>
#include <cerrno>
#include <climits>
#include <fcntl.h>
#include <optional>
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

/// Makes the names in a folder last. Some file systems cannot be asked for it: EINVAL.
bool syncFolder(const FileDescriptor& folder) { return fsync(folder.get()) == 0 || errno == EINVAL; }

std::string randomName(int attempt) {
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

/// A file beside the one to be written, under a name that nobody can guess. Removed at the end unless it got its own
/// name.
class LinuxPendingFile final : public PendingFile {
public:
    LinuxPendingFile(const std::string& path, std::uint32_t permissions) : path_(path), permissions_(permissions) {
        const auto [folderPath, name] = split(path);
        if (!isPath(path) || name.empty()) {
            failure_ = failureOf("write", path, EINVAL);
            return;
        }
        name_ = name;
        const Result<FileDescriptor> found = openFolder(folderPath);
        if (!found) {
            failure_ = found.failure();
            return;
        }
        folder_ = openForListing(*found);
        if (!folder_) {
            failure_ = failureOf("open folder", folderPath, errno);
            return;
        }
        openTemporary();
    }
    ~LinuxPendingFile() override {
        if (file_ && !renamed_) {
            unlinkat(folder_.get(), temporaryName_.c_str(), 0);
        }
    }
    LinuxPendingFile(const LinuxPendingFile&) = delete;
    LinuxPendingFile& operator=(const LinuxPendingFile&) = delete;

    void append(std::string_view piece) override {
        while (!failure_ && !piece.empty()) {
            const ssize_t written = ::write(file_.get(), piece.data(), piece.size());
            if (written < 0 && errno != EINTR) {
                failure_ = failureOf("write", path_, errno);
                return;
            }
            const std::size_t count = written < 0 ? 0 : static_cast<std::size_t>(written);
            piece.remove_prefix(count);
            size_ += static_cast<off64_t>(count);
        }
        writeBehind();
    }

    const Failure* failure() const override { return failure_ ? &*failure_ : nullptr; }

    Result<Done> commit() override {
        if (failure_) {
            return *failure_;
        }
        if (fchmod(file_.get(), permissions_ & kPermissionBits) != 0 || fsync(file_.get()) != 0) {
            return failureOf("write", path_, errno);
        }
        renamed_ = renameat(folder_.get(), temporaryName_.c_str(), folder_.get(), name_.c_str()) == 0;
        if (!renamed_ || !syncFolder(folder_)) {
            return failureOf("rename to", path_, errno);
        }
        return Done();
    }

private:
    // A long file goes to the disk while it grows and leaves the page cache: its pages are used again instead of ever
    // new ones, which cost several times as much, and other programs keep theirs.
    void writeBehind() {
        constexpr off64_t kStretch = off64_t{4} << 20U;
        for (; !failure_ && size_ - behind_ >= 2 * kStretch; behind_ += kStretch) {
            constexpr unsigned kAll = SYNC_FILE_RANGE_WAIT_BEFORE | SYNC_FILE_RANGE_WRITE | SYNC_FILE_RANGE_WAIT_AFTER;
            syncRange(behind_, kStretch, kAll);
            posix_fadvise(file_.get(), behind_, kStretch, POSIX_FADV_DONTNEED);
            syncRange(behind_ + kStretch, kStretch, SYNC_FILE_RANGE_WRITE);
        }
    }

    // A failure of the disk that is told here is not told again at the end. Not every file system has the operation.
    void syncRange(off64_t offset, off64_t count, unsigned flags) {
        const bool done = sync_file_range(file_.get(), offset, count, flags) == 0;
        if (!done && (errno == EIO || errno == ENOSPC || errno == EDQUOT)) {
            failure_ = failureOf("write", path_, errno);
        }
    }

    void openTemporary() {
        constexpr int kTries = 16;
        for (int attempt = 0; attempt < kTries; ++attempt) {
            temporaryName_ = randomName(attempt);
            file_ = FileDescriptor(openat(folder_.get(), temporaryName_.c_str(),
                                          O_WRONLY | O_CREAT | O_EXCL | O_NOFOLLOW | O_CLOEXEC, S_IRUSR | S_IWUSR));
            if (file_ || errno != EEXIST) {
                break;
            }
        }
        if (!file_) {
            failure_ = failureOf("write", path_, errno);
        }
    }

    const std::string path_;
    const std::uint32_t permissions_;
    std::string name_;
    std::string temporaryName_;
    FileDescriptor folder_;
    FileDescriptor file_;
    std::optional<Failure> failure_; ///< the first
    off64_t size_ = 0;
    off64_t behind_ = 0; ///< up to here the file is on the disk, from here two stretches may be on their way
    bool renamed_ = false;
};

/// All of `file`, which stands at `path`; none is open where that failed with an error number.
Result<std::string> contentOf(const FileDescriptor& file, const std::string& path, std::size_t limit) {
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

} // namespace

Result<std::string> LinuxFileSystem::readFile(const std::string& path, std::size_t limit) const {
    if (!isPath(path)) {
        return failureOf("open", path, EINVAL);
    }
    return contentOf(FileDescriptor(open(path.c_str(), O_RDONLY | O_CLOEXEC | O_NONBLOCK | O_NOCTTY)), path, limit);
}

Result<std::string> LinuxFileSystem::readFileFor(const Identity& reader, const std::string& path,
                                                 std::size_t limit) const {
    const Result<FileDescriptor> file = openFor(reader, path);
    return file ? contentOf(*file, path, limit) : file.failure();
}

std::unique_ptr<PendingFile> LinuxFileSystem::createFile(const std::string& path, std::uint32_t permissions) {
    return std::make_unique<LinuxPendingFile>(path, permissions);
}

Result<Done> LinuxFileSystem::createDirectories(const std::string& path, std::uint32_t permissions) {
    if (!isPath(path)) {
        return failureOf("create folder", path, EINVAL);
    }
    const Result<FileDescriptor> made = makeFolders(path, permissions);
    return made ? Result<Done>(Done()) : made.failure();
}

std::string LinuxFileSystem::currentDirectory() const {
    std::array<char, PATH_MAX> path{};
    return getcwd(path.data(), path.size()) == nullptr ? std::string() : std::string(path.data());
}

} // namespace vela::platform
