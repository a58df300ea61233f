// Compares what our readers read with what libplist reads from the same bytes. For tests and fuzz targets.
#pragma once

#include "platform/PropertyListReading.h"

#include <optional>
#include <string>
#include <string_view>

namespace vela::platform::plist {

/// Where the two differ, as a path from the top and what is different there; none when they agree. Leaves out what
/// libplist 2.2 is known to read otherwise: CR in XML, <key/>, empty UTF-16 strings, dictionaries with the key
/// "CF$UID", strings behind NUL (in a key it ends the process), the sign of integers, dates beyond 32 bits of seconds
/// and fractions of a second.
std::optional<std::string> differenceFromLibplist(ValueRef value, std::string_view bytes, PropertyListFormat format);

} // namespace vela::platform::plist
