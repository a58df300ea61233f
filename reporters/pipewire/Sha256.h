// The hash function SHA-256.
#pragma once

#include <string>
#include <string_view>

namespace vela::reporter {

/// 64 hexadecimal digits; none where the system's policy forbids the function.
std::string sha256(std::string_view bytes);

} // namespace vela::reporter
