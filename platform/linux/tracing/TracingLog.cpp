#include "platform/linux/tracing/TracingLog.h"

#include "platform/services.h"

namespace halvox::platform::linux_ {

LogCategory& tracingCategory() {
  // Made at the first call: the log service is installed after static initialisation.
  static LogCategory& category = platform::log().createCategory("com.tarno.halvox", "tracing");
  return category;
}

}  // namespace halvox::platform::linux_
