// The times that every client gives its messages.
#pragma once

#include "cli/Operations.h"
#include "platform/Clock.h"

#include <vector>

namespace vela {

/// Sets "velareporting_timestamp", "systemuptime_sec" and "processuptime_ms" where `arguments` are those of a sent
/// message that has not got them. `processStart` is a time of the clock's.
void addMessageTimes(const Operation& operation, std::vector<Value>& arguments, const platform::Clock& clock,
                     platform::MonotonicTime processStart);

} // namespace vela
