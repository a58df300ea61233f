// Owns a file descriptor. One owner at a time.
#pragma once

#include <cerrno>
#include <cstddef>
#include <string>
#include <unistd.h>
#include <utility>

namespace vela::platform {

class FileDescriptor {
public:
    FileDescriptor() = default;
    /// Takes over what a system call answered; negative is none.
    explicit FileDescriptor(int descriptor) : descriptor_(descriptor) {}
    FileDescriptor(FileDescriptor&& other) noexcept : descriptor_(std::exchange(other.descriptor_, -1)) {}
    FileDescriptor& operator=(FileDescriptor&& other) noexcept {
        std::swap(descriptor_, other.descriptor_);
        return *this;
    }
    FileDescriptor(const FileDescriptor&) = delete;
    FileDescriptor& operator=(const FileDescriptor&) = delete;
    /// Keeps errno, so that a failure may be reported behind it.
    ~FileDescriptor() {
        if (descriptor_ >= 0) {
            const int error = errno;
            close(descriptor_);
            errno = error;
        }
    }

    explicit operator bool() const { return descriptor_ >= 0; }
    int get() const { return descriptor_; }
    /// Gives it to the caller, whose to close it is.
    int release() { return std::exchange(descriptor_, -1); }

private:
    int descriptor_ = -1;
};

/// Appends to `bytes` what `descriptor` gives until its end or until `bytes` has more than `limit`. False with errno
/// set when reading fails.
inline bool readToEnd(const FileDescriptor& descriptor, std::string& bytes, std::size_t limit) {
    constexpr std::size_t kStep = 16 * 1024;
    while (bytes.size() <= limit) {
        const std::size_t before = bytes.size();
        bytes.resize(before + kStep);
        const ssize_t got = ::read(descriptor.get(), bytes.data() + before, kStep);
        bytes.resize(before + (got > 0 ? static_cast<std::size_t>(got) : 0));
        if (got == 0) {
            return true;
        }
        if (got < 0 && errno != EINTR) {
            return false;
        }
    }
    return true;
}

} // namespace vela::platform
