// Lets one program at a time change the files of a folder that are read, changed and written back. Readers need no
// lock: the files are replaced as a whole. Held until destruction. Confined to its scope.
#pragma once

#include "platform/linux/FileDescriptor.h"

#include <cerrno>
#include <fcntl.h>
#include <string>
#include <sys/file.h>

namespace vela::platform {

class FolderLock {
public:
    /// Waits for its turn. Without a folder at `path` it is not held and errno says why.
    explicit FolderLock(const std::string& path) : folder_(open(path.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC)) {
        while (folder_ && flock(folder_.get(), LOCK_EX) != 0) {
            if (errno != EINTR) {
                folder_ = FileDescriptor();
            }
        }
    }

    explicit operator bool() const { return static_cast<bool>(folder_); }

private:
    FileDescriptor folder_;
};

} // namespace vela::platform
