// Lets one program at a time change the files of a folder that are read, changed and written back. Readers need no
// lock: the files are replaced as a whole. Held until destruction. Confined to its scope.
#pragma once

#include "platform/linux/FileDescriptor.h"

#include <cerrno>
#include <chrono>
#include <fcntl.h>
#include <string>
#include <sys/file.h>
#include <thread>

namespace vela::platform {

class FolderLock {
public:
    /// Waits for its turn, for `patience` at most: whoever may read the folder can hold the lock. Where it is not held,
    /// errno says why; EBUSY when its turn did not come.
    explicit FolderLock(const std::string& path, std::chrono::milliseconds patience = std::chrono::seconds(5))
        : folder_(open(path.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC)) {
        constexpr std::chrono::milliseconds kBetween{5};
        const auto deadline = std::chrono::steady_clock::now() + patience;
        while (folder_ && flock(folder_.get(), LOCK_EX | LOCK_NB) != 0) {
            if (errno == EWOULDBLOCK && std::chrono::steady_clock::now() < deadline) {
                std::this_thread::sleep_for(kBetween);
            } else if (errno != EINTR) {
                const int error = errno == EWOULDBLOCK ? EBUSY : errno;
                folder_ = FileDescriptor();
                errno = error;
            }
        }
    }

    explicit operator bool() const { return static_cast<bool>(folder_); }

private:
    FileDescriptor folder_;
};

} // namespace vela::platform
