// velactl defaults
#include "cli/JsonReading.h"
#include "cli/SettingsArguments.h"
#include "cli/Subcommand.h"
#include "common/SettingValues.h"
#include "common/values/Json.h"
#include "platform/linux/LinuxFileSystem.h"
#include "platform/linux/LinuxPreferencesEditing.h"
#include "platform/plist/PropertyListCodec.h"

#include <ostream>
#include <vector>

namespace vela {

namespace {

int fail(const platform::Failure& failure, Console& console) {
    console.error << "velactl: " << escapedText(failure.description) << '\n';
    return kFailed;
}

int failMissing(std::string_view domain, std::string_view key, Console& console) {
    return fail({0, std::string(domain) + " has no " + std::string(key)}, console);
}

int read(const platform::LinuxPreferencesEditing& preferences, std::span<const std::string> words, Console& console) {
    const platform::Result<Dictionary> all = preferences.readAll(words[1]);
    if (!all) {
        return fail(all.failure(), console);
    }
    if (words.size() == 2) {
        console.out << jsonText(Value(*all), JsonLayout::Pretty) << '\n';
        return kDone;
    }
    const ValueRef value = all->find(words[2]);
    if (!value) {
        return failMissing(words[1], words[2], console);
    }
    console.out << jsonText(value, JsonLayout::Pretty) << '\n';
    return kDone;
}

/// What is no JSON is a text, so that most texts need no quotation marks of their own.
Value valueOf(std::string_view text) {
    platform::Result<Value> value = readJson(text);
    return value ? *std::move(value) : Value(text);
}

int write(platform::LinuxPreferencesEditing& preferences, std::span<const std::string> words, Console& console) {
    const platform::Result<platform::Done> written = preferences.write(words[1], words[2], valueOf(words[3]));
    return written ? kDone : fail(written.failure(), console);
}

int remove(platform::LinuxPreferencesEditing& preferences, std::span<const std::string> words, Console& console) {
    const platform::Result<bool> removed = preferences.remove(words[1], words[2]);
    if (!removed) {
        return fail(removed.failure(), console);
    }
    return *removed ? kDone : failMissing(words[1], words[2], console);
}

bool isUsage(std::span<const std::string> words) {
    return (words[0] == "read" && (words.size() == 2 || words.size() == 3)) ||
           (words[0] == "write" && words.size() == 4) || (words[0] == "delete" && words.size() == 3);
}

} // namespace

int runDefaults(std::span<const std::string_view> arguments, Console& console) {
    const platform::Result<CommandArguments> given = readArguments(arguments, kSettingsOptions);
    if (!given) {
        return refuseUsage("defaults", given.failure().description, console);
    }
    const std::span<const std::string> words(given->operands);
    if (words.empty() || !isUsage(words)) {
        return refuseUsage("defaults", "these arguments make no sense", console);
    }
    const auto loaded = loadSettingsOf(*given, console);
    if (!loaded) {
        return kFailed;
    }
    platform::LinuxFileSystem files;
    const platform::PropertyListCodec propertyLists;
    platform::LinuxPreferencesEditing preferences(loaded->reading.settings->paths.state, files, propertyLists);
    if (words[0] == "read") {
        return read(preferences, words, console);
    }
    return words[0] == "write" ? write(preferences, words, console) : remove(preferences, words, console);
}

} // namespace vela
