#pragma once

#include <string>
#include <string_view>

namespace halvox::platform::linux_ {

// Whether a name from outside (a user, a domain, a notification) may become the name of a file: not
// empty, not "." or "..", without "/" and NUL, and short enough for a file system with whatever
// ending the file gets.
bool isUsableName(std::string_view name);

// A name in quotes, shortened and on one line, as messages show one that is not usable.
std::string shownName(std::string_view name);

}  // namespace halvox::platform::linux_
