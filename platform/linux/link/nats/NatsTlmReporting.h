#pragma once

#include <memory>

#include "platform/dispatch.h"
#include "platform/linux/configuration/Configuration.h"
#include "platform/linux/store/spool/LinkSpool.h"
#include "platform/statistics.h"
#include "platform/tlm_reporting.h"

namespace halvox::platform::linux_ {

// The services that the back-end uses. They must outlive it.
struct NatsEnvironment {
  DispatchService& dispatch;
  StatisticsService& statistics;
  LinkSpool* spool = nullptr;  // null if messages are not kept while no server is there
};

// The real-time reporting framework over NATS with JetStream.
class NatsTlmReporting : public TLMReportingService {
 public:
  // Sends what earlier runs have kept. Call it once, when the spool is open and before any session
  // is created.
  virtual void resume() = 0;
  // Refuses further messages, publishes the accepted ones for up to 3 seconds, keeps the others in
  // the spool if there is one, calls back all
  // callers that still wait, and ends the connection. Blocks for at most about 10 seconds. Call it
  // when no other thread uses the back-end. Returns false if a thread still waits for a server,
  // because the NATS client library cannot interrupt that. The environment must then exist until
  // the process ends.
  [[nodiscard]] virtual bool close() = 0;
};

// Makes the back-end. It connects when the first session starts, because a service whose sessions
// never start needs no server. Call this function only in the module and in programs that link the
// module's code; the service calls loadNatsTlmReporting().
[[nodiscard]] std::unique_ptr<NatsTlmReporting> makeNatsTlmReporting(
    Configuration::Link options, const NatsEnvironment& environment);

}  // namespace halvox::platform::linux_
