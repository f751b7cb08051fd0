#pragma once

#include <string_view>

#include "backends/HVReportingVocabulary.h"
#include "platform/tlm_reporting.h"
#include "platform/value.h"

namespace halvox {

// How the service identifies itself to the real-time framework, in every session info.
inline constexpr int kLinkClientType = 19;
inline constexpr double kHVReportingVersionNumber = 2.1;
// How the service identifies itself in every user info.
inline constexpr std::string_view kLinkClientName = "com.tarno.halvox";

// The state of a session at the moment of its start, for the framework. The link's start job runs
// later and ignores the changes that were made meanwhile.
struct LinkStart {
  AudioServiceType serviceType;
  std::string_view serviceName;  // a constant of the vocabulary
  platform::Dictionary configuration;

  // Describes the session: its identifier, whether its messages may be batched, and the application
  // if the configuration names one.
  [[nodiscard]] platform::Dictionary sessionInfo(
      ReporterID reporterID, const platform::TLMSecureHierarchyToken& token) const;
  // Includes the whole configuration, whose entries replace the service's own entries of the same
  // key.
  [[nodiscard]] platform::Dictionary userInfo() const;
};

}  // namespace halvox
