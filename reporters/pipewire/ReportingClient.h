#pragma once

#include <cstdint>

#include "platform/value.h"

namespace halvox::pipewire_reporter {

using ReporterID = std::int64_t;
using ServiceType = std::uint16_t;
using Category = std::uint32_t;
using EventType = std::uint16_t;

// What the reporter asks of the reporting service: the life of a session and its messages.
// Operations are handed over in order and never block or fail; the caller does not own the client.
// Used on the reporter's loop thread only.
class ReportingClient {
 public:
  ReportingClient() = default;
  virtual ~ReportingClient() = default;
  ReportingClient(const ReportingClient&) = delete;
  ReportingClient& operator=(const ReportingClient&) = delete;

  virtual void createSession(ReporterID id) = 0;
  virtual void setServiceType(ReporterID id, ServiceType type) = 0;
  // Merges into what the session's configuration already holds.
  virtual void setConfiguration(ReporterID id, const platform::Dictionary& configuration) = 0;
  virtual void start(ReporterID id) = 0;
  virtual void send(ReporterID id, const platform::Dictionary& message, Category category,
                    EventType type) = 0;
  virtual void stop(ReporterID id) = 0;
  virtual void destroySession(ReporterID id) = 0;
};

}  // namespace halvox::pipewire_reporter
