// velactl notify
#include "cli/SettingsArguments.h"
#include "cli/Subcommand.h"
#include "common/SettingValues.h"
#include "platform/linux/LinuxNotificationFiles.h"

#include <charconv>
#include <optional>
#include <ostream>

namespace vela {

namespace {

std::optional<std::uint64_t> readState(std::string_view text) {
    std::uint64_t state = 0;
    const auto [end, error] = std::from_chars(text.data(), text.data() + text.size(), state);
    return error == std::errc() && end == text.data() + text.size() ? std::optional(state) : std::nullopt;
}

} // namespace

int runNotify(std::span<const std::string_view> arguments, Console& console) {
    const platform::Result<CommandArguments> given = readArguments(arguments, kSettingsOptions);
    if (!given || given->operands.empty() || given->operands.size() > 2) {
        return refuseUsage("notify", given ? "a name and perhaps a state are needed" : given.failure().description,
                           console);
    }
    std::optional<std::uint64_t> state;
    if (given->operands.size() == 2) {
        state = readState(given->operands[1]);
        if (!state) {
            return refuseUsage("notify", "a state is a whole number from 0 to 18446744073709551615", console);
        }
    }
    const auto loaded = loadSettingsOf(*given, console);
    if (!loaded) {
        return kFailed;
    }
    const auto posted =
        platform::postNotification(loaded->reading.settings->paths.runtime, given->operands.front(), state);
    if (!posted) {
        console.error << "velactl: " << escapedText(posted.failure().description) << '\n';
        return kFailed;
    }
    return kDone;
}

} // namespace vela
