#include "cli/SettingsArguments.h"

#include "platform/host/HostFacts.h"
#include "platform/linux/LinuxFileSystem.h"

#include <ostream>

namespace vela {

std::optional<platform::LoadedSettings> loadSettingsOf(const CommandArguments& arguments, Console& console) {
    platform::SettingsRequest request{std::nullopt, arguments.valuesOf("--set"), platform::processEnvironment()};
    if (const std::vector<std::string> files = arguments.valuesOf("--settings"); !files.empty()) {
        request.file = files.back();
    }
    platform::LoadedSettings loaded = platform::loadSettings(request, platform::LinuxFileSystem());
    for (const SettingError& error : loaded.reading.errors) {
        console.error << error.text() << '\n';
    }
    if (!loaded.reading.settings) {
        return std::nullopt;
    }
    return loaded;
}

} // namespace vela
