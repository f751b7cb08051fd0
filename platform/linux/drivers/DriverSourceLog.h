#pragma once

#include "platform/log.h"
#include "platform/services.h"

namespace halvox::platform::linux_ {

// The log category of everything in this folder.
inline LogCategory& driversCategory() {
  static LogCategory& category = log().createCategory("com.tarno.halvox", "drivers");
  return category;
}

}  // namespace halvox::platform::linux_
