// velactl settings
#include "cli/SettingsArguments.h"
#include "cli/Subcommand.h"
#include "cli/TextTable.h"
#include "common/CommandOptions.h"
#include "common/SettingValues.h"
#include "common/SettingsTable.h"
#include "common/values/Dictionary.h"
#include "common/values/Json.h"

#include <array>
#include <optional>
#include <ostream>

namespace vela {

namespace {

constexpr std::array<CommandOption, 4> kOptions{{{"--settings", true}, {"--set", true}, {"--json"}, {"--example"}}};

Value jsonValue(const SettingValue& value) {
    if (const auto* boolean = std::get_if<bool>(&value)) {
        return *boolean;
    }
    if (const auto* integer = std::get_if<std::int64_t>(&value)) {
        return *integer;
    }
    if (const auto* texts = std::get_if<std::vector<std::string>>(&value)) {
        ArrayBuilder array;
        for (const std::string& text : *texts) {
            array.add(std::string_view(text));
        }
        return array.build();
    }
    return std::string_view(std::get<std::string>(value));
}

void printJson(const std::vector<SettingInForce>& settings, std::ostream& out) {
    constexpr std::array<const char*, 3> kOrigins{"default", "file", "command line"};
    for (const SettingInForce& setting : settings) {
        DictionaryBuilder object;
        object.add("key", std::string_view(setting.section + "." + setting.key));
        object.add("value", jsonValue(setting.value));
        object.add("origin", kOrigins[static_cast<std::size_t>(setting.origin.kind)]);
        if (setting.origin.kind == SettingOrigin::Kind::File) {
            object.add("file", std::string_view(setting.origin.file));
            object.add("line", setting.origin.line);
        }
        out << jsonText(Value(object.build())) << '\n';
    }
}

void printTable(const std::vector<SettingInForce>& settings, std::ostream& out, bool colour) {
    TextTable table({"KEY", "VALUE", "FROM"});
    for (const SettingInForce& setting : settings) {
        const bool standard = setting.origin.kind == SettingOrigin::Kind::Default;
        table.add({escapedText(setting.section + "." + setting.key), setting.text, escapedText(setting.origin.text())},
                  standard);
    }
    table.print(out, colour);
}

std::optional<std::string> usageFault(const CommandArguments& arguments) {
    if (!arguments.operands.empty()) {
        return "there is nothing to do with " + quotedText(arguments.operands.front());
    }
    if (arguments.has("--example") && arguments.options.size() > 1) {
        return "--example stands alone";
    }
    return std::nullopt;
}

} // namespace

int runSettings(std::span<const std::string_view> arguments, Console& console) {
    const platform::Result<CommandArguments> read = readArguments(arguments, kOptions);
    if (!read) {
        return refuseUsage("settings", read.failure().description, console);
    }
    if (const std::optional<std::string> fault = usageFault(*read)) {
        return refuseUsage("settings", *fault, console);
    }
    if (read->has("--example")) {
        console.out << exampleSettingsFile();
        return kDone;
    }
    const std::optional<platform::LoadedSettings> loaded = loadSettingsOf(*read, console);
    if (!loaded) {
        return kFailed;
    }
    if (read->has("--json")) {
        printJson(loaded->reading.inForce, console.out);
    } else {
        printTable(loaded->reading.inForce, console.out, console.colour);
    }
    return kDone;
}

} // namespace vela
