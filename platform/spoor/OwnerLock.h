// Tells files whose owner lives from those it left behind: the owner holds a lock that the kernel releases at any end.
// Process IDs would not tell, as they differ between namespaces and are used again. Free functions, thread-safe.
#pragma once

#include <fcntl.h>

namespace vela::platform::spoor {

namespace detail {

inline struct flock wholeFile(int type) {
    struct flock lock {};
    lock.l_type = static_cast<short>(type);
    lock.l_whence = SEEK_SET;
    return lock;
}

} // namespace detail

/// Locks a file that is open for writing until its last descriptor is closed. False when it has an owner.
inline bool lockAsOwner(int descriptor) {
    struct flock lock = detail::wholeFile(F_WRLCK);
    return fcntl(descriptor, F_OFD_SETLK, &lock) == 0;
}

/// Whether an owner has locked the file.
inline bool hasLivingOwner(int descriptor) {
    // A lock for reading is in the way of nobody's but an owner's.
    struct flock lock = detail::wholeFile(F_RDLCK);
    return fcntl(descriptor, F_OFD_GETLK, &lock) == 0 && lock.l_type != F_UNLCK;
}

} // namespace vela::platform::spoor
