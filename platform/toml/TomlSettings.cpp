#include "platform/toml/TomlSettings.h"

#include "common/SettingSuggestion.h"
#include "common/SettingValues.h"
#include "platform/toml/TomlBounds.h"

// The library as headers only, in the form that reports failures as values: the installed shared one throws.
#define TOML_HEADER_ONLY 1
#define TOML_EXCEPTIONS 0
#define TOML_MAX_NESTED_VALUES 16
// It asserts things of its input that outside bytes need not keep ("[=" breaks one) and with NDEBUG lets the compiler
// rely on them, although it checks them again afterwards and reports an error. Neither is wanted.
#define TOML_ASSERT(condition) static_cast<void>(0)
#pragma push_macro("NDEBUG")
#undef NDEBUG
// clang-format off
#include <toml++/toml.h>
// clang-format on
#pragma pop_macro("NDEBUG")

#include <algorithm>
#include <optional>
#include <utility>

namespace vela::platform {

namespace {

int lineOf(const toml::node& node) { return static_cast<int>(node.source().begin.line); }
int columnOf(const toml::node& node) { return static_cast<int>(node.source().begin.column); }

std::optional<std::vector<std::string>> textsOf(const toml::array& array) {
    std::vector<std::string> texts;
    for (const toml::node& element : array) {
        const auto* text = element.as_string();
        if (text == nullptr) {
            return std::nullopt;
        }
        texts.push_back(text->get());
    }
    return texts;
}

/// The value as settings know it; none for dates, times, tables and lists of anything but texts.
std::optional<SettingValue> valueOf(const toml::node& node) {
    if (const auto* boolean = node.as_boolean()) {
        return SettingValue(boolean->get());
    }
    if (const auto* integer = node.as_integer()) {
        return SettingValue(integer->get());
    }
    if (const auto* real = node.as_floating_point()) {
        return SettingValue(real->get());
    }
    if (const auto* text = node.as_string()) {
        return SettingValue(text->get());
    }
    if (const auto* array = node.as_array()) {
        if (auto texts = textsOf(*array)) {
            return SettingValue(std::move(*texts));
        }
    }
    return std::nullopt;
}

std::string_view kindOf(const toml::node& node) {
    if (node.is_table()) {
        return "a table";
    }
    return node.is_array() ? "a list of something else than texts" : "a date or time";
}

class Collector {
public:
    explicit Collector(const std::string& file) : file_(file) {}

    void collect(const toml::table& root) {
        for (const auto& [key, node] : root) {
            const std::string_view name = key.str();
            if (const auto* section = node.as_table()) {
                collectSection(name, *section);
            } else {
                reading_.errors.push_back(
                    {file_, lineOf(node), columnOf(node), displayedName(name), "stands outside every section"});
            }
        }
    }

    TomlReading finish() && {
        std::ranges::stable_sort(reading_.settings, {}, [](const RawSetting& setting) { return setting.origin.line; });
        return std::move(reading_);
    }

private:
    void add(std::string_view section, std::string_view key, int line, SettingValue value) {
        reading_.settings.push_back(
            {std::string(section), std::string(key), std::move(value), {SettingOrigin::Kind::File, file_, line}});
    }

    void collectSection(std::string_view section, const toml::table& table) {
        add(section, "", lineOf(table), {});
        for (const auto& [key, node] : table) {
            if (std::optional<SettingValue> value = valueOf(node)) {
                add(section, key.str(), lineOf(node), std::move(*value));
            } else {
                const std::string name = std::string(section) + "." + std::string(key.str());
                reading_.errors.push_back({file_, lineOf(node), columnOf(node), displayedName(name),
                                           std::string(kindOf(node)) + " is no value of a setting"});
            }
        }
    }

    const std::string& file_;
    TomlReading reading_;
};

bool isBlank(char letter) { return letter == ' ' || letter == '\t'; }

std::string_view trimmed(std::string_view text) {
    while (!text.empty() && isBlank(text.front())) {
        text.remove_prefix(1);
    }
    while (!text.empty() && isBlank(text.back())) {
        text.remove_suffix(1);
    }
    return text;
}

std::string_view withoutMarks(std::string_view key) {
    const bool marked = key.size() >= 2 && key.front() == '"' && key.back() == '"';
    return marked ? key.substr(1, key.size() - 2) : key;
}

SettingValue optionValue(std::string_view text) {
    const std::string line = "value = " + std::string(text);
    if (text.size() <= kTomlBytes && text.find('\n') == std::string_view::npos && !findTomlRefusal(line)) {
        const toml::parse_result parsed = toml::parse(line);
        if (parsed) {
            const auto value = valueOf(*parsed.table().get("value"));
            return value ? *value : SettingValue(std::string(text));
        }
    }
    return SettingValue(std::string(text));
}

} // namespace

TomlReading readTomlSettings(std::string_view text, const std::string& file) {
    if (text.size() > kTomlBytes) {
        return {{}, {{file, 0, 0, "", "the file is larger than " + byteSizeText(kTomlBytes)}}};
    }
    if (std::optional<TomlRefusal> refusal = findTomlRefusal(text)) {
        return {{}, {{file, refusal->line, 0, "", std::move(refusal->reason)}}};
    }
    const toml::parse_result parsed = toml::parse(text);
    if (!parsed) {
        const auto& error = parsed.error();
        return {{},
                {{file, static_cast<int>(error.source().begin.line), static_cast<int>(error.source().begin.column), "",
                  escapedText(error.description())}}};
    }
    Collector collector(file);
    collector.collect(parsed.table());
    return std::move(collector).finish();
}

Result<RawSetting> readSettingOption(std::string_view option) {
    const std::size_t equals = option.find('=');
    const std::string_view name = trimmed(option.substr(0, equals));
    const std::size_t dot = name.find('.');
    if (equals == std::string_view::npos || dot == std::string_view::npos || dot == 0 || dot + 1 == name.size()) {
        return Failure{0, shownValue(std::string(option)) + " is not section.key=value"};
    }
    return RawSetting{std::string(name.substr(0, dot)),
                      std::string(withoutMarks(name.substr(dot + 1))),
                      optionValue(trimmed(option.substr(equals + 1))),
                      {SettingOrigin::Kind::CommandLine, "", 0}};
}

} // namespace vela::platform
