#pragma once

#include "platform/log.h"

namespace halvox::platform::linux_ {

// The category that all units of the connection adapter log under.
LogCategory& connectionCategory();

}  // namespace halvox::platform::linux_
