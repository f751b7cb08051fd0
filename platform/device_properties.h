#pragma once

#include <optional>
#include <string_view>

#include "platform/value.h"

namespace halvox::platform {

// Properties that the maker of the device set, such as "InternalBuild". The Linux adapter takes
// them from the configuration.
//
// Any thread may call; nothing blocks. The composition root owns the service.
class DevicePropertyService {
 public:
  virtual ~DevicePropertyService() = default;

  // The value of a property, or none if the device does not have it.
  [[nodiscard]] virtual std::optional<Value> copyDeviceProperty(std::string_view key) const = 0;
};

}  // namespace halvox::platform
