#pragma once

#include "platform/linux/link/local/ServerlessTlmReportingService.h"
#include "platform/statistics.h"

namespace halvox::platform::linux_ {

// The real-time reporting framework of a service whose link is disabled. No discovery finds a
// back-end, and every message is counted and refused.
// Threads: any may call; nothing blocks. Owner: the platform, which also owns the constructor's
// arguments; these must outlive this object.
class NoneTlmReportingService final : public ServerlessTlmReportingService {
 public:
  // `callbacks` answers discoveries on its thread.
  NoneTlmReportingService(StatisticsService& statistics, CallbackThread& callbacks)
      : ServerlessTlmReportingService("none", std::nullopt, callbacks),
        received_(statistics.counter("link none", "received")),
        dropped_(statistics.counter("link none", "dropped: no back-end")) {}

 private:
  TLMReportingOutcome accept(const std::shared_ptr<const LinkParty>& sender,
                             const TLMReportingMessage& message) override;

  Counter& received_;
  Counter& dropped_;
};

}  // namespace halvox::platform::linux_
