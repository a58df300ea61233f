// The service's settings as a subcommand's arguments choose them.
#pragma once

#include "cli/Subcommand.h"
#include "common/CommandOptions.h"
#include "platform/toml/SettingsLoading.h"

#include <array>
#include <optional>

namespace vela {

/// Options of the subcommands that read the settings.
constexpr std::array<CommandOption, 2> kSettingsOptions{{{"--settings", true}, {"--set", true}}};

/// Reads the settings of the last `--settings` (the standard file without one) under every `--set`. Says on `console`
/// what is wrong with them.
std::optional<platform::LoadedSettings> loadSettingsOf(const CommandArguments& arguments, Console& console);

} // namespace vela
