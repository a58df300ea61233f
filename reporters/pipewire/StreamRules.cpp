#include "reporters/pipewire/StreamRules.h"

#include "common/VelaReportingVocabulary.h"

#include <algorithm>
#include <array>
#include <cmath>
#include <fnmatch.h>
#include <numeric>
#include <set>
#include <string_view>

namespace vela::reporter {

namespace {

/// Roles have a name of the audio server's own and one of the older protocol's.
struct RoleRule {
    std::string_view role;
    AudioServiceType type;
};
constexpr std::array<RoleRule, 9> kRoles{{{"Music", AudioServiceTypeLongFormAudio},
                                          {"music", AudioServiceTypeLongFormAudio},
                                          {"Movie", AudioServiceTypeLongFormAudio},
                                          {"video", AudioServiceTypeLongFormAudio},
                                          {"animation", AudioServiceTypeLongFormAudio},
                                          {"Accessibility", AudioServiceTypeSystemSounds},
                                          {"a11y", AudioServiceTypeSystemSounds},
                                          {"Test", AudioServiceTypeSystemSounds},
                                          {"test", AudioServiceTypeSystemSounds}}};

/// Beginnings of the names of sounds that call for a person's attention, as sound themes name them.
constexpr std::array<std::string_view, 4> kAlerts{"alarm-", "phone-incoming-", "message-", "dialog-"};

constexpr double kVolumeSteps = 1e5;

bool isOneOf(const std::string& role, std::string_view own, std::string_view older) {
    return role == own || role == older;
}

} // namespace

std::uint16_t serviceTypeOf(const NodeProperties& node) {
    const NodeKind kind = nodeKind(node.mediaClass);
    const bool isDevice = kind == NodeKind::Sink || kind == NodeKind::Source;
    if (!isDevice && isOneOf(node.role, "Communication", "phone")) {
        return AudioServiceTypeTelephony;
    }
    if (kind != NodeKind::PlaybackStream) {
        return AudioServiceTypeAudioDeviceUsage;
    }
    if (isOneOf(node.role, "Notification", "event")) {
        const bool alerts = std::ranges::any_of(
            kAlerts, [&](std::string_view beginning) { return node.eventId.starts_with(beginning); });
        return alerts ? AudioServiceTypeAlerts : AudioServiceTypeSystemSounds;
    }
    const auto* const rule = std::ranges::find(kRoles, std::string_view(node.role), &RoleRule::role);
    return rule == kRoles.end() ? AudioServiceTypeGeneric : rule->type;
}

double userVolume(const Volume& volume) {
    if (volume.muted) {
        return 0;
    }
    double mean = 1;
    if (!volume.channels.empty()) {
        mean = std::accumulate(volume.channels.begin(), volume.channels.end(), 0.0) /
               static_cast<double>(volume.channels.size());
    }
    const double amplitude = volume.volume * mean;
    if (!(amplitude > 0)) { // also what is no number
        return 0;
    }
    // A user's 0.5 is 0.125 in a 32-bit float somewhere, and shall be 0.5 again.
    return std::round(std::min(std::cbrt(amplitude), 1.0) * kVolumeSteps) / kVolumeSteps;
}

std::string formatText(const Format& format) {
    return format.encoding + " " + std::to_string(format.rate) + " Hz " + std::to_string(format.channels) + " ch";
}

std::string listText(const std::vector<std::string>& names) {
    std::string text;
    for (const std::string& name : std::set<std::string>(names.begin(), names.end())) {
        text += (text.empty() ? "" : ", ") + name;
    }
    return text;
}

bool matchesAny(const std::vector<std::string>& patterns, const std::string& text) {
    return std::ranges::any_of(
        patterns, [&](const std::string& pattern) { return fnmatch(pattern.c_str(), text.c_str(), 0) == 0; });
}

} // namespace vela::reporter
