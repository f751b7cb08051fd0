#include "platform/linux/connection/Watchdog.h"

#include <cstdint>
#include <utility>

#include <systemd/sd-daemon.h>

#include "platform/linux/connection/ConnectionLog.h"

namespace halvox::platform::linux_ {
namespace {

constexpr UnitLog kLog{connectionCategory, "Watchdog"};
constexpr int kLooksInLimit = 3;

// Zero if the manager does not watch this process.
std::chrono::milliseconds limitOfManager() {
  std::uint64_t limit = 0;
  if (sd_watchdog_enabled(0, &limit) <= 0) return {};
  return std::chrono::duration_cast<std::chrono::milliseconds>(std::chrono::microseconds(limit));
}

}  // namespace

Watchdog::Watchdog(std::function<bool()> hasProgressed)
    : hasProgressed_(std::move(hasProgressed)), looks_(limitOfManager() / kLooksInLimit) {}

void Watchdog::start() {
  if (looks_.delay().count() > 0) looks_.start(next_);
}

void Watchdog::onDeadline() {
  looks_.start(next_);
  const bool wasStuck = std::exchange(isStuck_, hasProgressed_ && !hasProgressed_());
  if (!isStuck_) {
    static_cast<void>(sd_notify(0, "WATCHDOG=1"));
  } else if (!wasStuck) {
    kLog.error("the reporting queue is stuck: no request has ended or used processor time for ",
               looks_.delay().count(), " ms; sending no keep-alive until one does. The service ",
               "manager ends a service that sends none");
  }
}

}  // namespace halvox::platform::linux_
