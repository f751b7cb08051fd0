#pragma once

#include <cstddef>
#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

namespace halvox::platform::linux_ {

// The most levels of tables and arrays in a file. Code that walks them recurses.
inline constexpr std::size_t kDeepestNesting = 256;

// A place in a text that toml++ must not be given.
struct TomlTrouble {
  enum class Kind : std::uint8_t { kTooDeep, kCharacter };
  Kind kind = Kind::kTooDeep;
  std::size_t line = 1;
  // What was expected and found there, as part of a message for the user.
  [[nodiscard]] std::string description() const;
};

// Returns the first such place; std::nullopt if there is none. In a text that is not TOML, at least
// the part before the first mistake is checked.
//
// - Keys, tables and arrays may be nested deeper than kDeepestNesting. toml++ limits the depth of
//   brackets, but not the number of dots in a key. A key such as "a.a.a" with 100,000 dots makes as
//   many tables, and code that walks them overflows the stack.
// - A control character or one that is not ASCII is outside quotes and comments, where TOML has
//   none. For some of them the behaviour of toml++ is undefined.
std::optional<TomlTrouble> findTomlTrouble(std::string_view text);

}  // namespace halvox::platform::linux_
