#pragma once

#include <cstddef>
#include <string_view>

// The rules of D-Bus for names in a header.
namespace halvox::platform::linux_::dbus {

inline constexpr std::size_t kMaxNameBytes = 255;

// "/", or "/element/element". Elements consist of letters, digits and underscores.
[[nodiscard]] bool isObjectPath(std::string_view text);
// Two or more such elements, separated by dots. No element starts with a digit. Names of errors
// follow the same rule.
[[nodiscard]] bool isInterfaceName(std::string_view text);
// One such element.
[[nodiscard]] bool isMemberName(std::string_view text);
// A well-known name, which may also contain hyphens, or a unique name: ":" and elements that may
// start with a digit.
[[nodiscard]] bool isBusName(std::string_view text);

}  // namespace halvox::platform::linux_::dbus
