// A recorded tree of the system's files, for tests of what reads them.
#pragma once

#include "platform/hwstats/Samples.h"
#include "platform/hwstats/SystemSource.h"
#include "testing/ManualClock.h"
#include "testing/TemporaryFolder.h"

#include <filesystem>
#include <fstream>
#include <string>
#include <vector>

namespace vela::platform::hwstats {

class SystemTree {
public:
    /// Writes a file below the root, and the folders above it.
    void write(const std::string& path, const std::string& content) const {
        const std::filesystem::path file = folder_.path() + path;
        std::filesystem::create_directories(file.parent_path());
        std::ofstream(file, std::ios::binary) << content;
    }
    void remove(const std::string& path) const { std::filesystem::remove_all(folder_.path() + path); }
    void link(const std::string& path, const std::string& target) const {
        const std::filesystem::path file = folder_.path() + path;
        std::filesystem::create_directories(file.parent_path());
        std::filesystem::create_directory_symlink(target, file);
    }
    const std::string& root() const { return folder_.path(); }

private:
    const testing::TemporaryFolder folder_;
};

inline std::uint64_t nanosecondsOf(const Clock& clock) {
    return static_cast<std::uint64_t>(clock.monotonicNow().time_since_epoch().count());
}

inline Samples sampled(SystemSource& source, const SystemTree& tree, const Clock& clock) {
    SystemReading system(tree.root(), clock);
    Samples samples;
    samples.time = nanosecondsOf(clock);
    source.sample(system, samples);
    return samples;
}

/// A channel in one line: "cpuidle/Tarn/- cpu0: POLL 1x 2000, C1 3x 4000", "drv/g/s frames: 5",
/// "drv/g/s busy[us]: 1..9 0-5:2 5-10:1".
inline std::string lineOf(const HwStatsChannel& channel) {
    std::string line = channel.driverName.value_or("-") + "/" + channel.group.value_or("-") + "/" +
                       channel.subGroup.value_or("-") + " " + channel.channelName.value_or("-");
    switch (static_cast<HwStatsFormat>(channel.format)) {
    case HwStatsFormat::Simple:
        return line + ": " + std::to_string(channel.simpleValue);
    case HwStatsFormat::State:
        line += ":";
        for (const HwStatsState& state : channel.states) {
            line += (line.ends_with(':') ? " " : ", ") + state.name + " " + std::to_string(state.inTransitions) + "x " +
                    std::to_string(state.residency);
        }
        return line;
    default:
        line += "[" + channel.unitLabel.value_or("-") + "]: " + std::to_string(channel.histogramMin) + ".." +
                std::to_string(channel.histogramMax);
        for (const HwStatsBucket& bucket : channel.buckets) {
            line += " " + std::to_string(bucket.lower) + "-" + std::to_string(bucket.upper) + ":" +
                    std::to_string(bucket.hits);
        }
        return line;
    }
}

inline std::vector<std::string> linesOf(const Samples& samples) {
    std::vector<std::string> lines;
    UniqueFunction<int(const HwStatsChannel&)> use = [&](const HwStatsChannel& channel) {
        lines.push_back(lineOf(channel));
        return 0;
    };
    iterateSamples(samples, use);
    return lines;
}

} // namespace vela::platform::hwstats
