#pragma once

#include <chrono>
#include <functional>

#include "platform/linux/connection/Deadlines.h"

namespace halvox::platform::linux_ {

// Keeps the service manager's watchdog quiet while the service makes progress. If the manager has
// none for this process (WatchdogSec= of the unit, which arrives as WATCHDOG_USEC), does nothing:
// an idle service then makes no wake-ups.
//
// Looks at the service three times in the manager's limit. Each look that finds progress sends a
// keep-alive. A delay of one look, on a busy machine, is therefore harmless. A service that gets
// stuck is ended by the manager two thirds of the limit later at the earliest.
//
// Looks run on the I/O thread. If that thread is stuck, there is no look. Belongs to that thread.
class Watchdog final : public DeadlineOwner {
 public:
  // `hasProgressed` returns false if the service is stuck since the last call. If it is empty, only
  // the I/O thread is watched.
  explicit Watchdog(std::function<bool()> hasProgressed);

  // Call when the service is ready.
  void start();
  // The queue of the next look. Its deadlines call this object.
  [[nodiscard]] DeadlineQueue& looks() { return looks_; }
  [[nodiscard]] const DeadlineQueue& looks() const { return looks_; }
  void onDeadline() override;

 private:
  const std::function<bool()> hasProgressed_;
  DeadlineQueue looks_;
  Deadline next_{*this};
  bool isStuck_ = false;
};

}  // namespace halvox::platform::linux_
