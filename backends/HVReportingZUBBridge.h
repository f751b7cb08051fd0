#pragma once

#include <cstdint>
#include <memory>

#include "backends/HVReportingVocabulary.h"
#include "platform/value.h"

namespace halvox {

class HVReportingSession;

// Posts each issue that a client detected to the diagnostics metrics. Keeps no state; any thread.
// What an issue does not tell is logged, and posted empty.
class HVReportingZUBBridge {
 public:
  // Under which the issues are posted.
  static constexpr std::uint32_t kAudioIssueDetectedMetricID = 0x5B0003;

  HVReportingZUBBridge() = delete;

  // Posts one metric for a message of type kIssueDetector; does nothing for any other, or for none.
  // Category and session do not matter. Texts are what describe() says of the values; the duration
  // is a number's integer, or that which a text begins with, cut off to 32 bits.
  static void handleEvent(const platform::Message& message, AudioEventCategory category,
                          AudioEventType type, const std::shared_ptr<HVReportingSession>& session);
};

}  // namespace halvox
