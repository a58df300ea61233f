#include "platform/linux/LinuxClock.h"

#include "platform/Mutex.h"

#include <cassert>
#include <ctime>

namespace vela::platform {

namespace {

Nanoseconds read(clockid_t clock) {
    timespec time{};
    [[maybe_unused]] const int result = clock_gettime(clock, &time);
    assert(result == 0);
    return std::chrono::seconds(time.tv_sec) + Nanoseconds(time.tv_nsec);
}

} // namespace

WallTime LinuxClock::now() const { return WallTime(read(CLOCK_REALTIME)); }

MonotonicTime LinuxClock::monotonicNow() const { return MonotonicTime(read(CLOCK_MONOTONIC)); }

Nanoseconds LinuxClock::systemUptime() const { return read(CLOCK_BOOTTIME); }

std::chrono::seconds LinuxClock::localOffset(WallTime time) const {
    const std::time_t seconds = std::chrono::floor<std::chrono::seconds>(time).time_since_epoch().count();
    std::tm local{};
    // The library guards its zone by a lock that no sanitizer sees.
    static Mutex zone;
    const MutexLock lock(zone);
    tzset(); // localtime_r alone looks at the zone once and never again
    if (localtime_r(&seconds, &local) == nullptr) {
        return std::chrono::seconds(0); // a year beyond what tm can hold
    }
    return std::chrono::seconds(local.tm_gmtoff);
}

} // namespace vela::platform
