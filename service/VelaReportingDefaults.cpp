#include "service/VelaReportingDefaults.h"

#include "service/FeatureKeys.h"

#include <string_view>

namespace vela {

namespace {

constexpr std::string_view kDisableReporting = "disable_reporting";

} // namespace

Dictionary VelaReportingDefaults(const platform::Preferences& preferences) {
    DictionaryBuilder defaults;
    if (Value deviceName = preferences.copyValue(kVelaDomain, kDeviceName); deviceName.ref().isString()) {
        defaults.add(kDeviceName, std::move(deviceName));
    }
    const Value disabled = preferences.copyValue(kVelaDomain, kDisableReporting);
    defaults.add(kDisableReporting, disabled.ref().booleanValue(false));
    return defaults.build();
}

} // namespace vela
