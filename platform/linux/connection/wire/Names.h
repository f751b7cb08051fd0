#pragma once

#include <cstddef>
#include <string_view>

// The rules for the names that a header may carry.
namespace halvox::platform::linux_::dbus {

inline constexpr std::size_t kMaxNameBytes = 255;

// "/", or "/element/element"; elements are of letters, digits and underscores.
[[nodiscard]] bool isObjectPath(std::string_view text);
// Two or more elements between dots, none of which starts with a digit. Errors are named so too.
[[nodiscard]] bool isInterfaceName(std::string_view text);
// One such element.
[[nodiscard]] bool isMemberName(std::string_view text);
// As an interface, where hyphens may be too; or ":" and elements that may start with a digit.
[[nodiscard]] bool isBusName(std::string_view text);

}  // namespace halvox::platform::linux_::dbus
