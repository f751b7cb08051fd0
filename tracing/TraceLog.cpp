#include "tracing/TraceLog.h"

#include "platform/services.h"

namespace halvox {

platform::LogCategory& HVReportingTraceCategory() {
  // The category is made on first use and kept for the life of the process; this is required.
  static platform::LogCategory& category =
      platform::log().createCategory("com.tarno.halvox", "hvrt");
  return category;
}

}  // namespace halvox
