#pragma once

#include <memory>

#include "platform/dispatch.h"
#include "platform/linux/configuration/Configuration.h"
#include "platform/statistics.h"
#include "platform/tlm_reporting.h"

namespace halvox::platform::linux_ {

// The services that the back-end uses, which must outlive it.
struct NatsEnvironment {
  DispatchService& dispatch;
  StatisticsService& statistics;
};

// The real-time reporting framework over NATS with JetStream.
class NatsTlmReporting : public TLMReportingService {
 public:
  // Refuses what comes later, lets what was taken go out within a few seconds, tells whoever still
  // waits, and ends the connection. Blocks; call it once no other thread calls. False when a thread
  // is left behind that waits for a server: what it uses, the environment too, must then stay until
  // the process ends.
  [[nodiscard]] virtual bool close() = 0;
};

// Whether this build has that back-end.
[[nodiscard]] bool isNatsBuilt();

// The back-end; null when it is not in this build. Connects nowhere before a session asks.
[[nodiscard]] std::unique_ptr<NatsTlmReporting> makeNatsTlmReporting(
    Configuration::Link options, const NatsEnvironment& environment);

}  // namespace halvox::platform::linux_
