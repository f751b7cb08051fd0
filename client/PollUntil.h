#pragma once

#include <chrono>
#include <span>

#include <poll.h>

namespace halvox::client {

// Waits for events on the descriptors, at most until the deadline; time_point::max() stands for no
// deadline. Returns true if there is an event. Returns false after the deadline, and may return
// false earlier if a signal arrives. More precise than poll(), which has a resolution of a
// millisecond.
bool pollUntil(std::span<pollfd> polled, std::chrono::steady_clock::time_point deadline);

}  // namespace halvox::client
