#pragma once

#include <optional>
#include <string>
#include <string_view>

namespace halvox::platform::linux_ {

// What is wrong with a pattern for fnmatch(3) with FNM_NOESCAPE, and at which character; nothing if
// it is a pattern. fnmatch itself never reports a mistake: it takes a list without an end for
// ordinary characters, and a range such as `z-a` for an empty one. The pattern would match nothing,
// and a rule with a slip of the pen would silently protect nothing.
//
// Refuses also what the service does not need and what works differently in other locales: `[=a=]`,
// `[.a.]`, and characters other than those of ASCII within a list.
std::optional<std::string> findPatternMistake(std::string_view pattern);

}  // namespace halvox::platform::linux_
