// The files of issue snapshots: `<UTC time>-<number>.json`, the newest kMostFiles of them. A file whose time is after
// that of the one just written was made before the clock went back, so it counts as the older. Other files of the
// folder are left alone. Confined to one thread.
#pragma once

#include "platform/Clock.h"
#include "platform/FileSystem.h"
#include "platform/Result.h"

#include <cstddef>
#include <string>
#include <string_view>

namespace vela::platform {

class SnapshotFolder {
public:
    static constexpr std::size_t kMostFiles = 32;

    /// `fileSystem` outlives the folder, which is made when it is needed.
    SnapshotFolder(std::string path, FileSystem& fileSystem);

    /// Writes a new file, removes those that are too many, and answers the new one's path.
    Result<std::string> write(WallTime time, std::string_view content);

private:
    const std::string path_;
    FileSystem& fileSystem_;
};

} // namespace vela::platform
