// The command line of vela-pipewire-reporter. Pure.
#pragma once

#include "platform/Result.h"

#include <cstdint>
#include <optional>
#include <span>
#include <string>
#include <string_view>
#include <vector>

namespace vela::reporter {

struct ReporterCommandLine {
    enum class Action : std::uint8_t { Watch, Check, Example, Version, Help };

    Action action = Action::Watch;
    std::optional<std::string> settingsFile; ///< the last `--settings`
    std::vector<std::string> settings;       ///< each `--set`, in order
};

/// `arguments` without the program's name. Of several actions, help wins, then version, example and check.
platform::Result<ReporterCommandLine> readReporterCommandLine(std::span<const std::string_view> arguments);

/// What `--help` prints.
std::string_view reporterHelpText();

} // namespace vela::reporter
