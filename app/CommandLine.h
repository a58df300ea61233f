// The command line of vela-reportingd. Pure.
#pragma once

#include "platform/Result.h"

#include <cstdint>
#include <optional>
#include <span>
#include <string>
#include <string_view>
#include <vector>

namespace vela {

struct CommandLine {
    enum class Action : std::uint8_t { Serve, Check, Version, Help };

    Action action = Action::Serve;
    std::optional<std::string> settingsFile; ///< the last `--settings`
    std::vector<std::string> settings;       ///< each `--set`, in order
    bool json = false;                       ///< with Action::Check
};

/// `arguments` without the program's name. Help wins over version, version over the rest.
platform::Result<CommandLine> readCommandLine(std::span<const std::string_view> arguments);

/// What `--help` prints.
std::string_view helpText();

} // namespace vela
