#pragma once

#include <cstddef>

namespace halvox::platform {

// The number of allocations with `new` that the calling thread has made. A test program that is
// linked with this gets counting versions of the global operators. Tests of the hot path use it: an
// allocation that a change adds there is a mistake, and timing does not show it reliably.
std::size_t allocationsOfThisThread();

}  // namespace halvox::platform
