// velactl trace emit
#include "cli/SettingsArguments.h"
#include "cli/TraceCommand.h"
#include "common/SettingValues.h"
#include "platform/spoor/TraceEmitter.h"

#include <charconv>
#include <cstdint>
#include <optional>
#include <ostream>
#include <string>
#include <string_view>
#include <vector>

namespace vela {

namespace {

using platform::spoor::Emission;

/// "17", "-17" or "0x11".
std::optional<std::uint64_t> readNumber(std::string_view text) {
    constexpr int kDecimal = 10;
    constexpr int kHexadecimal = 16;
    const bool isHexadecimal = text.starts_with("0x") || text.starts_with("0X");
    const bool isNegative = text.starts_with('-');
    const std::string_view digits = text.substr(isHexadecimal ? 2 : isNegative ? 1 : 0);
    std::uint64_t number = 0;
    const auto [end, error] =
        std::from_chars(digits.data(), digits.data() + digits.size(), number, isHexadecimal ? kHexadecimal : kDecimal);
    const std::uint64_t greatest = isNegative ? std::uint64_t{1} << 63U : UINT64_MAX;
    if (error != std::errc() || end != digits.data() + digits.size() || number > greatest) {
        return std::nullopt;
    }
    return isNegative ? 0 - number : number;
}

struct GivenEvent {
    std::uint32_t code = 0;
    platform::spoor::TraceArguments arguments{};
};

/// The event that the operands say, or what is wrong with them.
platform::Result<GivenEvent> readEvent(const std::vector<std::string>& operands) {
    GivenEvent event;
    if (operands.empty()) {
        return platform::Failure{0, "a code is missing"};
    }
    if (operands.size() > 1 + event.arguments.size()) {
        return platform::Failure{0, "an event has at most four arguments"};
    }
    const auto code = readNumber(operands.front());
    if (!code || *code > UINT32_MAX || operands.front().starts_with('-')) {
        return platform::Failure{0, "a code is a number of 32 bits, such as 0x21040100, and not " +
                                        escapedText(operands.front())};
    }
    event.code = static_cast<std::uint32_t>(*code);
    for (std::size_t i = 1; i < operands.size(); ++i) {
        const auto argument = readNumber(operands[i]);
        if (!argument) {
            return platform::Failure{0, "an argument is a number of 64 bits, and not " + escapedText(operands[i])};
        }
        event.arguments[i - 1] = *argument;
    }
    return event;
}

} // namespace

int runTraceEmit(std::span<const std::string_view> arguments, Console& console) {
    const platform::Result<CommandArguments> given = readArguments(arguments, kSettingsOptions);
    if (!given) {
        return refuseUsage("trace", given.failure().description, console);
    }
    const platform::Result<GivenEvent> event = readEvent(given->operands);
    if (!event) {
        return refuseUsage("trace", event.failure().description, console);
    }
    const auto loaded = loadSettingsOf(*given, console);
    if (!loaded) {
        return kFailed;
    }
    const std::string& runtime = loaded->reading.settings->paths.runtime;
    platform::spoor::TraceEmitter emitter({{runtime, true}});
    Emission emission = emitter.emitNow(event->code, event->arguments);
    if (emission != Emission::NoService && !emitter.hasLivingService()) {
        emission = Emission::NoService; // what it left active is nobody's
    }
    switch (emission) {
    case Emission::Emitted:
        return kDone;
    case Emission::NobodyCollects:
        console.error << "velactl: nobody collects trace events\n";
        return kFailed;
    case Emission::OutOfRange:
        console.error << "velactl: nobody collects events with this code\n";
        return kFailed;
    case Emission::NoService:
        console.error << "velactl: no service in " << escapedText(runtime) << " collects trace events\n";
        return kNoService;
    case Emission::Lost:
        break;
    }
    console.error << "velactl: the event was lost: neither the kernel nor " << escapedText(runtime)
                  << "/trace/rings took it\n";
    return kFailed;
}

} // namespace vela
