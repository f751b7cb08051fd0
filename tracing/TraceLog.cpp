#include "tracing/TraceLog.h"

#include "platform/services.h"

namespace halvox {

platform::LogCategory& HVReportingTraceCategory() {
  // Not a namespace-scope variable: the log service is installed after static initialisation.
  static platform::LogCategory& category =
      platform::log().createCategory("com.tarno.halvox", "hvrt");
  return category;
}

}  // namespace halvox
