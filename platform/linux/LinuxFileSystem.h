// Files and folders of the operating system. Without state, so thread-safe. Folders that files are written or made in
// are found by platform/linux/FolderWalk.h, which says whose links are followed.
#pragma once

#include "platform/FileSystem.h"

namespace vela::platform {

class LinuxFileSystem final : public FileSystem {
public:
    Result<std::string> readFile(const std::string& path, std::size_t limit) const override;

    /// platform/linux/FileOpening.h says how the reader's rights are held to.
    Result<std::string> readFileFor(const Identity& reader, const std::string& path, std::size_t limit) const override;

    /// The new file is named ".vela-" and sixteen random hexadecimal digits until it is renamed; a crash may leave one
    /// behind. The content is on the disk before the name is, and the name before this answers.
    std::unique_ptr<PendingFile> createFile(const std::string& path, std::uint32_t permissions) override;

    Result<Done> createDirectories(const std::string& path, std::uint32_t permissions) override;

    std::string currentDirectory() const override;
};

} // namespace vela::platform
