#pragma once

#include "platform/log.h"
#include "platform/services.h"

namespace halvox::platform::linux_ {

// Where a program without installed services wants the lines of this folder. Set before any source
// is made; the category outlives them.
inline LogCategory*& ownDriversCategory() {
  static LogCategory* category = nullptr;
  return category;
}

// The log category of everything in this folder.
inline LogCategory& driversCategory() {
  static LogCategory& category = ownDriversCategory() != nullptr
                                     ? *ownDriversCategory()
                                     : log().createCategory("com.tarno.halvox", "drivers");
  return category;
}

}  // namespace halvox::platform::linux_
