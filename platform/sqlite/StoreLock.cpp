#include "platform/sqlite/StoreLock.h"

#include <cerrno>
#include <fcntl.h>
#include <filesystem>
#include <sys/file.h>
#include <system_error>
#include <unistd.h>

namespace vela::platform {

Result<StoreLock> StoreLock::acquire(const std::string& path) {
    std::error_code ignored;
    std::filesystem::create_directories(std::filesystem::path(path).parent_path(), ignored);
    const std::string name = path + ".lock";
    const int descriptor = open(name.c_str(), O_RDWR | O_CREAT | O_CLOEXEC | O_NOFOLLOW, 0600);
    if (descriptor < 0) {
        const int error = errno;
        return Failure{error, name + ": " + std::generic_category().message(error)};
    }
    StoreLock lock(descriptor);
    if (flock(descriptor, LOCK_EX | LOCK_NB) != 0) {
        const int error = errno;
        return Failure{error, error == EWOULDBLOCK ? path + " is in use by another service"
                                                   : name + ": " + std::generic_category().message(error)};
    }
    return lock;
}

StoreLock::~StoreLock() {
    if (descriptor_ >= 0) {
        close(descriptor_);
    }
}

} // namespace vela::platform
