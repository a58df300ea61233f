#include "platform/hwstats/AlsaSource.h"

#include <algorithm>
#include <utility>

namespace vela::platform::hwstats {

namespace {

constexpr std::uint64_t kNanosecondsPerSecond = 1'000'000'000;
constexpr std::uint64_t kNanosecondsPerMillisecond = 1'000'000;
constexpr std::string_view kFolder = "/proc/asound";

constexpr std::size_t kRunning = 4;
constexpr std::size_t kDraining = 6;
static_assert(kAlsaStates[kRunning] == "running" && kAlsaStates[kDraining] == "draining");

/// "12.000000345" as nanoseconds; 0 for anything else.
std::uint64_t readTime(std::string_view text) {
    constexpr std::size_t kDecimals = 9;
    const std::size_t point = text.find('.');
    if (point == std::string_view::npos || text.size() != point + 1 + kDecimals) {
        return 0;
    }
    const auto seconds = numberOf(text.substr(0, point));
    const auto decimals = numberOf(text.substr(point + 1));
    return seconds && decimals ? *seconds * kNanosecondsPerSecond + *decimals : 0;
}

/// Calls `use` with the name and value of each line "name : value".
template <class Use>
void forEachLine(std::string_view text, Use use) {
    while (!text.empty()) {
        const std::size_t end = std::min(text.find('\n'), text.size());
        const std::string_view line = text.substr(0, end);
        text.remove_prefix(std::min(end + 1, text.size()));
        const std::size_t colon = line.find(':');
        if (colon != std::string_view::npos) {
            use(trimmed(line.substr(0, colon)), trimmed(line.substr(colon + 1)));
        }
    }
}

std::string lowerCase(std::string_view text) {
    std::string lower(text);
    std::ranges::transform(lower, lower.begin(), [](char letter) {
        return letter >= 'A' && letter <= 'Z' ? static_cast<char>(letter - 'A' + 'a') : letter;
    });
    return lower;
}

} // namespace

std::optional<AlsaStatus> readAlsaStatus(std::string_view text) {
    AlsaStatus status;
    if (trimmed(text) == kAlsaStates[0]) {
        return status;
    }
    forEachLine(text, [&](std::string_view name, std::string_view value) {
        if (name == "state") {
            const auto* const known = std::ranges::find(kAlsaStates, lowerCase(value));
            status.state = known == kAlsaStates.end() ? 0 : static_cast<std::size_t>(known - kAlsaStates.begin());
        } else if (name == "trigger_time") {
            status.triggerTime = readTime(value);
        } else if (name == "tstamp") {
            status.time = readTime(value);
        } else if (name == "hw_ptr") {
            status.hardwarePointer = numberOf(value).value_or(0);
        }
    });
    return status.state == 0 ? std::nullopt : std::optional(status);
}

std::uint64_t readAlsaRate(std::string_view text) {
    std::uint64_t rate = 0;
    forEachLine(text, [&](std::string_view name, std::string_view value) {
        if (name == "rate") { // "48000 (48000/1)"
            rate = numberOf(value.substr(0, value.find(' '))).value_or(0);
        }
    });
    return rate;
}

void AlsaSource::observe(Stream& stream, const AlsaStatus& status, std::uint64_t rate, std::uint64_t now) const {
    const bool isFirst = stream.lastSampling == 0;
    const bool isSameRun = status.state != 0 && stream.last.state != 0 && status.triggerTime == stream.last.triggerTime;
    const std::uint64_t age =
        status.triggerTime != 0 && status.time > status.triggerTime ? status.time - status.triggerTime : 0;
    const bool isMoving = status.state == kRunning || status.state == kDraining;

    // The pointer begins anew whenever the stream is prepared, goes on after a pause, and wraps.
    std::uint64_t frames = status.hardwarePointer;
    if ((isSameRun || !isMoving) && stream.last.state != 0 && frames >= stream.last.hardwarePointer) {
        frames -= stream.last.hardwarePointer;
    } else if (!isFirst && !isSameRun && rate != 0) {
        const std::uint64_t seconds = age / kNanosecondsPerSecond;
        const std::uint64_t rest = age % kNanosecondsPerSecond * rate / kNanosecondsPerSecond;
        frames = isMoving ? std::min(frames, seconds * rate + rest) : 0;
    }
    stream.frames += frames;
    if (rate != 0) {
        stream.nanoseconds += frames / rate * kNanosecondsPerSecond + frames % rate * kNanosecondsPerSecond / rate;
    }

    const bool hasEntered = isFirst || status.state != stream.last.state || (!isSameRun && status.state != 0);
    const std::uint64_t inPresent = hasEntered ? (isFirst ? age : std::min(age, now - stream.lastSampling)) : 0;
    if (!isFirst) {
        stream.states[stream.last.state].residency += now - stream.lastSampling - inPresent;
    }
    stream.states[status.state].residency += inPresent;
    stream.states[status.state].inTransitions += hasEntered ? 1 : 0;
    stream.last = status;
    stream.lastSampling = now;
}

void AlsaSource::sample(SystemReading& system, Samples& samples) {
    for (const std::string& card : system.list(std::string(kFolder), "card")) {
        if (numberOf(std::string_view(card).substr(std::string_view("card").size()))) {
            sampleCard(system, card, samples);
        }
    }
    if (!system.spent()) { // what was not seen is gone
        std::erase_if(streams_, [&](const auto& entry) { return entry.second.lastSampling != samples.time; });
    }
}

void AlsaSource::sampleCard(SystemReading& system, const std::string& card, Samples& samples) {
    const std::string folder = below(kFolder, card);
    BlockBuilder block(std::string(playback_ ? "alsa-playback:" : "alsa-capture:") + card,
                       system.read(folder + "/id").value_or(card));
    for (const std::string& pcm : system.list(folder, "pcm")) {
        if (!pcm.ends_with(playback_ ? 'p' : 'c')) {
            continue;
        }
        for (const std::string& sub : system.list(below(folder, pcm), "sub")) {
            const std::string path = below(below(folder, pcm), sub);
            const std::optional<std::string> text = system.read(path + "/status");
            const std::optional<AlsaStatus> status = text ? readAlsaStatus(*text) : std::nullopt;
            if (!status) {
                continue;
            }
            const std::uint64_t rate =
                status->state == 0 ? 0 : readAlsaRate(system.read(path + "/hw_params").value_or(""));
            auto [stream, isNew] = streams_.try_emplace(path);
            for (std::size_t i = 0; isNew && i < kAlsaStates.size(); ++i) {
                stream->second.states[i].name = kAlsaStates[i];
            }
            observe(stream->second, *status, rate, samples.time);
            std::string name = pcm;
            name.append(" ").append(sub);
            block.simple(name + " frames", "frames", stream->second.frames);
            block.simple(name + " milliseconds", "ms", stream->second.nanoseconds / kNanosecondsPerMillisecond);
            block.state(name + " state", {stream->second.states.begin(), stream->second.states.end()});
        }
    }
    add(std::move(block), samples);
}

} // namespace vela::platform::hwstats
