#pragma once

#include "platform/log.h"

namespace halvox::platform::linux_ {

// The log category of the adapters in this folder. The first call makes it. Any thread may call.
LogCategory& tracingCategory();

}  // namespace halvox::platform::linux_
