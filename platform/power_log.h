#pragma once

#include <cstdint>
#include <optional>
#include <string_view>

#include "platform/value.h"

namespace halvox::platform {

// Collects registered power events.
//
// Any thread may call. A failure of storage is not reported to the caller. The service counts what
// it drops, and logs it. The composition root owns the service.
class PowerLogService {
 public:
  virtual ~PowerLogService() = default;

  // Records one event: its payload, and the entries of `extra` whose keys the payload does not
  // have. Does not wait until the record is on the disk, but blocks while the service holds its
  // maximum of pending records.
  virtual void logPowerEvent(std::uint32_t categoryID, std::string_view eventName,
                             const Dictionary& payload, const std::optional<Dictionary>& extra) = 0;
};

}  // namespace halvox::platform
