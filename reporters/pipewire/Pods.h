// Reads the audio server's values into the reporter's own words. What does not have the expected form is left out. Pure
// functions.
#pragma once

#include "reporters/pipewire/Graph.h"

#include <optional>
#include <vector>

struct spa_pod;
struct spa_dict;

namespace vela::reporter {

/// Of the parameter "Props"; none when it says nothing of volume.
std::optional<Volume> readVolume(const spa_pod* parameter);

/// Of the parameter "Format"; none when it is not that of plain audio.
std::optional<Format> readFormat(const spa_pod* parameter);

/// What the profiler tells at once.
std::vector<Cycle> readCycles(const spa_pod* batch);

NodeProperties readNodeProperties(const spa_dict* properties);

/// None when either end is missing.
std::optional<Link> readLink(const spa_dict* properties);

/// Empty when it is missing.
std::string readText(const spa_dict* properties, const char* key);

} // namespace vela::reporter
