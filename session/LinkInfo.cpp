#include "session/LinkInfo.h"

#include <string>

#include "backends/HVReportingUtility.h"
#include "session/SessionLog.h"

namespace halvox {

using platform::Dictionary;

Dictionary LinkStart::sessionInfo(ReporterID reporterID,
                                  const platform::TLMSecureHierarchyToken& token) const {
  const bool batch = HVReportingUtilityShouldBatchTLMReportingEventsForServiceType(serviceType);
  // Both keys about batching are required, although each is the negation of the other.
  Dictionary info{{platform::kTLMReportingSessionInfoClientType, kLinkClientType},
                  {platform::kTLMReportingSessionInfoClientVersion, kHVReportingVersionNumber},
                  {platform::kTLMReportingSessionInfoSessionID, number(reporterID)},
                  {platform::kTLMReportingSessionInfoBatchEvent, batch},
                  {platform::kTLMReportingSessionInfoHierarchyToken, token.text()},
                  {platform::kTLMReportingSessionInfoContainsRealtimeEvents, !batch}};
  if (const platform::Value* bundle = configuration.find("HostApplicationDisplayID")) {
    info.set(platform::kTLMReportingSessionInfoClientBundleID, *bundle);
  }
  return info;
}

Dictionary LinkStart::userInfo() const {
  Dictionary info{
      {platform::kTLMReportingUserInfoClientName, kLinkClientName},
      {platform::kTLMReportingUserInfoServiceName, std::string(serviceName) + "_session"}};
  // Added last: an entry of the configuration replaces the service's own entry of the same key.
  // This is required.
  info.merge(configuration);
  return info;
}

}  // namespace halvox
