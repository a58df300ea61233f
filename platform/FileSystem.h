// Files and folders. Paths are absolute unless an operation says otherwise; failures carry the system's own words.
#pragma once

#include "platform/Result.h"

#include <cstddef>
#include <cstdint>
#include <string>
#include <string_view>

namespace vela::platform {

/// Thread-safe.
class FileSystem {
public:
    virtual ~FileSystem() = default;

    /// The whole content of a regular file of at most `limit` bytes; anything else (a folder, a device, a larger file)
    /// is refused.
    virtual Result<std::string> readFile(const std::string& path, std::size_t limit) const = 0;

    /// Puts `content` into `path` so that a reader sees the old file or the new one, never a part: a new file beside
    /// it, opened exclusively and without following links, then renamed. `permissions` hold exactly, whatever the
    /// umask.
    virtual Result<Done> writeFileAtomically(const std::string& path, std::string_view content,
                                             std::uint32_t permissions) = 0;

    /// Creates `path` and the missing folders above it, each new one with exactly `permissions`. A folder that is there
    /// stays as it is.
    virtual Result<Done> createDirectories(const std::string& path, std::uint32_t permissions) = 0;

    virtual std::string currentDirectory() const = 0;
};

} // namespace vela::platform
