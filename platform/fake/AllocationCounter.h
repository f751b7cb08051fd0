#pragma once

#include <cstddef>

namespace halvox::platform {

// The number of allocations with `new` that the calling thread has made. A test program that is
// linked with this gets counting versions of the global operators. Tests of the hot path use it: an
// allocation that comes back is a mistake that no timing shows reliably.
std::size_t allocationsOfThisThread();

}  // namespace halvox::platform
