// Streams of sound cards, as ALSA's procfs shows them: /proc/asound/cardN/pcmM{p,c}/subK/{status,hw_params}.
//
// The kernel keeps no totals, so the source does, over its own samplings. For each stream:
//
//     "pcm0p sub0 frames"        Simple   frames that the device has played or captured
//     "pcm0p sub0 milliseconds"  Simple   the same as time, at the stream's rate
//     "pcm0p sub0 state"         State    the stream's states
//
// What happens between two samplings is seen as far as it left a trace: the last start, pause or stop. A stream that
// was closed before the next sampling keeps what was counted until the sampling before.
#pragma once

#include "platform/hwstats/SystemSource.h"

#include <array>
#include <cstddef>
#include <cstdint>
#include <map>
#include <optional>
#include <string>
#include <string_view>

namespace vela::platform::hwstats {

/// The text of a `status` file. Times in nanoseconds of whatever clock the stream's program chose.
struct AlsaStatus {
    std::size_t state = 0; ///< its number among kAlsaStates
    std::uint64_t triggerTime = 0;
    std::uint64_t time = 0;
    std::uint64_t hardwarePointer = 0; ///< frames since the stream was prepared
};

inline constexpr std::array<std::string_view, 10> kAlsaStates = {
    "closed", "open", "setup", "prepared", "running", "xrun", "draining", "paused", "suspended", "disconnected"};

std::optional<AlsaStatus> readAlsaStatus(std::string_view text);

/// Frames a second of a `hw_params` file; 0 where it says none.
std::uint64_t readAlsaRate(std::string_view text);

class AlsaSource final : public SystemSource {
public:
    AlsaSource(HwStatsGroupName group, bool playback) : SystemSource(std::move(group)), playback_(playback) {}
    void sample(SystemReading& system, Samples& samples) override;

private:
    /// What was seen of one stream so far.
    struct Stream {
        AlsaStatus last;
        std::uint64_t lastSampling = 0; ///< nanoseconds of the monotonic clock
        std::uint64_t frames = 0;
        std::uint64_t nanoseconds = 0; ///< of frames
        std::array<BlockBuilder::State, kAlsaStates.size()> states;
    };

    void sampleCard(SystemReading& system, const std::string& card, Samples& samples);
    void observe(Stream& stream, const AlsaStatus& status, std::uint64_t rate, std::uint64_t now) const;

    const bool playback_;
    std::map<std::string, Stream, std::less<>> streams_; ///< by path
};

} // namespace vela::platform::hwstats
