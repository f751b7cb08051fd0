#pragma once

#include <cstdint>
#include <mutex>
#include <optional>
#include <string>
#include <vector>

#include "platform/fake/Journal.h"
#include "platform/power_log.h"

namespace halvox::platform {

// Keeps the power events. Any thread may call the service; only the test's thread reads the
// results. FakePlatform owns it.
class FakePowerLogService final : public PowerLogService {
 public:
  struct Event {
    std::uint32_t categoryID;
    std::string name;
    Dictionary payload;
    std::optional<Dictionary> extra;
    // The payload together with the entries that `extra` adds: what the real service records.
    [[nodiscard]] Dictionary recorded() const;
    friend bool operator==(const Event&, const Event&) = default;
  };

  // Does not own the journal, which must outlive it.
  explicit FakePowerLogService(Journal& journal) : journal_(journal) {}

  [[nodiscard]] std::vector<Event> events() const;

  void logPowerEvent(std::uint32_t categoryID, std::string_view eventName,
                     const Dictionary& payload, const std::optional<Dictionary>& extra) override;

 private:
  Journal& journal_;
  mutable std::mutex mutex_;
  std::vector<Event> events_;
};

// Prints an event in the message of a failed test.
void PrintTo(const FakePowerLogService::Event& event, std::ostream* stream);

}  // namespace halvox::platform
