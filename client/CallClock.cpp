#include "client/CallClock.h"

#include "platform/linux/FileDescriptor.h"

#include <charconv>
#include <ctime>
#include <fcntl.h>
#include <string>
#include <system_error>
#include <unistd.h>

namespace vela::client {

namespace {

std::chrono::nanoseconds read(clockid_t clock) {
    timespec time{};
    clock_gettime(clock, &time);
    return std::chrono::seconds(time.tv_sec) + std::chrono::nanoseconds(time.tv_nsec);
}

} // namespace

std::optional<SinceBoot> startOfProcess(std::string_view stat, long ticksPerSecond) {
    // The second field, in parentheses, is the program's name, which may hold anything; starttime is the 22nd.
    const std::size_t name = stat.rfind(')');
    if (name == std::string_view::npos || ticksPerSecond <= 0) {
        return std::nullopt;
    }
    std::string_view rest = stat.substr(name + 1);
    for (int field = 2; field < 22; ++field) {
        const std::size_t space = rest.find(' ');
        if (space == std::string_view::npos) {
            return std::nullopt;
        }
        rest.remove_prefix(space + 1);
    }
    std::int64_t ticks = 0;
    const auto [end, error] = std::from_chars(rest.data(), rest.data() + rest.size(), ticks);
    if (error != std::errc() || ticks < 0) {
        return std::nullopt;
    }
    const std::int64_t whole = ticks / ticksPerSecond;
    const std::int64_t part = ticks % ticksPerSecond;
    return std::chrono::seconds(whole) + std::chrono::nanoseconds(part * 1'000'000'000 / ticksPerSecond);
}

Stamps stampsAt(std::chrono::nanoseconds sinceEpoch, SinceBoot sinceBoot, SinceBoot processStart) {
    using std::chrono::milliseconds;
    using std::chrono::seconds;
    Stamps stamps;
    stamps.epochSeconds = std::chrono::duration<double>(sinceEpoch).count();
    stamps.systemUptimeSeconds =
        static_cast<std::int32_t>(std::chrono::duration_cast<seconds>(sinceBoot + milliseconds(500)).count());
    stamps.processUptimeMilliseconds = std::chrono::duration_cast<milliseconds>(sinceBoot - processStart).count();
    return stamps;
}

CallClock::CallClock() : processStart_(read(CLOCK_BOOTTIME)) {
    const platform::FileDescriptor file(open("/proc/self/stat", O_RDONLY | O_CLOEXEC));
    std::string stat;
    if (file && platform::readToEnd(file, stat, 4096)) {
        processStart_ = startOfProcess(stat, sysconf(_SC_CLK_TCK)).value_or(processStart_);
    }
}

Stamps CallClock::now() const { return stampsAt(read(CLOCK_REALTIME), read(CLOCK_BOOTTIME), processStart_); }

} // namespace vela::client
