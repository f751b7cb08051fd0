#pragma once

#include <string>

#include "platform/linux/base/Result.h"

namespace halvox::tools {

// Looks the terminal of standard output up by its type, which TERM names. Fails with the reason if
// it cannot show a screen.
[[nodiscard]] platform::linux_::Result<void> checkTerminalType();

}  // namespace halvox::tools
