#pragma once

#include "platform/log.h"

namespace halvox::platform::linux_ {

// The log category of the adapters of this folder; made when it is first used.
LogCategory& tracingCategory();

}  // namespace halvox::platform::linux_
