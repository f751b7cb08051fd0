#pragma once

#include <cstddef>

namespace halvox::platform {

// The number of allocations with `new` that the calling thread has made. A test program that is
// linked with this library gets counting versions of the global operators. Tests of the hot path
// use it, because a change must not add an allocation there and timing does not reliably show one.
std::size_t allocationsOfThisThread();

}  // namespace halvox::platform
