// Files and folders in memory, with failures on demand. Paths are absolute and taken as they are, without "." or links.
// Everything is root's until a test says otherwise. Thread-safe.
#pragma once

#include "platform/FileSystem.h"
#include "platform/Mutex.h"

#include <cstddef>
#include <cstdint>
#include <functional>
#include <map>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

namespace vela::testing {

class FakeFileSystem final : public platform::FileSystem {
public:
    /// Holds the folder "/", which is also the current one.
    FakeFileSystem();

    // What a test arranges.
    /// A file, and the folders above it.
    void addFile(const std::string& path, std::string content, std::uint32_t permissions = 0644);
    /// Of what is there.
    void setOwner(const std::string& path, std::uint32_t user, std::uint32_t group);
    void setCurrentDirectory(std::string path);
    /// Every operation on exactly this path fails with `error` (ENOSPC, say); 0 ends it.
    void failOn(const std::string& path, int error);
    /// Files of more bytes cannot be written (EFBIG); none ends it.
    void limitFileSize(std::optional<std::size_t> bytes);
    /// Called for each piece that a file is given, outside the lock.
    void setObserver(std::function<void()> observer);

    // What a test looks at.
    std::optional<std::string> contentOf(const std::string& path) const;
    std::optional<std::uint32_t> permissionsOf(const std::string& path) const;
    /// Paths of all files, sorted.
    std::vector<std::string> files() const;
    /// Those that files were read for, in the order asked.
    std::vector<platform::Identity> readers() const;
    /// Bytes of the longest piece that a file was given so far.
    std::size_t longestPiece() const;

    platform::Result<std::string> readFile(const std::string& path, std::size_t limit) const override;
    platform::Result<std::string> readFileFor(const platform::Identity& reader, const std::string& path,
                                              std::size_t limit) const override;
    std::unique_ptr<platform::PendingFile> createFile(const std::string& path, std::uint32_t permissions) override;
    platform::Result<platform::Done> createDirectories(const std::string& path, std::uint32_t permissions) override;
    std::string currentDirectory() const override;

private:
    class Pending;
    struct Node {
        std::optional<std::string> content; ///< none for a folder
        std::uint32_t permissions = 0;
        std::uint32_t user = 0;
        std::uint32_t group = 0;
    };

    const Node* find(const std::string& path) const VELA_REQUIRES(mutex_);
    platform::Result<std::string> read(const std::string& path, std::size_t limit) const VELA_REQUIRES(mutex_);
    /// Whether `reader` may search the folders on the way to `path`, as far as they are there, and read what it names.
    bool mayRead(const platform::Identity& reader, const std::string& path) const VELA_REQUIRES(mutex_);
    /// The error that this path shall meet, or 0.
    int errorFor(const std::string& path) const VELA_REQUIRES(mutex_);
    /// 0 or an error number.
    int makeFolders(const std::string& path, std::uint32_t permissions) VELA_REQUIRES(mutex_);
    int checkWritable(const std::string& path) const VELA_REQUIRES(mutex_);
    /// 0 or the error of adding `piece` to a file of `size` bytes at `path`.
    int checkPiece(const std::string& path, std::size_t size, std::string_view piece) VELA_EXCLUDES(mutex_);
    platform::Result<platform::Done> put(const std::string& path, std::string content, std::uint32_t permissions);

    mutable Mutex mutex_;
    std::map<std::string, Node> nodes_ VELA_GUARDED_BY(mutex_);
    std::map<std::string, int> errors_ VELA_GUARDED_BY(mutex_);
    std::optional<std::size_t> sizeLimit_ VELA_GUARDED_BY(mutex_);
    std::function<void()> observer_ VELA_GUARDED_BY(mutex_);
    mutable std::vector<platform::Identity> readers_ VELA_GUARDED_BY(mutex_);
    std::size_t longestPiece_ VELA_GUARDED_BY(mutex_) = 0;
    std::string currentDirectory_ VELA_GUARDED_BY(mutex_) = "/";
};

} // namespace vela::testing
