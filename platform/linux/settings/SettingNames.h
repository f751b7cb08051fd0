#pragma once

#include <string>
#include <string_view>

namespace halvox::platform::linux_ {

// Returns true when a name from outside (of a user, a domain or a notification) may become part of
// a file name. It must not be empty, "." or "..", must not contain "/" or NUL, and may have at most
// 200 bytes, which leaves enough for an extension.
bool isUsableName(std::string_view name);

// Returns a name for use in a message: in quotes, escaped, on one line and at most 60 bytes long.
std::string shownName(std::string_view name);

}  // namespace halvox::platform::linux_
