#pragma once

#include <cstddef>
#include <optional>
#include <string_view>

namespace halvox::platform::linux_ {

// So many levels may the tables and arrays of a file have, one in another.
inline constexpr std::size_t kDeepestNesting = 256;

// The first line, from 1 on, at which the keys, tables and arrays of a TOML text may be nested
// deeper than that; none when they never are. The parser bounds brackets but no dots: a line of a
// hundred thousand of them, as in "a.a.a = 1", makes as many tables, and all that walks through
// them afterwards would run out of stack. A text that is no TOML is judged up to its first mistake
// at least.
std::optional<std::size_t> lineNestedTooDeep(std::string_view text);
inline bool isNestedTooDeep(std::string_view text) { return lineNestedTooDeep(text).has_value(); }

}  // namespace halvox::platform::linux_
