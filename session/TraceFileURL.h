// Paths of file URLs. Pure functions.
#pragma once

#include <string>
#include <string_view>

namespace vela {

/// "/tmp/a b" of "file:///tmp/a%20b", a host being passed over; what is no file URL comes back as it is.
std::string pathOfFileURL(std::string_view url);

} // namespace vela
