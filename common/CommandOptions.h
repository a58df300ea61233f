// Command lines of the programs: long options with or without a value, and operands. Pure.
#pragma once

#include "platform/Result.h"

#include <span>
#include <string>
#include <string_view>
#include <vector>

namespace vela {

struct CommandOption {
    std::string_view name; ///< "--settings"
    bool takesValue = false;
};

struct CommandArguments {
    struct Option {
        std::string_view name; ///< of the CommandOption
        std::string value;
    };
    std::vector<Option> options; ///< in the order given
    std::vector<std::string> operands;

    bool has(std::string_view name) const;
    /// Values of every option of that name, in the order given.
    std::vector<std::string> valuesOf(std::string_view name) const;
};

/// "--name value" and "--name=value"; all behind "--", a single "-" and a negative number ("-17") are operands. Fails
/// with what a person should know: `there is no option --sett`.
platform::Result<CommandArguments> readArguments(std::span<const std::string_view> arguments,
                                                 std::span<const CommandOption> known);

} // namespace vela
