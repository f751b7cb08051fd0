#pragma once

#include <string_view>

namespace halvox::platform::linux_::dbus {

// True for well-formed UTF-8 without a NUL, which is all that a text on the wire may be: no
// surrogates, no overlong forms, nothing past U+10FFFF.
[[nodiscard]] bool isWireText(std::string_view text);

}  // namespace halvox::platform::linux_::dbus
