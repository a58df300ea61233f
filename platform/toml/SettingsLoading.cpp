#include "platform/toml/SettingsLoading.h"

#include "platform/toml/TomlSettings.h"

#include <algorithm>
#include <iterator>
#include <system_error>

namespace vela::platform {

namespace {

/// What all layers gave, before it is merged.
struct Layers {
    std::vector<RawSetting> settings;
    std::vector<SettingError> errors;
};

bool isMissing(const Failure& failure) {
    return failure.code == static_cast<int>(std::errc::no_such_file_or_directory) ||
           failure.code == static_cast<int>(std::errc::not_a_directory);
}

/// Whether the file was there to be read.
bool addFile(Layers& layers, const std::string& file, bool required, const FileSystem& files) {
    const std::string path = file.starts_with('/') ? file : files.currentDirectory() + "/" + file;
    const Result<std::string> text = files.readFile(path, kTomlBytes);
    if (!text) {
        if (required || !isMissing(text.failure())) {
            layers.errors.push_back({file, 0, 0, "", text.failure().description});
        }
        return false;
    }
    TomlReading reading = readTomlSettings(*text, file);
    std::ranges::move(reading.settings, std::back_inserter(layers.settings));
    std::ranges::move(reading.errors, std::back_inserter(layers.errors));
    return true;
}

void addOptions(Layers& layers, const std::vector<std::string>& options) {
    for (const std::string& option : options) {
        Result<RawSetting> setting = readSettingOption(option);
        if (setting) {
            layers.settings.push_back(*std::move(setting));
        } else {
            layers.errors.push_back({"--set", 0, 0, "", setting.failure().description});
        }
    }
}

} // namespace

LoadedSettings loadSettings(const SettingsRequest& request, const FileSystem& files, const std::string& standardFile) {
    Layers layers;
    LoadedSettings loaded;
    const std::string file = request.file.value_or(standardFile);
    if (addFile(layers, file, request.file.has_value(), files)) {
        loaded.file = file;
    }
    addOptions(layers, request.options);
    loaded.reading = mergeSettings(layers.settings, request.environment);
    if (!layers.errors.empty()) {
        std::ranges::move(loaded.reading.errors, std::back_inserter(layers.errors));
        loaded.reading = {std::nullopt, {}, std::move(layers.errors)};
    }
    return loaded;
}

} // namespace vela::platform
