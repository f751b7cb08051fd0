#include "backends/HVReportingEventNames.h"

#include "backends/HVReportingUtility.h"

namespace halvox {
namespace {

HVReportingEventName nameOf(std::string_view service, AudioEventCategory category,
                            AudioEventType type) {
  const HVReportingCategoryText text = HVReportingUtilityCategoryTextParts(category);
  return {
      "com.tarno.", service, ".", text.domain, text.name, ".", HVReportingUtilityTypeString(type)};
}

}  // namespace

HVReportingEventNames::HVReportingEventNames(AudioEventCategory category, AudioEventType type,
                                             AudioServiceType serviceType)
    : ofAll(nameOf("halvox", category, type)),
      ofService(nameOf(HVReportingUtilityGenerateServiceNameFromServiceType(serviceType), category,
                       type)) {}

}  // namespace halvox
