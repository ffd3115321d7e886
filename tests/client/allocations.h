#pragma once

#include <cstddef>
#include <limits>

namespace appsync {

// What this thread takes with new, the plug-in's object included.

inline constexpr unsigned EndlessAllocations = std::numeric_limits<unsigned>::max();
/// After so many more allocations the memory of this thread is used up.
extern thread_local unsigned allocationsLeft;
/// All that was ever taken.
extern thread_local std::size_t allocatedBytes;

}  // namespace appsync
