#pragma once

#include <string_view>

#include "platform/linux/connection/wire/WireReader.h"

namespace halvox::platform::linux_::dbus {

// Skips one value of any valid type, and checks it by the rules of the wire. Returns false if the
// value breaks a rule, such as the limit of kMaxNesting levels. problem() of the reader then says
// which rule.
[[nodiscard]] bool skipValue(WireReader& reader, std::string_view type);

}  // namespace halvox::platform::linux_::dbus
