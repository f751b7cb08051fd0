#pragma once

#include "platform/log.h"
#include "platform/services.h"

namespace halvox::platform::linux_ {

// The log category of everything in this folder. The first call makes it; any thread may call.
inline LogCategory& settingsCategory() {
  static LogCategory& category = platform::log().createCategory("com.tarno.halvox", "settings");
  return category;
}

}  // namespace halvox::platform::linux_
