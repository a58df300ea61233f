// Keeps a second service from the same store: a lock on a file beside it, held while this lives. One owner at a time.
#pragma once

#include "platform/Result.h"

#include <string>
#include <utility>

namespace vela::platform {

class StoreLock {
public:
    /// Locks `<path>.lock`, which stays behind empty.
    static Result<StoreLock> acquire(const std::string& path);

    StoreLock(StoreLock&& other) noexcept : descriptor_(std::exchange(other.descriptor_, -1)) {}
    StoreLock& operator=(StoreLock&& other) noexcept {
        std::swap(descriptor_, other.descriptor_);
        return *this;
    }
    StoreLock(const StoreLock&) = delete;
    StoreLock& operator=(const StoreLock&) = delete;
    ~StoreLock();

private:
    explicit StoreLock(int descriptor) : descriptor_(descriptor) {}

    int descriptor_;
};

} // namespace vela::platform
