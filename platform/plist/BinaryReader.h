// Reader of binary property lists (drawn in BinaryLayout.h). Pure function.
//
// An object that several containers refer to is made once and shared, so memory stays in proportion to the input; the
// limits count each use of it all the same, for whoever then writes the value out. Integers of 8 bytes are signed, of
// 16 bytes must fit 64 bits unsigned; reals of 4 bytes are `ValueKind::Real32`.
#pragma once

#include "platform/PropertyListReading.h"

namespace vela::platform::plist {

/// So many times the limit `bytes` may the strings, keys and data have together, each use of a shared one counted.
/// UTF-16 text alone may grow by half as UTF-8.
constexpr std::size_t kExpandedBytesFactor = 4;

/// Takes time and memory in proportion to the input. A failure names the byte.
Result<Value> readBinary(std::string_view bytes, const PropertyListLimits& limits);

} // namespace vela::platform::plist
