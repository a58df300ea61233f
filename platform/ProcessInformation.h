// What the operating system knows of a process.
#pragma once

#include <cstdint>
#include <string>

namespace vela::platform {

/// One process's record as the system holds it.
struct ProcessRecord {
    std::int32_t pid = 0;
    std::int32_t parent = 0;
    std::string commandName; ///< raw bytes, shortened by the system (15 bytes on Linux)
    std::uint64_t startTimeTicks =
        0; ///< since the system's start, in clock ticks; with `pid` it names a process for good
};

/// Thread-safe.
class ProcessInformation {
public:
    virtual ~ProcessInformation() = default;

    virtual std::int32_t ownPid() const = 0;

    /// The service's own process name.
    virtual std::string ownName() const = 0;

    /// Fills `record` and answers true only when the whole record of a living process was read; otherwise leaves it as
    /// it was.
    virtual bool read(std::int32_t pid, ProcessRecord& record) const = 0;
};

} // namespace vela::platform
