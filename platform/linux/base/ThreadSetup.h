#pragma once

#include <string_view>

#include "platform/dispatch.h"

namespace halvox::platform::linux_ {

// What each thread of the adapters does first: takes the name that tools show (of a dotted label
// the last words that fit into 15 bytes) and leaves all signals to the main thread.
void setUpThread(std::string_view label);

// The same for a thread that works at a quality of service: utility and background work give way to
// requests. Lowers the priority of the calling thread, for good, by 5 or 10 steps of niceness below
// the main thread. Nothing may wait on such a thread that must not be as slow.
void setUpThread(std::string_view label, QualityOfService quality);

}  // namespace halvox::platform::linux_
