#pragma once

#include "platform/log.h"

namespace halvox::platform::linux_ {

// The log category of the connection adapter.
LogCategory& connectionCategory();

}  // namespace halvox::platform::linux_
