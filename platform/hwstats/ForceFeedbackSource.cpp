#include "platform/hwstats/ForceFeedbackSource.h"

#include <bit>
#include <utility>

namespace vela::platform::hwstats {

namespace {

constexpr std::uint64_t kNanosecondsPerMillisecond = 1'000'000;

/// How far up the tree of devices power management is looked for: an input device stands some steps below its port.
constexpr int kMostSteps = 4;

std::optional<unsigned> hexadecimal(char digit) {
    if (digit >= '0' && digit <= '9') {
        return static_cast<unsigned>(digit - '0');
    }
    return digit >= 'a' && digit <= 'f' ? std::optional(static_cast<unsigned>(digit - 'a') + 10) : std::nullopt;
}

} // namespace

std::uint64_t countBits(std::string_view bitmap) {
    std::uint64_t bits = 0;
    for (const char digit : bitmap) {
        bits += static_cast<std::uint64_t>(std::popcount(hexadecimal(digit).value_or(0)));
    }
    return bits;
}

void ForceFeedbackSource::sample(SystemReading& system, Samples& samples) {
    BlockBuilder block("force-feedback:", "input");
    for (const std::string& input : system.list("/sys/class/input", "input")) {
        sampleDevice(system, "/sys/class/input/" + input, block, samples.time);
    }
    if (!system.spent()) { // what was not seen is gone
        std::erase_if(devices_, [&](const auto& entry) { return entry.second.last != samples.time; });
    }
    add(std::move(block), samples);
}

void ForceFeedbackSource::sampleDevice(SystemReading& system, const std::string& folder, BlockBuilder& block,
                                       std::uint64_t now) {
    const std::uint64_t effects = countBits(system.read(folder + "/capabilities/ff").value_or(""));
    if (effects == 0) {
        return;
    }
    const std::string name = system.read(folder + "/name").value_or(folder.substr(folder.rfind('/') + 1));
    Device& device = devices_.try_emplace(folder, Device{now, now}).first->second;
    device.last = now;
    block.simple(name + " effects", "kinds", effects);
    block.state(name + " connection", {{"connected", 1, now - device.first}});
    std::string power = folder;
    for (int step = 0; step < kMostSteps; ++step) {
        const std::optional<std::string> status = system.read(power + "/power/runtime_status");
        if (status && *status != "unsupported") {
            const std::optional<std::uint64_t> active = system.number(power + "/power/runtime_active_time");
            const std::optional<std::uint64_t> suspended = system.number(power + "/power/runtime_suspended_time");
            if (active && suspended) {
                block.state(name + " power", {{"active", 0, *active * kNanosecondsPerMillisecond},
                                              {"suspended", 0, *suspended * kNanosecondsPerMillisecond}});
            }
            return;
        }
        power += "/device";
    }
}

} // namespace vela::platform::hwstats
