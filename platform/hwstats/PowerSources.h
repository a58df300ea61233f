// What the kernel knows of power: residency of processors in idle states, of devices at frequencies, and of devices in
// runtime power management. State channels, residencies in nanoseconds.
#pragma once

#include "platform/hwstats/SystemSource.h"

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

namespace vela::platform::hwstats {

/// /sys/devices/system/cpu/cpuN/cpuidle/stateM/{name,usage,time}: a channel for each processor. The time that it is not
/// idle belongs to none of the states.
class CpuIdleSource final : public SystemSource {
public:
    using SystemSource::SystemSource;
    void sample(SystemReading& system, Samples& samples) override;
};

/// /sys/class/devfreq/DEVICE/trans_stat: a channel for each device, a state for each frequency in Hz.
class DevFreqSource final : public SystemSource {
public:
    using SystemSource::SystemSource;
    void sample(SystemReading& system, Samples& samples) override;
};

/// power/runtime_{status,active_time,suspended_time} of the devices below /sys/devices: a channel for each device that
/// has ever been suspended, named by its path. The kernel does not count these transitions: they are 0.
class RuntimePmSource final : public SystemSource {
public:
    using SystemSource::SystemSource;
    void sample(SystemReading& system, Samples& samples) override;

private:
    void findDevices(SystemReading& system, std::uint64_t now);

    std::vector<std::string> devices_;   ///< paths below /sys/devices
    std::optional<std::uint64_t> found_; ///< when they were looked for
};

/// The states of a trans_stat text; none where it is no such text.
///
///          From  :   To
///                : 100000000 200000000   time(ms)
///     * 100000000:         0         3       120     the "*" marks the present frequency
///       200000000:         2         0        34
///     Total transition : 5
std::vector<BlockBuilder::State> readTransStat(std::string_view text);

} // namespace vela::platform::hwstats
