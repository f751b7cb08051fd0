#include "tracing/TraceLog.h"

#include "platform/services.h"

namespace halvox {

platform::LogCategory& HVReportingTraceCategory() {
  static platform::LogCategory& category =
      platform::log().createCategory("com.tarno.halvox", "hvrt");
  return category;
}

}  // namespace halvox
