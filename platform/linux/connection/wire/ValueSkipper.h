#pragma once

#include <string_view>

#include "platform/linux/connection/wire/WireReader.h"

namespace halvox::platform::linux_::dbus {

// Goes over one value of any sound type, checking it as the wire demands and keeping nothing.
// False when it breaks a rule, nests deeper than kMaxNesting among them; the reader has the
// problem.
[[nodiscard]] bool skipValue(WireReader& reader, std::string_view type);

}  // namespace halvox::platform::linux_::dbus
