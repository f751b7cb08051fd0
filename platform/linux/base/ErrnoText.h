#pragma once

#include <string>

namespace halvox::platform::linux_ {

// Returns the system's text for an errno, such as "No such file or directory" for ENOENT, and
// "Unknown error 9999" for a number that the system does not know. Any thread may call it. Does not
// change errno.
[[nodiscard]] std::string errnoText(int error);

}  // namespace halvox::platform::linux_
