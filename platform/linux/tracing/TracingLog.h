#pragma once

#include <string_view>

#include "platform/object_log.h"

namespace halvox::platform::linux_ {

// The log of one object, in the category that all objects of this folder share.
inline ObjectLog tracingLog(LogService& log, std::string_view unit) {
  return {log.createCategory("com.tarno.halvox", "tracing"), unit};
}

}  // namespace halvox::platform::linux_
