// The hash function SHA-256 (FIPS 180-4). Pure.
#pragma once

#include <string>
#include <string_view>

namespace vela::reporter {

/// 64 hexadecimal digits.
std::string sha256(std::string_view bytes);

} // namespace vela::reporter
