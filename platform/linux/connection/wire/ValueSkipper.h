#pragma once

#include <string_view>

#include "platform/linux/connection/wire/WireReader.h"

namespace halvox::platform::linux_::dbus {

// Skips one value of any valid type, and checks it by the rules of the wire. False if it breaks a
// rule, including the limit of kMaxNesting levels; the reader then has the problem.
[[nodiscard]] bool skipValue(WireReader& reader, std::string_view type);

}  // namespace halvox::platform::linux_::dbus
