// The service's defaults as the preferences of "com.orvex.vela" hold them. A free function, callable from any thread.
#pragma once

#include "common/values/Dictionary.h"
#include "platform/Preferences.h"

namespace vela {

/// "device_name", a string, where one is set; "disable_reporting", a boolean, always: false where it is not set. Read
/// once by each call.
Dictionary VelaReportingDefaults(const platform::Preferences& preferences);

} // namespace vela
