// The way to a folder, name by name. A symbolic link on it is followed only when root or the service's own user made
// it, as the kernel's protected_symlinks has it for folders like /tmp: where others may write, they cannot lead the
// service into another folder. What is then done by names relative to the descriptor stays in the folder that was
// found, whatever is renamed meanwhile. Free functions, thread-safe.
#pragma once

#include "platform/Result.h"
#include "platform/linux/FileDescriptor.h"

#include <cstdint>
#include <string>

namespace vela::platform {

/// The folder at `path`, to be named as a place (O_PATH). A relative path begins at the current folder.
Result<FileDescriptor> openFolder(const std::string& path);

/// As `openFolder`; makes the folders that are missing, each with exactly `permissions`, whatever the umask. None is
/// made behind a link that leads to nothing.
Result<FileDescriptor> makeFolders(const std::string& path, std::uint32_t permissions);

/// The same folder, to be listed and synchronized. None with errno set when it may not be read.
FileDescriptor openForListing(const FileDescriptor& folder);

} // namespace vela::platform
