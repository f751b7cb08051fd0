#pragma once

#include <string_view>

namespace halvox::platform::linux_ {

// What each thread of the adapters does first: takes the name that tools show (of a dotted label
// the last words that fit into 15 bytes) and leaves all signals to the main thread.
void setUpThread(std::string_view label);

}  // namespace halvox::platform::linux_
