// Files and folders. Paths are absolute unless an operation says otherwise; failures carry the system's own words.
#pragma once

#include "platform/Identity.h"
#include "platform/Result.h"

#include <cstddef>
#include <cstdint>
#include <memory>
#include <string>
#include <string_view>

namespace vela::platform {

/// A file that is being written and that nobody sees yet. Destroyed without `commit`, it leaves what was there before
/// and nothing else. One owner at a time; its file system outlives it.
class PendingFile {
public:
    virtual ~PendingFile() = default;

    /// Adds `piece` to the end; pieces of about 1 MiB cost the least. After a failure, that of the creation too, it
    /// does nothing: `commit` tells.
    virtual void append(std::string_view piece) = 0;

    /// Why nothing more can be written, or null. A creation that failed tells at once.
    virtual const Failure* failure() const = 0;

    /// Puts the file into its place, or answers the first failure. The last call of all.
    virtual Result<Done> commit() = 0;
};

/// Thread-safe.
class FileSystem {
public:
    virtual ~FileSystem() = default;

    /// The whole content of a regular file of at most `limit` bytes; anything else (a folder, a device, a larger file)
    /// is refused.
    virtual Result<std::string> readFile(const std::string& path, std::size_t limit) const = 0;

    /// As `readFile`, with the rights of `reader` and no others: what they may not read is refused (EACCES), whatever
    /// the service itself may. For paths that somebody else named. Nothing but a regular file is opened, and no wait
    /// for one.
    virtual Result<std::string> readFileFor(const Identity& reader, const std::string& path,
                                            std::size_t limit) const = 0;

    /// Begins a file at `path` that is written in pieces. A reader sees the old file or the whole new one, never a
    /// part: a new file beside it, opened exclusively and without following links, then renamed. `permissions` hold
    /// exactly, whatever the umask. Never null.
    virtual std::unique_ptr<PendingFile> createFile(const std::string& path, std::uint32_t permissions) = 0;

    /// As `createFile`, with all of the content at once.
    Result<Done> writeFileAtomically(const std::string& path, std::string_view content, std::uint32_t permissions) {
        const std::unique_ptr<PendingFile> file = createFile(path, permissions);
        file->append(content);
        return file->commit();
    }

    /// Creates `path` and the missing folders above it, each new one with exactly `permissions`. A folder that is there
    /// stays as it is.
    virtual Result<Done> createDirectories(const std::string& path, std::uint32_t permissions) = 0;

    virtual std::string currentDirectory() const = 0;
};

} // namespace vela::platform
