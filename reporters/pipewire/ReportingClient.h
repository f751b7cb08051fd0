#pragma once

#include <cstdint>

#include "platform/value.h"

namespace halvox::pipewire_reporter {

using ReporterID = std::int64_t;
using ServiceType = std::uint16_t;
using Category = std::uint32_t;
using EventType = std::uint16_t;

// The operations of the reporting service that the reporter uses: the life of a session, and its
// messages. Calls only queue an operation: they keep their order, do not block and do not fail.
// Belongs to the loop thread. Callers do not own the client.
class ReportingClient {
 public:
  ReportingClient() = default;
  virtual ~ReportingClient() = default;
  ReportingClient(const ReportingClient&) = delete;
  ReportingClient& operator=(const ReportingClient&) = delete;

  virtual void createSession(ReporterID id) = 0;
  virtual void setServiceType(ReporterID id, ServiceType type) = 0;
  // Adds the entries to the session's configuration; entries with the same keys are replaced.
  virtual void setConfiguration(ReporterID id, const platform::Dictionary& configuration) = 0;
  // A start has no reply here, because the service answers it only at the stop.
  virtual void start(ReporterID id) = 0;
  virtual void send(ReporterID id, const platform::Dictionary& message, Category category,
                    EventType type) = 0;
  virtual void stop(ReporterID id) = 0;
  virtual void destroySession(ReporterID id) = 0;
};

}  // namespace halvox::pipewire_reporter
