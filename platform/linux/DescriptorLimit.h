// How many file descriptors this process may have open. Free functions, thread-safe.
#pragma once

#include <algorithm>
#include <cstdint>
#include <sys/resource.h>

namespace vela::platform {

/// Up to the hard limit: the soft one is for programs that use descriptors as indices, and what bounds connections is
/// the settings.
inline void raiseDescriptorLimit() {
    rlimit limit{};
    if (getrlimit(RLIMIT_NOFILE, &limit) == 0 && limit.rlim_cur < limit.rlim_max) {
        limit.rlim_cur = limit.rlim_max;
        setrlimit(RLIMIT_NOFILE, &limit);
    }
}

/// The number from which on descriptors are the process's own, and not for its clients: the last `own`, or half of few.
inline std::uint64_t descriptorsForClients(std::uint64_t own) {
    rlimit limit{};
    if (getrlimit(RLIMIT_NOFILE, &limit) != 0 || limit.rlim_cur == RLIM_INFINITY) {
        return RLIM_INFINITY;
    }
    return limit.rlim_cur - std::min<std::uint64_t>(own, limit.rlim_cur / 2);
}

} // namespace vela::platform
