// What a trace parameters file asks for: one trace and its points. Plain data, owned by who loaded it.
#pragma once

#include <cstdint>
#include <memory>
#include <string>
#include <vector>

namespace vela {

/// `TraceParams::type`: the service's own kernel-trace collection, or signposts, which it does not collect.
inline constexpr std::int32_t kTraceTypeSpoor = 0;
inline constexpr std::int32_t kTraceTypeMilestone = 1;

/// `TraceDataParams::kind`.
inline constexpr std::uint32_t kTracePointImpulse = 0;
inline constexpr std::uint32_t kTracePointInterval = 1;
inline constexpr std::uint32_t kTracePointLevel = 2;

/// One trace point.
struct TraceDataParams {
    std::string name;
    std::uint32_t kind = kTracePointImpulse;
    std::uint32_t beginCode = 0;
    std::uint32_t endCode = 0; ///< an impulse's is its begin code, a level's is 0
    bool matchedByThread = false;
};

/// One file. Its points stand in the file's order, those of one trace after those of the other.
struct TraceParams {
    std::string name;
    std::int32_t type = kTraceTypeSpoor;
    std::vector<std::unique_ptr<TraceDataParams>> dataParams;
};

} // namespace vela
