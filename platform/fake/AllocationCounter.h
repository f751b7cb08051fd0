#pragma once

#include <cstddef>

namespace halvox::platform {

// How often the calling thread has allocated with `new`. A test program that is linked with this
// gets counting versions of the global operators.
std::size_t allocationsOfThisThread();

}  // namespace halvox::platform
