// The subcommands of `velactl trace`. As cli/Subcommand.h: nothing here is thread-safe.
#pragma once

#include "cli/Subcommand.h"

#include <span>
#include <string_view>

namespace vela {

/// Their arguments, as the usage line of `velactl trace` names them.
inline constexpr std::string_view kTraceArguments =
    "emit CODE [ARG]... [--settings FILE] [--set SECTION.KEY=VALUE]... | report FILE [--json]";

int runTraceEmit(std::span<const std::string_view> arguments, Console& console);
int runTraceReport(std::span<const std::string_view> arguments, Console& console);

} // namespace vela
