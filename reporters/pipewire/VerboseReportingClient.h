#pragma once

#include <functional>
#include <string>
#include <string_view>
#include <utility>

#include "reporters/pipewire/ReportingClient.h"

namespace halvox::pipewire_reporter {

// Logs each operation, then passes it to another client, which it does not own and which must
// outlive it. Belongs to the loop thread.
class VerboseReportingClient final : public ReportingClient {
 public:
  using Log = std::function<void(std::string_view line)>;

  VerboseReportingClient(ReportingClient& next, Log log) : next_(next), log_(std::move(log)) {}

  void createSession(ReporterID id) override {
    say(id, "create");
    next_.createSession(id);
  }
  void setServiceType(ReporterID id, ServiceType type) override {
    say(id, "service type " + std::to_string(type));
    next_.setServiceType(id, type);
  }
  void setConfiguration(ReporterID id, const platform::Dictionary& configuration) override {
    say(id, "configure " + platform::describe(configuration));
    next_.setConfiguration(id, configuration);
  }
  void start(ReporterID id) override {
    say(id, "start");
    next_.start(id);
  }
  void send(ReporterID id, const platform::Dictionary& message, Category category,
            EventType type) override {
    say(id, "send category " + std::to_string(category) + " type " + std::to_string(type) + ' ' +
                platform::describe(message));
    next_.send(id, message, category, type);
  }
  void stop(ReporterID id) override {
    say(id, "stop");
    next_.stop(id);
  }
  void destroySession(ReporterID id) override {
    say(id, "destroy");
    next_.destroySession(id);
  }

 private:
  void say(ReporterID id, const std::string& operation) const {
    log_("session " + std::to_string(id) + ": " + operation);
  }

  ReportingClient& next_;
  Log log_;
};

}  // namespace halvox::pipewire_reporter
