#include "backends/HVReportingVocabulary.h"

#include "platform/log.h"
#include "platform/services.h"

namespace halvox {
namespace {

platform::LogCategory& makeCategory(std::string_view name) {
  return platform::log().createCategory(kHVReportingLogSubsystem, name);
}

}  // namespace

// The category is made on first use and kept for the life of the process; this is required.
platform::LogCategory& HVReportingClientCategory() {
  static platform::LogCategory& category = makeCategory("hvrc");
  return category;
}

platform::LogCategory& HVReportingServiceDelegateCategory() {
  static platform::LogCategory& category = makeCategory("hvrs");
  return category;
}

platform::LogCategory& HVReportingSessionCategory() {
  static platform::LogCategory& category = makeCategory("hvrr");
  return category;
}

platform::LogCategory& HVReportingSessionTLMReportingCategory() {
  static platform::LogCategory& category = makeCategory("hvri");
  return category;
}

platform::LogCategory& HVReportingDriverUtilityCategory() {
  static platform::LogCategory& category = makeCategory("hvrd");
  return category;
}

platform::LogCategory& HVReportingJoulebookCategory() {
  static platform::LogCategory& category = makeCategory("hvrp");
  return category;
}

platform::LogCategory& HVReportingZUBLogCategory() {
  static platform::LogCategory& category = makeCategory("hvra");
  return category;
}

platform::LogCategory& HVReportingVEKLogCategory() {
  static platform::LogCategory& category = makeCategory("hvrb");
  return category;
}

}  // namespace halvox
