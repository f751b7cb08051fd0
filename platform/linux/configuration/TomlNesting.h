#pragma once

#include <cstddef>
#include <optional>
#include <string_view>

namespace halvox::platform::linux_ {

// The most levels of tables and arrays in a file. Code that walks them recurses.
inline constexpr std::size_t kDeepestNesting = 256;

// Returns the number of the first line, counted from 1, at which keys, tables and arrays may be
// nested deeper than kDeepestNesting. Returns std::nullopt if there is none. toml++ limits the
// depth of brackets, but not the number of dots in a key. A key such as "a.a.a" with 100,000 dots
// makes as many tables, and code that walks them overflows the stack. In a text that is not TOML,
// at least the part before the first mistake is checked.
std::optional<std::size_t> lineNestedTooDeep(std::string_view text);
inline bool isNestedTooDeep(std::string_view text) { return lineNestedTooDeep(text).has_value(); }

}  // namespace halvox::platform::linux_
