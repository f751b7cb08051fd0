#pragma once

#include "client/HalvoxClient.h"
#include "reporters/pipewire/ReportingClient.h"

namespace halvox::pipewire_reporter {

// Passes the reporter's operations to the client library, which it does not own and which must
// outlive it. Failures and losses are handled and counted by the library.
class HalvoxReportingClient final : public ReportingClient {
 public:
  explicit HalvoxReportingClient(client::HalvoxClient& client) : client_(client) {}

  // After a lost connection the library creates and starts the sessions again by itself.
  void createSession(ReporterID id) override { client_.createSession(id); }
  void setServiceType(ReporterID id, ServiceType type) override {
    client_.setServiceType(id, type);
  }
  void setConfiguration(ReporterID id, const platform::Dictionary& configuration) override {
    client_.setConfiguration(id, configuration);
  }
  void start(ReporterID id) override { client_.start(id); }
  // The result is ignored, because the library counts the messages that it drops.
  void send(ReporterID id, const platform::Dictionary& message, Category category,
            EventType type) override {
    static_cast<void>(client_.send(id, message, category, type));
  }
  void stop(ReporterID id) override { client_.stop(id); }
  void destroySession(ReporterID id) override { client_.destroySession(id); }

 private:
  client::HalvoxClient& client_;
};

}  // namespace halvox::pipewire_reporter
