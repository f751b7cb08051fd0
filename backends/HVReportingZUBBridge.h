#pragma once

#include <cstdint>
#include <memory>

#include "backends/HVReportingVocabulary.h"
#include "platform/value.h"

namespace halvox {

class HVReportingSession;
struct IssueMetricCounters;

// Posts each audio issue that a client detected to the diagnostics metrics. Keeps no state; any
// thread may call. Returns no error: a missing key is logged, and its field stays empty.
class HVReportingZUBBridge {
 public:
  // The identifier of the metric.
  static constexpr std::uint32_t kAudioIssueDetectedMetricID = 0x5B0003;

  HVReportingZUBBridge() = delete;

  // Posts one metric for a message of type kIssueDetector. Ignores messages of other types and a
  // missing message. Does not use category and session. Text fields are describe() of the values.
  // The duration is the low 32 bits of a number's integer, or of the integer at the beginning of a
  // text. The metric has no timestamp.
  static void handleEvent(const platform::Message& message, AudioEventCategory category,
                          AudioEventType type, const std::shared_ptr<HVReportingSession>& session,
                          const IssueMetricCounters& counters);
};

}  // namespace halvox
