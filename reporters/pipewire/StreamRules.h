// How what a graph says becomes what a report says. Pure functions.
#pragma once

#include "reporters/pipewire/Graph.h"

#include <cstdint>
#include <string>
#include <vector>

namespace vela::reporter {

/// The AudioServiceType of a node's session: by the role of its media, and for a notification by its event.
std::uint16_t serviceTypeOf(const NodeProperties& node);

/// Loudness as a person sets it, 0 to 1: the cube root of the mean amplitude, 0 when muted.
double userVolume(const Volume& volume);

/// "F32LE 48000 Hz 2 ch".
std::string formatText(const Format& format);

/// The names, in order and each once: "headphones, speaker".
std::string listText(const std::vector<std::string>& names);

/// Whether any of the shell patterns (`*`, `?`, `[a-z]`) fits all of `text`.
bool matchesAny(const std::vector<std::string>& patterns, const std::string& text);

} // namespace vela::reporter
