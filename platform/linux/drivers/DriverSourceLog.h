#pragma once

#include "platform/log.h"

namespace halvox::platform::linux_ {

// The log category that the service gives to the sources and their readers. A program without a log
// service, such as halvoxctl, gives them one of its own.
inline LogCategory& driversCategory(LogService& log) {
  return log.createCategory("com.tarno.halvox", "drivers");
}

}  // namespace halvox::platform::linux_
