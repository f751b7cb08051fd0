#pragma once

#include <algorithm>
#include <string>
#include <vector>

#include "reporters/pipewire/ReportingClient.h"
#include "reporters/pipewire/ReportingVocabulary.h"

namespace halvox::pipewire_reporter {

// For tests: records each operation as one word with its details.
class RecordingReportingClient final : public ReportingClient {
 public:
  struct Call {
    std::string operation;
    ReporterID id = 0;
    ServiceType serviceType = 0;
    platform::Dictionary dictionary;  // the configuration or the message
  };

  void createSession(ReporterID id) override { calls_.push_back({"create", id, 0, {}}); }
  void setServiceType(ReporterID id, ServiceType type) override {
    calls_.push_back({"type", id, type, {}});
  }
  void setConfiguration(ReporterID id, const platform::Dictionary& configuration) override {
    calls_.push_back({"configure", id, 0, configuration});
  }
  void start(ReporterID id) override { calls_.push_back({"start", id, 0, {}}); }
  void send(ReporterID id, const platform::Dictionary& message, Category category,
            EventType type) override {
    calls_.push_back({messageName(category, type), id, 0, message});
  }
  void stop(ReporterID id) override { calls_.push_back({"stop", id, 0, {}}); }
  void destroySession(ReporterID id) override { calls_.push_back({"destroy", id, 0, {}}); }

  [[nodiscard]] const std::vector<Call>& calls() const { return calls_; }
  // Returns the names of the operations, in order.
  [[nodiscard]] std::vector<std::string> operations() const {
    std::vector<std::string> names;
    std::ranges::transform(calls_, std::back_inserter(names), &Call::operation);
    return names;
  }
  // Returns the dictionary of the last operation of that name; empty if there was none.
  [[nodiscard]] platform::Dictionary last(const std::string& operation) const {
    const auto found = std::find_if(calls_.rbegin(), calls_.rend(),
                                    [&](const Call& call) { return call.operation == operation; });
    return found == calls_.rend() ? platform::Dictionary() : found->dictionary;
  }
  void forget() { calls_.clear(); }

 private:
  static std::string messageName(Category category, EventType type) {
    struct Name {
      Category category;
      EventType type;
      const char* name;
    };
    static constexpr Name kNames[] = {
        {0x08000004, 1, "playback-start"},
        {0x08000004, 2, "playback-stop"},
        {0x08000002, 1, "record-start"},
        {0x08000002, 2, "record-stop"},
        {0x08000008, 5, "format"},
        {10, 18, "route"},
        {14, 18, "volume"},
        {0x08000004, 7, "playback-issue"},
        {0x08000002, 7, "record-issue"},
    };
    const auto* found = std::ranges::find_if(kNames, [&](const Name& known) {
      return known.category == category && known.type == type;
    });
    return found == std::end(kNames)
               ? "message " + std::to_string(category) + ":" + std::to_string(type)
               : found->name;
  }

  std::vector<Call> calls_;
};

}  // namespace halvox::pipewire_reporter
