// XML and binary property lists, written by libplist. Pure functions.
//
// libplist 2.2 has its own ways, which are evened out here or refused:
// - its constructors take 64-bit integers for signed and dates as 32-bit seconds, so unsigned integers and dates are
// made
//   by its binary reader, from a list of one object;
// - it writes control characters and CR into XML as they are: the former are refused, CR becomes a reference;
// - its strings end at NUL: refused.
#pragma once

#include "platform/PropertyListReading.h"

namespace vela::platform::plist {

/// Of the value to write: containers inside each other, the same as readers take.
constexpr std::size_t kDeepestWritten = PropertyListLimits{}.depth;

/// Dates have whole seconds, a fraction is dropped (toward the past), and only the years 1000 to 9999 are taken; reals,
/// whatever their width, are one kind, and -0.0 is written as 0.0.
Result<std::string> writeXml(ValueRef value);

/// A real that a float holds exactly is written as one of 4 bytes, every other as one of 8.
Result<std::string> writeBinary(ValueRef value);

} // namespace vela::platform::plist
