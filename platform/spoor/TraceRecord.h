// One event on its way from an emitter to the sessions that collect it, whichever way it came. A value.
#pragma once

#include <array>
#include <cstdint>
#include <ctime>

namespace vela::platform::spoor {

using TraceArguments = std::array<std::uint64_t, 4>;

struct TraceRecord {
    std::uint64_t time = 0; ///< nanoseconds of the monotonic clock
    std::uint32_t code = 0;
    std::uint32_t cpu = 0;
    std::uint64_t thread = 0;
    TraceArguments arguments{};
    std::int32_t process = 0; ///< as the emitter says

    friend bool operator==(const TraceRecord&, const TraceRecord&) = default;
};

/// Nanoseconds of the kernel's clock `clock`; for most without a system call where the kernel lets programs read it.
inline std::uint64_t nanosecondsOf(clockid_t clock) {
    constexpr std::uint64_t kNanosecondsPerSecond = 1'000'000'000;
    timespec time{};
    clock_gettime(clock, &time);
    return static_cast<std::uint64_t>(time.tv_sec) * kNanosecondsPerSecond + static_cast<std::uint64_t>(time.tv_nsec);
}

inline std::uint64_t traceNow() { return nanosecondsOf(CLOCK_MONOTONIC); }

/// What an overflow would make small again stays large: some of these numbers are hostile.
inline std::uint64_t saturatingSum(std::uint64_t one, std::uint64_t other) {
    return one + other < one ? ~std::uint64_t{0} : one + other;
}

} // namespace vela::platform::spoor
