// velactl defaults
#include "cli/JsonReading.h"
#include "cli/SettingsArguments.h"
#include "cli/Subcommand.h"
#include "cli/TextTable.h"
#include "common/SettingValues.h"
#include "common/values/Dictionary.h"
#include "common/values/Json.h"
#include "platform/linux/LinuxFileSystem.h"
#include "platform/linux/LinuxPreferencesEditing.h"
#include "platform/plist/PropertyListCodec.h"

#include <algorithm>
#include <array>
#include <optional>
#include <ostream>

namespace vela {

namespace {

int fail(const platform::Failure& failure, Console& console) {
    console.error << "velactl: " << escapedText(failure.description) << '\n';
    return kFailed;
}

constexpr std::array<CommandOption, 3> kDefaultsOptions{{{"--settings", true}, {"--set", true}, {"--json"}}};

int failMissing(std::string_view domain, std::string_view key, Console& console) {
    return fail({0, std::string(domain) + " has no " + std::string(key)}, console);
}

void printJson(std::string_view key, ValueRef value, std::ostream& out) {
    out << jsonText(Value(Dictionary{{"key", key}, {"value", Value(value)}})) << '\n';
}

/// Every key of a domain.
int list(const Dictionary& all, bool json, Console& console) {
    TextTable table({"KEY", "VALUE"});
    for (const auto& preference : all) {
        if (json) {
            printJson(preference.key.text(), preference.value, console.out);
        } else {
            table.add({escapedText(preference.key.text()), jsonText(preference.value)});
        }
    }
    if (!json && all.empty()) {
        console.out << "No preferences\n";
    } else if (!json) {
        table.print(console.out, console.colour);
    }
    return kDone;
}

int read(const platform::LinuxPreferencesEditing& preferences, std::span<const std::string> words, bool json,
         Console& console) {
    const platform::Result<Dictionary> all = preferences.readAll(words[1]);
    if (!all) {
        return fail(all.failure(), console);
    }
    if (words.size() == 2) {
        return list(*all, json, console);
    }
    const ValueRef value = all->find(words[2]);
    if (!value) {
        return failMissing(words[1], words[2], console);
    }
    if (json) {
        printJson(words[2], value, console.out);
    } else {
        console.out << jsonText(value, JsonLayout::Pretty) << '\n';
    }
    return kDone;
}

/// What is no JSON is a text, so that most texts need no quotation marks of their own; but not what looks like JSON.
platform::Result<Value> valueOf(std::string_view text) {
    platform::Result<Value> value = readJson(text);
    if (value) {
        return value;
    }
    const bool looksLikeNumber = !text.empty() && text.find_first_not_of("0123456789+-.eE") == std::string_view::npos;
    if (looksLikeNumber || text == "null" || text.starts_with('{') || text.starts_with('[') || text.starts_with('"')) {
        return platform::Failure{0,
                                 value.failure().description + "; a text like this needs quotation marks of its own"};
    }
    return Value(text);
}

int write(platform::LinuxPreferencesEditing& preferences, std::span<const std::string> words, Console& console) {
    const platform::Result<Value> value = valueOf(words[3]);
    if (!value) {
        return fail(value.failure(), console);
    }
    const platform::Result<platform::Done> written = preferences.write(words[1], words[2], *value);
    return written ? kDone : fail(written.failure(), console);
}

int remove(platform::LinuxPreferencesEditing& preferences, std::span<const std::string> words, Console& console) {
    const bool one = words.size() > 2;
    const platform::Result<bool> removed =
        one ? preferences.remove(words[1], words[2]) : preferences.removeAll(words[1]);
    if (!removed) {
        return fail(removed.failure(), console);
    }
    return *removed ? kDone : failMissing(words[1], one ? words[2] : "preferences", console);
}

/// A verb and how many words stand behind it: of a domain, a key and a value.
struct Verb {
    std::string_view name;
    std::size_t needed;
    std::size_t most;
};

constexpr std::array<Verb, 3> kVerbs{{{"read", 1, 2}, {"write", 3, 3}, {"delete", 1, 2}}};

/// What is missing or too much; none when the arguments can be used.
std::optional<std::string> faultOf(const CommandArguments& given) {
    constexpr std::array<const char*, 3> kWords{"a domain", "a key", "a value"};
    const std::span<const std::string> words(given.operands);
    if (words.empty()) {
        return "read, write or delete is missing";
    }
    const auto* const verb = std::ranges::find(kVerbs, words[0], &Verb::name);
    if (verb == kVerbs.end()) {
        return "there is no " + quotedText(words[0]) + ", but read, write and delete";
    }
    const std::size_t count = words.size() - 1;
    if (count < verb->needed) {
        return std::string(verb->name) + ": " + kWords[count] + " is missing";
    }
    if (count > verb->most) {
        return std::string(verb->name) + ": there is nothing to do with " + quotedText(words[verb->most + 1]);
    }
    if (verb->name != "read" && given.has("--json")) {
        return std::string(verb->name) + " has nothing to print: --json goes with read";
    }
    return std::nullopt;
}

} // namespace

int runDefaults(std::span<const std::string_view> arguments, Console& console) {
    const platform::Result<CommandArguments> given = readArguments(arguments, kDefaultsOptions);
    if (!given) {
        return refuseUsage("defaults", given.failure().description, console);
    }
    if (const std::optional<std::string> fault = faultOf(*given)) {
        return refuseUsage("defaults", *fault, console);
    }
    const std::span<const std::string> words(given->operands);
    const auto loaded = loadSettingsOf(*given, console);
    if (!loaded) {
        return kFailed;
    }
    platform::LinuxFileSystem files;
    const platform::PropertyListCodec propertyLists;
    platform::LinuxPreferencesEditing preferences(loaded->reading.settings->paths.state, files, propertyLists);
    if (words[0] == "read") {
        return read(preferences, words, given->has("--json"), console);
    }
    return words[0] == "write" ? write(preferences, words, console) : remove(preferences, words, console);
}

} // namespace vela
