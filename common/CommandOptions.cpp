#include "common/CommandOptions.h"

#include "common/SettingValues.h"

#include <algorithm>

namespace vela {

namespace {

/// No option begins like a negative number.
bool isOperand(std::string_view argument) {
    return !argument.starts_with('-') || argument == "-" || (argument[1] >= '0' && argument[1] <= '9');
}

} // namespace

bool CommandArguments::has(std::string_view name) const {
    return std::ranges::any_of(options, [&](const Option& option) { return option.name == name; });
}

std::vector<std::string> CommandArguments::valuesOf(std::string_view name) const {
    std::vector<std::string> values;
    for (const Option& option : options) {
        if (option.name == name) {
            values.push_back(option.value);
        }
    }
    return values;
}

platform::Result<CommandArguments> readArguments(std::span<const std::string_view> arguments,
                                                 std::span<const CommandOption> known) {
    CommandArguments read;
    for (std::size_t index = 0; index < arguments.size(); ++index) {
        const std::string_view argument = arguments[index];
        if (argument == "--") {
            read.operands.insert(read.operands.end(), arguments.begin() + static_cast<std::ptrdiff_t>(index) + 1,
                                 arguments.end());
            break;
        }
        if (isOperand(argument)) {
            read.operands.emplace_back(argument);
            continue;
        }
        const std::size_t equals = argument.find('=');
        const std::string_view name = argument.substr(0, equals);
        const auto option = std::ranges::find(known, name, &CommandOption::name);
        if (option == known.end()) {
            return platform::Failure{0, "there is no option " + escapedText(name)};
        }
        if (option->takesValue && equals == std::string_view::npos && index + 1 == arguments.size()) {
            return platform::Failure{0, std::string(name) + " needs a value"};
        }
        if (!option->takesValue && equals != std::string_view::npos) {
            return platform::Failure{0, std::string(name) + " takes no value"};
        }
        std::string value;
        if (option->takesValue) {
            value = equals == std::string_view::npos ? arguments[++index] : argument.substr(equals + 1);
        }
        read.options.push_back({option->name, std::move(value)});
    }
    return read;
}

} // namespace vela
