// Counts the allocations of each thread in the program that this is linked into.
#pragma once

#include <cstdint>

namespace vela {

/// Allocations by `operator new` on the calling thread so far.
std::uint64_t allocationsOfThisThread();

} // namespace vela
