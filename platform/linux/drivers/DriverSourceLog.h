#pragma once

#include "platform/log.h"
#include "platform/services.h"

namespace halvox::platform::linux_ {

// The category for a program that has not installed the services, such as halvoxctl. Set it before
// any source is made; it must outlive them.
inline LogCategory*& ownDriversCategory() {
  static LogCategory* category = nullptr;
  return category;
}

// The log category of everything in this folder. Any thread may call.
inline LogCategory& driversCategory() {
  static LogCategory& category = ownDriversCategory() != nullptr
                                     ? *ownDriversCategory()
                                     : log().createCategory("com.tarno.halvox", "drivers");
  return category;
}

}  // namespace halvox::platform::linux_
