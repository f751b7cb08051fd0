#pragma once

#include <chrono>

#include "platform/log.h"
#include "platform/services.h"

namespace halvox::platform::linux_ {

// The log category of everything in this folder.
inline LogCategory& storeCategory() {
  static LogCategory& category = log().createCategory("com.tarno.halvox", "store");
  return category;
}

// Limits a log line that every record could cause to one line a second. Belongs to one thread.
class OncePerSecond {
 public:
  // Returns true if the line may be logged now. For one second after that, returns false.
  [[nodiscard]] bool tryPass() {
    const auto now = std::chrono::steady_clock::now();
    if (now < next_) return false;
    next_ = now + std::chrono::seconds(1);
    return true;
  }

 private:
  std::chrono::steady_clock::time_point next_{};
};

}  // namespace halvox::platform::linux_
