// Whether a value may stand for a setting. Pure.
#pragma once

#include "common/SettingsTable.h"
#include "platform/Result.h"

namespace vela {

/// `value` in its checked form (numbers, sizes in bytes and milliseconds as integers), or the reason why `description`
/// does not allow it. Placeholders in paths stay.
platform::Result<SettingValue> checkSetting(const SettingDescription& description, const SettingValue& value);

} // namespace vela
