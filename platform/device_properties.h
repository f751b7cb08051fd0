#pragma once

#include <optional>
#include <string_view>

#include "platform/value.h"

namespace halvox::platform {

// Properties of the device that its maker set, such as "InternalBuild". Any thread may ask.
class DevicePropertyService {
 public:
  virtual ~DevicePropertyService() = default;

  // The property's value, or none when the device has no such property.
  [[nodiscard]] virtual std::optional<Value> copyDeviceProperty(std::string_view key) const = 0;
};

}  // namespace halvox::platform
