#include "platform/hwstats/PowerSources.h"

#include <cstddef>
#include <utility>

namespace vela::platform::hwstats {

namespace {

constexpr std::uint64_t kNanosecondsPerMicrosecond = 1'000;
constexpr std::uint64_t kNanosecondsPerMillisecond = 1'000'000;

/// The devices change seldom and there are hundreds: they are looked for this often at the most.
constexpr std::uint64_t kSearchNanoseconds = 60'000'000'000;
/// Folders below /sys/devices that a search looks into.
constexpr std::size_t kMostFolders = 1'500;
constexpr std::size_t kMostDevices = 128;

constexpr const char* kDevices = "/sys/devices";

/// The words of a line.
std::vector<std::string_view> wordsOf(std::string_view line) {
    std::vector<std::string_view> words;
    for (line = trimmed(line); !line.empty(); line = trimmed(line)) {
        const std::size_t end = line.find_first_of(" \t");
        words.push_back(line.substr(0, end));
        line.remove_prefix(words.back().size());
    }
    return words;
}

/// The line at the start of `text`, taken off it.
std::string_view takeLine(std::string_view& text) {
    const std::size_t end = text.find('\n');
    const std::string_view line = text.substr(0, end);
    text.remove_prefix(end == std::string_view::npos ? text.size() : end + 1);
    return line;
}

/// "* 100000000: 0 3 120": the row of one frequency, with what it says of the others.
struct TransStatRow {
    std::string frequency;
    std::vector<std::uint64_t> transitions; ///< to each frequency
    std::uint64_t milliseconds = 0;
};

std::optional<TransStatRow> readRow(std::string_view line) {
    const std::size_t colon = line.find(':');
    if (colon == std::string_view::npos) {
        return std::nullopt;
    }
    std::string_view frequency = trimmed(line.substr(0, colon));
    if (frequency.starts_with('*')) {
        frequency = trimmed(frequency.substr(1));
    }
    TransStatRow row;
    row.frequency = frequency;
    for (const std::string_view word : wordsOf(line.substr(colon + 1))) {
        const std::optional<std::uint64_t> number = numberOf(word);
        if (!number) {
            return std::nullopt;
        }
        row.transitions.push_back(*number);
    }
    if (!numberOf(frequency) || row.transitions.empty()) {
        return std::nullopt;
    }
    row.milliseconds = row.transitions.back();
    row.transitions.pop_back();
    return row;
}

} // namespace

void CpuIdleSource::sample(SystemReading& system, Samples& samples) {
    const std::string folder = std::string(kDevices) + "/system/cpu";
    BlockBuilder block("cpuidle:", "cpuidle");
    block.countsSinceStart();
    for (const std::string& cpu : system.list(folder, "cpu")) {
        const std::string states = below(below(folder, cpu), "cpuidle");
        std::vector<BlockBuilder::State> residencies;
        for (const std::string& state : system.list(states, "state")) {
            const std::string path = below(states, state);
            const std::optional<std::string> name = system.read(path + "/name");
            const std::optional<std::uint64_t> usage = system.number(path + "/usage");
            const std::optional<std::uint64_t> microseconds = system.number(path + "/time");
            if (name && usage && microseconds) {
                residencies.push_back({*name, *usage, *microseconds * kNanosecondsPerMicrosecond});
            }
        }
        if (!residencies.empty()) {
            block.state(cpu, residencies);
        }
    }
    add(std::move(block), samples);
}

std::vector<BlockBuilder::State> readTransStat(std::string_view text) {
    std::vector<TransStatRow> rows;
    while (!text.empty()) {
        if (std::optional<TransStatRow> row = readRow(takeLine(text))) {
            rows.push_back(std::move(*row));
        }
    }
    std::vector<BlockBuilder::State> states;
    for (std::size_t to = 0; to < rows.size(); ++to) {
        BlockBuilder::State state{rows[to].frequency, 0, rows[to].milliseconds * kNanosecondsPerMillisecond};
        for (const TransStatRow& from : rows) {
            if (from.transitions.size() != rows.size()) {
                return {}; // a table that was cut, or none
            }
            state.inTransitions += from.transitions[to];
        }
        states.push_back(std::move(state));
    }
    return states;
}

void DevFreqSource::sample(SystemReading& system, Samples& samples) {
    const std::string folder = "/sys/class/devfreq";
    BlockBuilder block("devfreq:", "devfreq");
    for (const std::string& device : system.list(folder)) {
        const std::optional<std::string> text = system.read(below(below(folder, device), "trans_stat"));
        const std::vector<BlockBuilder::State> states = readTransStat(text.value_or(""));
        if (!states.empty()) {
            block.state(device, states);
        }
    }
    add(std::move(block), samples);
}

void RuntimePmSource::findDevices(SystemReading& system, std::uint64_t now) {
    if (found_ && now - *found_ < kSearchNanoseconds) {
        return;
    }
    found_ = now;
    devices_.clear();
    // Nearest first, so that a tree beyond the bound loses its farthest leaves.
    std::vector<std::string> folders{""};
    for (std::size_t i = 0; i < folders.size() && i < kMostFolders && devices_.size() < kMostDevices; ++i) {
        const std::string folder = folders[i];
        for (const std::string& name : system.folders(kDevices + folder)) {
            if (name != "power") {
                folders.push_back(below(folder, name));
                continue;
            }
            const std::optional<std::string> status = system.read(kDevices + folder + "/power/runtime_status");
            if (status && *status != "unsupported") {
                devices_.push_back(folder);
            }
        }
    }
}

void RuntimePmSource::sample(SystemReading& system, Samples& samples) {
    findDevices(system, samples.time);
    BlockBuilder block("runtime-pm:", "runtimepm");
    for (const std::string& device : devices_) {
        const std::string power = kDevices + device + "/power";
        const std::optional<std::uint64_t> active = system.number(power + "/runtime_active_time");
        const std::optional<std::uint64_t> suspended = system.number(power + "/runtime_suspended_time");
        if (active && suspended && *suspended != 0) {
            block.state(std::string_view(device).substr(1),
                        {{"active", 0, *active * kNanosecondsPerMillisecond},
                         {"suspended", 0, *suspended * kNanosecondsPerMillisecond}});
        }
    }
    add(std::move(block), samples);
}

} // namespace vela::platform::hwstats
