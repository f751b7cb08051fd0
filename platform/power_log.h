#pragma once

#include <cstdint>
#include <optional>
#include <string_view>

#include "platform/value.h"

namespace halvox::platform {

// Collects registered power events. Any thread may call.
class PowerLogService {
 public:
  virtual ~PowerLogService() = default;

  // Records one event with its payload, and with the entries of `extra` under keys that the payload
  // does not have. Never waits for storage to be written; waits for room when more are pending
  // than may be held.
  virtual void logPowerEvent(std::uint32_t categoryID, std::string_view eventName,
                             const Dictionary& payload, const std::optional<Dictionary>& extra) = 0;
};

}  // namespace halvox::platform
