#include "common/SettingCheck.h"
#include "common/Settings.h"
#include "common/SettingsTable.h"
#include "platform/toml/TomlSettings.h"

#include <algorithm>
#include <cstddef>
#include <cstdint>
#include <cstdlib>
#include <string_view>

namespace {

/// Settings that were accepted are shown in a form that gives the same setting again.
void readBack(const vela::SettingInForce& setting) {
    const vela::SettingDescription* known = vela::findSetting(setting.section, setting.key);
    if (known == nullptr) {
        return; // a further feature
    }
    const auto option = vela::platform::readSettingOption(known->name() + "=" + setting.text);
    if (!option) {
        std::abort();
    }
    const auto checked = vela::checkSetting(*known, option->value);
    if (!checked || *checked != setting.value) {
        std::abort();
    }
}

} // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
    const std::string_view text(reinterpret_cast<const char*>(data), size);
    const vela::platform::TomlReading toml = vela::platform::readTomlSettings(text, "fuzzed.toml");
    const vela::SettingsReading reading = vela::mergeSettings(toml.settings, {});
    for (const auto* errors : {&toml.errors, &reading.errors}) {
        for (const vela::SettingError& error : *errors) {
            if (error.text().find('\n') != std::string::npos) {
                std::abort();
            }
        }
    }
    if (reading.settings.has_value() != reading.errors.empty()) {
        std::abort();
    }
    std::ranges::for_each(reading.inForce, readBack);
    (void)vela::platform::readSettingOption(text);
    return 0;
}
