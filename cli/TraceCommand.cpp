// velactl trace
#include "cli/TraceCommand.h"

#include "common/SettingValues.h"

#include <algorithm>
#include <array>
#include <string>

namespace vela {

namespace {

struct TraceSubcommand {
    std::string_view name;
    int (*run)(std::span<const std::string_view> arguments, Console& console);
};

constexpr std::array kTraceSubcommands{
    TraceSubcommand{"emit", runTraceEmit},
    TraceSubcommand{"report", runTraceReport},
};

} // namespace

int runTrace(std::span<const std::string_view> arguments, Console& console) {
    if (arguments.empty()) {
        return refuseUsage("trace", "a subcommand of trace is missing", console);
    }
    const auto* const found = std::ranges::find(kTraceSubcommands, arguments.front(), &TraceSubcommand::name);
    if (found == kTraceSubcommands.end()) {
        return refuseUsage("trace", "trace has no subcommand " + escapedText(arguments.front()), console);
    }
    return found->run(arguments.subspan(1), console);
}

} // namespace vela
