// Input devices with force feedback: those of /sys/class/input whose capabilities/ff is not 0. The kernel shows nobody
// but the devices' users what is played, so there are, for each device:
//
//     "gamepad effects"     Simple   kinds of effects that the device can play; the same at any time
//     "gamepad connection"  State    how often it was seen to appear, and for how long it has been there
//     "gamepad power"       State    runtime power management, where it or what it is attached to has it
//
// Plays and stops are published in channel files by the programs that play.
#pragma once

#include "platform/hwstats/SystemSource.h"

#include <cstdint>
#include <map>
#include <optional>
#include <string>
#include <string_view>

namespace vela::platform::hwstats {

/// The bits that are set in a bitmap of the input system: hexadecimal words with spaces between them.
std::uint64_t countBits(std::string_view bitmap);

class ForceFeedbackSource final : public SystemSource {
public:
    using SystemSource::SystemSource;
    void sample(SystemReading& system, Samples& samples) override;

private:
    /// Since when a device is known.
    struct Device {
        std::uint64_t first = 0;
        std::uint64_t last = 0;
    };

    void sampleDevice(SystemReading& system, const std::string& folder, BlockBuilder& block, std::uint64_t now);

    std::map<std::string, Device, std::less<>> devices_; ///< by folder
};

} // namespace vela::platform::hwstats
