#include "platform/linux/connection/ConnectionLog.h"

#include "platform/services.h"

namespace halvox::platform::linux_ {

LogCategory& connectionCategory() {
  static LogCategory& category = log().createCategory("com.tarno.halvox", "connection");
  return category;
}

}  // namespace halvox::platform::linux_
